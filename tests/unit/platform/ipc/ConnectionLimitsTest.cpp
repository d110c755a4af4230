#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cstring>
#include <string>
#include <vector>

#include "fakes/FakeQueues.h"
#include "platform/dbus/Message.h"
#include "platform/ipc/DBusServiceConnection.h"

namespace tallyd::platform {
namespace {

using namespace std::string_view_literals;

/// A connection on time that the test moves, and a client that is nothing but a socket.
class ConnectionLimitsTest : public testing::Test {
 protected:
  ConnectionLimitsTest() {
    int ends[2];
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends), 0);
    client = FileDescriptor(ends[0]);
    connection = std::make_shared<DBusServiceConnection>(FileDescriptor(ends[1]), queues, 1);
    connection->setInterruptionHandler([this] { isInterrupted = true; });
    connection->setInvalidationHandler([this] { isInvalidated = true; });
    connection->resume();
    queues.serveReadable();
  }

  /// A connection holds itself until its client leaves.
  void TearDown() override {
    client.reset();
    queues.serveReadable();
  }

  bool put(std::string_view bytes) {
    const ssize_t sent = ::send(client.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    queues.serveReadable();
    return sent == static_cast<ssize_t>(bytes.size());
  }
  void authenticate() { ASSERT_TRUE(put("\0AUTH ANONYMOUS 61\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv)); }
  /// One byte of a message that never comes wholly, with descriptors.
  void putDescriptors(std::size_t count) {
    const std::vector<int> descriptors(count, client.get());
    std::vector<char> control(CMSG_SPACE(count * sizeof(int)));
    char byte = 'l';
    iovec part{.iov_base = &byte, .iov_len = 1};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* const header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(count * sizeof(int));
    std::memcpy(CMSG_DATA(header), descriptors.data(), count * sizeof(int));
    ASSERT_EQ(::sendmsg(client.get(), &message, MSG_NOSIGNAL), 1);
  }
  static std::string call() {
    std::string bytes;
    dbus::MessageBuilder(bytes, {.serial = 1,
                                 .path = "/",
                                 .interface = "org.freedesktop.DBus.Introspectable",
                                 .member = "Introspect"})
        .finish();
    return bytes;
  }

  fakes::FakeQueues queues;
  FileDescriptor client;
  std::shared_ptr<DBusServiceConnection> connection;
  bool isInterrupted = false;
  bool isInvalidated = false;
};

TEST_F(ConnectionLimitsTest, AClientThatDoesNotAuthenticateItselfIsClosedInTime) {
  queues.advance(DBusConnection::kAuthenticationTime - std::chrono::milliseconds(1));
  EXPECT_FALSE(isInvalidated);
  queues.advance(std::chrono::milliseconds(1));
  EXPECT_TRUE(isInvalidated);
  EXPECT_FALSE(isInterrupted);
}

TEST_F(ConnectionLimitsTest, AnAuthenticatedClientMayStaySilent) {
  authenticate();
  queues.advance(DBusConnection::kAuthenticationTime * 10);
  EXPECT_FALSE(isInvalidated);
}

TEST_F(ConnectionLimitsTest, DescriptorsThatWaitForTheirMessageAreBounded) {
  authenticate();
  putDescriptors(DBusConnection::kMaximumDescriptors / 2);
  queues.serveReadable();
  EXPECT_FALSE(isInvalidated);
  putDescriptors(DBusConnection::kMaximumDescriptors / 2 + 1);
  queues.serveReadable();
  EXPECT_TRUE(isInterrupted);
  EXPECT_TRUE(isInvalidated);
}

TEST_F(ConnectionLimitsTest, NothingMoreIsReadFromAClientThatDoesNotReadItsAnswers) {
  authenticate();
  constexpr int kFarTooMany = 200'000;
  int calls = 0;
  while (calls < kFarTooMany && put(call())) ++calls;
  EXPECT_LT(calls, kFarTooMany);
  EXPECT_FALSE(isInvalidated);
}

}  // namespace
}  // namespace tallyd::platform
