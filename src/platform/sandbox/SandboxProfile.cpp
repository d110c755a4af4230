#include "platform/sandbox/SandboxProfile.h"

#include <fmt/format.h>

#include <algorithm>

#include "platform/property-list/PropertyList.h"
#include "platform/sandbox/SandboxErrors.h"

namespace tallyd::platform {
namespace {

constexpr std::string_view kSystemPrefix = "system:";

std::vector<std::string> strings(std::string_view key, const Value& value) {
  const Array* array = value.array();
  if (!array) throw ProfileError(fmt::format("\"{}\" is not an array", key));
  std::vector<std::string> result;
  for (const Value& element : *array) {
    const auto text = element.string();
    if (!text || text->empty())
      throw ProfileError(fmt::format("\"{}\" holds something other than texts", key));
    result.emplace_back(*text);
  }
  return result;
}

std::filesystem::path pathNamed(const std::string& text, const Root& root) {
  const bool system = text.starts_with(kSystemPrefix);
  const std::filesystem::path path(system ? text.substr(kSystemPrefix.size()) : text);
  if (system && !path.is_absolute()) throw ProfileError(fmt::format("\"{}\" is not absolute", text));
  if (std::find(path.begin(), path.end(), "..") != path.end()) {
    throw ProfileError(fmt::format("\"{}\" leads upwards", text));
  }
  return system ? path : root.under(path.string());
}

std::vector<std::filesystem::path> paths(std::string_view key, const Value& value, const Root& root) {
  std::vector<std::filesystem::path> result;
  for (const auto& text : strings(key, value)) result.push_back(pathNamed(text, root));
  return result;
}

}  // namespace

SandboxProfile sandboxProfileWithData(std::string_view bytes, const Root& root) {
  const PropertyListResult list = propertyListWithData(bytes);
  if (!list.value) throw ProfileError(fmt::format("is no property list: {}", list.error));
  const Dictionary* entries = list.value->dictionary();
  if (!entries) throw ProfileError("is not a dictionary");

  SandboxProfile profile;
  for (const auto& [key, value] : *entries) {
    if (key == "Read") {
      profile.read = paths(key, value, root);
    } else if (key == "Write") {
      profile.write = paths(key, value, root);
    } else if (key == "Remove") {
      profile.remove = paths(key, value, root);
    } else if (key == "SystemCalls") {
      profile.systemCalls = strings(key, value);
    } else if (key == "Optional") {
      profile.optional = value.booleanValue();
    } else {
      throw ProfileError(fmt::format("\"{}\" is no key of a profile", key));
    }
  }
  if (profile.systemCalls.empty()) throw ProfileError("\"SystemCalls\" names nothing");
  return profile;
}

}  // namespace tallyd::platform
