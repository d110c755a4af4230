// Descriptors that run out: the daemon waits, says so, and serves again afterwards.

#include <gtest/gtest.h>

#include <future>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

class ResourceFaultTest : public FaultFixture {};

TEST_F(ResourceFaultTest, TakesNoProcessorTimeWhileItHasNoDescriptorForWhoWaits) {
  TestDaemon daemon(root, {.descriptorLimit = 60});
  expectServed(daemon);
  std::vector<std::unique_ptr<BusClient>> greedy;
  for (int i = 0; i < 100; ++i) greedy.push_back(std::make_unique<BusClient>(root.socket()));
  ASSERT_TRUE(daemon.process().waitForLineStartingWith("<2>Cannot accept connections at present: "));
  // How busy it is can only be seen over a time.
  constexpr std::chrono::seconds kWatched{1};
  const double before = figuresOf(daemon.process().pid()).processorSeconds;
  std::promise<void> never;
  EXPECT_EQ(never.get_future().wait_for(kWatched), std::future_status::timeout);
  EXPECT_LT(figuresOf(daemon.process().pid()).processorSeconds - before, 0.2);
  greedy.clear();
  expectServed(daemon);
}

TEST_F(ResourceFaultTest, BooksThePostsForWhichThereIsNoDescriptor) {
  TestDaemon daemon(root, {.descriptorLimit = 60});
  std::int64_t events = 0;
  {
    const auto session = startedSession(daemon, sessionInfo(7));
    // The collector that the posts of this session had a connection to is not the one that they go to next.
    const LoopbackServer other;
    postTo(other.url("/events"));
    const auto second = startedSession(daemon, sessionInfo(8));
    ASSERT_TRUE(other.waitForRequests(1));
    std::vector<std::unique_ptr<BusClient>> greedy;
    for (int i = 0; i < 100; ++i) greedy.push_back(std::make_unique<BusClient>(root.socket()));
    ASSERT_TRUE(daemon.process().waitForLineStartingWith("<2>Cannot accept connections at present: "));
    sendMessages(*session, 10);
    sendMessages(*second, 10);
    greedy.clear();
    events = 20 + 2 * kRecordsOfASession;
  }
  const Posts posts = settledPosts();
  EXPECT_EQ(posts.accepted, events);
  EXPECT_EQ(posts.accepted, posts.sent + posts.failed);
  expectServed(daemon);
}

}  // namespace
}  // namespace tallyd::test
