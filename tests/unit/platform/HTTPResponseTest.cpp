#include <gtest/gtest.h>

#include "platform/HTTPClient.h"

namespace tallyd::platform {
namespace {

TEST(HTTPResponseTest, FindsAHeaderInWhateverCase) {
  const HTTPResponse response{200, {{"cache-CONTROL", "max-age=60"}}};
  EXPECT_EQ(response.header("Cache-Control"), "max-age=60");
}

TEST(HTTPResponseTest, HasNothingForAHeaderThatIsNotThere) {
  const HTTPResponse response{200, {{"Cache-Controls", "max-age=60"}}};
  EXPECT_EQ(response.header("Cache-Control"), std::nullopt);
}

TEST(HTTPResponseTest, JoinsTheValuesOfHeadersOfOneName) {
  const HTTPResponse response{200,
                              {{"Cache-Control", "no-cache"}, {"Age", "1"}, {"cache-control", "max-age=60"}}};
  EXPECT_EQ(response.header("Cache-Control"), "no-cache, max-age=60");
}

}  // namespace
}  // namespace tallyd::platform
