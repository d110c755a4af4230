#include "station/EventNumbers.h"

#include <gtest/gtest.h>

namespace tallyd::station {

namespace {

EventNumbers numbersOf(std::initializer_list<int> numbers) {
  EventNumbers counted;
  for (const int number : numbers) counted.add(static_cast<std::uint16_t>(number));
  return counted;
}

}  // namespace

TEST(EventNumbersTest, MissesNothingAtFirst) {
  const EventNumbers numbers;
  EXPECT_EQ(numbers.distinct(), 0U);
  EXPECT_EQ(numbers.missing(), 0U);
  EXPECT_EQ(numbers.missingText(5), "");
}

TEST(EventNumbersTest, CountsWhatCameTwice) {
  const EventNumbers numbers = numbersOf({4, 5, 5, 4, 6});
  EXPECT_EQ(numbers.distinct(), 3U);
  EXPECT_EQ(numbers.repeated(), 2U);
  EXPECT_EQ(numbers.missing(), 0U);
}

TEST(EventNumbersTest, NamesTheGapsBetweenTheLowestAndTheHighest) {
  const EventNumbers numbers = numbersOf({10, 3, 4, 6});
  EXPECT_EQ(numbers.missing(), 4U);
  EXPECT_EQ(numbers.missingText(5), "5, 7–9");
  EXPECT_EQ(numbers.missingText(1), "5, …");
}

TEST(EventNumbersTest, ClosesAGapWhenTheNumberComesLate) {
  EventNumbers numbers = numbersOf({1, 3});
  EXPECT_EQ(numbers.missing(), 1U);
  numbers.add(2);
  EXPECT_EQ(numbers.missing(), 0U);
}

TEST(EventNumbersTest, GoesOnWhenTheCounterOverflows) {
  const EventNumbers numbers = numbersOf({65534, 65535, 0, 2});
  EXPECT_EQ(numbers.distinct(), 4U);
  EXPECT_EQ(numbers.repeated(), 0U);
  EXPECT_EQ(numbers.missing(), 1U);
  EXPECT_EQ(numbers.missingText(5), "1");
}

TEST(EventNumbersTest, KeepsTheSumsOfEarlierRounds) {
  EventNumbers numbers = numbersOf({1, 3});
  numbers.beginRound();
  numbers.add(1);
  numbers.add(4);
  EXPECT_EQ(numbers.distinct(), 4U);
  EXPECT_EQ(numbers.repeated(), 0U);
  EXPECT_EQ(numbers.missing(), 3U);
  EXPECT_EQ(numbers.missingText(5), "2–3");
}

}  // namespace tallyd::station
