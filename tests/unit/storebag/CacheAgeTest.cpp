#include <gtest/gtest.h>

#include <limits>

#include "storebag/StorebagRetrieval.h"

namespace tallyd {
namespace {

constexpr std::int32_t kDay = 86'400;

TEST(CacheAgeTest, AnAbsentHeaderMeansNoTimeAtAll) {
  const CacheAge age = cacheAgeFromHeader(std::nullopt);
  EXPECT_EQ(age.maxAgeSeconds, 0);
  EXPECT_FALSE(age.endsInMaxAge);
}

TEST(CacheAgeTest, AHeaderThatNamesNoMaxAgeMeansADay) {
  for (const char* header : {"", "public", "no-cache", "no-store, must-revalidate", "=", " ", "maxage=600",
                             "s-maxage=600", "Max-Age=600", "MAX-AGE=600"}) {
    const CacheAge age = cacheAgeFromHeader(header);
    EXPECT_EQ(age.maxAgeSeconds, kDay) << header;
    EXPECT_FALSE(age.endsInMaxAge) << header;
  }
}

TEST(CacheAgeTest, AMaxAgeThatIsGluedToAnotherDirectiveIsNotSeen) {
  EXPECT_EQ(cacheAgeFromHeader("public,max-age=600").maxAgeSeconds, kDay);
  EXPECT_EQ(cacheAgeFromHeader("max-age,600").maxAgeSeconds, kDay);
  EXPECT_EQ(cacheAgeFromHeader("\tmax-age=600").maxAgeSeconds, kDay);
}

TEST(CacheAgeTest, TheNumberIsTheComponentBehindTheFirstMaxAge) {
  const std::pair<const char*, std::int32_t> table[] = {
      {"max-age=600", 600},
      {"max-age=0", 0},
      {"no-cache, max-age=0", 0},
      {"public, max-age=3600, immutable", 3600},
      {"max-age=3600,must-revalidate", 3600},
      {"max-age 600", 600},
      {"private=\"max-age 5\" max-age=600", 600},
      {"max-age=1 max-age=2", 1},
      {"max-age=600, max-age", 600},
      {"max-age=max-age=5", 0},
      {"max-age=12x34", 12},
      {"max-age=007", 7},
      {"max-age=1.9", 1},
      {"max-age=-5", -5},
  };
  for (const auto& [header, seconds] : table) {
    const CacheAge age = cacheAgeFromHeader(header);
    EXPECT_EQ(age.maxAgeSeconds, seconds) << header;
    EXPECT_FALSE(age.endsInMaxAge) << header;
  }
}

TEST(CacheAgeTest, AnEmptyOrWordlyNumberReadsAsZero) {
  for (const char* header : {"max-age=", "max-age==600", "max-age  600", "max-age= 600", "max-age=soon",
                             "max-age=\"600\"", "max-age=, public"}) {
    const CacheAge age = cacheAgeFromHeader(header);
    EXPECT_EQ(age.maxAgeSeconds, 0) << header;
    EXPECT_FALSE(age.endsInMaxAge) << header;
  }
}

TEST(CacheAgeTest, ANumberOutsideThirtyTwoBitsIsClamped) {
  using Limits = std::numeric_limits<std::int32_t>;
  EXPECT_EQ(cacheAgeFromHeader("max-age=2147483647").maxAgeSeconds, Limits::max());
  EXPECT_EQ(cacheAgeFromHeader("max-age=2147483648").maxAgeSeconds, Limits::max());
  EXPECT_EQ(cacheAgeFromHeader("max-age=99999999999999999999999").maxAgeSeconds, Limits::max());
  EXPECT_EQ(cacheAgeFromHeader("max-age=-2147483649").maxAgeSeconds, Limits::min());
  EXPECT_EQ(cacheAgeFromHeader("max-age=-99999999999999999999999").maxAgeSeconds, Limits::min());
}

TEST(CacheAgeTest, AMaxAgeAtTheEndIsReported) {
  for (const char* header : {"max-age", "no-cache, max-age", "a=max-age", " max-age"}) {
    EXPECT_TRUE(cacheAgeFromHeader(header).endsInMaxAge) << header;
  }
}

}  // namespace
}  // namespace tallyd
