// Holds the code against the table of allowed includes in docs/architecture.md.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <optional>
#include <regex>
#include <set>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

const fs::path kSource = TALLYD_SOURCE_DIR;

using IncludeTable = std::map<std::string, std::set<std::string>>;

std::string trimmed(const std::string& text) {
  const auto first = text.find_first_not_of(' ');
  return first == std::string::npos ? "" : text.substr(first, text.find_last_not_of(' ') - first + 1);
}

std::set<std::string> splitAtCommas(const std::string& text) {
  std::set<std::string> parts;
  std::istringstream stream(text);
  for (std::string part; std::getline(stream, part, ',');) {
    if (!trimmed(part).empty()) parts.insert(trimmed(part));
  }
  return parts;
}

IncludeTable readTable() {
  std::ifstream page(kSource / "docs/architecture.md");
  const std::regex row(R"(\| ((?:src|tools)/[^ |]+) \|([^|]*)\|)");
  IncludeTable table;
  bool inSection = false;
  for (std::string line; std::getline(page, line);) {
    if (line.starts_with("## ")) inSection = line == "## Allowed includes";
    std::smatch match;
    if (inSection && std::regex_match(line, match, row)) table[match[1]] = splitAtCommas(match[2]);
  }
  return table;
}

/// The deepest folder of the table that `path`, relative to the source, lies in.
std::optional<std::string> folderOf(const IncludeTable& table, const fs::path& path) {
  for (fs::path folder = path.parent_path(); !folder.empty(); folder = folder.parent_path()) {
    if (table.contains(folder.string())) return folder.string();
  }
  return std::nullopt;
}

bool isCode(const fs::path& path) { return path.extension() == ".h" || path.extension() == ".cpp"; }

/// What a quoted include names, relative to the source; nothing for a file that is not there.
std::optional<fs::path> resolved(const fs::path& includer, const std::string& include) {
  for (const fs::path& base : {fs::path("src"), fs::path("tools"), includer.parent_path()}) {
    if (fs::exists(kSource / base / include)) return (base / include).lexically_normal();
  }
  return std::nullopt;
}

std::vector<std::string> includesOf(const fs::path& file) {
  const std::regex pattern(R"re(\s*#\s*include\s*"([^"]+)".*)re");
  std::vector<std::string> includes;
  std::ifstream stream(kSource / file);
  for (std::string line; std::getline(stream, line);) {
    std::smatch match;
    if (std::regex_match(line, match, pattern)) includes.push_back(match[1]);
  }
  return includes;
}

std::vector<fs::path> codeBelow(const std::string& folder) {
  std::vector<fs::path> files;
  for (const auto& entry : fs::recursive_directory_iterator(kSource / folder)) {
    if (isCode(entry.path())) files.push_back(fs::relative(entry.path(), kSource));
  }
  return files;
}

TEST(IncludeTableTest, NamesFoldersThatExist) {
  const IncludeTable table = readTable();
  ASSERT_GE(table.size(), 8U);
  for (const auto& [folder, allowed] : table) {
    EXPECT_TRUE(fs::is_directory(kSource / folder)) << folder;
    for (const auto& other : allowed)
      EXPECT_TRUE(table.contains(other)) << other << " in the row of " << folder;
  }
}

TEST(IncludeTableTest, AllowsEveryIncludeOfTheProject) {
  const IncludeTable table = readTable();
  std::size_t checked = 0;
  for (const std::string root : {"src", "tools"}) {
    for (const fs::path& file : codeBelow(root)) {
      const auto folder = folderOf(table, file);
      EXPECT_TRUE(folder) << file << " lies in no folder of the table";
      for (const std::string& include : includesOf(file)) {
        const auto target = resolved(file, include);
        ASSERT_TRUE(target) << file << " includes \"" << include << "\", which is not there";
        const auto targetFolder = folderOf(table, *target);
        ASSERT_TRUE(folder && targetFolder) << file << " includes " << *target;
        EXPECT_TRUE(*folder == *targetFolder || table.at(*folder).contains(*targetFolder))
            << file << " may not include " << include;
        ++checked;
      }
    }
  }
  EXPECT_GT(checked, 100U);
}

}  // namespace
