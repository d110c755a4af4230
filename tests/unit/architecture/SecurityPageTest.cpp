// Holds docs/security.md against the tests that it names.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <regex>
#include <set>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

const fs::path kSource = TALLYD_SOURCE_DIR;

std::string contentsOf(const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// The first group of each match, with the second one behind a dot where there is one.
std::vector<std::string> matches(const std::string& text, const std::regex& pattern) {
  std::vector<std::string> found;
  for (std::sregex_iterator match(text.begin(), text.end(), pattern), end; match != end; ++match) {
    found.push_back((*match)[1].str() + (match->size() > 2 ? "." + (*match)[2].str() : ""));
  }
  return found;
}

std::vector<std::string> testsNamedIn(const std::string& text) {
  static const std::regex pattern(R"(`(\w+Test\.\w+)`)");
  return matches(text, pattern);
}

std::set<std::string> testsThatExist() {
  const std::regex pattern(R"(\bTEST(?:_F|_P)?\(\s*(\w+),\s*(\w+)\s*\))");
  std::set<std::string> tests;
  for (const auto& entry : fs::recursive_directory_iterator(kSource / "tests")) {
    if (entry.path().extension() != ".cpp") continue;
    for (auto& name : matches(contentsOf(entry.path()), pattern)) tests.insert(std::move(name));
  }
  return tests;
}

std::string securityPage() { return contentsOf(kSource / "docs/security.md"); }

TEST(SecurityPageTest, NamesTestsThatExist) {
  const auto existing = testsThatExist();
  const auto named = testsNamedIn(securityPage());
  EXPECT_GT(named.size(), 50U);
  for (const auto& name : named) EXPECT_TRUE(existing.contains(name)) << name;
}

TEST(SecurityPageTest, NamesATestForEachLimit) {
  const std::string page = securityPage();
  const auto start = page.find("## Limits");
  ASSERT_NE(start, std::string::npos);
  const std::string section = page.substr(start, page.find("\n## ", start) - start);
  const auto rows = matches(section, std::regex(R"(\n(\| [^\n]+))"));
  EXPECT_GT(rows.size(), 10U);
  for (std::size_t row = 1; row < rows.size(); ++row)
    EXPECT_FALSE(testsNamedIn(rows[row]).empty()) << rows[row];
}

TEST(SecurityPageTest, NamesFilesThatExist) {
  for (const auto& name : matches(securityPage(), std::regex(R"(`((?:tests|packaging|src)/[^`]+)`)"))) {
    EXPECT_TRUE(fs::exists(kSource / name)) << name;
  }
}

}  // namespace
