#include "platform/ipc/StreamPosition.h"

#include <gtest/gtest.h>

#include "RawClient.h"

namespace tallyd::platform {
namespace {

using Verdict = StreamPosition::Verdict;

std::string_view startOf(const std::string& message) {
  return std::string_view(message).substr(0, StreamPosition::kHeaderSize);
}

TEST(StreamPositionTest, ReadsSizeAndSerialFromAHeaderOfEitherByteOrder) {
  const auto message = rawCall(7, "Nothing");
  const auto little = StreamPosition::header(message);
  ASSERT_TRUE(little);
  EXPECT_EQ(little->size, message.size());
  EXPECT_EQ(little->serial, 7U);

  const std::string big("B\1\0\1\0\0\0\5\0\0\1\2\0\0\0\11", 16);
  const auto header = StreamPosition::header(big);
  ASSERT_TRUE(header);
  EXPECT_EQ(header->size, 16U + 16 + 5);
  EXPECT_EQ(header->serial, 0x102U);
}

TEST(StreamPositionTest, HasNoHeaderOfAnUnknownByteOrderOrAShortStart) {
  EXPECT_FALSE(StreamPosition::header("x123456789012345"));
  EXPECT_FALSE(StreamPosition::header("l12345678901234"));
}

TEST(StreamPositionTest, StandsBetweenMessagesAfterEachDelivery) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  EXPECT_FALSE(position.withinMessage());
  position.willRead(message, message.size());
  EXPECT_TRUE(position.nextIsKnown());
  EXPECT_EQ(position.delivered(1), Verdict::Fine);
  EXPECT_FALSE(position.withinMessage());
  EXPECT_FALSE(position.nextIsKnown());
}

TEST(StreamPositionTest, KnowsEveryWholeMessageThatItHasSeen) {
  StreamPosition position;
  const auto bytes = rawCall(5, "Nothing") + rawCall(6, "Echo") + rawCall(7, "Nothing").substr(0, 30);
  position.willRead(bytes, bytes.size());
  EXPECT_EQ(position.delivered(5), Verdict::Fine);
  EXPECT_TRUE(position.nextIsKnown());
  EXPECT_EQ(position.delivered(6), Verdict::Fine);
  EXPECT_FALSE(position.nextIsKnown());
  EXPECT_FALSE(position.withinMessage());
  position.willRead(rawCall(7, "Nothing").substr(0, 30), 30);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
}

TEST(StreamPositionTest, StandsWithinAMessageThatCameInPart) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  position.willRead(startOf(message), message.size() - 1);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
  position.willRead(message.substr(message.size() - 1), 1);
  EXPECT_EQ(position.delivered(1), Verdict::Fine);
  EXPECT_FALSE(position.withinMessage());
}

TEST(StreamPositionTest, StandsWithinAMessageWhoseHeaderCameInPart) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  position.willRead(message.substr(0, 3), 3);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
  position.willRead(message.substr(3, 16), 200);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
  EXPECT_EQ(position.delivered(1), Verdict::Fine);
  EXPECT_FALSE(position.withinMessage());
}

TEST(StreamPositionTest, StandsWithinAMessageThatCameUnseen) {
  StreamPosition position;
  position.willRead({}, 0);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
  const auto rest = rawCall(1, "Nothing").substr(20);
  position.willRead(startOf(rest), rest.size());
  EXPECT_EQ(position.delivered(1), Verdict::Fine);
  EXPECT_FALSE(position.withinMessage());
}

TEST(StreamPositionTest, AWholeMessageThatIsNotDeliveredIsMalformed) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  position.willRead(startOf(message), message.size());
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Malformed);
}

TEST(StreamPositionTest, AMessageInPartsThatIsNotDeliveredIsMalformed) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  position.willRead(startOf(message), 20);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  position.willRead(message.substr(20, 16), message.size() - 20);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Malformed);
}

TEST(StreamPositionTest, ADeliveryThatPassedOverAMessageIsMalformed) {
  StreamPosition position;
  const auto first = rawCall(1, "Nothing");
  position.willRead(first + rawCall(2, "Nothing"), 2 * first.size());
  EXPECT_EQ(position.delivered(2), Verdict::Malformed);
}

TEST(StreamPositionTest, TellsWhetherAMessageWaitsWhole) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  EXPECT_TRUE(position.holdsWhole(message + "more"));
  EXPECT_FALSE(position.holdsWhole(message.substr(1)));
  EXPECT_FALSE(position.holdsWhole(startOf(message)));
  EXPECT_FALSE(position.holdsWhole({}));
  position.willRead(startOf(message), 80);
  EXPECT_EQ(position.readWithoutDelivery(), Verdict::Fine);
  EXPECT_TRUE(position.holdsWhole(message.substr(80)));
  EXPECT_FALSE(position.holdsWhole(message.substr(81)));
}

TEST(StreamPositionTest, CountsMessagesThatWereReadWithTheEndOfTheAuthentication) {
  StreamPosition position;
  const auto message = rawCall(1, "Nothing");
  position.authenticated(message + rawCall(2, "Nothing") + message.substr(0, 5));
  EXPECT_EQ(position.readAhead(), 2U);
  EXPECT_FALSE(position.withinMessage());
  EXPECT_EQ(position.delivered(1), Verdict::Fine);
  EXPECT_FALSE(position.withinMessage());
  EXPECT_EQ(position.delivered(2), Verdict::Fine);
  EXPECT_TRUE(position.withinMessage());
}

TEST(StreamPositionTest, MayStandWithinAMessageAtOnceAfterTheAuthentication) {
  StreamPosition position;
  position.authenticated("l");
  EXPECT_TRUE(position.withinMessage());
  EXPECT_EQ(position.readAhead(), 0U);
  StreamPosition other;
  other.authenticated({});
  EXPECT_FALSE(other.withinMessage());
}

}  // namespace
}  // namespace tallyd::platform
