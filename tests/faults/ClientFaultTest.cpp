// Clients that die, flood, stall or say nothing: each costs its own session at most.

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <thread>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

class ClientFaultTest : public FaultFixture {
 protected:
  static Dictionary userInfo() { return {{"ClientName", "demo"}}; }
  static Dictionary payload() { return {{"number", 5}, {"text", "some text"}, {"ok", true}}; }

  /// All that a client says who configures, starts, sends a message and leaves.
  static std::string wholeConversation() {
    return bus_calls::authentication() +
           bus_calls::setSessionInfo(1, sessionInfo(7), userInfo(), Answer::NotWanted) +
           bus_calls::plain(2, "StartConfig", Answer::NotWanted) +
           bus_calls::sendMessage(3, kMethod, 0, payload(), Answer::NotWanted);
  }
  /// Many calls of a session that is not delayed: far below what a client would wait for one.
  static void expectPrompt(TestDaemon& daemon) {
    constexpr int kCalls = 100;
    constexpr std::chrono::seconds kInAll{5};
    const auto start = std::chrono::steady_clock::now();
    const auto session = startedSession(daemon, sessionInfo(998));
    sendMessages(*session, kCalls);
    EXPECT_LT(std::chrono::steady_clock::now() - start, kInAll);
  }
  /// Writes questions until the daemon takes no more: not a byte, whenever it is tried again, while it serves
  /// others and so has the time to read. False when it has taken far more than sockets and queues hold.
  static bool isRefusedForGood(TestDaemon& daemon, const BusClient& deaf, const std::string& question) {
    constexpr std::size_t kFarTooMuch = 200'000;
    constexpr int kTimes = 4;
    constexpr std::chrono::milliseconds kBetween{100};
    std::size_t written = 0;
    int refusals = 0;
    while (refusals < kTimes && written < kFarTooMuch * question.size()) {
      const std::size_t taken = deaf.writeSome(std::string_view(question).substr(written % question.size()));
      written += taken;
      refusals = taken > 0 ? 0 : refusals + 1;
      if (taken > 0) continue;
      expectPrompt(daemon);
      deaf.waitForRoom(kBetween);
    }
    return refusals == kTimes;
  }
};

TEST_F(ClientFaultTest, EndsTheSessionOfAClientThatDiesAtAnyByte) {
  TestDaemon daemon(root, {.arguments = {"--log-level", "critical"}});
  expectServed(daemon);
  static_cast<void>(settledPosts());
  const ProcessFigures before = figuresOf(daemon.process().pid());
  const std::string conversation = wholeConversation();
  const std::size_t messageEnds = conversation.size();
  for (std::size_t length = 0; length <= messageEnds; ++length) {
    BusClient(root.socket()).write(std::string_view(conversation).substr(0, length));
  }
  TallyInspection inspection(inspectionSocket());
  const Dictionary stats = statsWhen(inspection, [&](const Dictionary& now) {
    return nothingUnderWay(now) &&
           number(*now.dictionary("connections"), "accepted") == 2 + static_cast<std::int64_t>(messageEnds);
  });
  const Posts posts = postsIn(stats);
  EXPECT_EQ(posts.accepted, posts.sent);
  EXPECT_EQ(receivedEvents(collector).size(), static_cast<std::size_t>(posts.sent));
  // Only the last one got its message across.
  const auto events = receivedEvents(collector);
  EXPECT_EQ(std::count_if(events.begin(), events.end(),
                          [](const Dictionary& event) { return event.string("text") == "some text"; }),
            1);
  const ProcessFigures after = figuresOf(daemon.process().pid());
  constexpr std::size_t kKeptConnections = 9;  // To the collector, and the inspection's.
  EXPECT_LE(after.descriptors, before.descriptors + kKeptConnections);
  expectPrompt(daemon);
}

TEST_F(ClientFaultTest, ServesOthersWhileAClientFloods) {
  TestDaemon daemon(root, {.arguments = {"--log-level", "critical"}});
  BusClient flood(root.socket());
  flood.authenticate();
  flood.startSession(sessionInfo(7), userInfo());
  std::atomic<bool> enough = false;
  std::atomic<std::int64_t> flooded = 0;
  std::thread flooding([&] {
    while (!enough) {
      for (int i = 0; i < 20; ++i) flood.sendMessage(kMethod, 0, payload(), Answer::NotWanted);
      flooded += 20;
    }
    flood.close();
  });
  expectPrompt(daemon);
  enough = true;
  flooding.join();
  const Posts posts = settledPosts();
  EXPECT_EQ(posts.accepted, flooded + kRecordsOfASession + 100 + kRecordsOfASession);
  EXPECT_EQ(posts.sent, posts.accepted);
  EXPECT_EQ(receivedEvents(collector).size(), static_cast<std::size_t>(posts.sent));
}

TEST_F(ClientFaultTest, HoldsBackAClientThatAsksAndNeverReads) {
  TestDaemon daemon(root, {.arguments = {"--log-level", "critical"}});
  BusClient deaf(root.socket());
  deaf.authenticate();
  deaf.startSession(sessionInfo(7), userInfo());
  const std::size_t before = figuresOf(daemon.process().pid()).residentBytes;
  EXPECT_TRUE(isRefusedForGood(daemon, deaf, bus_calls::plain(1000, "FetchDisplayURL", Answer::Wanted)));
  constexpr std::size_t kMostForOne = (16U << 20U) * kSanitizersShare;
  EXPECT_LT(figuresOf(daemon.process().pid()).residentBytes, before + kMostForOne);
}

TEST_F(ClientFaultTest, ServesOthersWhileClientsStallWithinACallOrSayNothing) {
  TestDaemon daemon(root, {.arguments = {"--log-level", "critical"}});
  const std::string conversation = wholeConversation();
  std::vector<std::unique_ptr<BusClient>> stalled;
  constexpr std::size_t kClients = 300;
  for (std::size_t i = 0; i < kClients; ++i) {
    stalled.push_back(std::make_unique<BusClient>(root.socket()));
    stalled.back()->write(std::string_view(conversation).substr(0, i * conversation.size() / kClients));
  }
  const double processor = figuresOf(daemon.process().pid()).processorSeconds;
  expectPrompt(daemon);
  EXPECT_LT(figuresOf(daemon.process().pid()).processorSeconds - processor, 5.0);
  stalled.clear();
  const Posts posts = settledPosts();
  EXPECT_EQ(posts.accepted, posts.sent);
}

}  // namespace
}  // namespace tallyd::test
