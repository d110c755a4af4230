#include "replay/SimulatedDatagrams.h"

#include <arpa/inet.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <deque>
#include <map>
#include <optional>
#include <string>

#include "backends/dashboard/Datagram.h"
#include "platform/FileDescriptor.h"
#include "replay/Scenario.h"
#include "replay/Storebags.h"

namespace tallyd::replay {

using std::chrono::milliseconds;

namespace {

constexpr std::size_t kMostWaiting = 50;
constexpr int kMostTransmissions = 5;
/// The least time from each transmission to the next, in ticks. The first counts from between two ticks.
constexpr std::array kTicksBefore{1, 3, 5, 9};
/// A session's end leaves its dashboard a tick and this to hear what was not acknowledged.
constexpr milliseconds kLastResort{9'500};

/// An acknowledgement, or what looks like one: the daemon reads the event ID alone.
std::string acknowledgement(std::uint16_t eventID) {
  std::string bytes(DatagramText, '\0');
  bytes[DatagramEventID] = static_cast<char>(eventID >> 8U);
  bytes[DatagramEventID + 1] = static_cast<char>(eventID & 0xFFU);
  return bytes;
}

std::optional<std::int64_t> serialIn(std::string_view text) {
  const std::string item = std::string(" ") + kSerialKey + "=";
  const auto found = text.find(item);
  if (found == std::string_view::npos) return std::nullopt;
  return platform::leadingInteger(text.substr(found + item.size()));
}

/// What has arrived for a socket; becomes readable.
struct Inbox {
  Inbox() : readable(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

  void put(std::string bytes) {
    if (waiting.empty()) ::eventfd_write(readable.get(), 1);
    waiting.push_back(std::move(bytes));
  }
  std::string take() {
    if (waiting.empty()) return {};
    std::string bytes = std::move(waiting.front());
    waiting.pop_front();
    eventfd_t ignored = 0;
    if (waiting.empty()) ::eventfd_read(readable.get(), &ignored);
    return bytes;
  }

  platform::FileDescriptor readable;
  std::deque<std::string> waiting;
};

}  // namespace

class SimulatedDatagrams::Socket : public platform::DatagramSocket {
 public:
  Socket(Surroundings& world, std::shared_ptr<platform::SerialQueue> network, int number)
      : _world(world), _network(std::move(network)), _number(number), _isOneShot(world.isOneShotCall) {
    ++_world.received.openSockets;
  }
  ~Socket() override {
    --_world.received.openSockets;
    _world.trace.write("socket", "{} closed", _number);
    if (_closedBy && _world.queues.now() > *_closedBy)
      _world.violated(fmt::format("socket {} outlived its session's clean-up", _number));
  }

  [[nodiscard]] int bindToAnyPort() override { return fails() ? EADDRINUSE : 0; }
  [[nodiscard]] int connect(const sockaddr_in& server) override {
    _port = ntohs(server.sin_port);
    return fails() ? ENETUNREACH : 0;
  }

  [[nodiscard]] bool send(std::string_view bytes) override {
    const std::uint16_t eventID = datagramNumber16(bytes, DatagramEventID);
    Datagram& datagram = _datagrams[eventID];
    if (!_closedBy && (_isOneShot || _world.isSessionEnding))
      _closedBy = _world.queues.now() + dashboardPeriod(_port) + kLastResort;
    const bool taken = !_world.draws.chance(_world.weather.datagramIsNotTaken);
    _world.trace.write("datagram", "{}:{} event {} {}{}", _number, _port, eventID, taken ? "" : "not taken ",
                       bytes.substr(DatagramText));
    const bool reliable = (datagramNumber16(bytes, DatagramFlags) & DatagramFlagReliable) != 0;
    keep(eventID, taken && !reliable);
    if (!taken) return false;
    book(datagram, bytes, reliable);
    if (reliable && !_world.draws.chance(_world.weather.datagramIsLost)) acknowledge(eventID);
    return true;
  }

  [[nodiscard]] std::size_t receive(std::span<char> buffer) override {
    const std::string bytes = _inbox->take();
    const auto eventID = acknowledgedEventID(bytes);
    if (eventID) heard(*eventID);
    return bytes.copy(buffer.data(), buffer.size());
  }
  [[nodiscard]] int descriptor() const override { return _inbox->readable.get(); }

 private:
  struct Datagram {
    int transmissions = 0;
    milliseconds last{0};
    bool acknowledged = false;
  };

  [[nodiscard]] bool fails() const { return _world.draws.chance(_world.weather.socketFails); }

  /// What the daemon keeps after an attempt: at most so many, the oldest goes for one more.
  void keep(std::uint16_t eventID, bool isDone) {
    forgetGivenUp();
    const auto kept = std::find(_waiting.begin(), _waiting.end(), eventID);
    if (isDone && kept != _waiting.end()) _waiting.erase(kept);
    if (isDone || kept != _waiting.end()) return;
    _waiting.push_back(eventID);
    if (_waiting.size() <= kMostWaiting) return;
    ++_world.received.pushedOut;
    _waiting.pop_front();
  }
  [[nodiscard]] bool isGivenUp(const Datagram& datagram) const {
    return datagram.transmissions == kMostTransmissions &&
           _world.queues.now() >= datagram.last + dashboardPeriod(_port);
  }
  /// A tick comes before whatever is sent at its instant.
  void forgetGivenUp() {
    std::erase_if(_waiting, [this](std::uint16_t eventID) { return isGivenUp(_datagrams[eventID]); });
  }

  void book(Datagram& datagram, std::string_view bytes, bool reliable) {
    const milliseconds now = _world.queues.now();
    Received& received = _world.received;
    if (++datagram.transmissions == 1) {
      ++(reliable ? received.reliableDatagrams : received.plainDatagrams);
      if (const auto serial = serialIn(bytes.substr(DatagramText)))
        _world.arrived(Channel::Datagram, *serial, 1);
    } else {
      ++received.retransmissions;
      checkRetransmission(datagram, now, reliable);
    }
    datagram.last = now;
  }

  void checkRetransmission(const Datagram& datagram, milliseconds now, bool reliable) const {
    if (!reliable) _world.violated("a datagram that needs no acknowledgement was sent again");
    if (datagram.acknowledged) _world.violated("an acknowledged datagram was sent again");
    if (datagram.transmissions > kMostTransmissions)
      return _world.violated("a datagram was sent a sixth time");
    const auto ticks = kTicksBefore[static_cast<std::size_t>(datagram.transmissions - 2)];
    if (now - datagram.last < ticks * dashboardPeriod(_port))
      _world.violated("a datagram was sent again too early");
  }

  void acknowledge(std::uint16_t eventID) {
    if (_world.draws.chance(_world.weather.acknowledgementIsLost)) return;
    deliverLater(acknowledgement(eventID));
    if (_world.draws.chance(_world.weather.acknowledgementComesTwice)) deliverLater(acknowledgement(eventID));
    if (!_world.draws.chance(_world.weather.noiseComes)) return;
    deliverLater(_world.draws.chance(0.5) ? "noise" : acknowledgement(0xFFFF));
  }
  void deliverLater(std::string bytes) {
    _network->asyncAfter(_world.upTo(_world.weather.longestRoundTrip),
                         [inbox = std::weak_ptr(_inbox), bytes = std::move(bytes)] {
                           if (const auto open = inbox.lock()) open->put(bytes);
                         });
  }

  /// The daemon reads an acknowledgement.
  void heard(std::uint16_t eventID) {
    const auto found = _datagrams.find(eventID);
    if (found == _datagrams.end() || found->second.acknowledged) return;
    Datagram& datagram = found->second;
    datagram.acknowledged = true;
    ++_world.received.acknowledged;
    const bool isKept = std::erase(_waiting, eventID) > 0;
    if (isKept && !isGivenUp(datagram)) ++_world.received.surelyAcknowledged;
    const bool isLastInstant = _world.queues.now() == datagram.last + dashboardPeriod(_port);
    if (isKept && isGivenUp(datagram) && isLastInstant) ++_world.received.perhapsAcknowledged;
    _world.trace.write("socket", "{} event {} acknowledged", _number, eventID);
  }

  Surroundings& _world;
  const std::shared_ptr<platform::SerialQueue> _network;
  const int _number;
  const bool _isOneShot;
  const std::shared_ptr<Inbox> _inbox = std::make_shared<Inbox>();
  std::uint16_t _port = 0;
  std::map<std::uint16_t, Datagram> _datagrams;
  std::deque<std::uint16_t> _waiting;     ///< What the daemon must have kept, oldest first.
  std::optional<milliseconds> _closedBy;  ///< From the last message of a session on.
};

std::unique_ptr<platform::DatagramSocket> SimulatedDatagrams::makeSocket() {
  if (_world.draws.chance(_world.weather.socketFails)) {
    errno = EMFILE;
    return nullptr;
  }
  return std::make_unique<Socket>(_world, _network, ++_sockets);
}

}  // namespace tallyd::replay
