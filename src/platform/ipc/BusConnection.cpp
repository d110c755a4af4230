#include "platform/ipc/BusConnection.h"

#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <system_error>
#include <utility>

namespace tallyd::platform {

namespace {

constexpr std::uint64_t kNoTime = UINT64_MAX;

std::uint64_t monotonicMicroseconds() {
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000 + static_cast<std::uint64_t>(now.tv_nsec) / 1'000;
}

bool isWritable(int descriptor) {
  pollfd ready{.fd = descriptor, .events = POLLOUT, .revents = 0};
  return ::poll(&ready, 1, 0) > 0;
}

std::size_t unreadBytes(int descriptor) {
  int unread = 0;
  return ::ioctl(descriptor, FIONREAD, &unread) == 0 ? static_cast<std::size_t>(unread) : 0;
}

}  // namespace

/// What lies in the socket before the library reads it.
struct BusConnection::Waiting {
  /// Shows many messages at once: the kernel walks over all that waits for each look.
  static constexpr std::size_t kView = 65'536;

  std::array<char, kView> bytes;
  std::size_t viewed = 0;     ///< Bytes of `bytes` in use.
  std::size_t available = 0;  ///< As many bytes wait, or more behind a whole message.
  bool ended = false;         ///< Nothing waits and nothing will come.
  std::uint64_t queued = 0;   ///< Messages that wait for the other side.

