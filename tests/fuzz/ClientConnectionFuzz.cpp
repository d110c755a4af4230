// A whole client's connection: bytes into the socket, in pieces, through session and backends, and the
// answers.

#include <sys/socket.h>

#include <map>
#include <set>
#include <string>

#include "ClosedPlatform.h"
#include "FuzzTarget.h"
#include "fakes/FakeSessionDelegate.h"
#include "framework/ClientSessionInterface.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/ByteReader.h"
#include "platform/dbus/Message.h"
#include "platform/ipc/DBusServiceConnection.h"
#include "session/ClientSessionExport.h"
#include "session/TallydSession.h"
#include "support/MessageLog.h"
#include "support/SessionBook.h"

namespace tallyd::fuzz {
namespace {

using namespace platform;
using namespace std::string_view_literals;

/// Says who it is, and that descriptors may come.
constexpr std::string_view kDialogue = "\0AUTH ANONYMOUS 61\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv;

/// A storebag with a backend of every kind but those that load a client's code.
Dictionary storebag() {
  const Dictionary client{{"client", ""},
                          {"locale_whitelist", Array{"US"}},
                          {"filters", Array{Dictionary{{"key", "secret"}, {"action", "remove"}}}},
                          {"sampling_threshold", 1.0},
                          {"post_url", "https://collector.test/in"}};
  return {{"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", 9}, {"post_url", "http://logs.test/in"}}},
          {"power", Dictionary()},
          {"splunk", Dictionary{{"clients", Array{client}}, {"post_url", "https://collector.test/in"}}},
          {"upload_server", Dictionary{{"url", "https://upload.test/in"}}}};
}

/// The daemon's end of one connection, and the client's socket.
class Connection {
 public:
  Connection() {
    _delegate.storebag = storebag();
    int ends[2];
    FUZZ_CHECK(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0);
    _client = FileDescriptor(ends[0]);
    auto connection = std::make_shared<DBusServiceConnection>(FileDescriptor(ends[1]), queues(), 1);
    auto session = std::make_shared<TallydSession>(_delegate, _closed.platform, _messageLog,
                                                   TallyBackend::newBackendWithName, _book);
    connection->setExportedInterface(clientSessionInterface());
    connection->setExportedObject(std::make_shared<ClientSessionExport>(session, _closed.sandbox));
    connection->setInterruptionHandler([this] {
      FUZZ_CHECK(!_isInvalidated);
      _isInterrupted = true;
    });
    connection->setInvalidationHandler([this, session] {
      FUZZ_CHECK(!_isInvalidated);
      _isInvalidated = true;
    });
    connection->resume();
    queues().serveReadable();
  }

  void put(std::string_view bytes) {
    while (!bytes.empty() && !_isInvalidated) {
      const ssize_t sent = ::send(_client.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (sent < 0) return;  // Too much waits: the daemon reads no more until its answers are read.
      bytes.remove_prefix(static_cast<std::size_t>(sent));
      queues().serveReadable();
      takeAnswers();
    }
  }

  /// The client goes; what it got until then.
  std::string close() {
    ::shutdown(_client.get(), SHUT_WR);
    queues().serveReadable();
    takeAnswers();
    _client.reset();
    queues().serveReadable();
    queues().advance(std::chrono::hours(1));
    FUZZ_CHECK(_isInvalidated);
    checkBooks();
    return _answers;
  }

  [[nodiscard]] bool isInterrupted() const { return _isInterrupted; }

 private:
  fakes::FakeQueues& queues() { return _closed.fake.queues; }

  void takeAnswers() {
    char buffer[65'536];
    ssize_t length = 0;
    while ((length = ::recv(_client.get(), buffer, sizeof buffer, MSG_DONTWAIT)) > 0) {
      _answers.append(buffer, static_cast<std::size_t>(length));
    }
  }

  void checkBooks() const {
    const SessionCounts counts = _book->counts();
    FUZZ_CHECK(counts.messages.isBalanced() && counts.messages.inFlight == 0);
    FUZZ_CHECK(counts.uploads.isBalanced() && counts.uploads.inFlight == 0);
    for (const auto& [name, backend] : counts.backends) {
      FUZZ_CHECK(backend.isBalanced() && backend.inFlight == 0 && backend.held == 0);
    }
  }

  ClosedPlatform _closed;
  fakes::FakeSessionDelegate _delegate;
  MessageLog _messageLog{_closed.platform};
  const std::shared_ptr<SessionBook> _book = std::make_shared<SessionBook>();
  FileDescriptor _client;
  std::string _answers;
  bool _isInterrupted = false;
  bool _isInvalidated = false;
};

/// Each answer is a sound message to a call that was made, and no call gets two.
void checkAnswers(std::string_view answers, std::multiset<std::uint32_t> calls) {
  while (!answers.empty()) {
    const std::size_t length = dbus::messageLength(answers);
    if (length == 0 || length > answers.size()) return;  // Cut where the connection broke.
    const dbus::Message answer = dbus::parseMessage(answers.substr(0, length));
    FUZZ_CHECK(answer.fields.type == dbus::MessageType::MethodReturn ||
               answer.fields.type == dbus::MessageType::Error);
    const auto call = calls.find(*answer.fields.replySerial);
    FUZZ_CHECK(call != calls.end());
    calls.erase(call);
    FUZZ_CHECK(!dbus::readBody(answer.body, answer.order, answer.fields.signature, {}).problem);
    answers.remove_prefix(length);
  }
}

/// The serial numbers of the calls that want an answer, up to where the bytes are no messages any more.
std::multiset<std::uint32_t> callsIn(std::string_view bytes) {
  std::multiset<std::uint32_t> calls;
  try {
    while (true) {
      const std::size_t length = dbus::messageLength(bytes);
      if (length == 0 || length > bytes.size()) return calls;
      const dbus::Message message = dbus::parseMessage(bytes.substr(0, length));
      if (message.fields.expectsReply()) calls.insert(message.fields.serial);
      bytes.remove_prefix(length);
    }
  } catch (const dbus::Malformed&) {
    return calls;
  }
}

struct Outcome {
  std::string answers;
  bool isInterrupted;
};

Outcome converse(std::string_view bytes, std::uint32_t seed) {
  Connection connection;
  connection.put(kDialogue);
  for (Pieces pieces(bytes, seed); !pieces.areOver();) connection.put(pieces.take());
  std::string answers = connection.close();
  // The dialogue's part has the server's random identifier.
  constexpr std::string_view kLastLine = "AGREE_UNIX_FD\r\n";
  const auto end = answers.find(kLastLine);
  FUZZ_CHECK(end != std::string::npos);
  answers.erase(0, end + kLastLine.size());
  return {std::move(answers), connection.isInterrupted()};
}

}  // namespace
}  // namespace tallyd::fuzz

/// A byte that says how the rest is cut into pieces, and the messages.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const std::uint8_t seed = input.takeByte();
  const auto bytes = input.takeRest();
  const Outcome parts = converse(bytes, seed + 1U);
  checkAnswers(parts.answers, callsIn(bytes));
  if (seed % 4 != 0) return 0;
  // However it was cut, it is the same conversation; one that breaks takes answers along that wait.
  const Outcome whole = converse(bytes, 0);
  FUZZ_CHECK(whole.isInterrupted == parts.isInterrupted);
  if (whole.isInterrupted) {
    FUZZ_CHECK(parts.answers.starts_with(whole.answers));
  } else {
    FUZZ_CHECK(parts.answers == whole.answers);
  }
  return 0;
}
