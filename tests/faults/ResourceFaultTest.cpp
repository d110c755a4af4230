// Descriptors that run out: the daemon waits, says so, and serves again afterwards.

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

class ResourceFaultTest : public FaultFixture {
 protected:
  static constexpr int kDescriptors = 60;
  using Clients = std::vector<std::unique_ptr<BusClient>>;

  /// Clients that leave the daemon without a descriptor; more of them wait.
  [[nodiscard]] Clients takeAllDescriptors(TestDaemon& daemon) const {
    Clients greedy;
    for (int i = 0; i < 100; ++i) greedy.push_back(std::make_unique<BusClient>(root.socket()));
    EXPECT_TRUE(daemon.process().waitForLineStartingWith("<2>Cannot accept connections at present: "));
    // What it closes of its own goes to one of those who wait.
    const auto deadline = std::chrono::steady_clock::now() + WatchedProcess::kPatience;
    while (hasFreeDescriptor(daemon.process().pid()) && std::chrono::steady_clock::now() < deadline) {
    }
    EXPECT_FALSE(hasFreeDescriptor(daemon.process().pid()));
    return greedy;
  }

 private:
  static bool hasFreeDescriptor(pid_t process) {
    const std::filesystem::path taken = "/proc/" + std::to_string(process) + "/fd";
    for (int i = 0; i < kDescriptors; ++i) {
      if (!std::filesystem::is_symlink(taken / std::to_string(i))) return true;
    }
    return false;
  }
};

TEST_F(ResourceFaultTest, TakesNoProcessorTimeWhileItHasNoDescriptorForWhoWaits) {
  TestDaemon daemon(root, {.descriptorLimit = kDescriptors});
  expectServed(daemon);
  Clients greedy = takeAllDescriptors(daemon);
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
  constexpr int kMessages = 10;
  constexpr std::int64_t kEvents = kMessages + 1;  // With the start record; later with the stop record.
  const LoopbackServer unknown;
  TestDaemon daemon(root, {.descriptorLimit = kDescriptors});
  expectServed(daemon);
  const Posts before = settledPosts();
  EXPECT_EQ(before.sent, before.accepted);
  TallyInspection inspection(inspectionSocket());
  postTo(unknown.url("/events"));
  // What a session holds back goes to its collector at the flush, and there is no connection before.
  auto session = startedSession(daemon, sessionInfo(7, 5, {{"BatchEvent", true}}));
  sendMessages(*session, kMessages);
  {
    const auto greedy = takeAllDescriptors(daemon);
    EXPECT_EQ(session->flushMessagesSync().error, std::nullopt);
    statsWhen(inspection, [](const Dictionary& now) { return postsIn(now).failed == kEvents; });
    EXPECT_EQ(linesWith(daemon, "<3>Tally(sendMessage) post error: ", unknown.url("/events"), 1), 1U);
    EXPECT_TRUE(unknown.requests().empty());
  }
  sendMessages(*session, kMessages);
  EXPECT_EQ(session->flushMessagesSync().error, std::nullopt);
  EXPECT_TRUE(unknown.waitForRequests(1));
  session.reset();
  const Dictionary stats = statsWhen(
      inspection, [&before](const Dictionary& now) { return postsIn(now).sent == before.sent + kEvents; });
  const Posts posts = postsIn(stats);
  EXPECT_EQ(posts.accepted, before.accepted + 2 * kEvents);
  EXPECT_EQ(posts.failed, kEvents);
  EXPECT_EQ(receivedEvents(unknown).size(), static_cast<std::size_t>(kEvents));
  expectServed(daemon);
}

}  // namespace
}  // namespace tallyd::test
