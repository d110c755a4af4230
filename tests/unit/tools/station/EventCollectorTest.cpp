#include "station/EventCollector.h"

#include <gmock/gmock.h>

#include "unit/tools/station/StationFixture.h"

namespace tallyd::station {

using testing::HasSubstr;

namespace {

constexpr const char* kPost =
    R"({"postTime":"100.  5","clientId":"C","events":[{"_method":"3"},{"_method":"4","note":"x"}]})";

}  // namespace

class EventCollectorTest : public StationFixture {
 protected:
  const std::filesystem::path file = folder.path() / "events.jsonl";
  Journal journal{file, Feed::Kind::Event, view, feed};
  EventCollector collector{journal, view};
};

TEST(ParsePostTest, TakesEveryPart) {
  const PostResult result = parsePost(kPost);
  ASSERT_TRUE(result.post);
  EXPECT_EQ(result.post->postTime, "100.  5");
  EXPECT_EQ(result.post->clientId, "C");
  ASSERT_EQ(result.post->events.size(), 2U);
  EXPECT_EQ(result.post->events[1].string("note"), "x");
}

TEST(ParsePostTest, SaysWhatIsWrong) {
  EXPECT_THAT(parsePost("").problem, HasSubstr("not JSON"));
  EXPECT_THAT(parsePost("{\"a\":").problem, HasSubstr("not JSON"));
  EXPECT_EQ(parsePost("[]").problem, "not a JSON object");
  EXPECT_THAT(parsePost(R"({"clientId":"C","events":[]})").problem, HasSubstr("\"postTime\""));
  EXPECT_THAT(parsePost(R"({"postTime":1,"clientId":"C","events":[]})").problem, HasSubstr("\"postTime\""));
  EXPECT_THAT(parsePost(R"({"postTime":"1","clientId":5,"events":[]})").problem, HasSubstr("\"clientId\""));
  EXPECT_THAT(parsePost(R"({"postTime":"1","clientId":"C"})").problem, HasSubstr("\"events\""));
  EXPECT_THAT(parsePost(R"({"postTime":"1","clientId":"C","events":[1]})").problem, HasSubstr("\"events\""));
}

TEST_F(EventCollectorTest, KeepsShowsAndPublishesOneRecordForEachEvent) {
  EXPECT_EQ(collector.collect(kPost, "gzip").status, 200);
  EXPECT_EQ(collector.collect(R"({"postTime":"101.000","clientId":"D","events":[]})", "identity").status,
            200);
  const std::string lines =
      R"({"clientId":"C","encoding":"gzip","event":{"_method":"3"},"postTime":"100.  5"})"
      "\n"
      R"({"clientId":"C","encoding":"gzip","event":{"_method":"4","note":"x"},"postTime":"100.  5"})"
      "\n";
  EXPECT_EQ(readFile(file), lines);
  EXPECT_EQ(published(), lines);
  EXPECT_THAT(output.str(), HasSubstr("method 4  status -  #-  note=x\n"));
  EXPECT_EQ(collector.totals().posts, 2U);
  EXPECT_EQ(collector.totals().events, 2U);
  EXPECT_EQ(collector.totals().refused, 0U);
}

TEST_F(EventCollectorTest, TakesAPostWithoutAClientID) {
  EXPECT_EQ(collector.collect(R"({"postTime":"1","events":[{"_method":"3"}]})", "identity").status, 200);
  ASSERT_EQ(recordsIn(file).size(), 1U);
  ASSERT_TRUE(recordsIn(file)[0].contains("clientId"));
  EXPECT_TRUE(recordsIn(file)[0].find("clientId")->isNull());
  EXPECT_THAT(output.str(), HasSubstr("[clientId missing]\n"));
}

TEST_F(EventCollectorTest, RefusesWhatIsNoPost) {
  const Answer answer = collector.collect("junk", "identity");
  EXPECT_EQ(answer.status, 400);
  EXPECT_THAT(answer.body, HasSubstr("not JSON"));
  EXPECT_EQ(collector.totals().refused, 1U);
  EXPECT_EQ(collector.totals().posts, 0U);
  EXPECT_THAT(problems.str(), HasSubstr("refused a post: not JSON"));
  EXPECT_FALSE(std::filesystem::exists(file));
}

TEST_F(EventCollectorTest, RefusesEventsThatItCannotKeep) {
  const std::filesystem::path missing = folder.path() / "missing" / "events.jsonl";
  Journal homeless(missing, Feed::Kind::Event, view, feed);
  EventCollector unlucky(homeless, view);
  const Answer answer = unlucky.collect(kPost, "gzip");
  EXPECT_EQ(answer.status, 500);
  EXPECT_THAT(answer.body, HasSubstr(missing.string()));
  EXPECT_THAT(problems.str(), HasSubstr(missing.string()));
  EXPECT_EQ(unlucky.totals().events, 0U);
  EXPECT_EQ(unlucky.totals().refused, 1U);
  EXPECT_EQ(output.str(), "");
  EXPECT_EQ(published(), "");
}

}  // namespace tallyd::station
