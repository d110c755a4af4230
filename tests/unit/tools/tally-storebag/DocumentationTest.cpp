// Holds the man page and the page on storebags against the tool's own words.

#include <regex>
#include <set>

#include "StorebagToolFixture.h"
#include "tally-storebag/KnownKeys.h"

namespace tallyd::storebagtool {
namespace {

using testing::HasSubstr;

std::string page(const std::string& path) {
  return fileText(std::filesystem::path(TALLYD_SOURCE_DIR) / path);
}

/// All matches of the pattern's first group.
std::set<std::string> found(const std::string& text, const char* pattern) {
  const std::regex expression(pattern);
  std::set<std::string> words;
  for (std::sregex_iterator match(text.begin(), text.end(), expression), end; match != end; ++match)
    words.insert((*match)[1]);
  return words;
}

/// The keys in the first column of the tables whose head begins "| key | type |".
std::set<std::string> documentedKeys() {
  std::istringstream lines(page("docs/storebag.md"));
  std::set<std::string> keys;
  bool inTable = false;
  for (std::string line; std::getline(lines, line);) {
    inTable = line.starts_with("| key | type |") || (inTable && line.starts_with("|"));
    if (inTable) keys.merge(found(line.substr(0, line.find('|', 1)), "`([^`]+)`"));
  }
  return keys;
}

class DocumentationTest : public StorebagToolTest {};

TEST_F(DocumentationTest, ListsTheKeysThatTheToolKnows) {
  std::set<std::string> known{"bag", "signature"};  // The envelope's.
  for (const KnownKey& key : knownKeys()) {
    if (key.place != Place::Section) known.emplace(key.key);
  }
  EXPECT_EQ(documentedKeys(), known);
  for (const std::string_view backend : keysOf(Place::Section))
    EXPECT_THAT(page("docs/storebag.md"), HasSubstr("`" + std::string(backend) + "`"));
}

TEST_F(DocumentationTest, DescribesEveryCommandAndItsOptions) {
  const std::string manual = page("packaging/man/tally-storebag.1");
  EXPECT_EQ(run({"--help"}), 0);
  const auto commands = found(_out.substr(_out.find("Subcommands:")), "\n  ([a-z]+)  ");
  EXPECT_EQ(commands.size(), 9U);
  for (const std::string& command : commands) {
    EXPECT_THAT(manual, HasSubstr("\n.Ss " + command + "\n"));
    EXPECT_EQ(run({command, "--help"}), 0);
    for (const std::string& option : found(_out.substr(_out.find("Options:")), "\n  (?:-[a-z],)?-(-[-a-z]+)"))
      EXPECT_TRUE(std::regex_search(manual, std::regex("Fl " + option + "\\b"))) << command << " -" << option;
  }
}

}  // namespace
}  // namespace tallyd::storebagtool
