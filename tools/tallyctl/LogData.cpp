#include "tallyctl/LogData.h"

#include <fmt/format.h>

#include <iterator>
#include <utility>

#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "tallyctl/Input.h"
#include "tallyctl/Session.h"
#include "tallyctl/StrictJSON.h"

namespace tallyd::tallyctl {

using platform::Value;

namespace {

using Elements = std::vector<Value>;

constexpr std::string_view kBlanks = " \t\r\n";

bool isBlank(std::string_view text) { return text.find_first_not_of(kBlanks) == std::string_view::npos; }

bool isJSON(std::string_view text) { return platform::valueFromJSON(text).value.has_value(); }

/// The next line, which is taken off `text`.
std::string_view takeLine(std::string_view& text) {
  const std::size_t end = text.find('\n');
  const std::string_view line = text.substr(0, end);
  text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  return line;
}

std::string_view firstLine(std::string_view text) {
  std::string_view line;
  while (!text.empty() && isBlank(line)) line = takeLine(text);
  return line;
}

Parsed<Elements> readLines(std::string_view text) {
  Elements elements;
  for (int number = 1; !text.empty(); ++number) {
    const std::string_view line = takeLine(text);
    if (isBlank(line)) continue;
    auto element = valueFromStrictJSON(line);
    if (!element.value) return {{}, fmt::format("{}: {}", number, element.error)};
    elements.push_back(std::move(*element.value));
  }
  return {std::move(elements), {}};
}

Parsed<Elements> oneElement(Parsed<Value> parsed) {
  if (!parsed.value) return {{}, " " + parsed.error};
  return {Elements{std::move(*parsed.value)}, {}};
}

}  // namespace

Parsed<Elements> logDataFromContent(std::string_view content) {
  if (isBlank(content)) return {{}, " is empty"};
  if (isJSON(content)) return oneElement(valueFromStrictJSON(content));
  if (isJSON(firstLine(content))) return readLines(content);
  auto list = platform::propertyListWithData(content);
  if (list.value) return {Elements{std::move(*list.value)}, {}};
  // What starts like JSON is more likely meant as that than as the old form of property lists.
  const char first = content[content.find_first_not_of(kBlanks)];
  const bool mayBeJSON = first == '{' || first == '[' || first == '"';
  if (!mayBeJSON) return {{}, " " + list.error};
  return {{}, fmt::format(" no JSON: {}; {}", platform::valueFromJSON(content).error, list.error)};
}

LogData readLogData(const std::vector<std::string>& files, int standardInput) {
  Elements all;
  std::size_t bytes = 0;
  for (const auto& file : files) {
    const Input input(file, standardInput);
    const std::string content = input.readWhole(kMaximumLogDataBytes - bytes);
    bytes += content.size();
    auto elements = logDataFromContent(content);
    if (!elements.value) throw Failure(fmt::format("{}:{}", input.name(), elements.error));
    std::move(elements.value->begin(), elements.value->end(), std::back_inserter(all));
  }
  return {platform::Array(std::move(all)), bytes};
}

}  // namespace tallyd::tallyctl
