#include "support/Account.h"

#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>

namespace tallyd {
namespace {

using platform::Dictionary;

TEST(AccountTest, BeginsWithNothing) {
  const Account account;
  EXPECT_EQ(account.counts(), AccountCounts());
  EXPECT_TRUE(account.counts().isBalanced());
}

TEST(AccountTest, FollowsAPieceThroughItsPlaces) {
  Account account;
  account.hold(3);
  EXPECT_EQ(account.counts().held, 3U);
  account.startHeld(2);
  EXPECT_EQ(account.counts().held, 1U);
  EXPECT_EQ(account.counts().inFlight, 2U);
  account.holdBack();
  EXPECT_EQ(account.counts().held, 2U);
  account.finish();
  EXPECT_EQ(account.counts().inFlight, 0U);
  EXPECT_EQ(account.counts().sent, 1U);
  account.dropHeld(DropReason::CleanUp, 2);
  const auto counts = account.counts();
  EXPECT_EQ(counts.held, 0U);
  EXPECT_EQ(counts.droppedFor(DropReason::CleanUp), 2U);
  EXPECT_EQ(counts.accepted, 3U);
  EXPECT_TRUE(counts.isBalanced());
}

TEST(AccountTest, CountsWhatIsSentOrDroppedAtOnceAsAccepted) {
  Account account;
  account.send(2);
  account.dropNew(DropReason::StateOff);
  account.start(4);
  account.drop(DropReason::PostFailed, 3);
  const auto counts = account.counts();
  EXPECT_EQ(counts.accepted, 7U);
  EXPECT_EQ(counts.sent, 2U);
  EXPECT_EQ(counts.inFlight, 1U);
  EXPECT_EQ(counts.droppedInAll(), 4U);
  EXPECT_EQ(counts.droppedFor(DropReason::PostFailed), 3U);
  EXPECT_TRUE(counts.isBalanced());
}

TEST(AccountTest, CountsWhatTheServerRefusedAmongTheSent) {
  Account account;
  account.start(5);
  account.finish(2, Account::Answer::Refused);
  account.finish(3);
  EXPECT_EQ(account.counts().sent, 5U);
  EXPECT_EQ(account.counts().refused, 2U);
  EXPECT_TRUE(account.counts().isBalanced());
}

TEST(AccountTest, KeepsWhatPassesByOutOfTheBalance) {
  Account account;
  account.passBy();
  EXPECT_EQ(account.counts().passedBy, 1U);
  EXPECT_EQ(account.counts().accepted, 0U);
  EXPECT_TRUE(account.counts().isBalanced());
}

TEST(AccountTest, ShowsEveryReasonThatHasOccurredByItsName) {
  Account account;
  Dictionary expected;
  std::uint64_t count = 0;
  for (std::size_t i = 0; i < kDropReasonCount; ++i) {
    account.dropNew(static_cast<DropReason>(i), ++count);
    expected.set(kDropReasonNames[i], count);
  }
  EXPECT_EQ(expected.size(), kDropReasonCount);  // No name twice.
  EXPECT_EQ(*account.counts().dictionary().dictionary("dropped"), expected);
  EXPECT_EQ(AccountCounts().dictionary().dictionary("dropped")->size(), 0U);
}

TEST(AccountTest, AddsCountsUp) {
  Account one;
  one.hold(2);
  one.passBy();
  Account other;
  other.start(3);
  other.finish(1, Account::Answer::Refused);
  other.drop(DropReason::GivenUp);
  AccountCounts sum = one.counts();
  sum += other.counts();
  const Dictionary expected{{"accepted", 5},
                            {"sent", 1},
                            {"refused", 1},
                            {"held", 2},
                            {"inFlight", 1},
                            {"passedBy", 1},
                            {"dropped", Dictionary{{"given-up", 1}}}};
  EXPECT_EQ(sum.dictionary(), expected);
  EXPECT_TRUE(sum.isBalanced());
}

TEST(AccountTest, TellsAnImbalance) {
  AccountCounts counts;
  counts.accepted = 1;
  EXPECT_FALSE(counts.isBalanced());
  counts.dropped[0] = 1;
  EXPECT_TRUE(counts.isBalanced());
}

TEST(AccountTest, IsBalancedAtEveryInstantForAnotherThread) {
  Account account;
  constexpr std::uint64_t kLooks = 5'000;
  std::atomic<bool> done = false;
  std::atomic<std::uint64_t> looks = 0;
  std::uint64_t unbalanced = 0;
  std::thread looker([&] {
    while (!done) {
      if (!account.counts().isBalanced()) ++unbalanced;
      ++looks;
    }
  });
  std::mt19937 random(20'261);
  for (int i = 0; i < 20'000 || looks < kLooks; ++i) {
    const std::uint64_t count = 1 + random() % 5;
    account.hold(count);
    account.startHeld(count);
    account.start(count);
    account.holdBack(count);
    account.finish(count);
    account.dropHeld(DropReason::QueueFull, count);
    account.dropNew(DropReason::MethodLimit, count);
  }
  done = true;
  looker.join();
  EXPECT_EQ(unbalanced, 0U);
  EXPECT_EQ(account.counts().held + account.counts().inFlight, 0U);
}

}  // namespace
}  // namespace tallyd
