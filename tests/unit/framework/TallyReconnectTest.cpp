// A daemon that comes, goes and comes back, on a real socket.

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <csignal>
#include <functional>
#include <thread>

#include "fakes/TemporaryFolder.h"
#include "framework/TallyConnection.h"
#include "unit/framework/ScriptedDaemon.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using std::chrono::milliseconds;
using Method = ClientSessionMethod;

/// What happened, in its order; waits with a deadline.
class Notes {
 public:
  void add(std::string note) {
    const std::lock_guard lock(_mutex);
    _notes.push_back(std::move(note));
    _changed.notify_all();
  }
  std::vector<std::string> wait(std::size_t count) {
    std::unique_lock lock(_mutex);
    EXPECT_TRUE(_changed.wait_for(lock, std::chrono::seconds(30), [&] { return _notes.size() >= count; }));
    return _notes;
  }

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::string> _notes;
};

class TallyReconnectTest : public testing::Test {
 protected:
  void startDaemon() { _daemon = std::make_unique<ScriptedDaemon>(_path, ScriptedDaemon::Answers::Fitting); }
  [[nodiscard]] TallyConnectionOptions options() const {
    return {.socketPath = _path, .firstPause = milliseconds(1), .maximumPause = milliseconds(20)};
  }
  void watch(TallyConnection& connection) {
    connection.setInterruptionHandler([this] { _notes.add("interrupted"); });
    connection.setInvalidationHandler([this] { _notes.add("invalidated"); });
    connection.setReconnectionHandler([this] { _notes.add("reconnected"); });
  }
  static std::vector<Method> methodsOf(const std::vector<ReceivedCall>& calls) {
    std::vector<Method> methods;
    for (const auto& each : calls) methods.push_back(each.method);
    return methods;
  }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "service";
  std::unique_ptr<ScriptedDaemon> _daemon;
  Notes _notes;
  const Dictionary _info{{"SessionID", 7}};
};

TEST_F(TallyReconnectTest, ACallMadeBeforeTheDaemonIsThereIsAnsweredWhenItComes) {
  TallyConnection connection(options());
  std::thread later([this] { startDaemon(); });
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "text");
  later.join();
}

TEST_F(TallyReconnectTest, ConfiguresTheNewSessionBeforeAnythingElseIsSent) {
  startDaemon();
  TallyConnection connection(options());
  watch(connection);
  EXPECT_EQ(connection.setSessionInfoSync(_info, Dictionary{{"ClientName", "a"}}, {"F"}).value, "text");
  connection.startConfig({});
  _daemon->calls(2);
  _daemon.reset();
  EXPECT_EQ(_notes.wait(1), std::vector<std::string>{"interrupted"});
  connection.flushMessages({});  // Waits for the daemon to come back.
  startDaemon();
  const auto calls = _daemon->calls(3);
  EXPECT_EQ(methodsOf(calls),
            (std::vector{Method::SetSessionInfo, Method::StartConfig, Method::FlushMessages}));
  EXPECT_EQ(calls[0].arguments,
            (std::vector{Value(Array{Value(_info)}), Value(Array{Value(Dictionary{{"ClientName", "a"}})}),
                         Value(Array{Value("F")})}));
  EXPECT_EQ(_notes.wait(2), (std::vector<std::string>{"interrupted", "reconnected"}));
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "text");
}

TEST_F(TallyReconnectTest, ACallUnderWayFailsAndReachesTheNextDaemonNot) {
  startDaemon();
  _daemon->answerNothing();
  TallyConnection connection(options());
  connection.sendMessage(1, 2, _info, [this](const auto& reply) {
    _notes.add(reply.kind == TallyError::Disconnected ? "disconnected" : "other");
  });
  _daemon->calls(1);
  _daemon.reset();
  EXPECT_EQ(_notes.wait(1), std::vector<std::string>{"disconnected"});
  startDaemon();
  EXPECT_EQ(connection.fetchDisplayURLSync().value, "text");
  EXPECT_EQ(methodsOf(_daemon->calls(1)), std::vector{Method::FetchDisplayURL});
}

