#include "framework/ClientValues.h"

#include <fcntl.h>

#include <string_view>
#include <utility>

namespace tallyd::client {

using platform::Array;
using platform::FileDescriptor;
using platform::Value;

namespace {

const Value* unwrapped(const Value& wrapper) {
  const auto* array = wrapper.array();
  return array && !array->empty() ? array->begin() : nullptr;
}

}  // namespace

Value wrapped(std::optional<platform::Dictionary> value) {
  return value ? Value(Array{Value(std::move(*value))}) : Value(Array());
}

Value arrayOf(Strings strings) {
  std::vector<Value> values;
  values.reserve(strings.size());
  for (auto& each : strings) values.emplace_back(std::move(each));
  return Value(Array(std::move(values)));
}

std::string readText(const Results& results) { return std::string(results[0].string().value_or("")); }

std::optional<std::string> readOptionalText(const Results& results) {
  const auto* text = unwrapped(results[0]);
  if (!text) return std::nullopt;
  return std::string(text->string().value_or(""));
}

std::optional<Strings> readOptionalTexts(const Results& results) {
  const auto* texts = unwrapped(results[0]);
  if (!texts) return std::nullopt;
  Strings strings;
  if (const auto* array = texts->array()) {
    for (const Value& each : *array) strings.emplace_back(each.string().value_or(""));
  }
  return strings;
}

bool readTruth(const Results& results) { return results[0].booleanValue(); }

std::string fileURL(const std::string& absolutePath) {
  constexpr std::string_view kUnescaped =
      "/-._~ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
  constexpr std::string_view kDigits = "0123456789ABCDEF";
  std::string url = "file://";
  for (const char each : absolutePath) {
    if (kUnescaped.find(each) != std::string_view::npos) {
      url.push_back(each);
      continue;
    }
    const auto byte = static_cast<unsigned char>(each);
    url.push_back('%');
    url.push_back(kDigits[byte >> 4]);
    url.push_back(kDigits[byte & 15]);
  }
  return url;
}

std::vector<FileDescriptor> grantFor(const std::filesystem::path& file) {
  std::vector<FileDescriptor> grant;
  grant.emplace_back(::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  grant.emplace_back(::open(file.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!grant[0] || !grant[1]) grant.clear();
  return grant;
}

}  // namespace tallyd::client
