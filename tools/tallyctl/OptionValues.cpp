#include "tallyctl/OptionValues.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include <charconv>
#include <optional>
#include <utility>

#include "tallyctl/Message.h"

namespace tallyd::tallyctl {

namespace {

constexpr double kLongestSeconds = 86'400;

/// The whole of `text` as a number; the library's own conversions take signs of unsigned numbers and octals.
template <class Number>
std::optional<Number> readNumber(const std::string& text) {
  Number number{};
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || stop != end) return std::nullopt;
  return number;
}

[[noreturn]] void refuse(const std::string& text) {
  throw CLI::ValidationError(text, CLI::ExitCodes::ValidationError);
}

}  // namespace

CLI::Option* addInteger(CLI::App& command, const std::string& name, const std::string& text,
                        IntegerRange range, std::function<void(std::int64_t)> store) {
  const std::function<void(const std::string&)> read = [name, range,
                                                        store = std::move(store)](const std::string& value) {
    const auto number = readNumber<std::int64_t>(value);
    if (!number || *number < range.least || *number > range.most) {
      refuse(fmt::format("{} {}: must be {} to {}", name, value, range.least, range.most));
    }
    store(*number);
  };
  return command.add_option_function(name, read, text)->type_name("N");
}

CLI::Option* addCount(CLI::App& command, const std::string& name, const std::string& text,
                      std::uint64_t& target) {
  return addInteger(command, name, text, {.least = 1},
                    [&target](std::int64_t count) { target = static_cast<std::uint64_t>(count); });
}

CLI::Option* addSeconds(CLI::App& command, const std::string& name, const std::string& text, double least,
                        std::chrono::milliseconds& target) {
  using Seconds = std::chrono::duration<double>;
  const std::function<void(const std::string&)> read = [name, least, &target](const std::string& value) {
    const auto seconds = readNumber<double>(value);
    // Not-a-number is in no range.
    if (!seconds || !(*seconds >= least && *seconds <= kLongestSeconds)) {
      refuse(fmt::format("{} {}: must be {} to {} seconds", name, value, least, kLongestSeconds));
    }
    target = std::chrono::ceil<std::chrono::milliseconds>(Seconds(*seconds));
  };
  return command.add_option_function(name, read, text)
      ->type_name("SECONDS")
      ->default_str(fmt::format("{}", Seconds(target).count()));
}

CLI::Option* addText(CLI::App& command, const std::string& name, const std::string& text,
                     std::string& target) {
  const std::function<void(const std::string&)> read = [name, &target](const std::string& value) {
    if (value.empty()) refuse(name + ": must not be empty");
    target = value;
  };
  return command.add_option_function(name, read, text)->default_str(target);
}

CLI::Option* takeAssignments(CLI::Option* option) {
  return option->type_name("KEY=VALUE")
      ->check(CLI::Validator([](const std::string& text) { return parseAssignment(text).error; }, ""));
}

platform::Dictionary dictionaryFrom(const std::string& what, const std::vector<std::string>& assignments) {
  auto parsed = parseAssignments(assignments);
  if (!parsed.value) throw CLI::ValidationError(what, parsed.error);
  return std::move(*parsed.value);
}

}  // namespace tallyd::tallyctl
