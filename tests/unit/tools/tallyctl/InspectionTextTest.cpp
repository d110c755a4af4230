#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>

#include "tallyctl/PlainText.h"
#include "tallyctl/StatsReport.h"
#include "tallyctl/TapText.h"

namespace tallyd::tallyctl {
namespace {

using platform::Array;
using platform::Dictionary;

Dictionary counts(int accepted, int sent, const Dictionary& dropped) {
  return {{"accepted", accepted}, {"sent", sent},     {"refused", 1},      {"held", 2},
          {"inFlight", 3},        {"passedBy", 1000}, {"dropped", dropped}};
}

Dictionary named(Dictionary row, const char* name, const char* kind) {
  row.set("name", name);
  row.set("kind", kind);
  return row;
}

TEST(StatsReportTest, ShowsSessionsBackendsAndReasons) {
  const Dictionary backend =
      named(counts(20, 8, {{"method-limit", 5}, {"post-failed", 2}}), "splunk", "https-post");
  const Dictionary stats{{"connections", Dictionary{{"accepted", 9}, {"open", 4}}},
                         {"sessions", Array{Dictionary{{"session", 3},
                                                       {"sessionID", 42},
                                                       {"clientType", 5},
                                                       {"clientName", "demo"},
                                                       {"messages", counts(6, 1, {})},
                                                       {"uploads", Dictionary{}},
                                                       {"backends", Array{backend}}}}},
                         {"sessionsNotShown", 2},
                         {"ended", Dictionary{{"sessions", 7}}}};
  const StatsReport report = reportOf(stats);
  const std::vector<std::string> expected{
      "connections: 4 open, 9 accepted",
      "                       KIND         ACCEPTED      SENT   REFUSED      HELD  UNDERWAY   DROPPED",
      "session 3 (ID 42, client type 5, demo)",
      "  messages             offered             6         1         1         2         3         0",
      "  splunk               https-post         20         8         1         2         3         7"
      "  method-limit 5, post-failed 2",
      "2 more sessions",
      "ended sessions (7)"};
  EXPECT_EQ(report.lines, expected);
  EXPECT_TRUE(report.imbalances.empty());
}

TEST(StatsReportTest, NamesEveryAccountThatDoesNotBalance) {
  const Dictionary total{
      {"messages", counts(7, 1, {})},
      {"backends", Array{named(counts(20, 8, {{"given-up", 6}}), "dashboard", "dashboard")}}};
  const StatsReport report = reportOf({{"total", total}});
  EXPECT_EQ(report.imbalances, (std::vector<std::string>{"total, messages: accepted 7, accounted for 6",
                                                         "total, dashboard: accepted 20, accounted for 19"}));
}

TEST(StatsReportTest, TakesAnythingForAnswer) {
  EXPECT_EQ(reportOf({}).lines.size(), 1U);
  EXPECT_TRUE(
      reportOf({{"sessions", Array{1, "text"}}, {"total", 7}, {"ended", Array()}}).imbalances.empty());
}

TEST(PlainTextTest, LeavesTextAndDisarmsControls) {
  EXPECT_EQ(plainText("demo ü"), "demo ü");
  EXPECT_EQ(plainText("a\x1B[2Jb"), "\"a\\u001B[2Jb\"");
  EXPECT_EQ(plainText("a\x7F"), "\"a\\u007f\"");
  EXPECT_EQ(plainText("a\xC2\x9B"), "\"a\\u009b\"");
  EXPECT_EQ(plainText("\xFF"), "\xEF\xBF\xBD");
}

class TapTextTest : public testing::Test {
 protected:
  TapTextTest() {
    ::setenv("TZ", "UTC0", 1);
    ::tzset();
  }
};

TEST_F(TapTextTest, ShowsAPostAndItsResult) {
  EXPECT_EQ(
      tapText(R"({"time":3661.25,"kind":"post","session":4,"backend":"splunk","post":17,"url":"https://a/b",)"
              R"("encoding":"gzip","bytes":99,"events":2,"document":{"a":1}})"),
      R"(01:01:01.250 [4 splunk] post 17 to https://a/b: 2 events, 99 bytes (gzip) {"a":1})");
  EXPECT_EQ(
      tapText(R"({"time":0,"kind":"post","session":4,"backend":"splunk","post":17,"result":{"status":503}})"),
      "00:00:00.000 [4 splunk] post 17: status 503");
  EXPECT_EQ(tapText(R"({"time":0,"kind":"post","session":4,"post":17,"result":{"error":"no route"}})"),
            "00:00:00.000 [4] post 17: failed, no route");
}

TEST_F(TapTextTest, ShowsTheOtherKinds) {
  EXPECT_EQ(
      tapText(R"({"time":0,"kind":"datagram","session":1,"backend":"d","server":"127.0.0.1:9","method":1,)"
              R"("event":2,"bytes":"0a0b","text":"x"})"),
      "00:00:00.000 [1 d] datagram to 127.0.0.1:9, method 1, event 2, 2 bytes: x");
  EXPECT_EQ(tapText(R"({"time":0,"kind":"power","session":1,"backend":"power","record":{"a":1}})"),
            R"(00:00:00.000 [1 power] power log {"a":1})");
  EXPECT_EQ(
      tapText(
          R"({"time":0,"kind":"adaptor","session":1,"backend":"pith","method":3,"event":4,"payload":{}})"),
      "00:00:00.000 [1 pith] adaptor, method 3, event 4 {}");
  EXPECT_EQ(
      tapText(
          R"({"time":0,"kind":"upload","session":1,"backend":"u","url":"http://x/","file":"/f","bytes":5,)"
          R"("result":{"status":200}})"),
      "00:00:00.000 [1 u] upload /f to http://x/, 5 bytes: status 200");
  EXPECT_EQ(tapText(R"({"time":0,"kind":"log-data","session":1,"backend":"d","url":"http://x/","bytes":5,)"
                    R"("result":{"error":"gone"}})"),
            "00:00:00.000 [1 d] log data to http://x/, 5 bytes: failed, gone");
  EXPECT_EQ(
      tapText(R"({"time":0,"kind":"drop","session":1,"backend":"d","reason":"given-up","count":1,"method":3,)"
              R"("event":4})"),
      "00:00:00.000 [1 d] dropped 1 (given-up), method 3, event 4");
  EXPECT_EQ(tapText(R"({"time":0,"kind":"missed","count":12})"), "00:00:00.000 missed 12 lines");
}

TEST_F(TapTextTest, ShowsWhatItDoesNotKnowAsItCame) {
  EXPECT_EQ(tapText("no JSON\x1B"), "\"no JSON\\u001B\"");
  EXPECT_EQ(tapText(R"({"time":0,"kind":"new","a":1})"), R"(00:00:00.000 {"time":0,"kind":"new","a":1})");
}

}  // namespace
}  // namespace tallyd::tallyctl
