// What --help shows, so that other texts can be held against it.
#pragma once

#include <gtest/gtest.h>

#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "tallyctl/Options.h"

namespace tallyd::tallyctl {

using Words = std::set<std::string>;

/// What `tallyctl ARGUMENTS --help` prints.
inline std::string helpOf(std::vector<const char*> arguments) {
  arguments.insert(arguments.begin(), "tallyctl");
  arguments.push_back("--help");
  std::ostringstream out;
  std::ostringstream err;
  const auto parsed = parseOptions(static_cast<int>(arguments.size()), arguments.data(), "1", out, err);
  EXPECT_EQ(parsed.exitStatus, kSucceeded) << err.str();
  return out.str();
}

/// What the pattern's group matches, in each line.
inline Words wordsIn(const std::string& text, const std::regex& pattern) {
  Words words;
  std::istringstream lines(text);
  for (std::string line; std::getline(lines, line);) {
    std::smatch match;
    if (std::regex_search(line, match, pattern)) words.insert(match[1]);
  }
  return words;
}

inline Words optionsIn(const std::string& help) {
  return wordsIn(help, std::regex("^  (?:-h,)?(--[a-z-]+)"));
}

inline Words commandsIn(const std::string& help) {
  const auto section = help.find("\nSubcommands:\n");
  EXPECT_NE(section, std::string::npos);
  return wordsIn(help.substr(section, help.find("\n\n", section + 1) - section), std::regex("^  ([a-z-]+) "));
}

/// Those that every command takes.
inline Words generalOptions() {
  Words options = optionsIn(helpOf({}));
  options.erase("--version");
  return options;
}

}  // namespace tallyd::tallyctl
