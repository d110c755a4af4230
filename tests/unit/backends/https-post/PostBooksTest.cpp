// Every event ends in exactly one place of the books, whatever becomes of the posts.

#include <gtest/gtest.h>

#include <new>
#include <random>

#include "HTTPSPostBackendFixture.h"
#include "support/Account.h"

namespace tallyd {
namespace {

using fakes::FakeHTTPClient;
using platform::HTTPFailure;
using platform::HTTPResponse;
using platform::HTTPResult;

class PostBooksTest : public HTTPSPostBackendFixture {
 protected:
  std::shared_ptr<HTTPSPostBackend> booked(std::shared_ptr<HTTPSPostBackend> backend) const {
    backend->setAccount(account);
    return backend;
  }
  static void send(HTTPSPostBackend& backend, std::uint16_t method = 3,
                   const Payload& payload = Dictionary()) {
    backend.sendMessage(payload, kEventTime, method, 0);
  }
  void expectBalance() const {
    const auto now = account->counts();
    EXPECT_TRUE(now.isBalanced()) << platform::Value(now.dictionary()).description();
  }
  [[nodiscard]] AccountCounts counts() const { return account->counts(); }
  void answerWith(const HTTPResult& result) {
    fake.http.answer = [result](const auto&) { return result; };
  }

  std::shared_ptr<Account> account = std::make_shared<Account>();
};

TEST_F(PostBooksTest, APostedEventIsInFlightUntilTheResponse) {
  const auto backend = booked(evaluated());
  send(*backend);
  EXPECT_EQ(counts().inFlight, 1U);
  fake.queues.run();
  EXPECT_EQ(counts().inFlight, 0U);
  EXPECT_EQ(counts().sent, 1U);
  EXPECT_EQ(counts().refused, 0U);
}

TEST_F(PostBooksTest, AnyResponseIsSentAndOneOf400OrAboveRefused) {
  const auto backend = booked(evaluated());
  for (const int status : {200, 302, 399, 400, 404, 500}) {
    answerWith({std::nullopt, HTTPResponse{status, {}}, {}});
    send(*backend);
  }
  fake.queues.run();
  EXPECT_EQ(counts().sent, 6U);
  EXPECT_EQ(counts().refused, 3U);
}

TEST_F(PostBooksTest, TellsAFailedPostFromOneThatFoundNoMemory) {
  const auto backend = booked(evaluated());
  answerWith(FakeHTTPClient::failure("refused"));
  send(*backend);
  HTTPResult tooMuch = FakeHTTPClient::failure("too many unfinished requests");
  tooMuch.failure = HTTPFailure::TooMuchWaits;
  answerWith(tooMuch);
  send(*backend);
  fake.queues.run();
  EXPECT_EQ(counts().droppedFor(DropReason::PostFailed), 1U);
  EXPECT_EQ(counts().droppedFor(DropReason::MemoryBound), 1U);
  expectBalance();
}

TEST_F(PostBooksTest, AnEventOfAPostThatCouldNotBeTakenOverIsDropped) {
  const auto backend = booked(evaluated());
  fake.http.answer = [](const auto&) -> HTTPResult { throw std::bad_alloc(); };
  send(*backend);
  fake.queues.run();
  EXPECT_EQ(counts().droppedFor(DropReason::OutOfMemory), 1U);
  EXPECT_EQ(counts().inFlight, 0U);
  EXPECT_TRUE(fake.log.has(Level::Error, "Tally(HTTPSPostBackend): out of memory for a post of 1 events"));
}

TEST_F(PostBooksTest, AnEventOfABackendThatDoesNotReportIsDropped) {
  const auto backend = booked(evaluated({entryWithout("filters")}));
  ASSERT_EQ(backend->state(), ReportingStateOff);
  send(*backend);
  EXPECT_EQ(counts().droppedFor(DropReason::StateOff), 1U);
  EXPECT_EQ(postCount(), 0U);
}

TEST_F(PostBooksTest, ABatchHoldsItsEventsAndDropsThoseOverTheLimit) {
  const auto backend = booked(evaluated());
  backend->setBatchEvents(true);
  for (int i = 0; i < 60; ++i) send(*backend);
  EXPECT_EQ(counts().held, 50U);
  EXPECT_EQ(counts().droppedFor(DropReason::MethodLimit), 10U);
  backend->flushMessages();
  EXPECT_EQ(counts().inFlight, 50U);
  fake.queues.run();
  EXPECT_EQ(counts().sent, 50U);
  expectBalance();
}

TEST_F(PostBooksTest, ABatchThatMayNotBePostedIsDroppedWithItsBackend) {
  auto backend = booked(pending());
  for (int i = 0; i < 4; ++i) send(*backend);
  EXPECT_EQ(counts().held, 4U);
  backend = nullptr;
  EXPECT_EQ(counts().droppedFor(DropReason::CleanUp), 4U);
  EXPECT_EQ(postCount(), 0U);
  expectBalance();
}

TEST_F(PostBooksTest, ABatchThatMayBePostedIsInFlightAfterItsBackend) {
  auto backend = booked(evaluated());
  backend->setBatchEvents(true);
  send(*backend);
  backend = nullptr;
  EXPECT_EQ(counts().inFlight, 1U);
  fake.queues.run();
  EXPECT_EQ(counts().sent, 1U);
}

TEST_F(PostBooksTest, WhatPassesByIsNotAccepted) {
  const auto backend = booked(evaluated());
  backend->uploadFileAtPath("/file", "token");
  backend->uploadLogData(Array{"a"});
  EXPECT_EQ(counts().passedBy, 2U);
  EXPECT_EQ(counts().accepted, 0U);
}

/// Random messages, flushes, states and answers, against what the collector received.
class PostFaultsTest : public PostBooksTest, public testing::WithParamInterface<unsigned> {
 protected:
  /// What the collector answers, and what it keeps of it.
  HTTPResult answer(const platform::HTTPRequest& request) {
    const auto document = platform::valueFromJSON(textOf(request));
    const auto* events = document.value->dictionary()->array("events");
    const std::uint64_t count = events ? events->size() : 0;
    switch (random() % 5) {
      case 0:
        failed += count;
        return FakeHTTPClient::failure("refused");
      case 1: {
        tooMuch += count;
        HTTPResult result = FakeHTTPClient::failure("too many unfinished requests");
        result.failure = HTTPFailure::TooMuchWaits;
        return result;
      }
      case 2:
        received += count;
        refused += count;
        return {std::nullopt, HTTPResponse{503, {}}, {}};
      default:
        received += count;
        return FakeHTTPClient::ok("");
    }
  }

