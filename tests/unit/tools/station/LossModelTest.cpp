#include "station/LossModel.h"

#include <gtest/gtest.h>

#include <vector>

namespace tallyd::station {

using Fate = LossModel::Fate;

namespace {

Share share(const char* percentage) { return Share::ofPercentage(percentage).value(); }

std::vector<Fate> fates(const LossModel::Shares& shares, std::uint64_t seed, std::size_t count) {
  LossModel model(shares, seed);
  std::vector<Fate> drawn;
  for (std::size_t i = 0; i < count; ++i) drawn.push_back(model.next());
  return drawn;
}

}  // namespace

TEST(LossModelTest, ReadsPercentages) {
  EXPECT_EQ(share("0").partsPerMillion(), 0U);
  EXPECT_EQ(share("12.5").partsPerMillion(), 125'000U);
  EXPECT_EQ(share("0.5%").partsPerMillion(), 5000U);
  EXPECT_EQ(share("100").partsPerMillion(), 1'000'000U);
  for (const char* text : {"", "%", "-1", "100.1", "nan", "inf", "ten", "5 %", "5%%", "1e3", "+5"}) {
    EXPECT_EQ(Share::ofPercentage(text), std::nullopt) << text;
  }
}

TEST(LossModelTest, DrawsTheSameForTheSameSeed) {
  const LossModel::Shares shares{share("30"), share("20"), share("10")};
  EXPECT_EQ(fates(shares, 7, 1000), fates(shares, 7, 1000));
  EXPECT_NE(fates(shares, 7, 1000), fates(shares, 8, 1000));
}

TEST(LossModelTest, DrawsTheSharesAskedFor) {
  constexpr std::size_t kCount = 100'000;
  std::size_t lost = 0;
  std::size_t duplicated = 0;
  std::size_t reordered = 0;
  for (const Fate& fate : fates({share("25"), share("50"), share("10")}, 1, kCount)) {
    lost += fate.isLost;
    duplicated += fate.isDuplicated;
    reordered += fate.isReordered;
  }
  // Of the three quarters that are not lost.
  EXPECT_NEAR(static_cast<double>(lost) / kCount, 0.25, 0.01);
  EXPECT_NEAR(static_cast<double>(duplicated) / kCount, 0.375, 0.01);
  EXPECT_NEAR(static_cast<double>(reordered) / kCount, 0.075, 0.01);
}

TEST(LossModelTest, DoesNothingOrEverythingWhenAskedTo) {
  for (const Fate& fate : fates({}, 3, 1000)) EXPECT_EQ(fate, Fate{});
  for (const Fate& fate : fates({share("100"), share("100"), share("100")}, 3, 1000)) {
    EXPECT_EQ(fate, Fate{.isLost = true});
  }
}

TEST(LossModelTest, DecidesEachShareByLotsOfItsOwn) {
  const auto few = fates({share("10"), share("20"), {}}, 5, 1000);
  const auto more = fates({share("10"), share("20"), share("50")}, 5, 1000);
  for (std::size_t i = 0; i < few.size(); ++i) {
    EXPECT_EQ(few[i].isLost, more[i].isLost);
    EXPECT_EQ(few[i].isDuplicated, more[i].isDuplicated);
  }
}

}  // namespace tallyd::station
