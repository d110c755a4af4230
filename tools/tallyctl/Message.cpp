#include "tallyctl/Message.h"

#include <fmt/format.h>

#include <limits>

#include "platform/JSON.h"
#include "tallyctl/StrictJSON.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

bool isDigit(char character) { return character >= '0' && character <= '9'; }

/// A number as JSON writes it, whole; JSON's reader would also pass over blanks around it.
std::optional<Value> readNumber(std::string_view text) {
  if (text.empty() || !(isDigit(text.front()) || text.front() == '-') || !isDigit(text.back())) {
    return std::nullopt;
  }
  return platform::valueFromJSON(text).value;
}

Value readPlainValue(std::string_view text) {
  if (text == "true") return true;
  if (text == "false") return false;
  if (auto number = readNumber(text)) return *number;
  return text;
}

Parsed<std::uint16_t> readCode(const Dictionary& message, std::string_view key) {
  const Value* value = message.find(key);
  if (!value) return {{}, fmt::format("\"{}\" is missing", key)};
  const auto number = value->isInteger() ? value->integerValue() : std::nullopt;
  if (!number || *number < 0 || *number > std::numeric_limits<std::uint16_t>::max()) {
    return {{}, fmt::format("\"{}\" is not an integer from 0 to 65535", key)};
  }
  return {static_cast<std::uint16_t>(*number), {}};
}

Parsed<Message> readMessage(const Dictionary& dictionary) {
  for (const auto& [key, value] : dictionary) {
    if (key != "category" && key != "type" && key != "payload") {
      return {{}, fmt::format("unknown key \"{}\"", key)};
    }
  }
  auto category = readCode(dictionary, "category");
  if (!category.value) return {{}, std::move(category.error)};
  auto type = readCode(dictionary, "type");
  if (!type.value) return {{}, std::move(type.error)};
  Message message{*category.value, *type.value, std::nullopt};
  if (const Value* payload = dictionary.find("payload"); payload && !payload->isNull()) {
    if (!payload->dictionary()) return {{}, "\"payload\" is not an object"};
    message.payload = *payload->dictionary();
  }
  return {std::move(message), {}};
}

}  // namespace

Parsed<Message> messageFromJSON(std::string_view text) {
  auto json = valueFromStrictJSON(text);
  if (!json.value) return {{}, std::move(json.error)};
  if (!json.value->dictionary()) return {{}, R"(not an object with "category", "type" and "payload")"};
  return readMessage(*json.value->dictionary());
}

Parsed<Dictionary::Entry> parseAssignment(std::string_view text) {
  const std::size_t sign = text.find('=');
  if (sign == std::string_view::npos) {
    return {{}, fmt::format("\"{}\" is neither KEY=VALUE nor KEY:=JSON", text)};
  }
  const bool isJSON = sign > 0 && text[sign - 1] == ':';
  const std::string_view key = text.substr(0, isJSON ? sign - 1 : sign);
  const std::string_view value = text.substr(sign + 1);
  if (key.empty()) return {{}, fmt::format("\"{}\" has no key", text)};
  if (!isJSON) return {Dictionary::Entry{std::string(key), readPlainValue(value)}, {}};
  auto json = valueFromStrictJSON(value);
  if (!json.value) return {{}, fmt::format("the value of \"{}\" is no usable JSON: {}", key, json.error)};
  return {Dictionary::Entry{std::string(key), std::move(*json.value)}, {}};
}

Parsed<Dictionary> parseAssignments(const std::vector<std::string>& texts) {
  Dictionary dictionary;
  for (const auto& text : texts) {
    auto assignment = parseAssignment(text);
    if (!assignment.value) return {{}, std::move(assignment.error)};
    auto& [key, value] = *assignment.value;
    if (dictionary.contains(key)) return {{}, fmt::format("the key \"{}\" comes twice", key)};
    dictionary.set(key, std::move(value));
  }
  return {std::move(dictionary), {}};
}

}  // namespace tallyd::tallyctl
