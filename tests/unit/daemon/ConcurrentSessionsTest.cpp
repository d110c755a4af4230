// Many sessions at once, each on a thread of its own as on a queue of its own.

#include <thread>

#include "AgentFixture.h"

namespace tallyd {
namespace {

/// Fakes that count are for one thread; these two are asked by all sessions.
class LockedRandomness : public platform::Randomness {
 public:
  double drand48() override {
    const std::lock_guard lock(_mutex);
    return _fake.drand48();
  }
  platform::UUIDBytes uuid() override {
    const std::lock_guard lock(_mutex);
    return _fake.uuid();
  }

 private:
  std::mutex _mutex;
  fakes::FakeRandomness _fake;
};

class FixedDevice : public platform::DeviceProperties {
 public:
  [[nodiscard]] std::optional<std::string> GNCopyAnswer(std::string_view question) const override {
    if (question == "ReleaseType") return std::nullopt;
    return "answer to " + std::string(question);
  }
  [[nodiscard]] std::optional<platform::UUIDBytes> machineIdentifier(std::string_view) const override {
    return platform::UUIDBytes{};
  }
};

class ConcurrentSessionsTest : public AgentFixture {
 protected:
  static constexpr int kThreads = 8;
  static constexpr int kSessionsOfAThread = 12;

  std::shared_ptr<fakes::FakeServiceConnection> connectShared() {
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    EXPECT_TRUE(sharedAgent.shouldAcceptNewConnection(connection));
    return connection;
  }
  template <class Work>
  static void onManyThreads(Work work) {
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) threads.emplace_back([work, thread] { work(thread); });
    for (std::thread& thread : threads) thread.join();
  }
  std::size_t linesEndingWith(std::string_view end) const {
    const auto lines = fake.log.lines();
    return static_cast<std::size_t>(std::count_if(
        lines.begin(), lines.end(), [&](const auto& line) { return line.text.ends_with(end); }));
  }

  LockedRandomness randomness;
  FixedDevice device;
  platform::Platform shared{
      fake.root,     fake.log,         fake.clock,    randomness, fake.locale,          fake.queues,
      fake.http,     fake.preferences, fake.defaults, device,     fake.frameworkBundle, fake.sandbox,
      fake.powerLog, fake.codeBundles, fake.process};
  TallydAgent sharedAgent{shared};
};

TEST_F(ConcurrentSessionsTest, SessionsComeAndGoAndChangeTheirUserInfo) {
  fake.http.answer = StorebagServer("max-age=0");
  const char* const services[] = {"calls", "video", "text"};
  std::atomic<int> failures = 0;
  onManyThreads([&](int thread) {
    const auto check = [&](const auto& call, const char* answer) {
      if (call->replies.size() != 1 || call->replies[0] != std::vector<Value>{answer}) ++failures;
    };
    for (int i = 0; i < kSessionsOfAThread; ++i) {
      const auto connection = connectShared();
      const Dictionary info = sessionInfo(thread * 100 + i, 5 + (thread + i) % 3);
      check(connection->call("SetSessionInfo", {some(info), some(userInfo("phone", "calls")), none()}),
            "received");
      connection->call("StartConfig");
      for (const char* service : services) {
        connection->call("FetchStates", {some(userInfo("phone", service))});
        connection->call("SendMessageWithCategory", {1, 2, some({{"a", i}})});
      }
      connection->call("FetchDisplayURL");
      if (i % 3 == 0) {
        check(connection->call("SendMessageWithSessionInfo",
                               {some(info), some(userInfo("Phone", "calls")), 3, 4, none()}),
              "finished");
      }
      if (i % 4 == 0) connection->call("StartConfig");
      connection->call("FlushMessages");
      if (i % 2 == 0) connection->interrupt();
      connection->invalidate();
    }
  });
  fake.queues.run();
  EXPECT_EQ(failures, 0);
  EXPECT_EQ(linesEndingWith(" was invalidated"), std::size_t{kThreads * kSessionsOfAThread});
  fake.log.clear();
  connectShared()->invalidate();
  EXPECT_EQ(fake.log.lines().at(0).text,
            "Accepting new XPC connection client 1 of user 0, 0(3) connections.");
}

TEST_F(ConcurrentSessionsTest, ChildrenReadTheirParentsWhileThoseChange) {
  // One thread's session is everybody's parent: its ID grows, its backends are replaced, while the others
  // ask.
  const auto parent = connectShared();
  parent->call("SetSessionInfo", {some(sessionInfo(1, 5)), some(userInfo("phone", "calls")), none()});
  parent->call("StartConfig");
  onManyThreads([&](int thread) {
    if (thread == 0) {
      for (int i = 0; i < kSessionsOfAThread; ++i) {
        parent->call("StartConfig");
        parent->call("FetchStates", {some(userInfo("phone", i % 2 == 0 ? "video" : "calls"))});
      }
      return;
    }
    const auto child = connectShared();
    child->call("SetSessionInfo", {some(sessionInfo(thread, 6)), some(userInfo("phone", "calls")), none()});
    child->call("StartConfig");
    for (int i = 0; i < kSessionsOfAThread; ++i) {
      child->call("FetchStates", {some(userInfo("phone", i % 2 == 0 ? "calls" : "video"))});
    }
    child->invalidate();
  });
  parent->invalidate();
  EXPECT_EQ(linesEndingWith(" was invalidated"), std::size_t{kThreads});
  EXPECT_EQ(fake.log.count(platform::LogLevel::Critical, "ERROR: No sessions found for user info key :"), 0U);
}

TEST_F(ConcurrentSessionsTest, AllSessionsLiveAtOnce) {
  std::vector<std::shared_ptr<fakes::FakeServiceConnection>> connections(kThreads * kSessionsOfAThread);
  onManyThreads([&](int thread) {
    for (int i = 0; i < kSessionsOfAThread; ++i) {
      auto& connection = connections[static_cast<std::size_t>(thread * kSessionsOfAThread + i)];
      connection = connectShared();
      connection->call("SetSessionInfo",
                       {some(sessionInfo(i, 5 + thread % 3)), some(userInfo("phone", "calls")), none()});
    }
  });
  fake.log.clear();
  connectShared()->invalidate();
  EXPECT_EQ(fake.log.lines().at(0).text,
            "Accepting new XPC connection client 1 of user 0, 96(1) connections.");
  onManyThreads([&](int thread) {
    for (int i = 0; i < kSessionsOfAThread; ++i) {
      connections[static_cast<std::size_t>(thread * kSessionsOfAThread + i)]->invalidate();
    }
  });
  fake.log.clear();
  connectShared()->invalidate();
  EXPECT_EQ(fake.log.lines().at(0).text,
            "Accepting new XPC connection client 1 of user 0, 0(1) connections.");
}

}  // namespace
}  // namespace tallyd
