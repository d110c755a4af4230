// Messages as events of the power log, written from within the sandbox.

#include <gtest/gtest.h>

#include <sstream>

#include "integration/TestDaemon.h"
#include "platform/JSON.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;

TEST(PowerLogTest, HoldsEachMessageThatHasAMethodAndAPayload) {
  StorebagServer storebags;
  storebags.serve("playhall", {{"power", Dictionary()}}, "max-age=600");
  TestRoot root(storebags);
  TestDaemon daemon(root);
  auto session = daemon.connect();
  session->setSessionInfoSync(sessionInfo(1), std::nullopt);
  EXPECT_EQ(session->startConfigSync().value, (std::vector<std::string>{"power"}));
  EXPECT_EQ(session->sendMessageSync(3, 500, Dictionary{{"level", 80}, {"event", "theirs"}}).value,
            std::nullopt);
  session->sendMessageSync(4, 0, std::nullopt);
  session->sendMessageSync(0, 0, Dictionary{{"level", 81}});
  session->sendMessageSync(5, 0, Dictionary{{"level", 82}});

  std::istringstream lines(root.read("/var/log/tallyd/power.jsonl"));
  std::vector<Dictionary> records;
  for (std::string line; std::getline(lines, line);) {
    const auto parsed = platform::valueFromJSON(line);
    ASSERT_TRUE(parsed.value && parsed.value->dictionary()) << line;
    const Dictionary& event = *parsed.value->dictionary();
    EXPECT_EQ(event.integer("number"), 28);
    EXPECT_EQ(event.string("name"), "StagehostD-RTC");
    EXPECT_GT(event.real("time").value_or(0), 1.6e9);
    ASSERT_NE(event.dictionary("record"), nullptr);
    records.push_back(*event.dictionary("record"));
  }
  // The session's start record was event 1.
  EXPECT_EQ(records,
            (std::vector<Dictionary>{{{"level", 80}, {"event", 2}, {"method", 3}, {"respCode", 500}},
                                     {{"level", 82}, {"event", 5}, {"method", 5}, {"respCode", 0}}}));
}

}  // namespace
}  // namespace tallyd::test
