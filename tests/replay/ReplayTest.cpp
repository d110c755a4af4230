// The daemon's core on simulated days: the same every time, and always in order.

#include <gtest/gtest.h>

#include "replay/Simulation.h"

namespace tallyd::replay {
namespace {

using std::chrono::hours;
using std::chrono::seconds;

/// What went wrong, with the command that shows it again.
std::string violationsOf(const Outcome& outcome, std::uint64_t seed, hours length) {
  std::string text = commandFor(seed, length) + "\n" + summary(outcome);
  for (const std::string& violation : outcome.violations) text += "\n" + violation;
  return text;
}

class ReplayedDayTest : public ::testing::TestWithParam<std::uint64_t> {};

TEST_P(ReplayedDayTest, BreaksNoInvariantWhateverGoesWrong) {
  constexpr hours kLength{3};
  const Outcome outcome = simulate(dayOfSeed(GetParam(), kLength));
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, GetParam(), kLength);
  EXPECT_GT(outcome.calls, 50U);
}

INSTANTIATE_TEST_SUITE_P(Seeds, ReplayedDayTest, ::testing::Range<std::uint64_t>(1, 21));

TEST(ReplayTest, IsTheSameByteForByteForOneSeed) {
  constexpr hours kLength{4};
  const Outcome first = simulate(dayOfSeed(3, kLength));
  const Outcome second = simulate(dayOfSeed(3, kLength));
  EXPECT_GT(first.traceLines, 1000U);
  EXPECT_TRUE(first.trace == second.trace) << commandFor(3, kLength);
}

TEST(ReplayTest, IsAnotherDayForAnotherSeed) {
  EXPECT_NE(simulate(dayOfSeed(1, hours(1))).trace, simulate(dayOfSeed(2, hours(1))).trace);
}

TEST(ReplayTest, SurvivesFaultsAtOtherStepsOfTheSameDay) {
  constexpr hours kLength{2};
  const Scenario day = makeScenario(11, kLength);
  for (std::uint64_t faults = 1; faults <= 10; ++faults) {
    const Outcome outcome = simulate(withFaults(day, faults));
    EXPECT_EQ(outcome.violationCount, 0U) << "faults of seed " << faults << "\n"
                                          << violationsOf(outcome, 11, kLength);
  }
}

TEST(ReplayTest, WaitsAfterEachFailedFetchHoweverOftenAClientStarts) {
  constexpr seconds kBetweenStarts{1};
  constexpr hours kLength{2};
  Scenario day{.seed = 1, .length = kLength, .isInternalDevice = false, .steps = {}};
  const platform::Dictionary sessionInfo{{"SessionID", 1}, {"ClientType", 5}};
  day.steps.push_back({seconds(0), 1, ChangeWeather{{.fetchFails = 1}}});
  day.steps.push_back({seconds(0), 1, Connect{}});
  day.steps.push_back({seconds(0), 1, Configure{sessionInfo, std::nullopt}});
  for (seconds at{0}; at < kLength; at += kBetweenStarts) day.steps.push_back({at, 1, Start{}});
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, 1, kLength);
  // One at once, then one with the first start past each wait of 900 s: 901 s after the one before.
  EXPECT_EQ(outcome.received.fetches, 8U);
  EXPECT_EQ(outcome.received.fetchesFailed, 8U);
}

TEST(ReplayTest, LetsNoDashboardOutliveItsSessionForLongThoughNothingIsAcknowledged) {
  constexpr hours kLength{1};
  constexpr seconds kBetweenSteps{1};
  Scenario day{.seed = 1, .length = kLength, .isInternalDevice = false, .steps = {}};
  seconds at{0};
  const auto then = [&](int client, Happening happening) {
    day.steps.push_back({at += kBetweenSteps, client, std::move(happening)});
  };
  then(0, ChangeWeather{{.acknowledgementIsLost = 1}});
  std::uint64_t records = 0;
  for (const int clientType : {5, 7, 8, 10, 11}) {  // Those whose dashboards ask for acknowledgements.
    const platform::Dictionary sessionInfo{{"SessionID", clientType}, {"ClientType", clientType}};
    then(clientType, Connect{});
    then(clientType, SendOnce{sessionInfo, std::nullopt, {1, 1, std::nullopt}});
    then(clientType, Configure{sessionInfo, std::nullopt});
    then(clientType, Start{});
    then(clientType, Send{2, 1, std::nullopt});
    then(clientType, Disconnect{Ending::Clean});
    records += 4;  // Those of start and stop, too.
  }
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, 1, kLength);
  EXPECT_EQ(outcome.received.reliableDatagrams, records);
  EXPECT_EQ(outcome.received.acknowledged, 0U);
  EXPECT_EQ(outcome.dropped.at("clean-up"), records);
}

TEST(ReplayTest, LosesNothingOnItsWayInFineWeather) {
  const Outcome outcome = simulate(makeScenario(5, hours(12)));
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, 5, hours(12));
  const Received& received = outcome.received;
  EXPECT_EQ(received.acknowledged, received.reliableDatagrams);
  EXPECT_EQ(received.retransmissions, 0U);
  EXPECT_EQ(received.fetchesFailed, 0U);
  // A burst may still fill a dashboard's queue before the first acknowledgement is back.
  for (const char* reason : {"given-up", "upload-failed", "adaptor-threw", "memory-bound"}) {
    EXPECT_EQ(outcome.dropped.count(reason), 0U) << reason;
  }
}

TEST(ReplayTest, FillsAWholeDayWithEverythingThatTheDaemonDoes) {
  const Outcome outcome = simulate(dayOfSeed(1, hours(24)));
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, 1, hours(24));
  const Received& received = outcome.received;
  EXPECT_GT(outcome.connections, 100U);
  EXPECT_GT(outcome.calls, 1000U);
  EXPECT_GT(received.fetchesFailed, 0U);
  EXPECT_GT(received.eventsTaken, 100U);
  EXPECT_GT(received.eventsRefused, 0U);
  EXPECT_GT(received.eventsFailed, 0U);
  EXPECT_GT(received.plainDatagrams, 0U);
  EXPECT_GT(received.acknowledged, 100U);
  EXPECT_GT(received.retransmissions, 0U);
  EXPECT_GT(received.uploads, 0U);
  EXPECT_GT(received.logData, 0U);
  EXPECT_GT(received.powerRecords, 0U);
  EXPECT_GT(received.adaptorMessages, 0U);
  EXPECT_GT(outcome.messageLogsDeleted, 0U);
  for (const char* reason : {"state-off", "method-limit", "post-failed", "given-up", "clean-up"}) {
    EXPECT_GT(outcome.dropped.count(reason), 0U) << reason;
  }
  EXPECT_NE(outcome.trace.find("must wait 900 seconds between attempts"), std::string::npos);
  EXPECT_NE(outcome.trace.find("Cached storebag found"), std::string::npos);
}

}  // namespace
}  // namespace tallyd::replay
