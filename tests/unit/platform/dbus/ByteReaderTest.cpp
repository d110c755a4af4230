#include "platform/dbus/ByteReader.h"

#include <gtest/gtest.h>

#include "platform/dbus/ByteWriter.h"

namespace tallyd::platform::dbus {
namespace {

using namespace std::string_view_literals;

std::string textBytes(std::string_view text) {
  std::string bytes;
  ByteWriter(bytes).text(text);
  return bytes;
}

bool reads(std::string_view text) {
  const std::string bytes = textBytes(text);
  try {
    return ByteReader(bytes, std::endian::native).text() == text;
  } catch (const Malformed&) {
    return false;
  }
}

TEST(ByteReaderTest, ReadsNumbersOfBothByteOrders) {
  ByteReader little("\1\0\2\0\3\0\0\0"sv, std::endian::little);
  EXPECT_EQ(little.number<std::uint8_t>(), 1);
  EXPECT_EQ(little.number<std::uint16_t>(), 2);
  EXPECT_EQ(little.number<std::uint32_t>(), 3U);
  EXPECT_TRUE(little.isAtEnd());
  ByteReader big("\1\0\0\2\0\0\0\3"sv, std::endian::big);
  EXPECT_EQ(big.number<std::uint8_t>(), 1);
  EXPECT_EQ(big.number<std::uint16_t>(), 2);
  EXPECT_EQ(big.number<std::uint32_t>(), 3U);
}

TEST(ByteReaderTest, RefusesPaddingThatIsNotZero) {
  ByteReader bytes("\1\1\0\0\0\0\0\0"sv, std::endian::little);
  (void)bytes.number<std::uint8_t>();
  EXPECT_THROW((void)bytes.number<std::uint32_t>(), Malformed);
}

TEST(ByteReaderTest, NeverReadsBeyondTheEnd) {
  const std::string whole = textBytes("some text");
  for (std::size_t size = 0; size < whole.size(); ++size) {
    ByteReader bytes(std::string_view(whole).substr(0, size), std::endian::native);
    EXPECT_THROW((void)bytes.text(), Malformed) << size;
  }
  ByteReader wrapping("\xFF\xFF\xFF\xFF\0"sv, std::endian::little);
  EXPECT_THROW((void)wrapping.text(), Malformed);
}

TEST(ByteReaderTest, ATextMustEndWithANUL) {
  std::string bytes = textBytes("text");
  bytes.back() = 'x';
  EXPECT_THROW((void)ByteReader(bytes, std::endian::native).text(), Malformed);
}

TEST(ByteReaderTest, TakesUTF8WhereverItStands) {
  for (const char* text : {"", "short", "long enough for more than one word", "eight by", "ä",
                           "sevenäbytes 漢字 and \U0001F600"})
    EXPECT_TRUE(reads(text)) << text;
}

TEST(ByteReaderTest, RefusesBrokenUTF8AndNULsWhereverTheyStand) {
  const std::string padding = "0123456789abcdef0123456789abcdef";
  for (std::size_t place = 0; place < padding.size(); ++place) {
    for (const char bad : {'\0', '\x80', '\xFF'}) {
      std::string text = padding;
      text[place] = bad;
      EXPECT_FALSE(reads(text)) << place;
    }
  }
  EXPECT_FALSE(reads("cut \xE6\xBC"));
}

}  // namespace
}  // namespace tallyd::platform::dbus
