#include "support/BusClient.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <bit>
#include <cstring>
#include <stdexcept>
#include <system_error>

namespace tallyd::test {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::uint8_t kMethodCall = 1;
constexpr std::uint8_t kError = 3;
constexpr std::uint8_t kNoReplyExpected = 1;
constexpr std::size_t kHeaderBytes = 16;

/// D-Bus marshalling; alignment counts from the first byte.
class Marshaller {
 public:
  void align(std::size_t boundary) {
    while (_bytes.size() % boundary != 0) _bytes.push_back('\0');
  }
  template <class Integer>
  void integer(Integer value) {
    align(sizeof value);
    char raw[sizeof value];
    std::memcpy(raw, &value, sizeof value);
    _bytes.append(raw, sizeof value);
  }
  void string(std::string_view text) {
    integer(static_cast<std::uint32_t>(text.size()));
    _bytes.append(text).push_back('\0');
  }
  void signature(std::string_view text) {
    _bytes.push_back(static_cast<char>(text.size()));
    _bytes.append(text).push_back('\0');
  }
  /// `elements` writes them; `boundary` is that of their type.
  template <class Elements>
  void array(std::size_t boundary, Elements&& elements) {
    integer(std::uint32_t{0});
    const std::size_t length = _bytes.size() - sizeof(std::uint32_t);
    align(boundary);
    const std::size_t start = _bytes.size();
    elements();
    const auto size = static_cast<std::uint32_t>(_bytes.size() - start);
    std::memcpy(_bytes.data() + length, &size, sizeof size);
  }
  void raw(std::string_view bytes) { _bytes += bytes; }
  [[nodiscard]] const std::string& bytes() const { return _bytes; }

 private:
  static_assert(std::endian::native == std::endian::little);
  std::string _bytes;
};

void appendVariant(Marshaller& out, const Value& value) {
  if (const auto text = value.string()) {
    out.signature("s");
    out.string(*text);
  } else if (value.isBoolean()) {
    out.signature("b");
    out.integer(static_cast<std::uint32_t>(value.booleanValue() ? 1 : 0));
  } else if (value.isReal()) {
    out.signature("d");
    out.integer(*value.realValue());
  } else if (value.isInteger()) {
    out.signature("x");
    out.integer(*value.integerValue());
  } else {
    throw std::invalid_argument("a client of this kind sends plain values only");
  }
}

/// "aa{sv}" with the dictionary as its only element.
void appendDictionary(Marshaller& out, const Dictionary& dictionary) {
  out.array(sizeof(std::uint32_t), [&] {
    out.array(8, [&] {
      for (const auto& [key, value] : dictionary) {
        out.align(8);
        out.string(key);
        appendVariant(out, value);
      }
    });
  });
}

std::string methodCall(std::uint32_t serial, std::string_view member, std::string_view signature,
                       const std::string& body, Answer answer) {
  Marshaller out;
  out.raw("l");
  out.integer(kMethodCall);
  out.integer(answer == Answer::Wanted ? std::uint8_t{0} : kNoReplyExpected);
  out.integer(std::uint8_t{1});
  out.integer(static_cast<std::uint32_t>(body.size()));
  out.integer(serial);
  const auto field = [&](std::uint8_t code, std::string_view type) {
    out.align(8);
    out.integer(code);
    out.signature(type);
  };
  out.array(8, [&] {
    field(1, "o");
    out.string("/com/quillon/tallyd");
    field(2, "s");
    out.string("com.quillon.tallyd.ClientSessionInterface");
    field(3, "s");
    out.string(member);
    if (signature.empty()) return;
    field(8, "g");
    out.signature(signature);
  });
  out.align(8);
  out.raw(body);
  return out.bytes();
}

std::uint32_t numberAt(std::string_view bytes, std::size_t offset) {
  std::uint32_t number = 0;
  std::memcpy(&number, bytes.substr(offset).data(), sizeof number);
  return number;
}

std::size_t roundedUp(std::size_t size) { return (size + 7) / 8 * 8; }

/// The size of the message that `bytes` starts with; nothing while its header is not there.
std::optional<std::size_t> messageSize(std::string_view bytes) {
  if (bytes.size() < kHeaderBytes) return std::nullopt;
  return kHeaderBytes + roundedUp(numberAt(bytes, 12)) + numberAt(bytes, 4);
}

/// The serial that a whole message answers; nothing when it is no answer.
std::optional<std::uint32_t> answeredSerial(std::string_view message) {
  constexpr char kReplySerial = 5;
  const std::size_t end = kHeaderBytes + numberAt(message, 12);
  for (std::size_t at = kHeaderBytes; at < end;) {
    at = roundedUp(at);
    const char code = message[at];
    const char type = message[at + 2];
    at += 4;  // Code, and a signature of one letter.
    if (type == 'u') {
      if (code == kReplySerial) return numberAt(message, at);
      at += sizeof(std::uint32_t);
    } else if (type == 'g') {
      at += static_cast<unsigned char>(message[at]) + 2U;
    } else {
      at += sizeof(std::uint32_t) + numberAt(message, at) + 1;
    }
  }
  return std::nullopt;
}

}  // namespace

