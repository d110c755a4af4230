#include "tally-storebag/ExplainArguments.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include <algorithm>
#include <charconv>

#include "storebag/StorebagEnvironment.h"
#include "tally-storebag/OptionTexts.h"

namespace tallyd::storebagtool {

namespace {

constexpr std::size_t kDeviceIDBytes = 40;

CLI::Validator readable(std::string what, bool (*isReadable)(std::string_view)) {
  return {[what = std::move(what), isReadable](const std::string& text) {
            return isReadable(text) ? std::string() : fmt::format("{} is no {}", text, what);
          },
          ""};
}

CLI::Validator isTime() {
  return readable("time in seconds since 1970",
                  [](std::string_view text) { return timeFromText(text).has_value(); });
}

std::optional<std::uint32_t> environmentNamed(std::string_view name) {
  for (std::uint32_t type = 1; environmentNameForType(type); ++type) {
    if (environmentNameForType(type) == name) return type;
  }
  return name == "internal" ? std::optional(kEnvironmentTypeInternal) : std::nullopt;
}

/// An option whose empty text says that the device has no answer.
void addAnswer(CLI::App& command, const char* name, std::optional<std::string>& answer, const char* text) {
  command
      .add_option_function<std::string>(
          name,
          [&answer](const std::string& given) {
            answer = given.empty() ? std::nullopt : std::optional(given);
          },
          fmt::format("{}{}", text, answer ? fmt::format(" [{}]", *answer) : ""))
      ->type_name("TEXT");
}

}  // namespace

std::optional<platform::TimePoint> timeFromText(std::string_view text) {
  constexpr std::size_t kFractionDigits = 6;
  constexpr std::int64_t kLatest = 9'000'000'000;  // 64 bits hold its nanoseconds.
  const auto point = text.find('.');
  std::string fraction(point == std::string_view::npos ? "" : text.substr(point + 1));
  if (fraction.size() > kFractionDigits || (point != std::string_view::npos && fraction.empty()))
    return std::nullopt;
  fraction.resize(kFractionDigits, '0');
  const auto number = [](std::string_view digits) -> std::optional<std::int64_t> {
    std::int64_t value = 0;
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), value);
    const bool isWhole = error == std::errc() && end == digits.data() + digits.size();
    return isWhole && digits.front() != '-' ? std::optional(value) : std::nullopt;
  };
  const auto seconds = number(text.substr(0, point));
  const auto microseconds = number(fraction);
  if (!seconds || !microseconds || *seconds > kLatest) return std::nullopt;
  return platform::TimePoint(std::chrono::seconds(*seconds) + std::chrono::microseconds(*microseconds));
}

std::optional<platform::UUIDBytes> uuidFromText(std::string_view text) {
  platform::UUIDBytes bytes{};
  constexpr std::string_view kForm = "00000000-0000-0000-0000-000000000000";
  if (text.size() != kForm.size()) return std::nullopt;
  std::string digits;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if ((kForm[i] == '-') != (text[i] == '-')) return std::nullopt;
    if (text[i] != '-') digits += text[i];
  }
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    const char* start = digits.data() + 2 * i;
    const auto [end, error] = std::from_chars(start, start + 2, bytes[i], 16);
    if (error != std::errc() || end != start + 2) return std::nullopt;
  }
  return bytes;
}

ExplainArguments::ExplainArguments(platform::TimePoint now) : _now(now) {}

void ExplainArguments::addTo(CLI::App& command) {
  command.add_option("bag", _options.bag, "The bag, bare or in its envelope")->type_name("BAG")->required();
  _session.addTo(command);
  command.add_option("--session-key", _texts["session-key"], "The session's combined ID, as in _sessionID")
      ->type_name("TEXT");
  _message.addTo(command);
  _message.require();
  addDeviceOptions(command);
  addTimeOptions(command);
  command.add_option("--raw", _raw, "Write the bytes into files in this folder")->type_name("DIR");
  command.add_flag("--all", _all, "Show the records of the session's start and end, too");
}

