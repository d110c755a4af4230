#include "station/BagFolder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "fakes/TemporaryFolder.h"
#include "platform/Base64.h"
#include "platform/property-list/PropertyList.h"
#include "signing/StorebagSigning.h"
#include "station/Files.h"

namespace tallyd::station {

using testing::HasSubstr;

class BagFolderTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { key = signing::makeStorebagKey(); }
  static void TearDownTestSuite() { key.reset(); }

  void writeBag(const std::string& name, const std::string& text) const {
    replaceFile(folder.path() / (name + ".plist"), text, 0644);
  }
  /// The "version" inside an envelope.
  static std::string versionIn(const Answer& answer) {
    const auto envelope = platform::propertyListWithData(answer.body).value;
    if (!envelope || envelope->dictionary() == nullptr) return "no envelope";
    const auto bytes =
        platform::base64DecodedIgnoringUnknown(envelope->dictionary()->string("bag").value_or(""));
    const auto bag = platform::propertyListWithData(bytes.value_or("")).value;
    if (!bag || bag->dictionary() == nullptr) return "no bag";
    return std::string(bag->dictionary()->string("version").value_or("no version"));
  }

  static inline signing::OpenSSLPointer<EVP_PKEY> key;
  fakes::TemporaryFolder folder;
  const BagFolder bags{folder.path(), key.get()};
};

TEST_F(BagFolderTest, ServesXMLAndASCIIBags) {
  writeBag("playhall", "{ version = \"7\"; release = { }; }");
  writeBag("vitrine",
           "<?xml version=\"1.0\"?><plist "
           "version=\"1.0\"><dict><key>version</key><string>8</string></dict></plist>");
  EXPECT_EQ(bags.storebag("playhall").status, 200);
  EXPECT_EQ(versionIn(bags.storebag("playhall")), "7");
  EXPECT_EQ(versionIn(bags.storebag("vitrine")), "8");
}

TEST_F(BagFolderTest, ReadsTheBagAnewAtEachRequest) {
  writeBag("playhall", "{ version = \"1\"; }");
  EXPECT_EQ(versionIn(bags.storebag("playhall")), "1");
  writeBag("playhall", "{ version = \"2\"; }");
  EXPECT_EQ(versionIn(bags.storebag("playhall")), "2");
}

TEST_F(BagFolderTest, KnowsOnlyNamesOfFilesInTheFolder) {
  std::filesystem::create_directory(folder.path() / "below");
  writeBag("below/bag", "{ version = \"1\"; }");
  writeBag(".hidden", "{ version = \"1\"; }");
  for (const std::string& name : {std::string("other"), std::string("below/bag"), std::string("../x"),
                                  std::string(".hidden"), std::string(), std::string("a\0b", 3)}) {
    EXPECT_EQ(bags.storebag(name).status, 404) << name;
  }
}

TEST_F(BagFolderTest, NamesTheFileThatIsNoBag) {
  for (const char* text : {"{ version = ", "( a, b )", "{ release = { }; }", "{ version = ( 1 ); }", ""}) {
    writeBag("broken", text);
    const Answer answer = bags.storebag("broken");
    EXPECT_EQ(answer.status, 500) << text;
    EXPECT_THAT(answer.body, HasSubstr((folder.path() / "broken.plist").string())) << text;
  }
}

TEST_F(BagFolderTest, DoesNotWaitForAPipeInPlaceOfABag) {
  ASSERT_EQ(::mkfifo((folder.path() / "pipe.plist").c_str(), 0600), 0);
  const Answer answer = bags.storebag("pipe");
  EXPECT_EQ(answer.status, 500);
  EXPECT_THAT(answer.body, HasSubstr((folder.path() / "pipe.plist").string() + " is not a regular file"));
}

}  // namespace tallyd::station