std::string bus_calls::authentication() {
  return std::string(1, '\0') + "AUTH ANONYMOUS 7465\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

std::string bus_calls::setSessionInfo(std::uint32_t serial, const Dictionary& sessionInfo,
                                      const Dictionary& userInfo, Answer answer) {
  Marshaller body;
  appendDictionary(body, sessionInfo);
  appendDictionary(body, userInfo);
  body.array(sizeof(std::uint32_t), [] {});
  return methodCall(serial, "SetSessionInfo", "aa{sv}aa{sv}as", body.bytes(), answer);
}

std::string bus_calls::plain(std::uint32_t serial, std::string_view member, Answer answer) {
  return methodCall(serial, member, "", "", answer);
}

std::string bus_calls::sendMessage(std::uint32_t serial, std::uint16_t category, std::uint16_t type,
                                   const Dictionary& payload, Answer answer) {
  Marshaller body;
  body.integer(category);
  body.integer(type);
  appendDictionary(body, payload);
  return methodCall(serial, "SendMessageWithCategory", "qqaa{sv}", body.bytes(), answer);
}

BusClient::BusClient(const std::filesystem::path& socketPath)
    : _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  socketPath.string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::connect(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("can't connect: " + std::generic_category().message(errno));
  }
}

void BusClient::authenticate() {
  constexpr std::string_view kLastAnswer = "AGREE_UNIX_FD\r\n";
  write(bus_calls::authentication());
  std::size_t at = 0;
  while ((at = _received.find(kLastAnswer)) == std::string::npos) readMore();
  _received.erase(0, at + kLastAnswer.size());
}

void BusClient::startSession(const Dictionary& sessionInfo, const Dictionary& userInfo) {
  const std::uint32_t serial = nextSerial();
  write(bus_calls::setSessionInfo(serial, sessionInfo, userInfo, Answer::Wanted));
  awaitAnswer(serial);
  call("StartConfig");
}

void BusClient::sendMessage(std::uint16_t category, std::uint16_t type, const Dictionary& payload,
                            Answer answer) {
  const std::uint32_t serial = nextSerial();
  write(bus_calls::sendMessage(serial, category, type, payload, answer));
  if (answer == Answer::Wanted) awaitAnswer(serial);
}

void BusClient::call(std::string_view member) {
  const std::uint32_t serial = nextSerial();
  write(bus_calls::plain(serial, member, Answer::Wanted));
  awaitAnswer(serial);
}

void BusClient::write(std::string_view bytes) const {
  while (!bytes.empty()) {
    const ssize_t sent = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (sent < 0 && errno == EINTR) continue;
    if (sent <= 0) throw std::runtime_error("can't send: " + std::generic_category().message(errno));
    bytes.remove_prefix(static_cast<std::size_t>(sent));
  }
}

std::size_t BusClient::writeSome(std::string_view bytes) const {
  const ssize_t sent = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  return sent > 0 ? static_cast<std::size_t>(sent) : 0;
}

void BusClient::waitForRoom(std::chrono::milliseconds time) const {
  pollfd ready{.fd = _socket.get(), .events = POLLOUT, .revents = 0};
  ::poll(&ready, 1, static_cast<int>(time.count()));
}

void BusClient::awaitAnswer(std::uint32_t serial) {
  while (true) {
    const auto size = messageSize(_received);
    if (!size || _received.size() < *size) {
      readMore();
      continue;
    }
    const std::string message = _received.substr(0, *size);
    _received.erase(0, *size);
    if (answeredSerial(message) != serial) continue;
    if (message[1] == kError) throw std::runtime_error("the call failed");
    return;
  }
}

void BusClient::readMore() {
  pollfd ready{.fd = _socket.get(), .events = POLLIN, .revents = 0};
  const auto patience = std::chrono::duration_cast<std::chrono::milliseconds>(kPatience);
  if (::poll(&ready, 1, static_cast<int>(patience.count())) <= 0) throw std::runtime_error("no answer");
  char bytes[4096];
  const ssize_t got = ::recv(_socket.get(), bytes, sizeof bytes, 0);
  if (got <= 0) throw std::runtime_error("the daemon has closed the connection");
  _received.append(bytes, static_cast<std::size_t>(got));
}

bool BusClient::isClosedByDaemon() const {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  char bytes[4096];
  while (std::chrono::steady_clock::now() < deadline) {
    pollfd ready{.fd = _socket.get(), .events = POLLIN, .revents = 0};
    constexpr int kStepMs = 1000;
    if (::poll(&ready, 1, kStepMs) > 0 && ::recv(_socket.get(), bytes, sizeof bytes, 0) <= 0) return true;
  }
  return false;
}

}  // namespace tallyd::test
