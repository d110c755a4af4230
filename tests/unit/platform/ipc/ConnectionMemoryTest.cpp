// Memory that runs out in any step of a connection's life: it ends, is heard to end, and holds nothing.

#include <gtest/gtest.h>

#include <array>
#include <filesystem>
#include <new>
#include <thread>

#include "RawClient.h"
#include "TestService.h"
#include "fakes/FakeQueues.h"
#include "platform/ipc/DBusServiceConnection.h"
#include "support/FailingAllocation.h"

namespace tallyd::platform {
namespace {

/// What a service is told of one connection, counted without memory.
struct Heard {
  int calls = 0;
  int invalidated = 0;
  int dropped = 0;
};

class CountingObject final : public ExportedObject {
 public:
  explicit CountingObject(Heard& heard) : _heard(heard) {}
  ~CountingObject() override { ++_heard.dropped; }
  CountingObject(const CountingObject&) = delete;
  CountingObject& operator=(const CountingObject&) = delete;

  void handleCall(const std::shared_ptr<IncomingCall>& call) override {
    ++_heard.calls;
    call->reply(call->methodIndex() == kEcho ? call->arguments() : std::vector<Value>());
  }

 private:
  Heard& _heard;
};

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

/// Sends all of the bytes, the descriptors with the first.
void sendWithDescriptors(int socket, std::string_view bytes, const std::array<int, 2>& descriptors) {
  union {
    cmsghdr header;
    std::array<char, CMSG_SPACE(sizeof descriptors)> bytes;
  } control{};
  iovec part{.iov_base = const_cast<char*>(bytes.data()), .iov_len = bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes.data();
  message.msg_controllen = control.bytes.size();
  control.header.cmsg_level = SOL_SOCKET;
  control.header.cmsg_type = SCM_RIGHTS;
  control.header.cmsg_len = CMSG_LEN(sizeof descriptors);
  std::memcpy(CMSG_DATA(&control.header), descriptors.data(), sizeof descriptors);
  ASSERT_EQ(::sendmsg(socket, &message, MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
}

class ConnectionMemoryTest : public testing::Test {
 protected:
  void connect() {
    std::array<int, 2> ends{};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()), 0);
    client = FileDescriptor(ends[0]);
    service = FileDescriptor(ends[1]);
  }

  /// Does what the queues have to do; what finds no memory to be given to them comes again.
  void serve() {
    try {
      queues.serveReadable();
    } catch (const std::bad_alloc&) {
      return;
    }
  }

  /// A connection from its first byte to its end, whose `number`-th allocation fails; false when there are
  /// not as many.
  bool liveWithout(int number) {
    auto connection = std::make_shared<DBusServiceConnection>(std::move(service), queues, 1);
    connection->setExportedInterface(testInterface());
    connection->setExportedObject(std::make_shared<CountingObject>(heard));
    connection->setInterruptionHandler([] { throw std::bad_alloc(); });
    connection->setInvalidationHandler([this] { ++heard.invalidated; });
    connection->resume();
    connection.reset();
    const std::string bytes = RawClient::authentication() +
                              rawCall(1, "Echo", "v", RawBytes().signature("s").text("a text").bytes()) +
                              rawCall(2, "Nothing");
    sendWithDescriptors(client.get(), bytes, {client.get(), client.get()});
    const test::OneFailingAllocation failing(std::this_thread::get_id(), number);
    serve();
    ::shutdown(client.get(), SHUT_WR);
    serve();
    return failing.hasFailed();
  }

  fakes::FakeQueues queues;
  FileDescriptor client;
  FileDescriptor service;
  Heard heard;
};

TEST_F(ConnectionMemoryTest, TheEndIsHeardWhicheverAllocationFails) {
  int number = 0;
  bool failed = true;
  while (failed) {
    heard = {};
    const std::size_t before = openDescriptors();
    connect();
    failed = liveWithout(++number);
    queues.serveReadable();
    client.reset();
    queues.serveReadable();
    EXPECT_EQ(heard.invalidated, 1) << "allocation " << number;
    EXPECT_EQ(heard.dropped, 1) << "allocation " << number;
    EXPECT_EQ(queues.armedTimers(), 0U) << "allocation " << number;
    EXPECT_EQ(openDescriptors(), before) << "allocation " << number;
  }
  EXPECT_EQ(heard.calls, 2);
  EXPECT_GT(number, 10);
}

}  // namespace
}  // namespace tallyd::platform
