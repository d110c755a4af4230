#include "Recording.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <vector>

#include "Events.h"
#include "fakes/TemporaryFolder.h"
#include "framework/TallyConnection.h"
#include "framework/TallyKeys.h"

namespace tallyd::bench {

using platform::Dictionary;
using platform::FileDescriptor;

namespace {

// D-Bus Specification, "Message Format" and "Authentication Protocol".
constexpr std::size_t kFixedHeader = 16;
constexpr std::size_t kTypeOffset = 1;
constexpr std::size_t kBodyLengthOffset = 4;
constexpr std::size_t kSerialOffset = 8;
constexpr std::size_t kFieldsLengthOffset = 12;
constexpr char kMethodReturn = 2;
constexpr std::string_view kBegin = "BEGIN\r\n";
constexpr std::string_view kAccepted = "DATA\r\nOK 00000000000000000000000000000001\r\nAGREE_UNIX_FD\r\n";
constexpr int kLinesOfAcceptance = 3;

[[noreturn]] void fail(const char* what) { throw std::system_error(errno, std::generic_category(), what); }

/// In this machine's byte order, which is what the library sends in.
std::uint32_t numberAt(const char* bytes) {
  std::uint32_t number = 0;
  std::memcpy(&number, bytes, sizeof number);
  return number;
}

std::size_t sizeOfMessage(const char* header) {
  const std::size_t fields = (std::size_t{numberAt(header + kFieldsLengthOffset)} + 7) / 8 * 8;
  return kFixedHeader + fields + numberAt(header + kBodyLengthOffset);
}

sockaddr_un addressOf(const std::filesystem::path& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

/// Plays the daemon for one connection, and takes down what it hears.
class Listener {
 public:
  explicit Listener(const std::filesystem::path& path)
      : _listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = addressOf(path);
    if (::bind(_listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        ::listen(_listener.get(), 1) != 0) {
      fail("listen");
    }
  }

  std::string authentication() {
    _socket = FileDescriptor(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    std::size_t end = std::string::npos;
    while ((end = _heard.find(kBegin)) == std::string::npos) hear();
    if (::send(_socket.get(), kAccepted.data(), kAccepted.size(), MSG_NOSIGNAL) < 0) fail("send");
    return take(end + kBegin.size());
  }

  std::string message() {
    while (_heard.size() < kFixedHeader) hear();
    const std::size_t size = sizeOfMessage(_heard.data());
    while (_heard.size() < size) hear();
    return take(size);
  }

  /// Else the client would wait for its answers.
  void hangUp() { _socket.reset(); }

 private:
  void hear() {
    char bytes[4096];
    const ssize_t length = ::recv(_socket.get(), bytes, sizeof bytes, 0);
    if (length <= 0) fail("recv");
    _heard.append(bytes, static_cast<std::size_t>(length));
  }

  std::string take(std::size_t length) {
    std::string taken = _heard.substr(0, length);
    _heard.erase(0, length);
    return taken;
  }

  FileDescriptor _listener;
  FileDescriptor _socket;
  std::string _heard;
};

std::size_t placeOf(const std::string& text, const std::string& message) {
  const auto place = message.find(text);
  if (place == std::string::npos) throw std::runtime_error("the recorded message lacks a field");
  return place;
}

void put(std::string& chunk, std::size_t place, const std::string& text) {
  text.copy(&chunk[place], text.size());
}

}  // namespace

Recording recordClient(Posting posting) {
  constexpr std::int32_t kClientType = 5;  // The first that has a storebag.
  const fakes::TemporaryFolder folder;
  const auto path = folder.path() / "socket";
  Listener listener(path);
  TallyConnection client(path);
  const Dictionary sessionInfo{{std::string(kTallySessionInfoSessionID), 1},
                               {std::string(kTallySessionInfoClientType), kClientType},
                               {std::string(kTallySessionInfoRequireUserInfo), true},
                               {std::string(kTallySessionInfoBatchEvent), posting == Posting::Batched}};
  const Dictionary userInfo{{std::string(kTallyUserInfoClientName), "Concert"},
                            {std::string(kTallyUserInfoServiceName), "playback"}};
  client.setSessionInfo(sessionInfo, userInfo, {}, [](const auto&) {});
  client.startConfig([](const auto&) {});
  client.fetchDisplayURL([](const auto&) {});
  client.sendMessage(kCategory, kType, payload(0), nullptr);
  client.flushMessages(nullptr);
  client.flushMessages([](const auto&) {});
  Recording recording;
  recording.authentication = listener.authentication();
  recording.setSessionInfo = listener.message();
  recording.startConfig = listener.message();
  recording.fetchDisplayURL = listener.message();
  recording.sendMessage = listener.message();
  recording.flushMessages = listener.message();
  recording.flushAndAnswer = listener.message();
  listener.hangUp();
  return recording;
}

ReplayingClient::ReplayingClient(const Recording& recording)
    : _recording(recording), _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {}

ReplayingClient::ReplayingClient(const std::filesystem::path& socketPath, const Recording& recording)
    : ReplayingClient(recording) {
  connect(socketPath);
  awaitAcceptance();
}

std::vector<ReplayingClient> ReplayingClient::crowd(std::size_t size, const std::filesystem::path& socketPath,
                                                    const Recording& recording) {
  std::vector<ReplayingClient> clients;
  clients.reserve(size);
  for (std::size_t i = 0; i < size; ++i) {
    clients.push_back(ReplayingClient(recording));
    clients.back().connect(socketPath);
  }
  for (const ReplayingClient& client : clients) client.awaitAcceptance();
  return clients;
}

void ReplayingClient::connect(const std::filesystem::path& socketPath) {
  const sockaddr_un address = addressOf(socketPath);
  if (!_socket ||
      ::connect(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    fail("connect");
  }
  write(_recording.authentication);
}

void ReplayingClient::awaitAcceptance() const {
  for (int lines = 0; lines < kLinesOfAcceptance;) {
    char byte = 0;
    read(&byte, 1);
    if (byte == '\n') ++lines;
  }
}

void ReplayingClient::send(std::string_view message) {
  std::string sent;
  append(sent, message);
  write(sent);
}

std::string ReplayingClient::call(std::string_view message) {
  send(message);
  char header[kFixedHeader];
  read(header, sizeof header);
  std::string rest(sizeOfMessage(header) - kFixedHeader, '\0');
  read(rest.data(), rest.size());
  if (header[kTypeOffset] != kMethodReturn) throw std::runtime_error("the daemon answers with an error");
  return rest;
}

void ReplayingClient::append(std::string& chunk, std::string_view message) {
  const std::size_t start = chunk.size();
  chunk += message;
  ++_serial;
  std::memcpy(&chunk[start + kSerialOffset], &_serial, sizeof _serial);
}

void ReplayingClient::sendEvents(std::size_t first, std::size_t count, std::size_t flushEvery) {
  std::vector<std::size_t> places;
  const VariableTexts recorded = variableTexts(0);
  for (const std::string* text : recorded.all()) places.push_back(placeOf(*text, _recording.sendMessage));
  std::string chunk;
  for (std::size_t number = first; number < first + count; ++number) {
    const std::size_t start = chunk.size();
    append(chunk, _recording.sendMessage);
    const VariableTexts texts = variableTexts(number);
    for (std::size_t i = 0; i < places.size(); ++i) put(chunk, start + places[i], *texts.all()[i]);
    const std::size_t sent = number + 1 - first;
    if (flushEvery != kNoFlush && sent % flushEvery == 0) append(chunk, _recording.flushMessages);
    if (sent % kBatchSize != 0) continue;
    write(chunk);
    chunk.clear();
  }
}

void ReplayingClient::write(std::string_view bytes) const {
  while (!bytes.empty()) {
    const ssize_t length = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (length < 0) fail("send");
    bytes.remove_prefix(static_cast<std::size_t>(length));
  }
}

void ReplayingClient::read(char* bytes, std::size_t length) const {
  if (length > 0 && ::recv(_socket.get(), bytes, length, MSG_WAITALL) != static_cast<ssize_t>(length))
    fail("recv");
}

}  // namespace tallyd::bench
