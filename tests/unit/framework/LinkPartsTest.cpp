// The link's decisions, each for itself: pauses, what a session was told, calls that wait.

#include <gtest/gtest.h>

#include "framework/ReconnectSchedule.h"
#include "framework/SessionKeeper.h"
#include "framework/WaitingCalls.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using std::chrono::milliseconds;
using Method = ClientSessionMethod;

Value some(const Dictionary& dictionary) { return Value(Array{Value(dictionary)}); }
Value none() { return Value(Array()); }

TEST(ReconnectScheduleTest, TheDrawTakesOffUpToHalf) {
  ReconnectSchedule schedule({.firstPause = milliseconds(1'000)});
  EXPECT_EQ(schedule.next(0.0), milliseconds(1'000));
  EXPECT_EQ(schedule.next(0.5), milliseconds(1'500));
  EXPECT_EQ(schedule.next(0.999999), milliseconds(2'000));
}

TEST(ReconnectScheduleTest, NeverPausesForNothing) {
  ReconnectSchedule schedule({.firstPause = milliseconds(0), .maximumPause = milliseconds(0)});
  EXPECT_EQ(schedule.next(0.9), milliseconds(1));
  EXPECT_EQ(schedule.next(0.9), milliseconds(1));
}

TEST(ReconnectScheduleTest, DoesNotOverflow) {
  ReconnectSchedule schedule({.firstPause = milliseconds(1), .maximumPause = milliseconds::max()});
  for (int i = 0; i < 200; ++i) EXPECT_GE(schedule.next(0), milliseconds(1));
}

TEST(ReconnectScheduleTest, CountsAttemptsInARowOnly) {
  ReconnectSchedule schedule({.maximumAttempts = 1});
  EXPECT_TRUE(schedule.next(0));
  EXPECT_FALSE(schedule.next(0));
  schedule.reset();
  EXPECT_TRUE(schedule.next(0));
}

std::vector<Method> methodsOf(const std::vector<ServiceRequest>& requests) {
  std::vector<Method> methods;
  for (const auto& each : requests) methods.push_back(each.method);
  return methods;
}

TEST(SessionKeeperTest, ASessionThatWasToldNothingNeedsNothing) {
  SessionKeeper keeper;
  keeper.leaves({.method = Method::SendMessageWithCategory, .arguments = {1, 2, none()}});
  keeper.leaves({.method = Method::SendMessageWithSessionInfo,
                 .arguments = {some({{"SessionID", 1}}), some({{"ClientName", "x"}}), 1, 2, none()}});
  EXPECT_TRUE(keeper.configuration().empty());
}

TEST(SessionKeeperTest, KeepsTheLastOfEverything) {
  SessionKeeper keeper;
  keeper.leaves({.method = Method::SetSessionInfo,
                 .arguments = {some({{"SessionID", 1}}), some({{"ClientName", "x"}}), Value(Array{"A"})}});
  keeper.leaves({.method = Method::StartConfig});
  keeper.leaves(
      {.method = Method::SetSessionInfo, .arguments = {some({{"SessionID", 2}}), none(), Value(Array{"B"})}});
  keeper.leaves({.method = Method::FetchStates, .arguments = {none()}});
  const auto calls = keeper.configuration();
  ASSERT_EQ(methodsOf(calls), (std::vector{Method::SetSessionInfo, Method::StartConfig}));
  EXPECT_EQ(calls[0].arguments,
            (std::vector{some({{"SessionID", 2}}), some({{"ClientName", "x"}}), Value(Array{"B"})}));
}

TEST(SessionKeeperTest, UserInfoAloneTravelsWithAQueryOfTheStates) {
  SessionKeeper keeper;
  keeper.leaves({.method = Method::FetchStates, .arguments = {some({{"ClientName", "x"}})}});
  const auto calls = keeper.configuration();
  ASSERT_EQ(methodsOf(calls), std::vector{Method::FetchStates});
  EXPECT_EQ(calls[0].arguments, std::vector{some({{"ClientName", "x"}})});
}

ServiceCall callAt(int deadline) {
  return {.request = {.arguments = {deadline}}, .deadline = SteadyTime(milliseconds(deadline))};
}

std::vector<Value> numbersOf(const std::vector<ServiceCall>& calls) {
  std::vector<Value> numbers;
  for (const auto& each : calls) numbers.push_back(each.request.arguments.at(0));
  return numbers;
}

TEST(WaitingCallsTest, ExpiredOnesComeInTheOrderOfTheCalls) {
  WaitingCalls calls;
  for (const int deadline : {30, 10, 20, 10}) calls.add(callAt(deadline));
  EXPECT_EQ(calls.earliestDeadline(), SteadyTime(milliseconds(10)));
  EXPECT_TRUE(calls.takeExpired(SteadyTime(milliseconds(9))).empty());
  EXPECT_EQ(numbersOf(calls.takeExpired(SteadyTime(milliseconds(20)))), (std::vector<Value>{10, 20, 10}));
  EXPECT_EQ(calls.takeFirst()->request.arguments.at(0), Value(30));
  EXPECT_TRUE(calls.empty());
  EXPECT_FALSE(calls.takeFirst());
  EXPECT_FALSE(calls.earliestDeadline());
}

TEST(WaitingCallsTest, GivesAllBackInTheirOrder) {
  WaitingCalls calls;
  for (const int deadline : {30, 10, 20}) calls.add(callAt(deadline));
  EXPECT_EQ(numbersOf(calls.takeAll()), (std::vector<Value>{30, 10, 20}));
  EXPECT_TRUE(calls.empty());
  EXPECT_FALSE(calls.earliestDeadline());
}

}  // namespace
}  // namespace tallyd
