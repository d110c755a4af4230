// The daemon's core on simulated days: the same every time, and always in order.

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <fstream>
#include <set>
#include <sstream>

#include "fakes/TemporaryFolder.h"
#include "integration/WatchedProcess.h"
#include "replay/ReplayOptions.h"
#include "replay/Simulation.h"

namespace tallyd::replay {
namespace {

using std::chrono::hours;
using std::chrono::seconds;

/// What went wrong, with the command that shows it again.
std::string violationsOf(const Outcome& outcome, const Scenario& day) {
  std::string text = commandFor(day).value_or("a day written by hand") + "\n" + description(day.optIns) +
                     "\n" + summary(outcome);
  for (const std::string& violation : outcome.violations) text += "\n" + violation;
  return text;
}

class ReplayedDayTest : public ::testing::TestWithParam<std::uint64_t> {};

TEST_P(ReplayedDayTest, BreaksNoInvariantWhateverGoesWrong) {
  constexpr hours kLength{3};
  const Scenario day = dayOfSeed(GetParam(), kLength);
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_GT(outcome.calls, 50U);
}

constexpr std::uint64_t kFirstSeed = 1;
constexpr std::uint64_t kLastSeed = 20;
INSTANTIATE_TEST_SUITE_P(Seeds, ReplayedDayTest, ::testing::Range(kFirstSeed, kLastSeed + 1));

/// The first day of those seeds on which the operator asked for what `isMeant` wants.
template <class IsMeant>
Scenario firstDay(hours length, IsMeant isMeant) {
  for (std::uint64_t seed = kFirstSeed; seed <= kLastSeed; ++seed) {
    if (isMeant(makeScenario(seed, hours(1)).optIns)) return dayOfSeed(seed, length);
  }
  throw std::logic_error("no such day");
}
bool rereadsConsent(const OptIns& optIns) { return optIns.consentChecks == ConsentChecks::BeforeEachPost; }
bool isResilient(const OptIns& optIns) {
  return optIns.fatalFailures == platform::FatalFailures::FailRequest;
}

/// The day that the replay program plays for a command that was printed.
Scenario dayOfCommand(const std::string& command) {
  const std::string script = "scripts/replay ";
  EXPECT_TRUE(command.starts_with(script)) << command;
  CLI::App app;
  const ReplayOptions options(app);
  app.parse(command.substr(script.size()));
  return scenarioOf(options.recipe());
}

TEST(ReplayCommandTest, MakesTheSameDayAgainHoweverItWasMade) {
  const Scenario fine = makeScenario(11, hours(2));
  std::set<std::string> commands;
  for (const Scenario& day : {fine, withFaults(fine, 3), withFaults(fine, 12), dayOfSeed(12, hours(2)),
                              scenarioOf({.seed = 11, .length = hours(3), .faults = 3})}) {
    const auto command = commandFor(day);
    ASSERT_TRUE(command);
    EXPECT_TRUE(dayOfCommand(*command) == day) << *command;
    commands.insert(*command);
  }
  EXPECT_EQ(commands.size(), 5U);
}

TEST(ReplayCommandTest, PlaysTheDayThatASeedStandsForWhenNothingElseIsSaid) {
  EXPECT_TRUE(dayOfCommand("scripts/replay --seed 11 --hours 2") == dayOfSeed(11, hours(2)));
}

TEST(ReplayCommandTest, IsNotThereForADayWrittenByHand) {
  EXPECT_EQ(commandFor({.seed = 1, .length = hours(1), .isInternalDevice = false, .steps = {}}),
            std::nullopt);
}

TEST(ReplayTest, IsTheSameByteForByteForOneSeed) {
  const Scenario day = dayOfSeed(3, hours(24));
  const Outcome first = simulate(day);
  const Outcome second = simulate(day);
  EXPECT_GT(first.traceLines, 10'000U);
  EXPECT_TRUE(first.trace == second.trace) << commandFor(day).value();
}

/// The whole file.
std::string contentsOf(const std::filesystem::path& path) {
  std::ostringstream contents;
  contents << std::ifstream(path).rdbuf();
  return contents.str();
}

TEST(ReplayTest, IsTheSameByteForByteInAnotherProcess) {
  const fakes::TemporaryFolder folder;
  const auto startProgram = [&](const char* trace) {
    return std::make_unique<test::WatchedProcess>(
        test::WatchedProcess::Options{{TALLYD_BIN_DIR "/../tests/bin/tally-replay", "--seed", "13", "--hours",
                                       "8", "--trace", folder.path() / trace}});
  };
  const auto first = startProgram("first");
  const auto second = startProgram("second");
  EXPECT_EQ(first->wait().code, EXIT_SUCCESS) << first->output();
  EXPECT_EQ(second->wait().code, EXIT_SUCCESS) << second->output();
  const std::string trace = contentsOf(folder.path() / "first");
  EXPECT_GT(std::count(trace.begin(), trace.end(), '\n'), 10'000);
  EXPECT_TRUE(trace == contentsOf(folder.path() / "second"));
}

TEST(ReplayTest, IsAnotherDayForAnotherSeed) {
  EXPECT_NE(simulate(dayOfSeed(1, hours(1))).trace, simulate(dayOfSeed(2, hours(1))).trace);
}

TEST(ReplayTest, SurvivesFaultsAtOtherStepsOfTheSameDay) {
  constexpr hours kLength{2};
  const Scenario day = makeScenario(11, kLength);
  for (std::uint64_t faults = 1; faults <= 10; ++faults) {
    const Scenario faulty = withFaults(day, faults);
    const Outcome outcome = simulate(faulty);
    EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, faulty);
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
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
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
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_EQ(outcome.received.reliableDatagrams, records);
  EXPECT_EQ(outcome.received.acknowledged, 0U);
  EXPECT_EQ(outcome.dropped.at("clean-up"), records);
}

TEST(ReplayTest, LosesNothingOnItsWayInFineWeather) {
  const Scenario day = makeScenario(5, hours(12));
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
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
  const Scenario day = dayOfSeed(1, hours(24));
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
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
  for (const char* reason :
       {"state-off", "method-limit", "post-failed", "queue-full", "given-up", "clean-up"}) {
    EXPECT_GT(outcome.dropped.count(reason), 0U) << reason;
  }
  EXPECT_NE(outcome.trace.find("must wait 900 seconds between attempts"), std::string::npos);
  EXPECT_NE(outcome.trace.find("Cached storebag found"), std::string::npos);
}

TEST(ReplayOptInTest, TriesPostsAgainOnlyWhereThatIsAskedFor) {
  const Scenario day = firstDay(
      hours(6), [](const OptIns& optIns) { return optIns.retryPosts > 1 && !rereadsConsent(optIns); });
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_GT(outcome.received.furtherAttempts, 0U);
  EXPECT_GT(outcome.received.eventsSaved, 0U);
  EXPECT_EQ(outcome.received.eventsWithdrawn, 0U);

  Scenario plain = day;
  plain.optIns.retryPosts = 0;
  const Outcome withoutRetries = simulate(plain);
  EXPECT_EQ(withoutRetries.violationCount, 0U);
  EXPECT_GT(withoutRetries.received.eventsFailed, 0U);
  EXPECT_EQ(withoutRetries.received.furtherAttempts, 0U);
}

TEST(ReplayOptInTest, StopsFurtherAttemptsForWithdrawnConsent) {
  Scenario day = firstDay(
      hours(6), [](const OptIns& optIns) { return optIns.retryPosts > 1 && rereadsConsent(optIns); });
  day.recipe.reset();
  std::erase_if(day.steps,
                [](const Step& step) { return std::holds_alternative<ChangeWeather>(step.happening); });
  day.steps.push_back({seconds(0), 0, ChangeWeather{{.postFails = 1}}});
  constexpr seconds kPeriod{20};
  for (seconds at{0}; at < day.length; at += kPeriod) {
    const bool consents = at / kPeriod % 2 == 0;
    day.steps.push_back({at, 0, SetPreference{"com.quillon.diagnostics", kConsentKey, consents}});
  }
  std::stable_sort(day.steps.begin(), day.steps.end(),
                   [](const Step& one, const Step& other) { return one.at < other.at; });
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_GT(outcome.received.furtherAttempts, 0U);
  EXPECT_GT(outcome.received.eventsWithdrawn, 0U);
}

TEST(ReplayOptInTest, StopsPostsForWithdrawnConsentOnlyWhereItIsReadAgain) {
  const Scenario day = firstDay(
      hours(12), [](const OptIns& optIns) { return rereadsConsent(optIns) && optIns.retryPosts == 0; });
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_GT(outcome.dropped.count("consent-withdrawn"), 0U);

  Scenario plain = day;
  plain.optIns.consentChecks = ConsentChecks::AtStart;
  const Outcome withoutChecks = simulate(plain);
  EXPECT_EQ(withoutChecks.violationCount, 0U);
  EXPECT_EQ(withoutChecks.dropped.count("consent-withdrawn"), 0U);
}

TEST(ReplayOptInTest, GoesOnAfterWhatWouldEndTheDaemon) {
  const Scenario day = firstDay(hours(8), isResilient);
  const Outcome outcome = simulate(day);
  EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
  EXPECT_GT(outcome.received.fatalAnswers, 0U);
  for (const char* line : {"ends in max-age without a number", "has no version", "has no storebag name"}) {
    EXPECT_NE(outcome.trace.find(line), std::string::npos) << line;
  }
}

TEST(ReplayOptInTest, DrainsWhatIsUnderWayInTheTimeThatItGets) {
  using std::chrono::minutes;
  Scenario day{.seed = 1, .length = hours(1), .isInternalDevice = false, .steps = {}};
  const platform::Dictionary sessionInfo{{"SessionID", 1}, {"ClientType", 5}};
  day.steps.push_back({seconds(0), 1, Connect{}});
  day.steps.push_back({seconds(0), 1, Configure{sessionInfo, std::nullopt}});
  day.steps.push_back({seconds(0), 1, Start{}});
  day.steps.push_back({seconds(1), 1, ChangeWeather{{.postFails = 1, .acknowledgementIsLost = 1}}});
  day.steps.push_back({minutes(59), 1, Send{1, 0, std::nullopt}});
  day.optIns.retryPosts = 3;
  const auto isSettledIn = [&](seconds time) {
    day.optIns.drain = time;
    const Outcome outcome = simulate(day);
    EXPECT_EQ(outcome.violationCount, 0U) << violationsOf(outcome, day);
    return outcome.isDrainSettled;
  };
  EXPECT_EQ(isSettledIn(seconds(1)), false);
  EXPECT_EQ(isSettledIn(kLongDrain), true);
}

TEST(ReplayOptInTest, IsThereInAllCombinationsForTheSeedsThatAreTested) {
  std::set<std::array<bool, 4>> combinations;
  for (std::uint64_t seed = kFirstSeed; seed <= kLastSeed; ++seed) {
    const OptIns optIns = makeScenario(seed, hours(1)).optIns;
    combinations.insert(
        {optIns.retryPosts > 0, rereadsConsent(optIns), isResilient(optIns), optIns.drain.has_value()});
  }
  EXPECT_EQ(combinations.size(), 16U);
}

}  // namespace
}  // namespace tallyd::replay
