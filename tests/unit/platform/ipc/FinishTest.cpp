// Connections that the service ends.

#include <gtest/gtest.h>

#include "IPCTest.h"

namespace tallyd::platform {
namespace {

using FinishTest = IPCTest;

TEST_F(FinishTest, AnIdleConnectionIsInvalidatedAsIfTheClientHadLeft) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  EXPECT_TRUE(client.isClosedByPeer());
}

TEST_F(FinishTest, AConnectionThatSaidNothingYetIsInvalidatedToo) {
  RawClient client(_socketPath);
  ASSERT_TRUE(_service.events.waitFor("accepted"));
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
}

TEST_F(FinishTest, EveryCallThatHasArrivedIsHeardAndAnsweredFirst) {
  constexpr std::size_t kCalls = 200;
  RawClient client(_socketPath);
  client.authenticate();
  std::string calls;
  for (std::uint32_t i = 1; i <= kCalls; ++i) calls += rawCall(i, "Nothing");
  client.send(calls);
  _service.finishAll();
  std::size_t answers = 0;
  while (client.receiveMessage()) ++answers;
  EXPECT_EQ(answers, kCalls);
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  EXPECT_EQ(_service.events.count("Nothing"), kCalls);
}

TEST_F(FinishTest, WhatComesAfterwardsIsRefused) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  client.send(rawCall(2, "Nothing"));
  EXPECT_TRUE(client.isClosedByPeer());
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_F(FinishTest, AClientThatDoesNotReadIsNotWaitedFor) {
  RawClient client(_socketPath);
  client.authenticate();
  for (std::uint32_t i = 1; i <= 20; ++i) {
    client.send(rawCall(i, "Large", "u", RawBytes().number(1'000'000).bytes()));
  }
  ASSERT_TRUE(_service.events.waitFor("Large", 4));  // More than may wait for it.
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
}

TEST_F(FinishTest, AMessageThatIsCutOffInterrupts) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing") + rawCall(2, "Nothing").substr(0, 30));
  ASSERT_TRUE(client.receiveMessage());
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInterrupted);
}

TEST_F(FinishTest, ClientsHearThatTheConnectionHasEnded) {
  const auto client = makeClient();
  TestEvents events;
  client->setInvalidationHandler([&events] { events.add("invalidated"); });
  EXPECT_FALSE(call(*client, kNothing).error);
  _service.finishAll();
  EXPECT_TRUE(events.waitFor("invalidated"));
  client->setInvalidationHandler({});
}

TEST_F(FinishTest, FinishingTwiceDoesNoMoreThanOnce) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  _service.finishAll();
  _service.finishAll();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  _service.finishAll();
}

}  // namespace
}  // namespace tallyd::platform
