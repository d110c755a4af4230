#include <signal.h>
#include <sys/wait.h>

#include <system_error>

#include "IPCTest.h"

namespace tallyd::platform {
namespace {

class ConnectionEndTest : public IPCTest {
 protected:
  /// Authenticates and makes a first call.
  static void greet(RawClient& client) {
    client.authenticate().send(rawCall(1, "Nothing"));
    ASSERT_TRUE(client.receiveMessage());
  }
};

TEST_F(ConnectionEndTest, ClosingBetweenMessagesOnlyInvalidates) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  client.close();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
}

TEST_F(ConnectionEndTest, ClosingWithoutAWordOnlyInvalidates) {
  RawClient client(_socketPath);
  client.close();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
}

TEST_F(ConnectionEndTest, ClosingRightAfterAMessageOnlyInvalidates) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  client.close();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_F(ConnectionEndTest, EveryPartOfAMessageThatIsCutOffInterrupts) {
  const auto message = rawCall(1, "Echo", "v", RawBytes().signature("s").text("text").bytes());
  std::size_t ends = 0;
  for (std::size_t size = 1; size < message.size(); size += 5) {
    RawClient client(_socketPath);
    greet(client);
    client.send(message.substr(0, size));
    client.close();
    ++ends;
    ASSERT_TRUE(_service.events.waitFor("dropped", ends));
    EXPECT_EQ(_service.events.count("interrupted"), ends) << "after " << size << " bytes";
  }
  EXPECT_EQ(_service.events.count("invalidated"), ends);
  EXPECT_EQ(_service.events.count("Echo"), 0U);
}

TEST_F(ConnectionEndTest, AMessageCutOffAfterItsFirstPartWasReadInterrupts) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  client.send(rawCall(2, "Nothing").substr(0, 30));
  client.send(rawCall(2, "Nothing").substr(30, 10));
  client.close();
  EXPECT_EQ(endEvents(), kInterrupted);
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_F(ConnectionEndTest, AMessageCutOffRightBehindTheAuthenticationInterrupts) {
  RawClient client(_socketPath);
  client.authenticate(rawCall(1, "Nothing") + rawCall(2, "Nothing").substr(0, 20));
  ASSERT_TRUE(client.receiveMessage());
  client.close();
  EXPECT_EQ(endEvents(), kInterrupted);
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_F(ConnectionEndTest, MessagesRightBehindTheAuthenticationAreHeardAndClosingOnlyInvalidates) {
  RawClient client(_socketPath);
  std::string calls;
  for (std::uint32_t i = 1; i <= 20; ++i) calls += rawCall(i, "Nothing");
  client.authenticate(calls);
  for (int i = 0; i < 20; ++i) ASSERT_TRUE(client.receiveMessage());
  client.close();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  EXPECT_EQ(_service.events.count("Nothing"), 20U);
}

TEST_F(ConnectionEndTest, BytesThatAreNoMessageInterruptAndClose) {
  RawClient client(_socketPath);
  client.authenticate().send("GET / HTTP/1.1\r\nHost: example.com\r\n\r\n");
  EXPECT_TRUE(client.isClosedByPeer());
  EXPECT_EQ(endEvents(), kInterrupted);
}

TEST_F(ConnectionEndTest, BytesThatAreNoAuthenticationInterruptAndClose) {
  RawClient client(_socketPath);
  client.send("GET / HTTP/1.1\r\nHost: example.com\r\n\r\n");
  EXPECT_TRUE(client.isClosedByPeer());
  EXPECT_EQ(endEvents(), kInterrupted);
}

struct Malformation {
  const char* name;
  std::function<void(std::string& message)> apply;
};

class MalformedMessageTest : public ConnectionEndTest, public testing::WithParamInterface<Malformation> {};

TEST_P(MalformedMessageTest, InterruptsAndCloses) {
  auto message = rawCall(1, "Nothing");
  GetParam().apply(message);
  RawClient client(_socketPath);
  greet(client);
  client.send(message);
  EXPECT_TRUE(client.isClosedByPeer());
  EXPECT_EQ(endEvents(), kInterrupted);
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_P(MalformedMessageTest, InterruptsAlsoWhenAGoodOneFollows) {
  auto message = rawCall(1, "Nothing");
  GetParam().apply(message);
  RawClient client(_socketPath);
  greet(client);
  client.send(message + rawCall(2, "Nothing") + rawCall(3, "Nothing"));
  EXPECT_EQ(endEvents(), kInterrupted);
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, MalformedMessageTest,
    testing::Values(Malformation{"ByteOrder", [](std::string& message) { message[0] = 'x'; }},
                    Malformation{"MessageType", [](std::string& message) { message[1] = 0; }},
                    Malformation{"ProtocolVersion", [](std::string& message) { message[3] = 9; }},
                    Malformation{"ZeroSerial", [](std::string& message) { message[8] = 0; }},
                    Malformation{"TooLong", [](std::string& message) { message[7] = '\x7F'; }},
                    Malformation{"FieldsTooLong", [](std::string& message) { message[15] = '\x7F'; }},
                    Malformation{"FieldType", [](std::string& message) { message[18] = '('; }},
                    Malformation{"Path", [](std::string& message) { message[24] = 'x'; }}),
    [](const auto& kind) { return std::string(kind.param.name); });

TEST_F(ConnectionEndTest, AKilledClientCountsAsClosed) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Nothing"));
  ASSERT_TRUE(client.receiveMessage());
  const pid_t child = ::fork();
  if (child == 0) {
    for (;;) ::pause();
  }
  client.close();  // Only the child still has the connection.
  EXPECT_EQ(_service.events.count("invalidated"), 0U);
  ::kill(child, SIGKILL);
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  ::waitpid(child, nullptr, 0);
}

TEST_F(ConnectionEndTest, AClientKilledWithinAMessageInterrupts) {
  RawClient client(_socketPath);
  greet(client);
  const auto half = rawCall(1, "Nothing").substr(0, 40);
  const pid_t child = ::fork();
  if (child == 0) {
    [[maybe_unused]] const auto sent = ::write(client.descriptor(), half.data(), half.size());
    ::kill(::getpid(), SIGKILL);
  }
  client.close();
  EXPECT_EQ(endEvents(), kInterrupted);
  ::waitpid(child, nullptr, 0);
}

TEST_F(ConnectionEndTest, AnAnswerThatComesAfterTheEndGoesNowhere) {
  RawClient client(_socketPath);
  client.authenticate().send(rawCall(1, "Large", "u", RawBytes().number(1'000'000).bytes()) +
                             rawCall(2, "Nothing"));
  client.close();
  EXPECT_EQ(endEvents(), kInvalidatedOnly);
  EXPECT_FALSE(call(*makeClient(), kNothing).error);
}

/// A service that does what the test says, for the client's side of an end.
class ForeignServiceTest : public testing::Test {
 protected:
  ForeignServiceTest() : _listening(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, _path.c_str(), sizeof address.sun_path - 1);
    EXPECT_EQ(::bind(_listening.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(::listen(_listening.get(), 1), 0);
    _client = DBusClientConnection::connect(_path, testInterface(), _queues);
    _client->setInterruptionHandler([this] { _events.add("interrupted"); });
    _client->setInvalidationHandler([this] { _events.add("invalidated"); });
    _served = FileDescriptor(::accept4(_listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
  }
  ~ForeignServiceTest() override { _client->close(std::chrono::seconds(5)); }

  void authenticate() {
    char byte = 0;
    std::string seen;
    while (!seen.ends_with("BEGIN\r\n") && ::read(_served.get(), &byte, 1) == 1) seen += byte;
    answer("DATA\r\nOK 0123456789abcdef0123456789abcdef\r\nAGREE_UNIX_FD\r\n");
  }
  void answer(std::string_view bytes) {
    EXPECT_EQ(::write(_served.get(), bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
  }
  void callAndExpectFailure() {
    _client->call({kNothing, {}, {}}, std::chrono::seconds(60), [this](DBusClientConnection::Reply reply) {
      _events.add(reply.error ? "failed" : "answered");
    });
  }
  void waitForCall() {
    char byte = 0;
    EXPECT_EQ(::read(_served.get(), &byte, 1), 1);
  }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "service";
  FileDescriptor _listening;
  AsioQueues _queues{1};
  TestEvents _events;
  std::shared_ptr<DBusClientConnection> _client;
  FileDescriptor _served;
};

TEST_F(ForeignServiceTest, WhenTheServiceClosesCallsFailAndTheConnectionIsInvalidated) {
  authenticate();
  callAndExpectFailure();
  waitForCall();
  _served.reset();
  ASSERT_TRUE(_events.waitFor("invalidated"));
  EXPECT_EQ(_events.all(), (std::vector<std::string>{"failed", "invalidated"}));
  callAndExpectFailure();
  EXPECT_TRUE(_events.waitFor("failed", 2));
}

TEST_F(ForeignServiceTest, WhenTheServiceBreaksOffWithinAMessageTheConnectionIsInterruptedFirst) {
  authenticate();
  callAndExpectFailure();
  waitForCall();
  answer(std::string("l\2\0\1\0\0\0\0\1\0\0\0", 12));
  _served.reset();
  ASSERT_TRUE(_events.waitFor("invalidated"));
  EXPECT_EQ(_events.all(), (std::vector<std::string>{"failed", "interrupted", "invalidated"}));
}

TEST_F(ForeignServiceTest, CallsMadeBeforeTheAuthenticationFailWhenItNeverComes) {
  callAndExpectFailure();
  _served.reset();
  ASSERT_TRUE(_events.waitFor("failed"));
  EXPECT_TRUE(_events.waitFor("invalidated"));
}

TEST_F(ForeignServiceTest, AHandlerThatIsSetAfterTheEndIsCalledAtOnce) {
  authenticate();
  _client->setInvalidationHandler({});
  callAndExpectFailure();
  waitForCall();
  _served.reset();
  ASSERT_TRUE(_events.waitFor("failed"));
  _client->setInvalidationHandler([this] { _events.add("late"); });
  EXPECT_TRUE(_events.waitFor("late"));
}

TEST_F(ForeignServiceTest, CloseDoesNotWaitForAServiceThatDoesNotTakeWhatWasCalled) {
  callAndExpectFailure();
  _client->close(std::chrono::milliseconds(20));
  EXPECT_EQ(_events.all(), std::vector<std::string>{"failed"});
}

TEST(DBusClientConnectionTest, NamesThePathThatItCannotConnectTo) {
  AsioQueues queues(1);
  try {
    DBusClientConnection::connect("/nonexistent/service", testInterface(), queues);
    FAIL();
  } catch (const std::system_error& error) {
    EXPECT_EQ(error.code().value(), ENOENT);
    EXPECT_NE(std::string(error.what()).find("/nonexistent/service"), std::string::npos);
  }
}

}  // namespace
}  // namespace tallyd::platform
