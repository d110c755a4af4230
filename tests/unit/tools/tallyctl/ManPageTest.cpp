// Holds the man page against the real command line.

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>

#include "HelpText.h"

namespace tallyd::tallyctl {
namespace {

/// The page's source, with its marks of fonts and of hyphens resolved.
std::string manPage() {
  std::ifstream file(TALLYD_SOURCE_DIR "/packaging/man/tallyctl.1");
  const std::string text{std::istreambuf_iterator<char>(file), {}};
  return std::regex_replace(std::regex_replace(text, std::regex(R"(\\-)"), "-"), std::regex(R"(\\f[A-Z])"),
                            "");
}

bool hasOption(const std::string& page, const std::string& option) {
  return std::regex_search(page, std::regex("(^|[^-a-z])" + option + "([^-a-z]|$)"));
}

TEST(ManPageTest, DescribesEveryCommandInASectionOfItsOwn) {
  const std::string page = manPage();
  for (const std::string& command : commandsIn(helpOf({}))) {
    EXPECT_NE(page.find("\n.SS " + command + "\n"), std::string::npos) << command;
  }
}

TEST(ManPageTest, NamesEveryOption) {
  const std::string page = manPage();
  Words options = optionsIn(helpOf({}));
  for (const std::string& command : commandsIn(helpOf({})))
    options.merge(optionsIn(helpOf({command.c_str()})));
  EXPECT_GE(options.size(), 20U);
  for (const std::string& option : options) EXPECT_TRUE(hasOption(page, option)) << option;
}

TEST(ManPageTest, ListsEveryExitStatus) {
  const std::string page = manPage();
  const auto section = page.find("\n.SH EXIT STATUS\n");
  ASSERT_NE(section, std::string::npos);
  for (const int status : {kSucceeded, kFailed, kWrongUsage, kClosedPipe}) {
    EXPECT_NE(page.find("\n.B " + std::to_string(status) + "\n", section), std::string::npos) << status;
  }
}

}  // namespace
}  // namespace tallyd::tallyctl
