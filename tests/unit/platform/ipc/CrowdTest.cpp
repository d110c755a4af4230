#include <sys/resource.h>

#include "IPCTest.h"

namespace tallyd::platform {
namespace {

using CrowdTest = IPCTest;

TEST_F(CrowdTest, AClientThatDoesNotReadIsNotReadFromAndDisturbsNobody) {
  constexpr std::uint32_t kCalls = 2'000;
  constexpr std::uint32_t kAnswerBytes = 64 * 1024;
  constexpr int kPatienceMs = 300;
  RawClient greedy(_socketPath);
  greedy.authenticate();
  std::uint32_t sent = 0;
  const auto nextCall = [&] {
    return rawCall(sent + 1, "Large", "u", RawBytes().number(kAnswerBytes).bytes());
  };
  while (sent < kCalls && greedy.trySend(nextCall(), kPatienceMs)) ++sent;
  ASSERT_LT(sent, kCalls) << "everything was taken";
  EXPECT_LT(_service.events.count("Large"), kCalls / 2);

  const auto client = makeClient();
  for (int i = 0; i < 100; ++i) ASSERT_FALSE(call(*client, kEcho, {Value(i)}).error);

  // It reads at last, and gets everything.
  std::uint32_t received = 0;
  while (received < sent) {
    const auto answer = greedy.receiveMessage();
    ASSERT_TRUE(answer) << received << " of " << sent;
    EXPECT_GT(answer->size(), kAnswerBytes);
    ++received;
  }
  EXPECT_TRUE(_service.events.waitFor("Large", sent));
  EXPECT_EQ(_service.events.count("interrupted"), 0U);
}

TEST_F(CrowdTest, AClientThatNeverReadsCanLeave) {
  RawClient greedy(_socketPath);
  greedy.authenticate();
  std::uint32_t sent = 0;
  while (greedy.trySend(rawCall(sent + 1, "Large", "u", RawBytes().number(256 * 1024).bytes()), 100)) ++sent;
  greedy.close();
  EXPECT_TRUE(_service.events.waitFor("invalidated"));
  EXPECT_TRUE(_service.events.waitFor("dropped"));
}

TEST_F(CrowdTest, ManyClientsAreServedAtOnce) {
  constexpr std::size_t kClients = 500;
  constexpr rlim_t kDescriptors = 2 * kClients + 200;
  rlimit limit{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
  if (limit.rlim_cur < kDescriptors) {
    limit.rlim_cur = kDescriptors;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
  }
  std::vector<std::unique_ptr<RawClient>> clients;
  for (std::size_t i = 0; i < kClients; ++i) {
    clients.push_back(std::make_unique<RawClient>(_socketPath));
    clients.back()->authenticate();
  }
  for (const auto& client : clients) client->send(rawCall(1, "Nothing"));
  for (const auto& client : clients) EXPECT_TRUE(client->receiveMessage());
  EXPECT_TRUE(_service.events.waitFor("Nothing", kClients));
  clients.clear();
  EXPECT_TRUE(_service.events.waitFor("dropped", kClients));
  EXPECT_EQ(_service.events.count("interrupted"), 0U);
}

}  // namespace
}  // namespace tallyd::platform
