// Acknowledgements, on real queues and a real network.

#include <future>
#include <map>

#include "DashboardFixture.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd {
namespace {

using platform::SerialQueue;
using platform::Source;
using platform::Work;

/// Tells when a queue made here has gone, and with it everything that used it.
class WatchedQueues : public platform::Queues {
 public:
  std::shared_ptr<SerialQueue> makeSerialQueue(std::string label) override {
    return std::make_shared<Queue>(_queues.makeSerialQueue(std::move(label)), _gone);
  }
  std::unique_ptr<BlockingCall> blockingCall() override { return _queues.blockingCall(); }

  [[nodiscard]] bool waitUntilQueueIsGone() {
    return _gone->get_future().wait_for(std::chrono::seconds(20)) == std::future_status::ready;
  }
  [[nodiscard]] std::size_t threadCount() const { return _queues.threadCount(); }

 private:
  class Queue : public SerialQueue {
   public:
    Queue(std::shared_ptr<SerialQueue> queue, std::shared_ptr<std::promise<void>> gone)
        : _queue(std::move(queue)), _gone(std::move(gone)) {}
    ~Queue() override { _gone->set_value(); }
    const std::string& label() const override { return _queue->label(); }
    void async(Work work) override { _queue->async(std::move(work)); }
    void asyncAfter(std::chrono::milliseconds delay, Work work) override {
      _queue->asyncAfter(delay, std::move(work));
    }
    std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first, std::chrono::milliseconds period,
                                      Work handler, Work cancelHandler) override {
      return _queue->makeTimer(first, period, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<Source> makeReadSource(int descriptor, Work handler, Work cancelHandler) override {
      return _queue->makeReadSource(descriptor, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<Source> makeWriteSource(int descriptor, Work handler, Work cancelHandler) override {
      return _queue->makeWriteSource(descriptor, std::move(handler), std::move(cancelHandler));
    }

   private:
    const std::shared_ptr<SerialQueue> _queue;
    const std::shared_ptr<std::promise<void>> _gone;
  };

  platform::AsioQueues _queues;
  const std::shared_ptr<std::promise<void>> _gone = std::make_shared<std::promise<void>>();
};

class DashboardWireTest : public DashboardFixture {
 protected:
  std::shared_ptr<DashboardBackend> madeOnRealQueues(const Dictionary& entry) {
    auto backend = configured(DashboardBackend::initWithName(platform, "dashboard", entry, "Kasten"));
    EXPECT_NE(backend, nullptr);
    return backend;
  }
  std::string waitForText() {
    const auto datagram = server.waitForDatagram();
    EXPECT_TRUE(datagram);
    return datagram.value_or(std::string(DatagramText, '\0')).substr(DatagramText);
  }
  /// How often each text arrived until the backend was gone.
  std::map<std::string, int> textsReceivedUntilTheEnd() {
    EXPECT_TRUE(queues->waitUntilQueueIsGone());
    std::map<std::string, int> counts;
    while (const auto datagram = server.received()) ++counts[datagram->substr(DatagramText)];
    return counts;
  }
  static std::string acknowledgement(std::uint16_t eventID) {
    return std::string(Datagram({.eventID = eventID}, std::nullopt).bytes());
  }

  std::unique_ptr<WatchedQueues> queues = std::make_unique<WatchedQueues>();
  platform::Platform platform = platformWith(fake, *queues, fake.log);

  void TearDown() override {
    queues.reset();
    DashboardFixture::TearDown();
  }
};

TEST_F(DashboardWireTest, SendsWithoutDelay) {
  auto backend = madeOnRealQueues(profile());
  send(*backend, 1, "first");
  send(*backend, 2, "second");
  EXPECT_EQ(waitForText(), " a=first");
  EXPECT_EQ(waitForText(), " a=second");
  backend->cleanup();
  backend.reset();
  EXPECT_TRUE(queues->waitUntilQueueIsGone());
}

TEST_F(DashboardWireTest, SendsNothingAgainThatWasAcknowledged) {
  auto backend = madeOnRealQueues(profile({{"reliable", 1000}}));
  send(*backend, 1);
  const auto datagram = server.waitForDatagram();
  ASSERT_TRUE(datagram);
  server.reply(*datagram);  // The echo of the whole.
  send(*backend, 2);
  ASSERT_TRUE(server.waitForDatagram());
  server.reply(datagram->substr(0, DatagramEventID) + std::string("\0\2", 2));  // As short as it may be.
  backend.reset();
  EXPECT_EQ(textsReceivedUntilTheEnd(), (std::map<std::string, int>{}));
}

TEST_F(DashboardWireTest, AnAcknowledgementIsForTheOldestDatagramOfItsEvent) {
  auto backend = madeOnRealQueues(profile({{"reliable", 50}}));
  send(*backend, 7, "first");
  send(*backend, 7, "second");
  EXPECT_EQ(waitForText(), " a=first");
  EXPECT_EQ(waitForText(), " a=second");
  server.reply(acknowledgement(7));
  backend.reset();
  const auto counts = textsReceivedUntilTheEnd();
  EXPECT_EQ(counts.at(" a=second"), 4);
  // The acknowledgement may have met a retransmission on its way, but no more than that.
  EXPECT_LT(counts.contains(" a=first") ? counts.at(" a=first") : 0, 4);
}

TEST_F(DashboardWireTest, IgnoresShortForeignAndUnknownAcknowledgements) {
  auto backend = madeOnRealQueues(profile({{"reliable", 20}}));
  send(*backend, 7);
  EXPECT_EQ(waitForText(), " a=x");
  server.reply("");
  server.reply("x");
  server.reply(acknowledgement(7).substr(0, 61));
  server.reply(acknowledgement(8));
  server.reply(std::string(5000, '\xFF'));
  test::LoopbackDashboard().send(acknowledgement(7), server.senderPort());
  backend.reset();
  EXPECT_EQ(textsReceivedUntilTheEnd(), (std::map<std::string, int>{{" a=x", 4}}));
}

TEST_F(DashboardWireTest, CleansUpOnTheTickAfterTheLastAcknowledgement) {
  auto backend = madeOnRealQueues(profile({{"reliable", 20}}));
  send(*backend, 1);
  const auto datagram = server.waitForDatagram();
  ASSERT_TRUE(datagram);
  backend->cleanup();
  backend.reset();
  server.reply(*datagram);
  EXPECT_TRUE(queues->waitUntilQueueIsGone());
  EXPECT_EQ(fake.log.count(Level::Debug, "Tally: clean up at myPeriodicTask."), 1U);
}

TEST_F(DashboardWireTest, GetsEveryMessageThroughAServerThatHearsEverySecondTry) {
  constexpr std::size_t kMessages = 400;
  constexpr std::size_t kAtATime = 40;  // Fewer than the queue holds.
  auto backend = madeOnRealQueues(profile({{"reliable", 20}}));
  std::map<std::string, int> tries;
  std::size_t heard = 0;
  for (std::size_t sent = 0; sent < kMessages; sent += kAtATime) {
    for (std::size_t i = sent; i < sent + kAtATime; ++i) {
      send(*backend, static_cast<std::uint16_t>(i), std::to_string(i));
    }
    while (heard < sent + kAtATime) {
      const auto datagram = server.waitForDatagram();
      ASSERT_TRUE(datagram);
      if (++tries[datagram->substr(DatagramText)] < 2) continue;
      server.reply(*datagram);
      if (tries[datagram->substr(DatagramText)] == 2) ++heard;
    }
  }
  EXPECT_EQ(tries.size(), kMessages);
  backend->cleanup();
  backend.reset();
  EXPECT_TRUE(queues->waitUntilQueueIsGone());
}

TEST_F(DashboardWireTest, LeavesNothingBehindWhenItIsSetUpInVain) {
  for (const Dictionary& more :
       {Dictionary{{"ip", "nowhere"}}, Dictionary{{"ip", "nowhere"}, {"reliable", 20}}}) {
    WatchedQueues own;
    EXPECT_EQ(DashboardBackend::initWithName(platformWith(fake, own, fake.log), "dashboard", profile(more),
                                             "Kasten"),
              nullptr);
    EXPECT_TRUE(own.waitUntilQueueIsGone());
  }
}

TEST_F(DashboardWireTest, NeedsNoThreadOfItsOwn) {
  std::vector<std::shared_ptr<DashboardBackend>> backends;
  platform::AsioQueues own;
  const auto ownPlatform = platformWith(fake, own, fake.log);
  std::size_t threads = 0;
  for (int i = 0; i < 20; ++i) {
    backends.push_back(DashboardBackend::initWithName(ownPlatform, "dashboard", reliableProfile(), "Kasten"));
    send(*backends.back(), 1);
    if (i == 0) threads = own.threadCount();
  }
  for (int i = 0; i < 20; ++i) EXPECT_TRUE(server.waitForDatagram());
  EXPECT_EQ(own.threadCount(), threads);
  backends.clear();
}

TEST_F(DashboardWireTest, GoesWithTheQueuesWhenThoseEndFirst) {
  auto backend = madeOnRealQueues(profile({{"reliable", 8000}}));
  send(*backend, 1);
  EXPECT_EQ(waitForText(), " a=x");
  send(*backend, 2);
  backend.reset();
  // The end of the test ends the queues and finds no descriptor; the sanitizers find no leak.
}

}  // namespace
}  // namespace tallyd
