#include <gtest/gtest.h>
#include <pthread.h>

#include <csignal>

#include "tallyctl/SignalPacer.h"

namespace tallyd::tallyctl {
namespace {

using std::chrono::hours;
using std::chrono::milliseconds;

TEST(TicksTest, DoNotDriftWhenServedLate) {
  const SteadyTime start{hours(1)};
  const Ticks ticks(start, milliseconds(1000));
  EXPECT_EQ(ticks.next(start), start + milliseconds(1000));
  EXPECT_EQ(ticks.next(start + milliseconds(1007)), start + milliseconds(2000));
  EXPECT_EQ(ticks.next(start + milliseconds(2000)), start + milliseconds(3000));
  EXPECT_EQ(ticks.next(start + milliseconds(2999)), start + milliseconds(3000));
}

TEST(TicksTest, LeaveOutWhatWasMissed) {
  const SteadyTime start{hours(1)};
  const Ticks ticks(start, milliseconds(100));
  EXPECT_EQ(ticks.next(start + milliseconds(1234)), start + milliseconds(1300));
}

TEST(SignalPacerTest, WaitsUntilATimeThatHasCome) {
  SignalPacer pacer;
  EXPECT_TRUE(pacer.waitUntil(pacer.now()));
  const auto soon = pacer.now() + milliseconds(5);
  EXPECT_TRUE(pacer.waitUntil(soon));
  EXPECT_GE(pacer.now(), soon);
}

class SignalPacerSignalTest : public testing::TestWithParam<int> {};

TEST_P(SignalPacerSignalTest, StopsAtASignal) {
  SignalPacer pacer;
  ASSERT_EQ(pthread_kill(pthread_self(), GetParam()), 0);
  EXPECT_FALSE(pacer.waitUntil(pacer.now() + hours(1)));
  EXPECT_FALSE(pacer.waitUntil(pacer.now()));
}

INSTANTIATE_TEST_SUITE_P(Both, SignalPacerSignalTest, testing::Values(SIGINT, SIGTERM));

TEST(SignalPacerTest, GivesTheSignalsBackAfterTheFirst) {
  SignalPacer pacer;
  sigset_t blocked;
  pthread_sigmask(SIG_SETMASK, nullptr, &blocked);
  EXPECT_EQ(sigismember(&blocked, SIGINT), 1);
  ASSERT_EQ(pthread_kill(pthread_self(), SIGINT), 0);
  EXPECT_FALSE(pacer.waitUntil(pacer.now() + hours(1)));
  pthread_sigmask(SIG_SETMASK, nullptr, &blocked);
  EXPECT_EQ(sigismember(&blocked, SIGINT), 0);
  EXPECT_EQ(sigismember(&blocked, SIGTERM), 0);
}

}  // namespace
}  // namespace tallyd::tallyctl
