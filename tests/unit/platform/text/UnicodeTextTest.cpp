#include "platform/text/UnicodeText.h"

#include <gtest/gtest.h>

#include <clocale>

#include "platform/UTF8.h"

namespace tallyd::platform {
namespace {

TEST(UnicodeTextTest, LowerCasesASCIIByteByByte) {
  EXPECT_EQ(lowercased("Tally-09 [AZaz] @`{"), "tally-09 [azaz] @`{");
  EXPECT_EQ(lowercased(""), "");
}

TEST(UnicodeTextTest, LowerCasesOtherScripts) {
  EXPECT_EQ(lowercased("ÄÖÜ ЖУК"), "äöü жук");
  EXPECT_EQ(lowercased("ΟΔΟΣ"), "οδος") << "a sigma that ends a word has a form of its own";
}

TEST(UnicodeTextTest, LowerCasingDoesNotDependOnTheLocale) {
  const std::string before = std::setlocale(LC_ALL, nullptr);
  std::setlocale(LC_ALL, "tr_TR.UTF-8");
  EXPECT_EQ(lowercased("TITLE"), "title");
  EXPECT_EQ(lowercased("TITLE Ä"), "title ä");
  EXPECT_EQ(lowercased("\u0130"), "i\u0307");
  std::setlocale(LC_ALL, before.c_str());
}

TEST(UnicodeTextTest, KeepsZeroBytes) {
  using namespace std::string_literals;
  EXPECT_EQ(lowercased("A\0B"s), "a\0b"s);
  EXPECT_EQ(lowercased("Ä\0B"s), "ä\0b"s);
  EXPECT_FALSE(equalIgnoringCase("a\0b"s, "a\0c"s));
}

TEST(UnicodeTextTest, ComparesAfterCaseFolding) {
  EXPECT_TRUE(equalIgnoringCase("Content-Type", "content-TYPE"));
  EXPECT_TRUE(equalIgnoringCase("Straße", "STRASSE"));
  EXPECT_TRUE(equalIgnoringCase("\u212A", "k")) << "the Kelvin sign folds to an ASCII letter";
  EXPECT_TRUE(equalIgnoringCase("Σ", "ς"));
  EXPECT_TRUE(equalIgnoringCase("", ""));
  EXPECT_FALSE(equalIgnoringCase("a", "ab"));
  EXPECT_FALSE(equalIgnoringCase("[", "{")) << "only letters have case, though these differ by the same bit";
  EXPECT_FALSE(equalIgnoringCase("ä", "a"));
}

TEST(UnicodeTextTest, TextsThatDifferOnlyInCaseFoldToTheSameText) {
  EXPECT_EQ(caseFolded("Content-TYPE"), "content-type");
  EXPECT_EQ(caseFolded("Straße"), caseFolded("STRASSE"));
  EXPECT_EQ(caseFolded("\u212A"), caseFolded("K")) << "also where one is ASCII and the other is not";
  EXPECT_NE(caseFolded("ä"), caseFolded("a"));
}

TEST(UnicodeTextTest, FindsTextWithoutRegardToCase) {
  EXPECT_TRUE(containsIgnoringCase("Mozilla/5.0", "ZILLA"));
  EXPECT_TRUE(containsIgnoringCase("de", "DE"));
  EXPECT_TRUE(containsIgnoringCase("Große Straße", "STRASS"));
  EXPECT_TRUE(containsIgnoringCase("273 \u212A", "k"));
  EXPECT_FALSE(containsIgnoringCase("D", "DE"));
  EXPECT_FALSE(containsIgnoringCase("ä", "b"));
}

TEST(UnicodeTextTest, AnEmptyNeedleOccursNowhere) {
  EXPECT_FALSE(containsIgnoringCase("text", ""));
  EXPECT_FALSE(containsIgnoringCase("", ""));
  EXPECT_FALSE(containsIgnoringCase("ä", ""));
}

TEST(UnicodeTextTest, CountsUTF16Units) {
  EXPECT_EQ(utf16Length(""), 0U);
  EXPECT_EQ(utf16Length("plain ASCII, longer than a word"), 31U);
  EXPECT_EQ(utf16Length("ä"), 1U);
  EXPECT_EQ(utf16Length("漢字"), 2U);
  EXPECT_EQ(utf16Length("\U0001F600"), 2U);
  EXPECT_EQ(utf16Length("a\xFFz"), 3U);
}

TEST(UnicodeTextTest, CountsWhatIsIllFormedAsTheReplacementCharacter) {
  EXPECT_EQ(lowercased("A\xFF"), "a\uFFFD");
  EXPECT_TRUE(equalIgnoringCase("A\xFF", "a\uFFFD"));
}

TEST(UnicodeTextTest, CountsWhatItReplacesAsItReplacesIt) {
  for (const std::string_view text : {"\xE6\xBC", "\xF0\x9F\x98", "\xED\xA0\x80", "\xC3\xC3\xA4", "a\x80z"}) {
    EXPECT_EQ(utf16Length(text), utf16Length(withBrokenUTF8Replaced(text))) << testing::PrintToString(text);
  }
}

}  // namespace
}  // namespace tallyd::platform
