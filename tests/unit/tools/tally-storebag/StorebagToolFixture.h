// The tool on files of its own, and bags to change.
#pragma once

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "fakes/TemporaryFolder.h"
#include "platform/Value.h"
#include "platform/property-list/PropertyList.h"
#include "tally-storebag/Linter.h"
#include "tally-storebag/Tool.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;
using platform::Value;

/// An entry that reports, with `more` over it.
inline Dictionary clientEntry(const Dictionary& more = {}) {
  Dictionary entry{{"locale_whitelist", Array{"DE"}},
                   {"filters", Array{Dictionary{{"key", "token"}, {"action", "remove"}}}},
                   {"sampling_threshold", 1},
                   {"post_url", "https://collector.example.com/events"}};
  entry.merge(more);
  return entry;
}

inline Dictionary bagWithSection(const Dictionary& section) {
  return {{"version", "1"}, {"release", section}};
}

inline Dictionary bagWithClients(const Array& clients) {
  return bagWithSection({{"splunk", Dictionary{{"clients", clients}}}});
}

inline Dictionary without(Dictionary dictionary, std::string_view key) {
  dictionary.remove(key);
  return dictionary;
}

inline std::string xml(const Value& value) {
  return *platform::dataWithPropertyList(value, platform::PropertyListFormat::XML);
}

inline std::string fileText(const std::filesystem::path& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

class StorebagToolTest : public testing::Test {
 protected:
  /// The exit status; what was written is in _out and _err.
  int run(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), "tally-storebag");
    std::vector<const char*> pointers;
    for (const auto& argument : arguments) pointers.push_back(argument.c_str());
    std::ostringstream out;
    std::ostringstream err;
    const int status = runTool(static_cast<int>(pointers.size()), pointers.data(),
                               {.version = "1.2.3", .out = out, .err = err, .now = {}});
    _out = out.str();
    _err = err.str();
    return status;
  }

  [[nodiscard]] std::string path(const std::string& name) const { return _folder.path() / name; }

  std::string write(const std::string& name, const std::string& bytes) const {
    std::ofstream(path(name), std::ios::binary) << bytes;
    return path(name);
  }
  std::string write(const std::string& name, const Dictionary& bag) const { return write(name, xml(bag)); }

  fakes::TemporaryFolder _folder;
  std::string _out;
  std::string _err;
};

}  // namespace tallyd::storebagtool
