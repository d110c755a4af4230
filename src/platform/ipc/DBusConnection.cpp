#include "platform/ipc/DBusConnection.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "platform/dbus/Authentication.h"
#include "platform/dbus/BodyWriter.h"
#include "platform/dbus/ByteReader.h"
#include "platform/dbus/Message.h"

namespace tallyd::platform {

namespace {

constexpr std::size_t kReadBytes = 65'536;
constexpr std::size_t kKeptOutputBytes = 4'096;     ///< Room that an idle connection may keep.
constexpr std::size_t kDescriptorsInMessage = 253;  ///< unix(7): as many as the kernel passes at once.

/// One for each thread: between two turns a connection needs none.
char* readBuffer() {
  thread_local const auto buffer = std::make_unique_for_overwrite<char[]>(kReadBytes);
  return buffer.get();
}

union ControlBuffer {
  cmsghdr header;
  std::array<char, CMSG_SPACE(kDescriptorsInMessage * sizeof(int))> bytes;
};

/// False when there was no memory to keep one; that one is closed.
bool keep(FileDescriptor descriptor, std::vector<FileDescriptor>& descriptors) {
  try {
    descriptors.push_back(std::move(descriptor));
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

/// False when not all could be kept.
bool collectDescriptors(msghdr& message, std::vector<FileDescriptor>& descriptors) {
  bool keptAll = true;
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(part) + i * sizeof(int), sizeof descriptor);
      keptAll = keep(FileDescriptor(descriptor), descriptors) && keptAll;
    }
  }
  return keptAll;
}

ssize_t sendWithDescriptors(int socket, std::string_view bytes,
                            const std::vector<FileDescriptor>& descriptors) {
  iovec part{.iov_base = const_cast<char*>(bytes.data()), .iov_len = bytes.size()};
  ControlBuffer control{};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes.data();
  message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
  control.header.cmsg_level = SOL_SOCKET;
  control.header.cmsg_type = SCM_RIGHTS;
  control.header.cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
  for (std::size_t i = 0; i < descriptors.size(); ++i) {
    const int descriptor = descriptors[i].get();
    std::memcpy(CMSG_DATA(&control.header) + i * sizeof(int), &descriptor, sizeof descriptor);
  }
  return ::sendmsg(socket, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
}

}  // namespace

DBusConnection::DBusConnection(FileDescriptor socket, std::shared_ptr<SerialQueue> queue)
    : _socket(std::move(socket)), _queue(std::move(queue)) {}

DBusConnection::~DBusConnection() = default;

void DBusConnection::start(std::unique_ptr<dbus::Authentication> authentication) {
  if (_isStarted || _hasEnded) return;
  _isStarted = true;
  endWithoutMemory([&] {
    _output += authentication->opening();
    _authentication = std::move(authentication);
    _authenticationTimer =
        _queue->makeTimer(kAuthenticationTime, kAuthenticationTime,
                          [self = shared_from_this()] { self->end(End::BetweenMessages); });
    sendAndWatch();
  });
}

void DBusConnection::end(End end) {
  if (std::exchange(_hasEnded, true)) return;
  const auto keptAlive = shared_from_this();
  _readSource.reset();
  _writeSource.reset();
  _authenticationTimer.reset();
  _endTimer.reset();
  _socket.reset();
  _descriptors.clear();
  dropOutput();
  ended(end);
}

void DBusConnection::endAfterInput() {
  if (!_isStarted) return end(End::BetweenMessages);
  if (!isOpen() || _endTimer) return;
  ::shutdown(_socket.get(), SHUT_RD);
  endWithoutMemory([this] {
    _endTimer = _queue->makeTimer(kPatienceAtEnd, kPatienceAtEnd, turn(&DBusConnection::endUnlessReading));
  });
}

std::uint32_t DBusConnection::nextSerial() {
  if (++_lastSerial == 0) ++_lastSerial;  // 0 is no serial number.
  return _lastSerial;
}

std::optional<std::string> DBusConnection::write(dbus::MessageFields fields, const std::vector<Value>& values,
                                                 std::vector<FileDescriptor> descriptors) {
  if (!isOpen() || _peerHasGone) return std::nullopt;
  fields.descriptors = static_cast<std::uint32_t>(descriptors.size());
  const std::size_t start = _output.size();
  try {
    if (auto problem = append(fields, values, std::move(descriptors))) {
      _output.resize(start);
      return problem;
    }
  } catch (const std::bad_alloc&) {
    _output.resize(start);
    throw;
  }
  ++_queuedMessages;
  if (!_isTakingTurn) finishTurn();
  return std::nullopt;
}

std::optional<std::string> DBusConnection::append(const dbus::MessageFields& fields,
                                                  const std::vector<Value>& values,
                                                  std::vector<FileDescriptor> descriptors) {
  const std::size_t start = _output.size();
  dbus::MessageBuilder message(_output, fields);
  auto problem = dbus::writeBody(message.body(), fields.signature, values, descriptors.size());
  if (problem) return problem;
  message.finish();
  if (!descriptors.empty()) _attachments.push_back({start, std::move(descriptors)});
  return std::nullopt;
}

void DBusConnection::wake() {
  if (_isStarted && isOpen() && !_isTakingTurn) finishTurn();
}

bool DBusConnection::peerHasClosed() const {
  pollfd closed{.fd = _socket.get(), .events = POLLRDHUP, .revents = 0};
  return ::poll(&closed, 1, 0) > 0;
}

bool DBusConnection::isClogged() const {
  return hasOutput() &&
         (_queuedMessages > kMaximumQueuedMessages || _output.size() - _sentBytes > kMaximumQueuedBytes);
}

/// A message that is too large for what memory is left, or whatever else finds none in a turn, costs this
/// connection, and nobody else.
template <class Part>
void DBusConnection::endWithoutMemory(const Part& part) {
  try {
    part();
  } catch (const std::bad_alloc&) {
    _isTakingTurn = false;
    end(End::WithinMessage);
  }
}

Work DBusConnection::turn(void (DBusConnection::*part)()) {
  return [self = shared_from_this(), part] { self->endWithoutMemory([&] { (self.get()->*part)(); }); };
}

void DBusConnection::readable() {
  if (!isOpen()) return;
  _isTakingTurn = true;
  std::string_view bytes;
  const Received received = receive(bytes);
  if (received == Received::Bytes) take(bytes);
  if (received == Received::EndOfStream) inputEnded();
  finishTurn();
}

void DBusConnection::writable() {
  if (!isOpen()) return;
  _isTakingTurn = true;
  flush();
  if (!isClogged() && !_input.empty()) take({});
  finishTurn();
}

void DBusConnection::finishTurn() {
  endWithoutMemory([this] { sendAndWatch(); });
}

void DBusConnection::sendAndWatch() {
  _isTakingTurn = true;
  flush();
  while (isOpen() && !hasOutput() && drained()) flush();
  _isTakingTurn = false;
  if (!isOpen()) return;
  if (_inputHasEnded && !hasOutput()) return end(End::BetweenMessages);
  chooseSources();
}

DBusConnection::Received DBusConnection::receive(std::string_view& bytes) {
  iovec part{.iov_base = readBuffer(), .iov_len = kReadBytes};
  ControlBuffer control;
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes.data();
  message.msg_controllen = control.bytes.size();
  const ssize_t length = ::recvmsg(_socket.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (length < 0) return errno == EAGAIN || errno == EINTR ? Received::Nothing : Received::EndOfStream;
  if (length == 0) return Received::EndOfStream;
  const bool keptAll = message.msg_controllen == 0 || collectDescriptors(message, _descriptors);
  bytes = {readBuffer(), static_cast<std::size_t>(length)};
  const bool isCut = (message.msg_flags & MSG_CTRUNC) != 0;  // No room for them in this process.
  if (keptAll && !isCut && _descriptors.size() <= kMaximumDescriptors) return Received::Bytes;
  end(End::WithinMessage);
  return Received::Nothing;
}

/// What lay here from earlier turns comes first.
void DBusConnection::take(std::string_view fresh) {
  try {
    if (_input.empty()) {
      _input = fresh.substr(takeWhole(fresh));
    } else {
      _input += fresh;
      _input.erase(0, takeWhole(_input));
      if (_input.empty()) _input = {};  // An idle connection keeps no room.
    }
  } catch (const dbus::Malformed&) {
    end(End::WithinMessage);
  }
}

std::size_t DBusConnection::takeWhole(std::string_view bytes) {
  std::size_t taken = 0;
  if (_authentication && !takeAuthentication(bytes, taken)) return taken;
  while (isOpen()) {
    if (isClogged()) flush();
    if (isClogged()) break;
    const std::string_view rest = bytes.substr(taken);
    const std::size_t length = dbus::messageLength(rest);
    if (length == 0 || length > rest.size()) break;
    takeMessage(rest.substr(0, length));
    taken += length;
  }
  return isOpen() ? taken : bytes.size();
}

bool DBusConnection::takeAuthentication(std::string_view bytes, std::size_t& taken) {
  switch (_authentication->take(bytes, taken, _output)) {
    case dbus::Authentication::Progress::More:
      return false;
    case dbus::Authentication::Progress::Failed:
      throw dbus::Malformed{"no authentication"};
    case dbus::Authentication::Progress::Over:
      _authentication.reset();
      _authenticationTimer.reset();
      authenticated();
  }
  return isOpen();
}

void DBusConnection::takeMessage(std::string_view bytes) {
  const dbus::Message message = dbus::parseMessage(bytes);
  std::vector<FileDescriptor> descriptors;
  if (const std::size_t count = message.fields.descriptors; count > 0) {
    if (count > _descriptors.size()) throw dbus::Malformed{"descriptors that did not come"};
    const auto end = _descriptors.begin() + static_cast<std::ptrdiff_t>(count);
    std::move(_descriptors.begin(), end, std::back_inserter(descriptors));
    _descriptors.erase(_descriptors.begin(), end);
  }
  incoming(message, std::move(descriptors));
}

/// What is still to be sent is sent: the peer may have stopped sending only.
void DBusConnection::inputEnded() {
  if (!_authentication && !_input.empty()) return end(End::WithinMessage);
  _inputHasEnded = true;
}

/// While something is still read, or about to be, the end comes by itself.
void DBusConnection::endUnlessReading() {
  if (_inputHasEnded || isClogged()) end(End::BetweenMessages);
}

void DBusConnection::flush() {
  while (isOpen() && hasOutput()) {
    const bool attached = !_attachments.empty();
    const bool withDescriptors = attached && _attachments.front().at == _sentBytes;
    std::size_t limit = _output.size();
    if (withDescriptors && _attachments.size() > 1) limit = _attachments[1].at;
    if (attached && !withDescriptors) limit = _attachments.front().at;
    const std::string_view bytes = std::string_view(_output).substr(_sentBytes, limit - _sentBytes);
    const ssize_t sent = withDescriptors
                             ? sendWithDescriptors(_socket.get(), bytes, _attachments.front().descriptors)
                             : ::send(_socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (sent < 0 && errno == EINTR) continue;
    if (sent < 0 && errno == EAGAIN) return forgetSent();
    if (sent < 0) {
      // What the peer sent before it left is still heard.
      _peerHasGone = true;
      return dropOutput();
    }
    if (withDescriptors) _attachments.erase(_attachments.begin());
    _sentBytes += static_cast<std::size_t>(sent);
  }
  if (!hasOutput()) dropOutput();
}

/// So that what a slow peer has read takes no room for ever.
void DBusConnection::forgetSent() {
  if (_sentBytes < kReadBytes || _sentBytes < _output.size() / 2) return;
  _output.erase(0, _sentBytes);
  for (Attachment& attachment : _attachments) attachment.at -= _sentBytes;
  _sentBytes = 0;
}

void DBusConnection::dropOutput() {
  _attachments.clear();
  _sentBytes = 0;
  _queuedMessages = 0;
  if (_output.capacity() > kKeptOutputBytes) {
    _output = {};
  } else {
    _output.clear();
  }
}

void DBusConnection::chooseSources() {
  if (isClogged() || _inputHasEnded) {
    _readSource.reset();
  } else if (!_readSource) {
    _readSource = _queue->makeReadSource(_socket.get(), turn(&DBusConnection::readable));
  }
  if (!hasOutput()) {
    _writeSource.reset();
  } else if (!_writeSource) {
    _writeSource = _queue->makeWriteSource(_socket.get(), turn(&DBusConnection::writable));
  }
}

}  // namespace tallyd::platform
