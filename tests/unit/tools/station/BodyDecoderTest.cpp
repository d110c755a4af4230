#include "station/BodyDecoder.h"

#include <gtest/gtest.h>

#include "unit/tools/station/Gzipped.h"

namespace tallyd::station {

using Encoding = BodyDecoder::Encoding;

namespace {

constexpr std::uint64_t kLimit = 100'000;

/// The status of the error that a body meets; 0 without one.
int errorOf(Encoding encoding, std::uint64_t limit, std::string_view bytes) {
  try {
    (void)decodedBody(encoding, limit, bytes);
    return 0;
  } catch (const BodyError& error) {
    return error.status();
  }
}

}  // namespace

TEST(BodyDecoderTest, DecodesWhateverTheParts) {
  const std::string text = std::string(50'000, 'x') + "end";
  const std::string bytes = gzipped(text);
  for (const std::size_t part : {std::size_t{1}, std::size_t{7}, bytes.size()}) {
    std::string decoded;
    BodyDecoder decoder(Encoding::Gzip, kLimit, [&](std::string_view more) { decoded += more; });
    for (std::size_t i = 0; i < bytes.size(); i += part) decoder.put(std::string_view(bytes).substr(i, part));
    decoder.finish();
    EXPECT_EQ(decoded, text);
  }
  EXPECT_EQ(decodedBody(Encoding::Identity, kLimit, text), text);
}

TEST(BodyDecoderTest, TakesMembersOneAfterTheOther) {
  EXPECT_EQ(decodedBody(Encoding::Gzip, kLimit, gzipped("one") + gzipped("two")), "onetwo");
  // The output just fills the decoder's buffer when the member ends.
  for (const std::size_t size : {16'384U, 2 * 16'384U}) {
    EXPECT_EQ(decodedBody(Encoding::Gzip, kLimit, gzipped(std::string(size, 'x'))).size(), size);
  }
}

TEST(BodyDecoderTest, RefusesABodyThatIsCutAnywhere) {
  const std::string whole = gzipped("some text that is worth its bytes");
  for (std::size_t length = 0; length < whole.size(); ++length) {
    EXPECT_EQ(errorOf(Encoding::Gzip, kLimit, whole.substr(0, length)), 400) << length;
  }
  EXPECT_EQ(errorOf(Encoding::Gzip, kLimit, whole), 0);
}

TEST(BodyDecoderTest, RefusesABodyThatIsBroken) {
  std::string broken = gzipped("text");
  broken[broken.size() - 6] = static_cast<char>(~broken[broken.size() - 6]);  // In the check sum.
  EXPECT_EQ(errorOf(Encoding::Gzip, kLimit, broken), 400);
  EXPECT_EQ(errorOf(Encoding::Gzip, kLimit, "no gzip at all"), 400);
  EXPECT_EQ(errorOf(Encoding::Gzip, kLimit, gzipped("text") + "more"), 400);
}

TEST(BodyDecoderTest, BoundsWhatComesOut) {
  const std::string text(5000, 'x');
  EXPECT_EQ(errorOf(Encoding::Gzip, 5000, gzipped(text)), 0);
  EXPECT_EQ(errorOf(Encoding::Gzip, 4999, gzipped(text)), 413);
  EXPECT_EQ(errorOf(Encoding::Identity, 5000, text), 0);
  EXPECT_EQ(errorOf(Encoding::Identity, 4999, text), 413);
}

TEST(BodyDecoderTest, KnowsTheNamesOfEncodings) {
  EXPECT_EQ(BodyDecoder::encodingNamed(""), Encoding::Identity);
  EXPECT_EQ(BodyDecoder::encodingNamed("identity"), Encoding::Identity);
  EXPECT_EQ(BodyDecoder::encodingNamed("GZip"), Encoding::Gzip);
  EXPECT_EQ(BodyDecoder::encodingNamed("x-gzip"), Encoding::Gzip);
  EXPECT_EQ(BodyDecoder::encodingNamed("br"), std::nullopt);
}

}  // namespace tallyd::station
