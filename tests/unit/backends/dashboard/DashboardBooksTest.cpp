// Every datagram ends in exactly one place of the books, whatever the network does.

#include <gtest/gtest.h>

#include <new>
#include <random>
#include <thread>

#include "DashboardFixture.h"
#include "backends/dashboard/DatagramSender.h"
#include "backends/dashboard/LocalLog.h"
#include "support/Account.h"
#include "support/FailingAllocation.h"

namespace tallyd {
namespace {

class DashboardBooksTest : public DashboardFixture {
 protected:
  std::shared_ptr<DashboardBackend> booked(const TallyBackend::Payload& entry) {
    auto backend = made(entry);
    EXPECT_TRUE(backend);
    backend->setAccount(account);
    return backend;
  }
  void expectBalance() const {
    const auto counts = account->counts();
    EXPECT_TRUE(counts.isBalanced()) << platform::Value(counts.dictionary()).description();
  }
  [[nodiscard]] AccountCounts counts() const { return account->counts(); }

  const Lines kNoMemory{{Level::Error, "Tally (DashboardBackend): can't malloc."}};
  std::shared_ptr<Account> account = std::make_shared<Account>();
};

TEST_F(DashboardBooksTest, ADatagramThatTheNetworkTookIsSent) {
  const auto backend = booked(profile());
  send(*backend, 1);
  EXPECT_EQ(counts().inFlight, 1U);
  fake.queues.run();
  EXPECT_EQ(counts().sent, 1U);
  EXPECT_EQ(receivedEventIDs().size(), 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, ADatagramThatCouldNotBeSentIsHeldUntilItIs) {
  const auto backend = booked(profile());
  disconnect();
  send(*backend, 1);
  fake.queues.run();
  EXPECT_EQ(counts().held, 1U);
  connectAgain();
  fake.queues.advance(DatagramSender::kDefaultPeriod);
  EXPECT_EQ(counts().sent, 1U);
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
  expectBalance();
}

TEST_F(DashboardBooksTest, AReliableDatagramIsSentWhenItIsAcknowledged) {
  const auto backend = booked(reliableProfile());
  send(*backend, 5);
  fake.queues.run();
  EXPECT_EQ(counts().inFlight, 1U);
  const auto datagram = server.received();
  ASSERT_TRUE(datagram);
  server.reply(*datagram);
  fake.queues.serveReadable();
  EXPECT_EQ(counts().sent, 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, AReliableDatagramIsGivenUpAfterTheLastRetransmission) {
  const auto backend = booked(reliableProfile());
  send(*backend, 5);
  fake.queues.advance(kPeriod * 20);
  EXPECT_EQ(counts().droppedFor(DropReason::GivenUp), 1U);
  EXPECT_EQ(receivedEventIDs().size(), 5U);
  expectBalance();
}

TEST_F(DashboardBooksTest, TheOldestOfTheFiftyFirstGoes) {
  const auto backend = booked(reliableProfile());
  for (std::uint16_t event = 1; event <= 53; ++event) send(*backend, event);
  fake.queues.run();
  EXPECT_EQ(counts().droppedFor(DropReason::QueueFull), 3U);
  EXPECT_EQ(counts().inFlight, 50U);
  expectBalance();
}

TEST_F(DashboardBooksTest, ADatagramForWhichTheQueueHasNoMemoryIsDropped) {
  const auto backend = booked(profile());
  fake.queues.refuseWork(1);
  EXPECT_EQ(backend->sendMessage(Dictionary{{"a", 1}}, kTime, 1, 0, 1), std::nullopt);
  EXPECT_EQ(counts().droppedFor(DropReason::OutOfMemory), 1U);
  EXPECT_EQ(fake.log.lines(), kNoMemory);
  send(*backend, 2);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{2});
  EXPECT_EQ(counts().sent, 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, ADatagramWithoutMemoryForItsLineIsDropped) {
  const auto backend = booked(profile());
  const std::string broken(kDatagramDeviceIDBytes, '\xFF');  // Becomes longer, and the line with it.
  backend->setUdid(broken.c_str());
  const Dictionary payload{{"a", std::string(1000, 'x')}};
  {
    const test::FailingLargeAllocations failing(kMaximumLocalLogBytes + 100);
    EXPECT_EQ(backend->sendMessage(payload, kTime, 1, 0, 1), std::nullopt);
  }
  EXPECT_EQ(counts().droppedFor(DropReason::OutOfMemory), 1U);
  EXPECT_EQ(fake.log.lines(), kNoMemory);
  fake.queues.run();
  EXPECT_TRUE(receivedEventIDs().empty());
  expectBalance();
}

TEST_F(DashboardBooksTest, ADatagramThatCannotBeKeptForItsAcknowledgementIsDropped) {
  const auto backend = booked(reliableProfile());
  send(*backend, 1, std::string(2000, 'x'));
  {
    const test::FailingLargeAllocations failing(kDatagramBufferBytes - 1);
    fake.queues.run();
  }
  EXPECT_EQ(counts().droppedFor(DropReason::OutOfMemory), 1U);
  EXPECT_EQ(fake.log.lines(), kNoMemory);
  fake.queues.advance(kPeriod * 20);
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
  expectBalance();
}

TEST_F(DashboardBooksTest, WhatACleanUpFindsAtItsLastResortIsDropped) {
  const auto backend = booked(profile());
  disconnect();
  send(*backend, 1);
  backend->cleanup();
  fake.queues.advance(Seconds(60));
  EXPECT_EQ(counts().droppedFor(DropReason::CleanUp), 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, WhatADroppedBackendCouldNotSendIsDropped) {
  auto backend = booked(profile());
  disconnect();
  send(*backend, 1);
  backend = nullptr;
  fake.queues.advance(Seconds(200));
  EXPECT_EQ(counts().droppedFor(DropReason::CleanUp), 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, WhatComesAfterTheCleanUpIsBooked) {
  const auto backend = booked(reliableProfile());
  backend->cleanup();
  fake.queues.run();
  send(*backend, 1);
  fake.queues.run();
  EXPECT_EQ(counts().held + counts().inFlight, 0U);
  EXPECT_EQ(counts().droppedFor(DropReason::CleanUp), 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, LogDataIsBookedAsItsAnswerComes) {
  const auto backend = booked(profile({{"post_url", "https://logs.example/"}}));
  EXPECT_TRUE(backend->uploadLogData(Array{"a"}));
  fake.queues.run();
  EXPECT_EQ(counts().sent, 2U);  // The data, and the datagram that tells of it.
  fake.http.answer = [](const auto&) { return fakes::FakeHTTPClient::failure("refused"); };
  EXPECT_FALSE(backend->uploadLogData(Array{"a"}));
  EXPECT_EQ(counts().droppedFor(DropReason::UploadFailed), 1U);
  fake.http.answer = [](const auto&) {
    return platform::HTTPResult{std::nullopt, platform::HTTPResponse{503, {}}, {}};
  };
  EXPECT_TRUE(backend->uploadLogData(Array{"a"}));
  EXPECT_EQ(counts().refused, 1U);
  const auto without = booked(profile());
  EXPECT_FALSE(without->uploadLogData(Array{"a"}));
  EXPECT_EQ(counts().droppedFor(DropReason::NotUploadable), 1U);
  expectBalance();
}

TEST_F(DashboardBooksTest, LogDataIsSentOrDroppedWhicheverAllocationFails) {
  const auto backend = booked(profile({{"post_url", "https://logs.example/"}}));
  const Array logData{"a", Dictionary{{"b", 1}}};
  int number = 0;
  bool sent = false;
  for (bool failed = true; failed;) {
    {
      const test::OneFailingAllocation failing(std::this_thread::get_id(), ++number);
      try {
        sent = backend->uploadLogData(logData);
      } catch (const std::bad_alloc&) {
        sent = false;  // The answer could not be told.
      }
      failed = failing.hasFailed();
    }
    fake.queues.run();
    EXPECT_EQ(counts().held + counts().inFlight, 0U) << "allocation " << number;
    expectBalance();
  }
  EXPECT_TRUE(sent);
  EXPECT_GT(counts().droppedFor(DropReason::OutOfMemory), 5U);
}

TEST_F(DashboardBooksTest, FilesPassItBy) {
  const auto backend = booked(profile());
  backend->uploadFileAtPath("/file", "token");
  EXPECT_EQ(counts().passedBy, 1U);
  EXPECT_EQ(counts().accepted, 0U);
}

/// Random sends, ticks, faults of the network, acknowledgements and endings, against a server that knows what
/// it received.
class DashboardFaultsTest : public DashboardBooksTest, public testing::WithParamInterface<unsigned> {
 protected:
  enum class Mode { FireAndForget, Reliable };

  void run(Mode mode, unsigned seed) {
    std::mt19937 random(seed);
    auto backend = booked(mode == Mode::Reliable ? reliableProfile() : profile());
    std::uint64_t accepted = 0;
    std::uint64_t acknowledged = 0;
    std::set<std::uint16_t> settled;
    bool connected = true;
    for (int step = 0; step < 400; ++step) {
      switch (random() % 8) {
        case 0:
          connected = !connected;
          connected ? connectAgain() : disconnect();
          break;
        case 1:
          fake.queues.advance(mode == Mode::Reliable ? kPeriod : DatagramSender::kDefaultPeriod);
          break;
        case 2:
          fake.queues.run();
          break;
        case 3:
          fake.queues.run();
          acknowledged += acknowledgeSome(random, mode, settled, connected);
          break;
        default:
          for (auto more = 1 + random() % 20; more > 0; --more) {
            send(*backend, static_cast<std::uint16_t>(++accepted));
            expectBalance();
          }
      }
      expectBalance();
      EXPECT_EQ(counts().accepted, accepted);
      takeReceived();  // A server that reads too late would lose some.
    }
    if (random() % 2 == 0) backend->cleanup();
    backend = nullptr;
    fake.queues.advance(Seconds(200));
    fake.queues.serveReadable();
    expectBalance();
    const auto end = counts();
    EXPECT_EQ(end.accepted, accepted);
    EXPECT_EQ(end.held + end.inFlight, 0U);
    takeReceived();
    if (mode == Mode::FireAndForget) {
      EXPECT_EQ(end.sent, arrivals);
      EXPECT_EQ(end.droppedFor(DropReason::GivenUp), 0U);
    } else {
      EXPECT_EQ(end.sent, acknowledged);
      EXPECT_GE(distinct.size(), acknowledged);
    }
    EXPECT_GT(end.sent, 0U);
    EXPECT_GT(end.droppedInAll(), 0U);
  }

 private:
  void takeReceived() {
    for (const std::uint16_t event : receivedEventIDs()) {
      ++arrivals;
      distinct.insert(event);
      unanswered.push_back(event);
    }
  }

  /// How many of the datagrams that the backend still waits for were acknowledged.
  std::uint64_t acknowledgeSome(std::mt19937& random, Mode mode, std::set<std::uint16_t>& settled,
                                bool connected) {
    takeReceived();
    if (mode == Mode::FireAndForget || !connected || unanswered.empty()) return 0;
    const std::uint64_t sentBefore = counts().sent;
    for (const std::uint16_t event : unanswered) {
      if (random() % 2 == 0) continue;
      std::string answer(DatagramText, '\0');
      answer[DatagramEventID] = static_cast<char>(event >> 8U);
      answer[DatagramEventID + 1] = static_cast<char>(event & 0xFFU);
      server.reply(answer);
      settled.insert(event);
    }
    fake.queues.serveReadable();
    unanswered.clear();
    const std::uint64_t newlySent = counts().sent - sentBefore;
    EXPECT_LE(counts().sent, settled.size());  // Nothing is sent that the server has not acknowledged.
    return newlySent;
  }

  std::uint64_t arrivals = 0;
  std::set<std::uint16_t> distinct;
  std::vector<std::uint16_t> unanswered;
};

TEST_P(DashboardFaultsTest, TheBooksBalanceAtEveryStepWithoutAcknowledgements) {
  run(Mode::FireAndForget, GetParam());
}

TEST_P(DashboardFaultsTest, TheBooksBalanceAtEveryStepWithAcknowledgements) {
  run(Mode::Reliable, GetParam());
}

INSTANTIATE_TEST_SUITE_P(Seeds, DashboardFaultsTest, testing::Range(1U, 13U));

}  // namespace
}  // namespace tallyd
