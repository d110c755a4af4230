#include "daemon/InspectionService.h"

#include <gtest/gtest.h>

#include "fakes/FakeIPC.h"
#include "fakes/FakePlatform.h"
#include "framework/InspectionInterface.h"
#include "support/Ledger.h"
#include "support/TapEnd.h"

namespace tallyd {
namespace {

using fakes::FakeIncomingCall;
using fakes::FakeServiceConnection;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;
using test::TapEnd;

constexpr uid_t kOwnUser = 990;

class InspectionServiceTest : public testing::Test {
 protected:
  std::shared_ptr<FakeServiceConnection> connectionOf(std::optional<uid_t> user) {
    auto connection = std::make_shared<FakeServiceConnection>("client of process 7");
    connection->peer = user;
    isAccepted = service.shouldAcceptNewConnection(connection);
    return connection;
  }
  static std::shared_ptr<FakeIncomingCall> callTap(FakeServiceConnection& connection, FileDescriptor output) {
    std::vector<FileDescriptor> descriptors;
    descriptors.push_back(std::move(output));
    return connection.call("Tap", {Value()}, FakeIncomingCall::Answer::Wanted, std::move(descriptors));
  }

  fakes::FakePlatform fake;
  std::shared_ptr<Tap> tap = std::make_shared<Tap>(fake.queues, fake.clock);
  Ledger ledger{tap};
  InspectionService service{fake.log, ledger, *tap, kOwnUser};
  bool isAccepted = false;
};

TEST_F(InspectionServiceTest, IsForRootAndItsOwnUser) {
  for (const uid_t user : {uid_t{0}, kOwnUser}) {
    const auto connection = connectionOf(user);
    EXPECT_TRUE(isAccepted);
    EXPECT_TRUE(connection->resumed());
    EXPECT_EQ(connection->exportedInterface(), &inspectionInterface());
  }
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(InspectionServiceTest, TurnsEverybodyElseAwayWithOneLine) {
  for (const std::optional<uid_t> user : {std::optional<uid_t>(1'000), std::optional<uid_t>()}) {
    fake.log.clear();
    const auto connection = connectionOf(user);
    EXPECT_FALSE(isAccepted);
    EXPECT_FALSE(connection->resumed());
    ASSERT_EQ(fake.log.lines().size(), 1U);
    EXPECT_EQ(fake.log.lines()[0].text, "Inspection is not for this client of process 7.");
    EXPECT_EQ(fake.log.lines()[0].level, platform::LogLevel::Warning);
  }
}

TEST_F(InspectionServiceTest, AnswersStatsWithTheLedgersSnapshot) {
  const auto book = ledger.openBook();
  book->messages().send();
  const auto call = connectionOf(0)->call("Stats");
  ASSERT_EQ(call->replies.size(), 1U);
  EXPECT_EQ(call->replies[0], std::vector<Value>{ledger.snapshot()});
}

TEST_F(InspectionServiceTest, TapsUntilTheConnectionEnds) {
  const auto connection = connectionOf(0);
  TapEnd end;
  EXPECT_EQ(callTap(*connection, std::move(end.writing))->replies.size(), 1U);
  EXPECT_TRUE(tap->isListening());
  tap->write(tap->line("test"));
  fake.queues.run();
  EXPECT_NE(end.next().value_or("").find("\"kind\":\"test\""), std::string::npos);
  connection->invalidate();
  fake.queues.run();
  EXPECT_FALSE(tap->isListening());
  EXPECT_TRUE(end.ended());
}

TEST_F(InspectionServiceTest, RejectsAnOutputThatCannotBeWrittenWithoutWaiting) {
  const auto connection = connectionOf(0);
  EXPECT_EQ(
      callTap(*connection, FileDescriptor(::open("/dev/null", O_WRONLY | O_CLOEXEC)))->rejections.size(), 1U);
  EXPECT_EQ(connection->call("Tap", {Value()})->rejections.size(), 1U);
  EXPECT_FALSE(tap->isListening());
}

}  // namespace
}  // namespace tallyd