TEST_F(TallyReconnectTest, ComesBackEveryTime) {
  TallyConnection connection(options());
  for (int i = 0; i < 5; ++i) {
    startDaemon();
    const auto reply = connection.fetchDisplayURLSync();
    EXPECT_EQ(reply.value, "text") << reply.error.value_or("");
    _daemon.reset();
  }
}

TEST_F(TallyReconnectTest, GivesUpAfterTheAttemptsThatItWasGiven) {
  auto few = options();
  few.maximumAttempts = 3;
  TallyConnection connection(few);
  watch(connection);
  const auto reply = connection.fetchDisplayURLSync();
  EXPECT_EQ(reply.kind, TallyError::Closed);
  EXPECT_NE(reply.error.value_or("").find(_path.string()), std::string::npos) << reply.error.value_or("");
  EXPECT_EQ(_notes.wait(1), std::vector<std::string>{"invalidated"});
}

TEST_F(TallyReconnectTest, EveryCompletionRunsOnceWhateverHappens) {
  constexpr std::size_t kThreads = 4;
  constexpr std::size_t kCallsEach = 500;
  std::vector<std::atomic<int>> times(kThreads * kCallsEach);
  {
    auto tight = options();
    tight.maximumCalls = 300;
    tight.closeTimeout = milliseconds(100);
    TallyConnection connection(tight);
    std::vector<std::thread> threads;
    for (std::size_t thread = 0; thread < kThreads; ++thread) {
      threads.emplace_back([&, thread] {
        for (std::size_t i = 0; i < kCallsEach; ++i) {
          auto& counter = times[thread * kCallsEach + i];
          connection.fetchDisplayURL([&counter](const auto&) { ++counter; });
        }
      });
    }
    for (int i = 0; i < 3; ++i) {
      startDaemon();
      connection.fetchDisplayURLSync(milliseconds(100));
      if (i == 1) _daemon->answerNothing();
      _daemon.reset();
    }
    for (auto& thread : threads) thread.join();
  }
  for (const auto& each : times) EXPECT_EQ(each, 1);
}

TEST_F(TallyReconnectTest, CallsThatCompletionsMakeWhileTheConnectionIsDestroyedAreCompletedToo) {
  startDaemon();
  _daemon->answerNothing();
  std::atomic<int> completed = 0;
  std::function<void(int)> call;
  {
    auto hasty = options();
    hasty.closeTimeout = milliseconds(50);
    TallyConnection connection(hasty);
    call = [&](int more) {
      connection.fetchDisplayURL([&, more](const auto& reply) {
        EXPECT_TRUE(reply.error);
        ++completed;
        if (more > 0) call(more - 1);
      });
    };
    call(10);
    _daemon->calls(1);
  }
  EXPECT_EQ(completed, 11);
}

TEST_F(TallyReconnectTest, ASynchronousCallFromACompletionFailsAtOnce) {
  startDaemon();
  TallyConnection connection(options());
  connection.fetchDisplayURL([&](const auto&) {
    const auto reply = connection.fetchDisplayURLSync();
    _notes.add(reply.kind == TallyError::OwnThread ? "own thread" : "waited");
  });
  EXPECT_EQ(_notes.wait(1), std::vector<std::string>{"own thread"});
}

TEST_F(TallyReconnectTest, SignalsAreLeftToTheProgramsOwnThreads) {
  startDaemon();
  TallyConnection connection(options());
  connection.fetchDisplayURL([&](const auto&) {
    sigset_t blocked;
    sigemptyset(&blocked);
    pthread_sigmask(SIG_BLOCK, nullptr, &blocked);
    _notes.add(sigismember(&blocked, SIGTERM) == 1 && sigismember(&blocked, SIGCHLD) == 1 ? "blocked"
                                                                                          : "open");
  });
  EXPECT_EQ(_notes.wait(1), std::vector<std::string>{"blocked"});
  sigset_t own;
  pthread_sigmask(SIG_BLOCK, nullptr, &own);
  EXPECT_EQ(sigismember(&own, SIGTERM), 0);
}

}  // namespace
}  // namespace tallyd
