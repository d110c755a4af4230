// What a message becomes on the wire and in the log, and when it is sent again.

#include <fcntl.h>
#include <sys/socket.h>

#include "DashboardFixture.h"
#include "support/FailingAllocation.h"

namespace tallyd {
namespace {

using namespace std::string_literals;

class DashboardBackendTest : public DashboardFixture {};

TEST_F(DashboardBackendTest, SendsOneDatagramAndReturnsItsLine) {
  const auto backend = made(profile());
  EXPECT_EQ(
      backend->sendMessage(Dictionary{{"a", 7}}, kTime, 1, 0, 12),
      "1000.020 0123456789abcdef0123456789abcdef01234567 127.0.0.1 VT     3    77    12     1     0  a=7");
  fake.queues.run();
  EXPECT_EQ(server.received(),
            "\x07\x06\x01\x05\x00\x00\x03\xE8\xFF\xFF\xFF\xB2\xFF\xFC\xFF\xBB\x00\x01\x00\x00"
            "0123456789abcdef0123456789abcdef01234567"
            "\x00\x0C\x00\x00 a=7"s);
  EXPECT_EQ(server.received(), std::nullopt);
  EXPECT_EQ(fake.log.lines(), Lines{});
}

TEST_F(DashboardBackendTest, LeavesTheNetworkToItsQueue) {
  const auto backend = made(profile());
  send(*backend, 1);
  EXPECT_EQ(server.received(), std::nullopt);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
}

TEST_F(DashboardBackendTest, NumbersItsMessages) {
  const auto backend = made(profile());
  for (int i = 0; i < 3; ++i) backend->sendMessage(std::nullopt, kTime, 1, 0);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), (std::vector<std::uint16_t>{1, 2, 3}));
}

TEST_F(DashboardBackendTest, SendsAHeaderAloneForAnEmptyPayload) {
  const auto backend = made(profile());
  backend->sendMessage(Dictionary(), kTime, 1, 0, 1);
  backend->sendMessage(std::nullopt, kTime, 1, 0, 2);
  fake.queues.run();
  EXPECT_EQ(server.received().value_or("").size(), 64U);
  EXPECT_EQ(server.received().value_or("").size(), 64U);
}

TEST_F(DashboardBackendTest, SendsTheLargestDatagramWhole) {
  const auto backend = made(profile());
  send(*backend, 1, std::string(5000, 'x'));
  fake.queues.run();
  const std::string datagram = server.received().value_or("");
  ASSERT_EQ(datagram.size(), 1087U);
  EXPECT_EQ(datagramNumber16(datagram, DatagramLength), static_cast<std::uint16_t>(~1087));
}

TEST_F(DashboardBackendTest, WorksWithoutADeviceIdentifier) {
  const auto backend = made(profile());
  backend->setUdid(nullptr);
  EXPECT_EQ(backend->sendMessage(std::nullopt, kTime, 1, 0, 1),
            "1000.020  127.0.0.1 VT     3    77     1     1     0 ");
  fake.queues.run();
  EXPECT_EQ(server.received().value_or("").substr(DatagramDeviceID, 40), std::string(40, '\0'));
}

TEST_F(DashboardBackendTest, FlagsHowItSendsAndWhereTheServerIsFrom) {
  const auto flagsOf = [&](const std::shared_ptr<DashboardBackend>& backend) {
    send(*backend, 1);
    fake.queues.run();
    const auto datagram = server.received();
    return datagram ? datagramNumber16(*datagram, DatagramFlags) : 0xFFFF;
  };
  EXPECT_EQ(flagsOf(made(profile())), 0);
  EXPECT_EQ(flagsOf(made(reliableProfile())), 1);
  EXPECT_EQ(flagsOf(madeWithServer("127.0.0.1", server.port())), 3);
}

TEST_F(DashboardBackendTest, PrefersTheProfilesServerToAnExplicitOne) {
  const auto backend = configured(
      DashboardBackend::initWithName(fake.platform, "dashboard", profile(), "127.0.0.1", 1, "Kasten"));
  send(*backend, 9);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{9});
}

TEST_F(DashboardBackendTest, IsOnOnceItIsAsked) {
  const auto backend = made(profile());
  EXPECT_EQ(backend->state(), ReportingStatePending);
  backend->updateState();
  EXPECT_EQ(backend->state(), ReportingStateOn);
}

