#include "backends/dashboard/DatagramSender.h"

#include <arpa/inet.h>

#include <array>
#include <exception>

#include "platform/Log.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;
using platform::Source;

namespace {

/// The source that `make` makes; null when the queue does not take it.
template <class Make>
std::unique_ptr<Source> sourceOrNothing(Make&& make) {
  try {
    return make();
  } catch (const std::exception&) {
    return nullptr;
  }
}

std::string addressText(const sockaddr_in& address) {
  std::array<char, INET_ADDRSTRLEN> text{};
  ::inet_ntop(AF_INET, &address.sin_addr, text.data(), text.size());
  return fmt::format("{}:{}", text.data(), ntohs(address.sin_port));
}

std::string hexadecimal(std::string_view bytes) {
  std::string text;
  text.reserve(2 * bytes.size());
  for (const char byte : bytes) {
    fmt::format_to(std::back_inserter(text), "{:02x}", static_cast<unsigned char>(byte));
  }
  return text;
}

}  // namespace

DatagramSender::DatagramSender(platform::Log& log, platform::Queues& queues,
                               std::unique_ptr<platform::DatagramSocket> socket,
                               std::shared_ptr<Account> account)
    : _log(log),
      _networkProcQueue(queues.makeSerialQueue("com.quillon.Tally.networkProc")),
      _socket(std::move(socket)),
      _account(std::move(account)),
      _messageQueue(_account) {}

DatagramSender::~DatagramSender() { _messageQueue.drop(DropReason::CleanUp); }

void DatagramSender::useReliableUDP() {
  if (const int error = _socket->bindToAnyPort()) {
    asl_log(_log, LogLevel::Error, "Tally (DashboardBackend): can't bind socket, {:d}", error);
    return;
  }
  _delivery = Delivery::Reliable;
  _readSource = sourceOrNothing([self = shared_from_this()] {
    return self->_networkProcQueue->makeReadSource(
        self->_socket->descriptor(), [self] { self->processSocketRead(); },
        [self] { self->_socket.reset(); });
  });
  if (!_readSource) asl_log(_log, LogLevel::Error, "Tally (setReliable): can't create read source");
}

bool DatagramSender::start(const sockaddr_in& server, Milliseconds period) {
  _server = server;
  if (_socket->connect(server) != 0) {
    asl_log(_log, LogLevel::Error, "Tally (DashboardBackend): initWitName socket connect failed.");
    _readSource.reset();
    return false;
  }
  // The descriptor must outlast every source on it.
  const bool closesSocket = !_readSource;
  _timer = sourceOrNothing([&, self = shared_from_this()] {
    return _networkProcQueue->makeTimer(
        period, period, [self] { self->myPeriodicTask(); },
        [self, closesSocket] {
          if (closesSocket) self->_socket.reset();
        });
  });
  if (!_timer) {
    asl_log(_log, LogLevel::Error, "Tally (DashboardBackend): initWithName can't create timer source.");
    _readSource.reset();
    return false;
  }
  _isStarted = true;
  return true;
}

void DatagramSender::setAccount(std::shared_ptr<Account> account) {
  _networkProcQueue->async([self = shared_from_this(), account = std::move(account)] {
    self->_messageQueue.setAccount(account);
    self->_account = account;
  });
}

void DatagramSender::send(std::shared_ptr<const Datagram> datagram) {
  _networkProcQueue->dispatch(
      [self = shared_from_this(), datagram = std::move(datagram)] { self->tryToSendMsg(*datagram); });
}

void DatagramSender::cleanup() {
  _networkProcQueue->async([self = shared_from_this()] {
    if (self->_messageQueue.empty()) {
      self->cleanupSources();
    } else {
      self->_cleanupState = CleanupRequested;
    }
  });
}

void DatagramSender::drop() {
  if (!_isStarted) return;
  _networkProcQueue->async([self = shared_from_this()] {
    if (self->_cleanupState != CleanupNotAsked) return;
    self->_ticksAfterDrop = kTicksAfterDrop;
    if (self->_messageQueue.empty()) self->cleanupSources();
  });
}

// Everything below runs on the queue.

void DatagramSender::tryToSendMsg(const Datagram& datagram) {
  const bool isSent = sendAllBytes(datagram.bytes());
  if (isSent && _delivery == Delivery::FireAndForget) return _account->finish();
  try {
    keep(datagram, isSent ? PacketStateWaiting : PacketStateNotSent);
  } catch (const std::bad_alloc&) {
    asl_log(_log, LogLevel::Error, "Tally (DashboardBackend): can't malloc.");
    const std::uint16_t method = datagramNumber16(datagram.bytes(), DatagramMethod);
    _account->drop(DropReason::OutOfMemory, 1, {{method, datagram.eventID()}});
  }
  if (!_timer) _messageQueue.drop(DropReason::CleanUp);  // Nothing looks after it any more.
}

void DatagramSender::keep(const Datagram& datagram, PacketState state) {
  UDPPacketToSend packet(datagram.bytes(), datagram.eventID());
  packet.setState(state);
  _messageQueue.append(std::move(packet));
}

bool DatagramSender::sendAllBytes(std::string_view bytes) const {
  if (!_socket || !_socket->send(bytes)) return false;
  showOnTap(bytes);
  return true;
}

void DatagramSender::showOnTap(std::string_view bytes) const {
  _account->show("datagram", [&](TapLine& line) {
    line.add("server", addressText(_server)).add("method", datagramNumber16(bytes, DatagramMethod));
    line.add("event", datagramNumber16(bytes, DatagramEventID)).add("bytes", hexadecimal(bytes));
    line.add("text", bytes.substr(DatagramText));
  });
}

void DatagramSender::myPeriodicTask() {
  _messageQueue.tick(_delivery, [this](std::string_view bytes) { return sendAllBytes(bytes); });
  if (_cleanupState != CleanupNotAsked) {
    advanceCleanup();
  } else if (_ticksAfterDrop) {
    advanceDrop();
  }
}

void DatagramSender::advanceCleanup() {
  if (_messageQueue.empty()) {
    asl_log(_log, LogLevel::Debug, "Tally: clean up at myPeriodicTask.");
    cleanupSources();
  } else if (_cleanupState == CleanupRequested) {
    _cleanupState = CleanupLastResortScheduled;
    asl_log(_log, LogLevel::Debug, "Tally: scheduled last resort clean-up in {:d} ms.",
            kLastResortDelay.count());
    _networkProcQueue->asyncAfter(kLastResortDelay, [self = shared_from_this()] { self->cleanupSources(); });
  }
}

void DatagramSender::advanceDrop() {
  if (_messageQueue.empty() || --*_ticksAfterDrop == 0) cleanupSources();
}

void DatagramSender::processSocketRead() {
  std::array<char, kDatagramBufferBytes> received{};
  const std::size_t length = _socket ? _socket->receive(received) : 0;
  if (length == 0) return;
  const auto eventID = acknowledgedEventID({received.data(), length});
  if (eventID) _messageQueue.acknowledge(*eventID);
}

void DatagramSender::cleanupSources() {
  _timer.reset();
  _readSource.reset();
  _messageQueue.drop(DropReason::CleanUp);
}

}  // namespace tallyd
