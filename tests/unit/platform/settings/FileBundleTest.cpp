#include "platform/settings/FileBundle.h"

#include "SettingsFolder.h"

namespace tallyd::platform {
namespace {

class FileBundleTest : public SettingsFolder {
 protected:
  FileBundle _bundle{path("My.bundle"), _log};
};

TEST_F(FileBundleTest, ReadsTheInformationDictionaryAfresh) {
  EXPECT_EQ(_bundle.infoValue("Version"), std::nullopt);
  writeList("My.bundle/Info.plist", Dictionary{{"Version", "1.0"}});
  EXPECT_EQ(_bundle.infoValue("Version"), Value("1.0"));
  EXPECT_EQ(_bundle.infoValue("Name"), std::nullopt);
  writeList("My.bundle/Info.plist", Dictionary{{"Version", "1.0.1"}});
  EXPECT_EQ(_bundle.infoValue("Version"), Value("1.0.1"));
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FileBundleTest, LogsABrokenInformationDictionaryOnce) {
  write("My.bundle/Info.plist", "{");
  EXPECT_EQ(_bundle.infoValue("Version"), std::nullopt);
  EXPECT_EQ(_bundle.infoValue("Version"), std::nullopt);
  EXPECT_EQ(_log.lines().size(), 1U);
}

TEST_F(FileBundleTest, ReadsResources) {
  const std::string bytes("\x30\x00\xFF", 3);
  write("My.bundle/Resources/publicKey.der", bytes);
  write("My.bundle/Resources/plain", "text");
  EXPECT_EQ(_bundle.resource("publicKey", "der"), Data(bytes));
  EXPECT_EQ(_bundle.resource("plain", ""), Data("text"));
  EXPECT_EQ(_bundle.resource("missing", "der"), std::nullopt);
  EXPECT_TRUE(_log.lines().empty());
}

TEST_F(FileBundleTest, ResourcesLieInTheirFolderOnly) {
  write("My.bundle/secret.txt", "secret");
  write("My.bundle/Resources/inner/file.txt", "inner");
  EXPECT_EQ(_bundle.resource("../secret", "txt"), std::nullopt);
  EXPECT_EQ(_bundle.resource("inner/file", "txt"), std::nullopt);
  EXPECT_EQ(_bundle.resource("secret", "/../../secret.txt"), std::nullopt);
  EXPECT_EQ(_bundle.resource("", "txt"), std::nullopt);
}

TEST_F(FileBundleTest, LogsAResourceThatCannotBeRead) {
  std::filesystem::create_directories(path("My.bundle/Resources/folder.der"));
  EXPECT_EQ(_bundle.resource("folder", "der"), std::nullopt);
  EXPECT_TRUE(_log.has(LogLevel::Error, "Cannot read " + path("My.bundle/Resources/folder.der").native() +
                                            ": not a regular file"));
}

}  // namespace
}  // namespace tallyd::platform
