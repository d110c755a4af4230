#include "platform/UTF8.h"

#include <gtest/gtest.h>

#include <vector>

namespace tallyd::platform {
namespace {

TEST(UTF8Test, KeepsWellFormedText) {
  for (const char* text :
       {"", "a", "é", "€", "😀", "\xEF\xBF\xBF", "\xF4\x8F\xBF\xBF", "\xED\x9F\xBF", "\xEE\x80\x80"}) {
    EXPECT_EQ(withBrokenUTF8Replaced(text), text);
  }
}

TEST(UTF8Test, ReplacesEachMaximalPartOfABrokenCharacterOnce) {
  const std::string r(kReplacementCharacter);
  EXPECT_EQ(withBrokenUTF8Replaced("\x80"), r);
  EXPECT_EQ(withBrokenUTF8Replaced("a\xFFz"), "a" + r + "z");
  EXPECT_EQ(withBrokenUTF8Replaced("\xC0\x80"), r + r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xC3"), r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xC3z"), r + "z");
  EXPECT_EQ(withBrokenUTF8Replaced("\xE2\x82"), r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xE2\x82z"), r + "z");
  EXPECT_EQ(withBrokenUTF8Replaced("\xE0\x9F\xBF"), r + r + r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xED\xA0\x80"), r + r + r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xF0\x9F\x98"), r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xF4\x90\x80\x80"), r + r + r + r);
  EXPECT_EQ(withBrokenUTF8Replaced("\xF5\x80"), r + r);
}

TEST(UTF8Test, AppendsEveryScalarValueAsAWellFormedCharacter) {
  for (std::uint32_t code = 0; code <= 0x110000; code += code < 0x1000 ? 1 : 251) {
    std::string text;
    appendUTF8(text, code);
    const UTF8Sequence sequence = firstUTF8Sequence(text);
    EXPECT_TRUE(sequence.wellFormed) << code;
    EXPECT_EQ(sequence.length, text.size()) << code;
  }
  std::string text;
  appendUTF8(text, 0x1F600);
  appendUTF8(text, 0x20AC);
  appendUTF8(text, 0xE9);
  EXPECT_EQ(text, "😀€é");
}

TEST(UTF8Test, AppendsTheReplacementCharacterForSurrogatesAndNumbersTooLarge) {
  std::string text;
  appendUTF8(text, 0xD800);
  appendUTF8(text, 0xDFFF);
  appendUTF8(text, 0x110000);
  EXPECT_EQ(text, "\uFFFD\uFFFD\uFFFD");
}

TEST(UTF8Test, CutsBetweenTwoCharacters) {
  const std::string text = "aé€😀";
  const std::vector<std::string> cuts{"", "a", "a", "aé", "aé", "aé", "aé€", "aé€", "aé€", "aé€", text, text};
  for (std::size_t most = 0; most < cuts.size(); ++most) {
    EXPECT_EQ(wholeUTF8Characters(text, most), cuts[most]) << most;
  }
}

TEST(UTF8Test, TellsWhatIsUTF8) {
  for (const char* text : {"", "plain text that is longer than a word", "é€😀", "words before é and behind"}) {
    EXPECT_TRUE(isUTF8(text)) << text;
  }
  for (const char* text : {"\xFF", "a\xC3", "words before \xED\xA0\x80", "\xED\xB8\x80 and behind them"}) {
    EXPECT_FALSE(isUTF8(text));
  }
}

}  // namespace
}  // namespace tallyd::platform
