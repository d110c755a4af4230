#include "platform/Base64.h"

#include <gtest/gtest.h>

namespace tallyd::platform {
namespace {

TEST(Base64Test, EncodesTheVectorsOfRFC4648) {
  EXPECT_EQ(base64Encoded(""), "");
  EXPECT_EQ(base64Encoded("f"), "Zg==");
  EXPECT_EQ(base64Encoded("fo"), "Zm8=");
  EXPECT_EQ(base64Encoded("foo"), "Zm9v");
  EXPECT_EQ(base64Encoded("foob"), "Zm9vYg==");
  EXPECT_EQ(base64Encoded("fooba"), "Zm9vYmE=");
  EXPECT_EQ(base64Encoded("foobar"), "Zm9vYmFy");
  EXPECT_EQ(base64Encoded("\xFB\xFF\xBF"), "+/+/");
}

TEST(Base64Test, EncodesMoreThanOneBlockWithoutPaddingInside) {
  const std::string bytes((3 << 20) + 1, 'x');
  const std::string text = base64Encoded(bytes);
  EXPECT_EQ(text.size(), (bytes.size() + 2) / 3 * 4);
  EXPECT_EQ(text.find('='), text.size() - 2);
  EXPECT_EQ(text.find('\0'), std::string::npos);
  EXPECT_EQ(base64DecodedIgnoringUnknown(text), bytes);
}

TEST(Base64Test, DecodesWhatItEncodes) {
  std::string bytes;
  for (int i = 0; i < 300; ++i) {
    bytes += static_cast<char>(i * 7);
    EXPECT_EQ(base64DecodedIgnoringUnknown(base64Encoded(bytes)), bytes);
  }
}

TEST(Base64Test, PassesOverCharactersOutsideTheAlphabet) {
  EXPECT_EQ(base64DecodedIgnoringUnknown(" Z\nm-9_v\tY=\xFF=!"), std::nullopt);
  EXPECT_EQ(base64DecodedIgnoringUnknown(" Z\nm-9_v\tYg\xFF=!= "), "foob");
  EXPECT_EQ(base64DecodedIgnoringUnknown("-_\n"), "");
  EXPECT_EQ(base64DecodedIgnoringUnknown(std::string_view("Zm\0"
                                                          "9v",
                                                          5)),
            "foo");
}

TEST(Base64Test, RefusesWhatIsNoWholeGroups) {
  for (const char* text : {"Z", "Zg", "Zg=", "Zm9", "Zm9vY", "=", "==", "====", "Z===", "Zg==Z"}) {
    EXPECT_EQ(base64DecodedIgnoringUnknown(text), std::nullopt) << text;
  }
}

TEST(Base64Test, RefusesAnythingBehindThePadding) {
  for (const char* text : {"Zg==Zg==", "Zg=a", "Zm8=Zm9v", "Zg======"}) {
    EXPECT_EQ(base64DecodedIgnoringUnknown(text), std::nullopt) << text;
  }
}

}  // namespace
}  // namespace tallyd::platform
