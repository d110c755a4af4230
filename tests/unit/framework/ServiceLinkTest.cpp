#include "framework/ServiceLink.h"

#include <gtest/gtest.h>

#include <future>

#include "fakes/FakeQueues.h"
#include "unit/framework/FakeChannels.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using std::chrono::milliseconds;
using Method = ClientSessionMethod;

class ServiceLinkTest : public testing::Test {
 protected:
  ~ServiceLinkTest() override {
    close();
    for (const int times : _completions) EXPECT_EQ(times, 1);
  }

  /// On queues that only run when they are told to.
  void close() {
    if (!_link) return;
    auto closed = std::async(std::launch::async,
                             [link = std::exchange(_link, nullptr)] { link->close(std::chrono::hours(1)); });
    while (closed.wait_for(milliseconds(1)) != std::future_status::ready) _queues.run();
    _queues.run();
  }

  void start() {
    _link = std::make_shared<ServiceLink>(
        _options,
        ServiceLink::Environment{_queues.makeSerialQueue("link"), _channels.connector(),
                                 [this] { return SteadyTime(_queues.now()); }, [this] { return _draw; }});
    note(ServiceLink::Handler::Interruption, "interrupted");
    note(ServiceLink::Handler::Invalidation, "invalidated");
    note(ServiceLink::Handler::Reconnection, "reconnected");
    _link->start();
    _queues.run();
  }
  void startAccepted() {
    start();
    _channels.last().accept();
  }
  void note(ServiceLink::Handler which, const char* event) {
    _link->setHandler(which, [this, event] { _events.emplace_back(event); });
  }
  bool submit(Method method = Method::FetchDisplayURL, std::vector<Value> arguments = {},
              milliseconds timeout = milliseconds(60'000)) {
    _completions.push_back(0);
    const bool taken = _link->submit({.method = method, .arguments = std::move(arguments)}, timeout,
                                     [this, index = _completions.size() - 1](ServiceReply reply) {
                                       ++_completions[index];
                                       _kinds.push_back(reply.kind);
                                       _errors.push_back(std::move(reply.error));
                                     });
    _queues.run();
    return taken;
  }
  void configure() {
    submit(Method::SetSessionInfo,
           {some({{"SessionID", 7}}), some({{"ClientName", "a"}}), Value(Array{"F"})});
    submit(Method::StartConfig);
  }
  static Value some(const Dictionary& dictionary) { return Value(Array{Value(dictionary)}); }

  TallyConnectionOptions _options{.socketPath = "/the/socket"};
  fakes::FakeQueues _queues;
  FakeChannels _channels;
  double _draw = 0;
  std::shared_ptr<ServiceLink> _link;
  std::vector<std::string> _events;
  std::vector<TallyError> _kinds;
  std::vector<std::string> _errors;
  std::vector<int> _completions;  ///< How often each call was completed.
};

TEST_F(ServiceLinkTest, CallsWaitForTheServiceAndLeaveInTheirOrder) {
  start();
  submit(Method::FetchDisplayURL);
  submit(Method::FlushMessages);
  EXPECT_TRUE(_channels.last().calls.empty());
  _channels.last().accept();
  EXPECT_EQ(_channels.last().methods(), (std::vector{Method::FetchDisplayURL, Method::FlushMessages}));
  _channels.last().answer(1);
  _channels.last().answer(0);
  EXPECT_EQ(_kinds, (std::vector{TallyError::None, TallyError::None}));
  EXPECT_TRUE(_events.empty());
}

TEST_F(ServiceLinkTest, ACallThatFollowsWaitingOnesWaitsToo) {
  startAccepted();
  _channels.last().room = 1;
  submit(Method::StartConfig);
  submit(Method::FetchDisplayURL);
  _channels.last().room = 1;
  submit(Method::FlushMessages);
  EXPECT_EQ(_channels.last().methods(), std::vector{Method::StartConfig});
  _channels.last().makeRoom(2);
  EXPECT_EQ(_channels.last().methods(),
            (std::vector{Method::StartConfig, Method::FetchDisplayURL, Method::FlushMessages}));
}

TEST_F(ServiceLinkTest, WhatIsLeftOfTheTimeGoesWithTheCall) {
  start();
  submit(Method::FetchDisplayURL, {}, milliseconds(1'000));
  _queues.advance(milliseconds(400));
  _channels.last().accept();
  EXPECT_EQ(_channels.last().calls.at(0).timeout, milliseconds(600));
}

TEST_F(ServiceLinkTest, AWaitingCallIsGivenUpJustAtItsDeadline) {
  start();
  submit(Method::FetchDisplayURL, {}, milliseconds(1'000));
  submit(Method::FlushMessages, {}, milliseconds(500));
  _queues.advance(milliseconds(499));
  EXPECT_TRUE(_kinds.empty());
  _queues.advance(milliseconds(1));
  EXPECT_EQ(_kinds, std::vector{TallyError::TimedOut});
  _queues.advance(milliseconds(499));
  EXPECT_EQ(_kinds.size(), 1U);
  _queues.advance(milliseconds(1));
  EXPECT_EQ(_kinds.size(), 2U);
  _channels.last().accept();
  EXPECT_TRUE(_channels.last().calls.empty());
}

TEST_F(ServiceLinkTest, ATimeoutNamesWhyThereIsNoConnection) {
  _channels.absent = true;
  start();
  submit(Method::FetchDisplayURL, {}, milliseconds(10));
  _queues.advance(milliseconds(10));
  ASSERT_EQ(_errors.size(), 1U);
  EXPECT_NE(_errors[0].find("no connection to the daemon within 10 ms: cannot connect to /the/socket"),
            std::string::npos)
      << _errors[0];
}

TEST_F(ServiceLinkTest, TheCallBeyondTheBoundIsRefusedAndEveryEarlierOneIsKept) {
  _options.maximumCalls = 3;
  start();
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(submit());
  EXPECT_FALSE(submit());
  EXPECT_EQ(_kinds, std::vector{TallyError::Refused});
  EXPECT_EQ(_errors[0], "3 calls are unfinished; no more are taken");
  _channels.last().accept();
  EXPECT_EQ(_channels.last().calls.size(), 3U);
  EXPECT_FALSE(submit());  // They are under way, which counts as well.
  _channels.last().answer(0);
  EXPECT_TRUE(submit());
}

TEST_F(ServiceLinkTest, ACallThatWantsNoAnswerIsFinishedOnceItHasLeft) {
  _options.maximumCalls = 1;
  startAccepted();
  for (int i = 0; i < 5; ++i) {
    EXPECT_TRUE(_link->submit({.method = Method::FlushMessages}, milliseconds(10), {}));
    _queues.run();
  }
  EXPECT_EQ(_channels.last().calls.size(), 5U);
}

TEST_F(ServiceLinkTest, TheSessionIsConfiguredAgainBeforeAnythingElse) {
  startAccepted();
  configure();
  submit(Method::FetchStates, {some({{"ClientName", "b"}})});
  _channels.last().end();
  submit(Method::FlushMessages);  // Made while the daemon is away.
  EXPECT_EQ(_events, std::vector<std::string>{"interrupted"});
  _queues.advance(milliseconds(100));
  ASSERT_EQ(_channels.made.size(), 2U);
  _channels.last().accept();
  submit(Method::FetchDisplayURL);
  EXPECT_EQ(_channels.last().methods(), (std::vector{Method::SetSessionInfo, Method::StartConfig,
                                                     Method::FlushMessages, Method::FetchDisplayURL}));
  EXPECT_EQ(_channels.last().calls[0].arguments,
            (std::vector{some({{"SessionID", 7}}), some({{"ClientName", "b"}}), Value(Array{"F"})}));
  EXPECT_EQ(_events, (std::vector<std::string>{"interrupted", "reconnected"}));
}

TEST_F(ServiceLinkTest, WhatWasUnderWayFailsAndIsNotSentAgain) {
  startAccepted();
  submit(Method::SendMessageWithCategory);
  _channels.last().end();
  EXPECT_EQ(_kinds, std::vector{TallyError::Disconnected});
  _queues.advance(milliseconds(100));
  _channels.last().accept();
  EXPECT_TRUE(_channels.last().calls.empty());
  EXPECT_EQ(_kinds.size(), 1U);
}

TEST_F(ServiceLinkTest, WhatHadNotLeftSurvivesTheBreak) {
  startAccepted();
  _channels.last().room = 0;
  submit(Method::SendMessageWithCategory);
  _channels.last().end();
  EXPECT_TRUE(_kinds.empty());
  _queues.advance(milliseconds(100));
  _channels.last().accept();
  EXPECT_EQ(_channels.last().methods(), std::vector{Method::SendMessageWithCategory});
}

TEST_F(ServiceLinkTest, PausesGrowToTheMaximumAndAnAnswerSetsThemBack) {
  _options.maximumPause = milliseconds(300);
  _channels.absent = true;
  start();
  EXPECT_EQ(_channels.attempts, 1);
  for (const int pause : {100, 200, 300, 300}) {
    const int before = _channels.attempts;
    _queues.advance(milliseconds(pause - 1));
    EXPECT_EQ(_channels.attempts, before);
    _queues.advance(milliseconds(1));
    EXPECT_EQ(_channels.attempts, before + 1);
  }
  _channels.absent = false;
  _queues.advance(milliseconds(300));
  _channels.last().accept();
  submit();
  _channels.last().answer(0);
  _channels.last().end();
  const int before = _channels.attempts;
  _queues.advance(milliseconds(100));
  EXPECT_EQ(_channels.attempts, before + 1);
}

TEST_F(ServiceLinkTest, AServiceThatAcceptsAndAnswersNothingDoesNotSetThePausesBack) {
  startAccepted();
  _channels.last().end();
  _queues.advance(milliseconds(100));
  _channels.last().accept();
  _channels.last().end();
  _queues.advance(milliseconds(199));
  EXPECT_EQ(_channels.attempts, 2);
  _queues.advance(milliseconds(1));
  EXPECT_EQ(_channels.attempts, 3);
}

TEST_F(ServiceLinkTest, AServiceThatNeverAcceptsIsTriedAgain) {
  _options.timeout = milliseconds(1'000);
  start();
  _queues.advance(milliseconds(999));
  EXPECT_FALSE(_channels.made[0]->ended);
  _queues.advance(milliseconds(1));
  EXPECT_TRUE(_channels.made[0]->ended);
  _queues.advance(milliseconds(100));
  EXPECT_EQ(_channels.made.size(), 2U);
  EXPECT_TRUE(_events.empty());  // Nothing was lost.
}

TEST_F(ServiceLinkTest, AfterTheLastAttemptEverythingFailsAndTheLinkIsInvalid) {
  _options.maximumAttempts = 2;
  _channels.absent = true;
  start();
  submit();
  _queues.advance(milliseconds(300));
  EXPECT_EQ(_channels.attempts, 3);
  EXPECT_EQ(_kinds, std::vector{TallyError::Closed});
  EXPECT_EQ(_events, std::vector<std::string>{"invalidated"});
  EXPECT_TRUE(submit());
  EXPECT_EQ(_kinds.size(), 2U);
  _queues.advance(milliseconds(100'000));
  EXPECT_EQ(_channels.attempts, 3);
}

TEST_F(ServiceLinkTest, WithoutReconnectingTheFirstBreakIsTheEnd) {
  _options.reconnect = TallyReconnect::Never;
  startAccepted();
  submit();
  _channels.last().room = 0;
  submit();
  _channels.last().end(true);
  EXPECT_EQ(_kinds, (std::vector{TallyError::Disconnected, TallyError::Closed}));
  EXPECT_EQ(_events, (std::vector<std::string>{"interrupted", "invalidated"}));
  _queues.advance(milliseconds(100'000));
  EXPECT_EQ(_channels.attempts, 1);
}

TEST_F(ServiceLinkTest, AnInvalidationHandlerThatComesLateIsCalledAtOnceAndOnlyOnce) {
  _options.reconnect = TallyReconnect::Never;
  start();
  _link->setHandler(ServiceLink::Handler::Invalidation, {});
  _queues.run();
  _channels.last().end();
  note(ServiceLink::Handler::Invalidation, "late");
  note(ServiceLink::Handler::Invalidation, "later");
  _queues.run();
  EXPECT_EQ(_events, std::vector<std::string>{"late"});
}

TEST_F(ServiceLinkTest, ClosingSendsWhatWaitsAndLetsItBeAnswered) {
  start();
  submit();
  auto& channel = _channels.last();
  channel.lingers = true;
  auto closed = std::async(std::launch::async, [this] { _link->close(std::chrono::hours(1)); });
  while (!channel.finished) {
    _queues.run();
    if (!channel.accepted) channel.accept();
  }
  ASSERT_EQ(channel.calls.size(), 1U);
  channel.answer(0);
  channel.end();
  while (closed.wait_for(milliseconds(1)) != std::future_status::ready) _queues.run();
  EXPECT_EQ(_kinds, std::vector{TallyError::None});
  EXPECT_TRUE(
      _link->submit({}, milliseconds(1), [this](ServiceReply reply) { _kinds.push_back(reply.kind); }));
  EXPECT_EQ(_kinds.back(), TallyError::Closed);
  _link.reset();
}

TEST_F(ServiceLinkTest, ClosingFailsWhatWaitsForADaemonThatIsAway) {
  _channels.absent = true;
  start();
  submit();
  close();
  EXPECT_EQ(_kinds, std::vector{TallyError::Closed});
  EXPECT_TRUE(_events.empty());
}

TEST_F(ServiceLinkTest, ClosingWithNothingToWaitForEndsAChannelThatWasNeverAccepted) {
  start();
  close();
  EXPECT_TRUE(_channels.last().ended);
}

}  // namespace
}  // namespace tallyd
