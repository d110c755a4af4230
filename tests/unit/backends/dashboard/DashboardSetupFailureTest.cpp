// What the system can refuse while a backend is set up.

#include <seccomp.h>

#include <cerrno>
#include <cstdio>

#include "DashboardFixture.h"
#include "fakes/LoudLog.h"

namespace tallyd {
namespace {

using platform::SerialQueue;
using platform::Source;
using platform::Work;

/// Queues that don't take some sources.
class RefusingQueues : public platform::Queues {
 public:
  enum class Refusal { None, ReturnsNothing, Throws };

  explicit RefusingQueues(platform::Queues& queues) : _queues(queues) {}

  std::shared_ptr<SerialQueue> makeSerialQueue(std::string label) override {
    labels.push_back(label);
    return std::make_shared<Queue>(*this, _queues.makeSerialQueue(std::move(label)));
  }
  std::unique_ptr<BlockingCall> blockingCall() override { return _queues.blockingCall(); }

  Refusal timers = Refusal::None;
  Refusal readSources = Refusal::None;
  std::vector<std::string> labels;

 private:
  class Queue : public SerialQueue {
   public:
    Queue(const RefusingQueues& owner, std::shared_ptr<SerialQueue> queue)
        : _owner(owner), _queue(std::move(queue)) {}
    const std::string& label() const override { return _queue->label(); }
    void async(Work work) override { _queue->async(std::move(work)); }
    void asyncAfter(std::chrono::milliseconds delay, Work work) override {
      _queue->asyncAfter(delay, std::move(work));
    }
    std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first, std::chrono::milliseconds period,
                                      Work handler, Work cancelHandler) override {
      if (refuses(_owner.timers)) return nullptr;
      return _queue->makeTimer(first, period, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<Source> makeReadSource(int descriptor, Work handler, Work cancelHandler) override {
      if (refuses(_owner.readSources)) return nullptr;
      return _queue->makeReadSource(descriptor, std::move(handler), std::move(cancelHandler));
    }
    std::unique_ptr<Source> makeWriteSource(int descriptor, Work handler, Work cancelHandler) override {
      return _queue->makeWriteSource(descriptor, std::move(handler), std::move(cancelHandler));
    }

   private:
    static bool refuses(Refusal refusal) {
      if (refusal == Refusal::Throws) throw std::runtime_error("no space left in the event queue");
      return refusal == Refusal::ReturnsNothing;
    }
    const RefusingQueues& _owner;
    const std::shared_ptr<SerialQueue> _queue;
  };

  platform::Queues& _queues;
};

class DashboardSetupFailureTest : public DashboardFixture {
 protected:
  using Refusal = RefusingQueues::Refusal;

  std::shared_ptr<DashboardBackend> madeOn(const platform::Platform& platform, const Dictionary& entry) {
    return configured(DashboardBackend::initWithName(platform, "dashboard", entry, "Kasten"));
  }

  /// For a process of its own: makes `systemCall` fail from now on.
  static void refuse(int systemCall, std::uint32_t error) {
    const scmp_filter_ctx filter = seccomp_init(SCMP_ACT_ALLOW);
    if (!filter || seccomp_rule_add(filter, SCMP_ACT_ERRNO(error), systemCall, 0) != 0 ||
        seccomp_load(filter) != 0) {
      std::fputs("no filter\n", stderr);
      std::_Exit(2);
    }
  }
  /// Whether making a backend where `systemCall` fails ends as `expected` says. Ends the process.
  [[noreturn]] void expectInChild(int systemCall, std::uint32_t error, const Dictionary& entry) {
    const auto open = openDescriptors();
    refuse(systemCall, error);
    const auto backend = madeOn(loudPlatform, entry);
    fake.queues.run();
    std::_Exit(backend == nullptr && openDescriptors() == open ? 0 : 1);
  }
  /// The same for an explicit server whose bind fails: it gets the flags that say so.
  [[noreturn]] void expectUnreliableInChild() {
    const auto open = openDescriptors();
    refuse(SCMP_SYS(bind), EADDRINUSE);
    const auto backend = configured(
        DashboardBackend::initWithName(loudPlatform, "dashboard", "127.0.0.1", server.port(), "Kasten"));
    if (!backend) std::_Exit(1);
    send(*backend, 1);
    fake.queues.advance(Seconds(100));
    const auto datagram = server.received();
    const bool isFlagged = datagram && datagramNumber16(*datagram, DatagramFlags) == DatagramFlagNoProfile;
    const bool isSentOnce = !server.received();
    backend->cleanup();
    fake.queues.run();
    std::_Exit(isFlagged && isSentOnce && openDescriptors() == open ? 0 : 1);
  }

