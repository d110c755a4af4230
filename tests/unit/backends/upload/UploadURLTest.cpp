#include "backends/upload/UploadURL.h"

#include <gtest/gtest.h>

namespace tallyd {
namespace {

constexpr const char* kDeviceID = "0123456789abcdef0123456789abcdef01234567";

std::string fileNameIn(std::string_view path) {
  const std::string url = uploadURLForFile("U", kDeviceID, 1, path);
  const auto start = url.find("&filename=") + 10;
  return url.substr(start, url.find("&raw=true") - start);
}

TEST(UploadURLTest, CarriesWhatIsSaidAboutTheFile) {
  EXPECT_EQ(uploadURLForFile("https://upload.example/in", kDeviceID, 42, "/tmp/a b.log"),
            "https://upload.example/in?uuid=0123456789abcdef0123456789abcdef01234567&sequence=42"
            "&description=Parlor%20QPRC%20log%20(Uploaded%20by%20PHS)&filename=a%20b.log.gz&raw=true");
}

TEST(UploadURLTest, WritesTheSessionIDUnsigned) {
  EXPECT_NE(uploadURLForFile("U", kDeviceID, 0xFFFF'FFFF, "/a").find("&sequence=4294967295&"),
            std::string::npos);
}

TEST(UploadURLTest, EscapesEveryByteOfTheFileNameThatIsNotUnreserved) {
  EXPECT_EQ(fileNameIn("/x/a&b#c+d=e?f%g.log"), "a%26b%23c%2Bd%3De%3Ff%25g.log.gz");
  EXPECT_EQ(fileNameIn("/x/\xC3\xA4\xE2\x82\xAC"), "%C3%A4%E2%82%AC.gz");
  EXPECT_EQ(fileNameIn("/x/(null)\n\x7F\xFF"), "%28null%29%0A%7F%FF.gz");
  EXPECT_EQ(fileNameIn("/x/Az09-._~"), "Az09-._~.gz");
}

TEST(UploadURLTest, TakesTheLastComponentOfThePath) {
  EXPECT_EQ(lastPathComponent("/var/log/a.log"), "a.log");
  EXPECT_EQ(lastPathComponent("a.log"), "a.log");
  EXPECT_EQ(lastPathComponent("/var/log//"), "log");
  EXPECT_EQ(lastPathComponent("/"), "/");
  EXPECT_EQ(lastPathComponent("///"), "/");
  EXPECT_EQ(lastPathComponent(""), "");
}

TEST(UploadURLTest, KnowsTheCharactersOfAURL) {
  EXPECT_TRUE(hasURLCharactersOnly("https://user@[::1]:80/a;b,c'(d)*/~e-f._?g=h&i=%20%aF!$+#j"));
  for (const std::string wrong : {"a b", "a\tb", "\xC3\xA4", "a%2", "%", "%g0", "%0g", "a\"b", "<", ">", "\\",
                                  "^", "`", "{", "|", "}", "\x7F"}) {
    EXPECT_FALSE(hasURLCharactersOnly(wrong)) << wrong;
  }
  EXPECT_FALSE(hasURLCharactersOnly(std::string_view("a\0", 2)));
}

}  // namespace
}  // namespace tallyd
