#include "station/PageModel.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <thread>

#include "fakes/FakeClock.h"
#include "platform/JSON.h"

namespace tallyd::station {

using platform::Dictionary;
using testing::HasSubstr;

class PageModelTest : public testing::Test {
 protected:
  static constexpr std::chrono::seconds kPatience{20};

  void publishEvents(int first, int last) {
    for (int i = first; i <= last; ++i) {
      feed.publish(Feed::Kind::Event,
                   R"({"event":{"_sessionID":"K","_eventNumber":")" + std::to_string(i) + "\"}}");
    }
  }
  /// Takes updates until the record with this number has come; the numbers of all of them.
  std::vector<std::int64_t> numbersUpTo(std::int64_t number, PagePosition& position) {
    std::vector<std::int64_t> numbers;
    while (numbers.empty() || numbers.back() < number) {
      if (!model.waitForMore(position, kPatience)) break;
      const PageUpdate update = model.updateSince(position);
      position = update.position;
      const auto parsed = platform::valueFromJSON(update.json);
      EXPECT_TRUE(parsed.value) << parsed.error;
      for (const auto& record : *parsed.value->dictionary()->array("records"))
        numbers.push_back(record.dictionary()->integer("n").value_or(0));
    }
    return numbers;
  }

  Feed feed{5000};
  fakes::FakeClock clock;
  PageModel model{feed, clock, 1000};
};

TEST_F(PageModelTest, ReadsThePositionsThatItWrites) {
  const auto position = pagePositionFrom(textOfPosition({"ab12", 3, 4}));
  ASSERT_TRUE(position);
  EXPECT_EQ(position->station, "ab12");
  EXPECT_EQ(position->number, 3U);
  EXPECT_EQ(position->revision, 4U);
  for (const char* text : {"", "a", "a.1", "a.1.", "a.1.x", "a.-1.2", "a.1.2.3"})
    EXPECT_FALSE(pagePositionFrom(text)) << text;
}

TEST_F(PageModelTest, TellsWhatIsNew) {
  publishEvents(1, 3);
  PagePosition position;
  EXPECT_EQ(numbersUpTo(3, position), (std::vector<std::int64_t>{1, 2, 3}));
  EXPECT_FALSE(model.waitForMore(position, std::chrono::milliseconds(0)));
  publishEvents(4, 4);
  EXPECT_EQ(numbersUpTo(4, position), (std::vector<std::int64_t>{4}));
}

TEST_F(PageModelTest, BeginsAnewForAPageOfAnotherStation) {
  publishEvents(1, 2);
  PagePosition position;
  numbersUpTo(2, position);
  EXPECT_THAT(model.updateSince(position).json, HasSubstr(R"("reset":false)"));
  const PagePosition foreign{"elsewhere", 900, 900};
  EXPECT_TRUE(model.waitForMore(foreign, std::chrono::milliseconds(0)));
  const std::string json = model.updateSince(foreign).json;
  EXPECT_THAT(json, HasSubstr(R"("reset":true)"));
  EXPECT_THAT(json, HasSubstr(R"("n":1)"));
  EXPECT_THAT(json, HasSubstr(R"("session":"K")"));
}

TEST_F(PageModelTest, HandsOutManyRecordsInParts) {
  const int many = PageModel::kRecordsPerUpdate + 10;
  publishEvents(1, many);
  PagePosition position;
  EXPECT_EQ(numbersUpTo(many, position).size(), static_cast<std::size_t>(many));
  const auto all = platform::valueFromJSON(model.snapshot());
  ASSERT_TRUE(all.value);
  EXPECT_EQ(all.value->dictionary()->array("records")->size(), static_cast<std::size_t>(many));
}

TEST_F(PageModelTest, HoldsTheLatestRecordsOfEachKind) {
  feed.publish(Feed::Kind::Upload, R"({"sequence":"5"})");
  publishEvents(1, 1200);
  PagePosition position;
  const auto numbers = numbersUpTo(1201, position);
  const auto all = platform::valueFromJSON(model.snapshot());
  ASSERT_TRUE(all.value);
  const auto* records = all.value->dictionary()->array("records");
  ASSERT_EQ(records->size(), 1001U);
  EXPECT_EQ((*records)[0].dictionary()->string("kind"), "upload");
  EXPECT_EQ((*records)[1].dictionary()->integer("n"), 202);
  EXPECT_THAT(model.snapshot(), HasSubstr(R"("received":1200)"));
}

TEST(PageModelWithASmallFeedTest, TellsHowManyRecordsItNeverSaw) {
  Feed feed(10);
  for (int i = 1; i <= 25; ++i) feed.publish(Feed::Kind::Event, "{}");
  const fakes::FakeClock clock;
  const PageModel model(feed, clock, 10);
  ASSERT_TRUE(model.waitForMore({"elsewhere", 0, 0}, std::chrono::seconds(20)));
  const auto hasAll = [&] { return model.snapshot().find(R"("n":25)") != std::string::npos; };
  while (!hasAll()) std::this_thread::yield();
  EXPECT_THAT(model.snapshot(), HasSubstr(R"("uncounted":15)"));
}

TEST_F(PageModelTest, StopsAllThatWait) {
  model.stop();
  EXPECT_FALSE(model.waitForMore({"elsewhere", 0, 0}, kPatience));
  EXPECT_FALSE(model.rest(kPatience));
}

}  // namespace tallyd::station