  RefusingQueues queues{fake.queues};
  platform::Platform refusingPlatform = platformWith(fake, queues, fake.log);
  fakes::LoudLog loudLog;
  platform::Platform loudPlatform = platformWith(fake, fake.queues, loudLog);
};

TEST_F(DashboardSetupFailureTest, LabelsItsQueue) {
  madeOn(refusingPlatform, profile());
  EXPECT_EQ(queues.labels, std::vector<std::string>{"com.quillon.Tally.networkProc"});
}

TEST_F(DashboardSetupFailureTest, YieldsNothingWithoutATimer) {
  for (const Refusal refusal : {Refusal::ReturnsNothing, Refusal::Throws}) {
    queues.timers = refusal;
    for (const auto& entry : {profile(), reliableProfile()}) {
      fake.log.clear();
      EXPECT_EQ(madeOn(refusingPlatform, entry), nullptr);
      fake.queues.run();
      EXPECT_EQ(fake.log.lines(),
                (Lines{{Level::Error, "Tally (DashboardBackend): initWithName can't create timer source."}}));
      EXPECT_EQ(openDescriptors(), descriptors);
    }
  }
}

TEST_F(DashboardSetupFailureTest, StaysReliableWithoutAReadSourceAndGivesUpDatagramsInTheEnd) {
  for (const Refusal refusal : {Refusal::ReturnsNothing, Refusal::Throws}) {
    fake.log.clear();
    queues.readSources = refusal;
    const auto backend = madeOn(refusingPlatform, reliableProfile());
    ASSERT_NE(backend, nullptr);
    EXPECT_EQ(fake.log.lines(), (Lines{{Level::Error, "Tally (setReliable): can't create read source"}}));
    send(*backend, 1);
    fake.queues.run();
    EXPECT_EQ(datagramNumber16(server.received().value_or(std::string(64, '\xFF')), DatagramFlags), 1);
    fake.queues.advance(19 * kPeriod);
    EXPECT_EQ(receivedEventIDs().size(), 4U);
    fake.queues.advance(kPeriod);
    backend->cleanup();
    fake.queues.run();
    EXPECT_EQ(openDescriptors(), descriptors);
  }
}

TEST_F(DashboardSetupFailureTest, YieldsNothingWithoutASocket) {
  EXPECT_EXIT(expectInChild(SCMP_SYS(socket), EMFILE, profile()), testing::ExitedWithCode(0),
              "^<3>Tally\\(DashboardBackend\\): socket\\(\\) failed \\(24\\)\n$");
}

TEST_F(DashboardSetupFailureTest, YieldsNothingWithoutAConnection) {
  for (const auto& entry : {profile(), reliableProfile()}) {
    EXPECT_EXIT(expectInChild(SCMP_SYS(connect), ENETUNREACH, entry), testing::ExitedWithCode(0),
                "^<3>Tally \\(DashboardBackend\\): initWitName socket connect failed\\.\n$");
  }
}

TEST_F(DashboardSetupFailureTest, IsNotReliableWhenTheSocketCantBeBound) {
  EXPECT_EXIT(expectUnreliableInChild(), testing::ExitedWithCode(0),
              "^<3>Tally \\(DashboardBackend\\): can't bind socket, 98\n$");
}

}  // namespace
}  // namespace tallyd