  [[nodiscard]] std::string_view view() const { return {bytes.data(), viewed}; }
};

BusConnection::BusConnection(FileDescriptor socket, std::shared_ptr<SerialQueue> queue)
    : _socket(std::move(socket)), _descriptor(_socket.get()), _queue(std::move(queue)) {}

BusConnection::~BusConnection() = default;

void BusConnection::start() {
  if (_bus || _ended) return;
  int result = 0;
  Waiting before;
  try {
    sd_bus* bus = nullptr;
    checkBus(sd_bus_new(&bus), "sd_bus_new");
    _bus.reset(bus);
    checkBus(sd_bus_set_fd(bus, _descriptor, _descriptor), "sd_bus_set_fd");
    (void)_socket.release();
    const auto callback = [](sd_bus_message* message, void* self, sd_bus_error* error) {
      return filter(message, self, error);
    };
    checkBus(sd_bus_add_filter(bus, nullptr, callback, this), "sd_bus_add_filter");
    setUp(bus);
    _authentication = std::make_unique<std::string>();
    lookAtSocket(before);
    result = sd_bus_start(bus);
  } catch (const std::system_error&) {
    return end(End::BetweenMessages);
  }
  if (processed(result, before) != Step::Ended) takeTurn();
}

void BusConnection::wake() {
  if (_bus && !_takingTurn) takeTurn();
}

void BusConnection::end(End end) {
  if (std::exchange(_ended, true)) return;
  const auto keptAlive = shared_from_this();
  _readSource.reset();
  _writeSource.reset();
  _timer.reset();
  _bus.reset();
  _socket.reset();
  ended(end);
}

std::uint64_t BusConnection::queuedMessages() const {
  std::uint64_t queued = 0;
  if (_bus) sd_bus_get_n_queued_write(_bus.get(), &queued);
  return queued;
}

bool BusConnection::peerHasGone() const {
  pollfd hangUp{.fd = _descriptor, .events = 0, .revents = 0};
  return ::poll(&hangUp, 1, 0) > 0 && (hangUp.revents & POLLHUP) != 0;
}

int BusConnection::filter(sd_bus_message* message, void* self, void* /*error*/) noexcept {
  auto& connection = *static_cast<BusConnection*>(self);
  if (sd_bus_message_is_signal(message, "org.freedesktop.DBus.Local", nullptr) > 0)
    return 1;  // The library's own.
  std::uint64_t serial = 0;
  sd_bus_message_get_cookie(message, &serial);
  connection._deliveredSerial = serial;
  return connection.incoming(message) ? 1 : 0;
}

void BusConnection::takeTurn() {
  if (!_bus) return;
  _takingTurn = true;
  Step last = Step::More;
  for (int steps = 0; last == Step::More && steps < kMessagesPerTurn; ++steps) {
    last = step();
    if (last == Step::Idle && settled()) last = Step::More;
    if (!_bus) last = Step::Ended;
  }
  _takingTurn = false;
  if (last == Step::Ended) return;
  if (last == Step::More && !std::exchange(_turnQueued, true)) {
    _queue->async([self = shared_from_this()] {
      self->_turnQueued = false;
      self->takeTurn();
    });
  }
  chooseSources();
}

BusConnection::Step BusConnection::step() {
  if (queuedMessages() > kMaximumQueuedMessages && !isWritable(_descriptor)) return Step::Idle;
  Waiting before;
  if (_position.nextIsKnown() && !_mayHaveReadAhead) {
    before.queued = queuedMessages();
  } else {
    lookAtSocket(before);
    _position.willRead(before.view(), before.available);
    if (!hasWork(before)) return Step::Idle;
  }
  return processed(sd_bus_process(_bus.get(), nullptr), before);
}

/// The library is only called for a reason: what comes between the look at the socket and a needless read
/// would make the position unclear.
bool BusConnection::hasWork(const Waiting& waiting) const {
  if (waiting.available > 0 || waiting.ended) return true;
  if (_authentication && (sd_bus_get_events(_bus.get()) & POLLOUT) != 0)
    return true;  // Its own part of the dialogue.
  if (_mayHaveReadAhead || _position.readAhead() > 0 || queuedMessages() > 0) return true;
  std::uint64_t time = kNoTime;
  return sd_bus_get_timeout(_bus.get(), &time) >= 0 && time <= monotonicMicroseconds();
}

BusConnection::Step BusConnection::processed(int result, const Waiting& before) {
  const auto delivered = std::exchange(_deliveredSerial, std::nullopt);
  if (!_bus) return Step::Ended;
  if (result < 0) {
    const bool closed = result == -ECONNRESET || result == -EPIPE || result == -ETIMEDOUT;
    end(closed ? End::BetweenMessages : End::WithinMessage);
    return Step::Ended;
  }
  if (result == 0) _mayHaveReadAhead = false;
  const bool open = sd_bus_is_open(_bus.get()) > 0;
  auto verdict = StreamPosition::Verdict::Fine;
  if (_authentication) {
    followAuthentication(before);
    if (delivered && !_authentication) verdict = _position.delivered(*delivered);
  } else {
    // The library reads until nothing is left or a message is whole, but not in a turn that finished a queued
    // message.
    const bool wasRead = open ? result > 0 && queuedMessages() == before.queued
                              : before.available > 0 && unreadBytes(_descriptor) == 0;
    if (delivered) {
      verdict = _position.delivered(*delivered);
      // It was another one because it had been read ahead, unless something was taken from the socket.
      if (_mayHaveReadAhead && unreadBytes(_descriptor) >= before.available)
        verdict = StreamPosition::Verdict::Fine;
    } else if (wasRead) {
      verdict = _position.readWithoutDelivery();
    }
  }
  if (!open || verdict == StreamPosition::Verdict::Malformed) {
    const bool within = verdict == StreamPosition::Verdict::Malformed || _position.withinMessage();
    end(within ? End::WithinMessage : End::BetweenMessages);
    return Step::Ended;
  }
  return result > 0 ? Step::More : Step::Idle;
}

void BusConnection::lookAtSocket(Waiting& waiting) const {
  waiting.queued = queuedMessages();
  const auto viewed = ::recv(_descriptor, waiting.bytes.data(), Waiting::kView, MSG_PEEK | MSG_DONTWAIT);
  if (viewed > 0) {
    waiting.viewed = static_cast<std::size_t>(viewed);
    waiting.available = waiting.viewed;
    if (_authentication || _mayHaveReadAhead ||
        (waiting.viewed == Waiting::kView && !_position.holdsWhole(waiting.view()))) {
      waiting.available = std::max(waiting.viewed, unreadBytes(_descriptor));
    }
  } else {
    waiting.ended = viewed == 0 || (errno != EAGAIN && errno != EINTR);
  }
}

void BusConnection::followAuthentication(const Waiting& before) {
  const std::size_t left = unreadBytes(_descriptor);
  const std::size_t taken = before.available > left ? before.available - left : 0;
  *_authentication += before.view().substr(0, taken);
  // Over for good or ill: what came behind the dialogue counts also when the other side has left since.
  if (sd_bus_is_ready(_bus.get()) <= 0 && sd_bus_is_open(_bus.get()) > 0) return;
  constexpr std::string_view kEnd = "\r\nBEGIN\r\n";  // D-Bus Specification, "Authentication Protocol".
  const auto end = _authentication->find(kEnd);
  if (end != std::string::npos) {
    _position.authenticated(std::string_view(*_authentication).substr(end + kEnd.size()));
  }
  _authentication.reset();
  // What came between the look at the socket and the library's read is not in the text.
  _mayHaveReadAhead = true;
}

Work BusConnection::turn() {
  return [self = shared_from_this()] { self->takeTurn(); };
}

void BusConnection::chooseSources() {
  const int events = sd_bus_get_events(_bus.get());
  if (events < 0) return end(End::BetweenMessages);
  const bool clogged = queuedMessages() > kMaximumQueuedMessages;
  if (clogged) {
    _readSource.reset();
  } else if (!_readSource) {
    _readSource = _queue->makeReadSource(_descriptor, turn());
  }
  if ((events & POLLOUT) == 0) {
    _writeSource.reset();
  } else if (!_writeSource) {
    _writeSource = _queue->makeWriteSource(_descriptor, turn());
  }
  chooseTimer();
}

void BusConnection::chooseTimer() {
  std::uint64_t time = kNoTime;
  if (sd_bus_get_timeout(_bus.get(), &time) < 0 || time == kNoTime) {
    _timer.reset();
    return;
  }
  // One that fires early does no harm; making one for each of many calls would.
  const auto now = monotonicMicroseconds();
  if (_timer && _timerTime > now && _timerTime <= time) return;
  constexpr std::chrono::milliseconds kAgain{1'000};
  const auto delay = std::chrono::milliseconds(time > now ? (time - now) / 1'000 + 1 : 0);
  _timerTime = time;
  _timer = _queue->makeTimer(delay, kAgain, turn());
}

}  // namespace tallyd::platform
