#include "station/EventCollector.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

#include "fakes/TemporaryFolder.h"
#include "station/Files.h"

namespace tallyd::station {

using testing::HasSubstr;

namespace {

constexpr const char* kPost =
    R"({"postTime":"100.  5","clientId":"C","events":[{"_method":"3"},{"_method":"4","note":"x"}]})";

}  // namespace

class EventCollectorTest : public testing::Test {
 protected:
  fakes::TemporaryFolder folder;
  const std::filesystem::path file = folder.path() / "events.jsonl";
  std::ostringstream output;
  std::ostringstream problems;
  TerminalView view{output, problems, TerminalView::Events::JSON};
  EventCollector collector{file, view};
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
  EXPECT_THAT(parsePost(R"({"postTime":"1"})").problem, HasSubstr("\"clientId\""));
  EXPECT_THAT(parsePost(R"({"postTime":"1","clientId":"C"})").problem, HasSubstr("\"events\""));
  EXPECT_THAT(parsePost(R"({"postTime":"1","clientId":"C","events":[1]})").problem, HasSubstr("\"events\""));
}

TEST_F(EventCollectorTest, ShowsAndKeepsOneLineForEachEvent) {
  EXPECT_EQ(collector.collect(kPost, "gzip"), std::nullopt);
  EXPECT_EQ(collector.collect(R"({"postTime":"101.000","clientId":"D","events":[]})", "identity"),
            std::nullopt);
  const std::string lines =
      R"({"clientId":"C","encoding":"gzip","event":{"_method":"3"},"postTime":"100.  5"})"
      "\n"
      R"({"clientId":"C","encoding":"gzip","event":{"_method":"4","note":"x"},"postTime":"100.  5"})"
      "\n";
  EXPECT_EQ(output.str(), lines);
  EXPECT_EQ(readFile(file), lines);
  EXPECT_EQ(collector.totals().posts, 2U);
  EXPECT_EQ(collector.totals().events, 2U);
  EXPECT_EQ(collector.totals().refused, 0U);
}

TEST_F(EventCollectorTest, RefusesWhatIsNoPost) {
  EXPECT_THAT(collector.collect("junk", "identity").value_or(""), HasSubstr("not JSON"));
  EXPECT_EQ(collector.totals().refused, 1U);
  EXPECT_EQ(collector.totals().posts, 0U);
  EXPECT_THAT(problems.str(), HasSubstr("refused a post: not JSON"));
  EXPECT_FALSE(std::filesystem::exists(file));
}

TEST_F(EventCollectorTest, GoesOnWhenItCannotKeepEvents) {
  EventCollector homeless(folder.path() / "missing" / "events.jsonl", view);
  EXPECT_EQ(homeless.collect(kPost, "gzip"), std::nullopt);
  EXPECT_THAT(problems.str(), HasSubstr((folder.path() / "missing" / "events.jsonl").string()));
  EXPECT_EQ(homeless.totals().events, 2U);
}

}  // namespace tallyd::station