TEST_F(DashboardBackendTest, HasNothingToFlushAndUploadsNoFiles) {
  const auto backend = made(profile());
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
  EXPECT_FALSE(backend->uploadFileAtPath("/tmp/x", ""));
}

TEST_F(DashboardBackendTest, SendsOnceWithoutReliableDelivery) {
  const auto backend = made(profile());
  send(*backend, 1);
  fake.queues.advance(Seconds(500));
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
}

TEST_F(DashboardBackendTest, SendsAgainOnTicks2And5And10And19WithoutAcknowledgement) {
  const auto backend = made(reliableProfile());
  send(*backend, 1);
  fake.queues.run();
  std::vector<int> sentBefore;
  for (int tick = 0; tick < 40; ++tick) {
    if (!receivedEventIDs().empty()) sentBefore.push_back(tick);
    fake.queues.advance(kPeriod);
  }
  EXPECT_EQ(sentBefore, (std::vector<int>{0, 2, 5, 10, 19}));
}

TEST_F(DashboardBackendTest, ResendsTheSameBytes) {
  const auto backend = made(reliableProfile());
  send(*backend, 1, "some text");
  fake.queues.advance(2 * kPeriod);
  const auto first = server.received();
  ASSERT_TRUE(first);
  EXPECT_EQ(server.received(), first);
}

TEST_F(DashboardBackendTest, DropsTheOldestOf51DatagramsThatWait) {
  const auto backend = made(reliableProfile());
  for (std::uint16_t event = 1; event <= 51; ++event) send(*backend, event);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs().size(), 51U);
  fake.queues.advance(2 * kPeriod);
  const auto again = receivedEventIDs();
  ASSERT_EQ(again.size(), 50U);
  EXPECT_EQ(again.front(), 2);
  EXPECT_EQ(again.back(), 51);
}

TEST_F(DashboardBackendTest, SendsAFailedDatagramOnceOnTheNextTick) {
  const auto backend = made(profile());
  disconnect();
  send(*backend, 1);
  fake.queues.advance(Seconds(8));
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{});
  connectAgain();
  fake.queues.advance(Milliseconds(7999));
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{});
  fake.queues.advance(Seconds(100));
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
}

TEST_F(DashboardBackendTest, CountsTheTicksOfAFailedDatagramFromItsFirstSend) {
  const auto backend = made(reliableProfile());
  disconnect();
  send(*backend, 1);
  fake.queues.advance(4 * kPeriod);
  connectAgain();
  fake.queues.advance(2 * kPeriod);
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
  fake.queues.advance(kPeriod);
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{1});
  fake.queues.advance(100 * kPeriod);
  EXPECT_EQ(receivedEventIDs(), (std::vector<std::uint16_t>{1, 1, 1}));
}

TEST_F(DashboardBackendTest, DropsAMessageForWhichThereIsNoMemoryAndGoesOn) {
  const auto backend = made(profile());
  const Dictionary payload{{"a", 1}};
  std::optional<test::FailingLargeAllocations> failing(std::in_place, kDatagramBufferBytes);
  const auto line = backend->sendMessage(payload, kTime, 1, 0, 1);
  failing.reset();
  EXPECT_EQ(line, std::nullopt);
  EXPECT_EQ(fake.log.lines(), (Lines{{Level::Error, "Tally (DashboardBackend): can't malloc."}}));
  EXPECT_NE(backend->sendMessage(payload, kTime, 1, 0, 2), std::nullopt);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{2});
}

TEST_F(DashboardBackendTest, RaisesNoSignalOnASocketThatIsShutDown) {
  const auto backend = made(profile());
  ASSERT_EQ(::shutdown(newDescriptor(), SHUT_WR), 0);
  EXPECT_NE(backend->sendMessage(std::nullopt, kTime, 1, 0, 1), std::nullopt);
  fake.queues.advance(Seconds(100));
  EXPECT_EQ(server.received(), std::nullopt);
  backend->cleanup();
}

TEST_F(DashboardBackendTest, OpensASocketThatNoProgramInheritsAndThatNeverBlocks) {
  const auto backend = made(profile());
  const int descriptor = newDescriptor();
  EXPECT_NE(::fcntl(descriptor, F_GETFD) & FD_CLOEXEC, 0);
  EXPECT_NE(::fcntl(descriptor, F_GETFL) & O_NONBLOCK, 0);
}

}  // namespace
}  // namespace tallyd
