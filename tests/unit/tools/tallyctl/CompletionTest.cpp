// Holds what the shell offers against the real command line.

#include <gtest/gtest.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <regex>
#include <string>

#include "HelpText.h"
#include "InputFile.h"
#include "fakes/TemporaryFolder.h"

namespace tallyd::tallyctl {
namespace {

/// What bash offers in the place of the last word of `line`, whose words have no blanks.
Words offered(const std::string& line) {
  const std::string script = "source '" TALLYD_SOURCE_DIR "/packaging/completions/tallyctl'; COMP_WORDS=(" +
                             line + "); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _tallyctl; " +
                             "printf '%s\\n' \"${COMPREPLY[@]}\"";
  const fakes::TemporaryFolder folder;
  const auto file = folder.path() / "script";
  writeFile(file, script);
  const auto close = [](FILE* pipe) { EXPECT_EQ(::pclose(pipe), 0); };
  const std::unique_ptr<FILE, decltype(close)> pipe(::popen(("bash " + file.string()).c_str(), "re"), close);
  std::string text;
  std::array<char, 4096> buffer;
  while (pipe && std::fgets(buffer.data(), buffer.size(), pipe.get()) != nullptr) text += buffer.data();
  return wordsIn(text, std::regex("^(.+)$"));
}

TEST(CompletionTest, OffersEveryCommandAndGeneralOption) {
  const std::string help = helpOf({});
  EXPECT_GE(commandsIn(help).size(), 8U);
  EXPECT_EQ(offered("tallyctl ''"), commandsIn(help));
  EXPECT_GE(optionsIn(help).size(), 6U);
  EXPECT_EQ(offered("tallyctl --"), optionsIn(help));
}

TEST(CompletionTest, OffersTheOptionsOfEveryCommandAndNoOthers) {
  for (const std::string& command : commandsIn(helpOf({}))) {
    Words expected = optionsIn(helpOf({command.c_str()}));
    EXPECT_TRUE(expected.contains("--help")) << command;
    expected.merge(generalOptions());
    EXPECT_EQ(offered("tallyctl " + command + " --"), expected) << command;
  }
}

TEST(CompletionTest, FindsTheCommandBehindGeneralOptions) {
  EXPECT_EQ(offered("tallyctl --root /r --json --timeout 5 rep"), Words{"report"});
  EXPECT_EQ(offered("tallyctl --root = /r state"), Words{"states"});
  EXPECT_EQ(offered("tallyctl --socket s --json report --strict --mess"), Words{"--messages"});
}

TEST(CompletionTest, OffersValuesWhereThereAreAny) {
  const fakes::TemporaryFolder folder;
  writeFile(folder.path() / "sub/file", "");
  writeFile(folder.path() / "seven", "");
  const std::string start = folder.path().string() + "/s";
  const Words both{start + "ub", start + "even"};
  EXPECT_EQ(offered("tallyctl --root " + start), Words{start + "ub"});
  EXPECT_EQ(offered("tallyctl --root = " + start), Words{start + "ub"});
  EXPECT_EQ(offered("tallyctl report --messages " + start), both);
  EXPECT_EQ(offered("tallyctl upload " + start), both);
  EXPECT_EQ(offered("tallyctl upload-log a.plist " + start), both);
  EXPECT_EQ(offered("tallyctl states --client-type 1"), (Words{"10", "11"}));
  EXPECT_EQ(offered("tallyctl report --category ''"), Words());
}

std::string completionFile(const std::string& name) {
  std::ifstream file(TALLYD_SOURCE_DIR "/packaging/completions/" + name);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// The general options and those of all commands.
Words allOptions() {
  Words options = optionsIn(helpOf({}));
  for (const std::string& command : commandsIn(helpOf({})))
    options.merge(optionsIn(helpOf({command.c_str()})));
  return options;
}

TEST(CompletionTest, NamesEveryCommandAndOptionForFish) {
  const std::string text = completionFile("tallyctl.fish");
  for (const std::string& command : commandsIn(helpOf({}))) {
    EXPECT_NE(text.find(" -a " + command + " -d "), std::string::npos) << command;
  }
  for (const std::string& option : allOptions()) {
    EXPECT_NE(text.find(" -l " + option.substr(2) + " "), std::string::npos) << option;
  }
}

TEST(CompletionTest, NamesEveryCommandAndOptionForZsh) {
  const std::string text = completionFile("_tallyctl");
  for (const std::string& command : commandsIn(helpOf({}))) {
    EXPECT_TRUE(std::regex_search(text, std::regex("['\"]" + command + ":"))) << command;
  }
  for (const std::string& option : allOptions()) {
    EXPECT_TRUE(std::regex_search(text, std::regex(option + "[\\[}]"))) << option;
  }
}

}  // namespace
}  // namespace tallyd::tallyctl
