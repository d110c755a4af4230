#include "tallyctl/StrictJSON.h"

#include <fmt/format.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include <unordered_set>
#include <utility>
#include <vector>

#include "platform/JSON.h"

namespace tallyd::tallyctl {

namespace {

/// Notes the first key that an object has twice, and ends the reading there.
class RepeatedKeyFinder : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, RepeatedKeyFinder> {
 public:
  bool StartObject() {
    _open.emplace_back();
    return true;
  }
  bool Key(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    std::string key(text, length);
    if (_open.back().insert(key).second) return true;
    _repeated = std::move(key);
    return false;
  }
  bool EndObject(rapidjson::SizeType /*count*/) {
    _open.pop_back();
    return true;
  }

  [[nodiscard]] const std::optional<std::string>& repeated() const { return _repeated; }

 private:
  std::vector<std::unordered_set<std::string>> _open;
  std::optional<std::string> _repeated;
};

/// Of a text that is JSON, and so within the bounds of its nesting.
std::optional<std::string> repeatedKey(std::string_view text) {
  constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
  if (text.starts_with(kByteOrderMark)) text.remove_prefix(kByteOrderMark.size());
  rapidjson::MemoryStream stream(text.data(), text.size());
  RepeatedKeyFinder finder;
  rapidjson::Reader().Parse<rapidjson::kParseNumbersAsStringsFlag>(stream, finder);
  return finder.repeated();
}

}  // namespace

Parsed<platform::Value> valueFromStrictJSON(std::string_view text) {
  auto json = platform::valueFromJSON(text);
  if (!json.value) return {{}, std::move(json.error)};
  if (const auto key = repeatedKey(text)) return {{}, fmt::format("the key \"{}\" comes twice", *key)};
  return {std::move(json.value), {}};
}

}  // namespace tallyd::tallyctl