void ExplainArguments::addDeviceOptions(CLI::App& command) {
  auto& device = _options.occasion.device;
  command.add_option("--country", device.countryCode, "Country code; by default the locale names none")
      ->type_name("CC");
  command.add_option("--consent", _consent, "Whether the user lets diagnostics leave: yes or no")
      ->type_name("YES|NO")
      ->check(CLI::IsMember({"yes", "no"}).description(""))
      ->capture_default_str();
  command.add_flag("--internal", device.internal, "The device runs an internal build");
  command
      .add_option("--environment", _texts["environment"],
                  "release, seed, internal or development; by the build")
      ->type_name("NAME")
      ->check(
          readable("environment", [](std::string_view text) { return environmentNamed(text).has_value(); }));
  command.add_option("--sampling-factor", device.samplingFactor, "What the backend draws, 0 to 1")
      ->type_name("F")
      ->check(CLI::Range(0.0, 1.0).description(""))
      ->capture_default_str();
  addAnswer(command, "--device-family", device.family, "Product family (DeviceName)");
  addAnswer(command, "--product-type", device.productType, "ProductType");
  addAnswer(command, "--product-version", device.productVersion, "ProductVersion");
  addAnswer(command, "--build-version", device.buildVersion, "BuildVersion");
  addAnswer(command, "--hardware-model", device.hardwareModel, "HWModelStr");
  addAnswer(command, "--serial-number", device.serialNumber, "SerialNumber");
  addAnswer(command, "--framework-version", device.frameworkVersion, "The framework's CFBundleVersion");
  addAnswer(command, "--https-post-url", device.httpsPostURL, "The device's preference httpsPostURL");
  command.add_option("--device-id", device.deviceID, "UniqueDeviceID, 40 characters; by default zeros")
      ->type_name("ID")
      ->check(
          readable("text of 40 bytes", [](std::string_view text) { return text.size() == kDeviceIDBytes; }));
  command.add_option("--client-id", _texts["client-id"], "The client identifier; by default zeros")
      ->type_name("UUID")
      ->check(readable("UUID", [](std::string_view text) { return uuidFromText(text).has_value(); }));
}

void ExplainArguments::addTimeOptions(CLI::App& command) {
  const auto add = [&](const char* name, const char* key, const char* text) {
    command.add_option(name, _texts[key], text)->type_name("SECONDS")->check(isTime());
  };
  add("--time", "time", "When the message is sent, since 1970; by default now");
  add("--session-start", "session-start", "When the session starts; by default with the message");
  add("--post-time", "post-time", "When the document is made; by default with the message");
  command
      .add_option_function<std::int64_t>(
          "--timezone-offset",
          [this](std::int64_t seconds) {
            _options.occasion.device.timezoneOffset = std::chrono::seconds(seconds);
          },
          "Seconds east of GMT [0]")
      ->type_name("SECONDS");
}

ExplainOptions ExplainArguments::result() const {
  ExplainOptions result = _options;
  Occasion& occasion = result.occasion;
  occasion.session = _session.options();
  if (!storebagNameForClientType(occasion.session.clientType))
    throw CLI::ValidationError("--client-type", "only 5 to 11 have storebags");
  occasion.message = _message.message();
  if (const auto& key = _texts.at("session-key"); !key.empty()) occasion.sessionKey = key;
  occasion.device.consented = _consent == "yes";
  occasion.device.environmentType = environmentNamed(_texts.at("environment"));
  occasion.device.clientID = uuidFromText(_texts.at("client-id")).value_or(platform::UUIDBytes());
  occasion.messageTime = timeFromText(_texts.at("time")).value_or(_now);
  occasion.sessionStart = timeFromText(_texts.at("session-start")).value_or(occasion.messageTime);
  occasion.postTime = timeFromText(_texts.at("post-time")).value_or(occasion.messageTime);
  if (!_raw.empty()) result.rawFolder = _raw;
  result.acts = _all ? Acts::All : Acts::Message;
  return result;
}

}  // namespace tallyd::storebagtool