  void step(HTTPSPostBackend& backend) {
    switch (random() % 10) {
      case 0:
        fake.queues.run();
        break;
      case 1:
        backend.flushMessages();
        break;
      case 2:
        backend.setBatchEvents(random() % 2 == 0);
        backend.updateState();
        break;
      case 3:
        backend.setUserInfoDict(random() % 3 == 0 ? Payload() : Payload(userInfo()));
        backend.updateState();
        break;
      case 4:
        backend.setUserInfoDict(userInfo(random() % 2 == 0 ? "Alpha" : "Nobody"));
        backend.updateState();
        break;
      default:
        for (auto more = 1 + random() % 30; more > 0; --more) {
          ++offered;
          send(backend, static_cast<std::uint16_t>(random() % 3), randomPayload());
          expectBalance();
        }
    }
  }

  Payload randomPayload() {
    if (random() % 4 == 0) return std::nullopt;
    return Dictionary{{"number", static_cast<std::int64_t>(random() % 100)},
                      {"text", std::string(random() % 40, '\xC3')},
                      {"nan", std::numeric_limits<double>::quiet_NaN()}};
  }

  std::mt19937 random{GetParam()};
  std::uint64_t offered = 0;
  std::uint64_t received = 0;
  std::uint64_t refused = 0;
  std::uint64_t failed = 0;
  std::uint64_t tooMuch = 0;
};

TEST_P(PostFaultsTest, TheBooksBalanceAtEveryStepAndAgreeWithTheCollector) {
  fake.http.answer = [this](const platform::HTTPRequest& request) { return answer(request); };
  for (int session = 0; session < 6; ++session) {
    const bool reports = session % 3 != 2;
    auto backend = booked(pending({reports ? defaultEntry() : entryWithout("filters")}));
    for (int i = 0; i < 60; ++i) {
      step(*backend);
      expectBalance();
      EXPECT_EQ(counts().held, backend->batchedEventCount());
      EXPECT_EQ(counts().accepted, offered);
    }
    backend = nullptr;
    expectBalance();
    EXPECT_EQ(counts().held, 0U);
  }
  fake.queues.run();
  const auto end = counts();
  expectBalance();
  EXPECT_EQ(end.inFlight, 0U);
  EXPECT_EQ(end.sent, received);
  EXPECT_EQ(end.refused, refused);
  EXPECT_EQ(end.droppedFor(DropReason::PostFailed), failed);
  EXPECT_EQ(end.droppedFor(DropReason::MemoryBound), tooMuch);
  EXPECT_GT(received, 0U);
  EXPECT_GT(end.droppedFor(DropReason::MethodLimit), 0U);
  EXPECT_GT(end.droppedFor(DropReason::StateOff), 0U);
}

INSTANTIATE_TEST_SUITE_P(Seeds, PostFaultsTest, testing::Range(1U, 13U));

}  // namespace
}  // namespace tallyd
