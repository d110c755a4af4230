#include "support/Tap.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <deque>
#include <exception>
#include <new>
#include <utility>

#include "platform/SerialQueue.h"

namespace tallyd {

namespace {

constexpr int kWritesPerTurn = 64;  ///< Then other work of the queues' threads comes.

enum class Channel { Pipe, Socket };

std::optional<Channel> channelOf(int descriptor) {
  struct stat facts {};
  if (::fstat(descriptor, &facts) != 0) return std::nullopt;
  if (S_ISFIFO(facts.st_mode)) return Channel::Pipe;
  if (S_ISSOCK(facts.st_mode)) return Channel::Socket;
  return std::nullopt;
}

bool makeNonBlocking(int descriptor) {
  const int flags = ::fcntl(descriptor, F_GETFL);
  return flags >= 0 && (flags & O_ACCMODE) != O_RDONLY &&
         ::fcntl(descriptor, F_SETFL, flags | O_NONBLOCK) == 0;
}

}  // namespace

struct Tap::Listener {
  Listener(platform::FileDescriptor toOwn, Channel itsChannel)
      : descriptor(std::move(toOwn)), channel(itsChannel) {}

  void keep(Text text) {
    const std::size_t bytes = text->size();
    backlog.push_back(std::move(text));
    backlogBytes += bytes;
  }

  [[nodiscard]] ssize_t send(std::string_view bytes) const {
    if (channel == Channel::Pipe) return ::write(descriptor.get(), bytes.data(), bytes.size());
    return ::send(descriptor.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
  }

  const platform::FileDescriptor descriptor;
  const Channel channel;
  // Shared, under the tap's lock.
  std::deque<Text> backlog;
  std::size_t backlogBytes = 0;
  std::size_t frontWritten = 0;  ///< Bytes of the first line that have left.
  std::uint64_t missed = 0;      ///< Since the last line that told of it.
  bool isPumping = false;
  bool isOver = false;
  // The queue's own.
  std::unique_ptr<platform::Source> roomSource;
};

class Tap::Membership final : public Subscription {
 public:
  Membership(std::shared_ptr<Tap> tap, SharedListener listener)
      : _tap(std::move(tap)), _listener(std::move(listener)) {}
  ~Membership() override { _tap->remove(_listener); }
  Membership(const Membership&) = delete;
  Membership& operator=(const Membership&) = delete;

 private:
  const std::shared_ptr<Tap> _tap;
  const SharedListener _listener;
};

Tap::Tap(platform::Queues& queues, const platform::Clock& clock)
    : _clock(clock), _queue(queues.makeSerialQueue("com.quillon.tallyd.tap")) {}

Tap::~Tap() = default;

std::unique_ptr<Tap::Subscription> Tap::listen(platform::FileDescriptor descriptor) {
  const auto channel = channelOf(descriptor.get());
  if (!channel || !makeNonBlocking(descriptor.get())) return nullptr;
  auto listener = std::make_shared<Listener>(std::move(descriptor), *channel);
  {
    const std::lock_guard lock(_mutex);
    if (_listeners.size() >= kMaximumListeners) return nullptr;
    _listeners.push_back(listener);
    _isListening = true;
  }
  return std::make_unique<Membership>(shared_from_this(), std::move(listener));
}

void Tap::write(TapLine line) {
  const auto text = std::make_shared<const std::string>(std::move(line).finished());
  const std::lock_guard lock(_mutex);
  for (const SharedListener& listener : _listeners) append(listener, text);
}

void Tap::miss() {
  const std::lock_guard lock(_mutex);
  for (const SharedListener& listener : _listeners) ++listener->missed;
}

void Tap::append(const SharedListener& listener, const Text& text) {
  if (listener->backlogBytes >= kMaximumBacklogBytes) {
    ++listener->missed;
    return;
  }
  try {
    keepMissedLine(*listener);
    listener->keep(text);
  } catch (const std::bad_alloc&) {
    ++listener->missed;
  }
  if (!listener->isPumping) startPumping(listener);
}

void Tap::keepMissedLine(Listener& listener) const {
  if (listener.missed == 0) return;
  listener.keep(std::make_shared<const std::string>(
      std::move(line("missed").add("count", listener.missed)).finished()));
  listener.missed = 0;
}

/// Without memory for that the next line tries again. With the lock held.
void Tap::startPumping(const SharedListener& listener) {
  try {
    _queue->async([self = shared_from_this(), listener] { self->pump(listener); });
    listener->isPumping = true;
  } catch (const std::bad_alloc&) {
    listener->isPumping = false;
  }
}

void Tap::pump(const SharedListener& listener) {
  try {
    pumpSome(listener);
  } catch (const std::bad_alloc&) {
    const std::lock_guard lock(_mutex);
    listener->isPumping = false;
  }
}

void Tap::pumpSome(const SharedListener& listener) {
  for (int i = 0; i < kWritesPerTurn; ++i) {
    const Text text = front(*listener);
    if (!text) return;
    // Only this queue takes lines away: the first one stays what it is.
    const ssize_t written = listener->send(std::string_view(*text).substr(listener->frontWritten));
    if (written >= 0) {
      wrote(*listener, static_cast<std::size_t>(written));
    } else if (errno == EAGAIN) {
      return waitForRoom(listener);
    } else if (errno != EINTR) {
      return remove(listener);
    }
  }
  const std::lock_guard lock(_mutex);
  startPumping(listener);
}

Tap::Text Tap::front(Listener& listener) {
  const std::lock_guard lock(_mutex);
  if (listener.backlog.empty()) keepMissedLine(listener);
  listener.isPumping = !listener.isOver && !listener.backlog.empty();
  return listener.isPumping ? listener.backlog.front() : nullptr;
}

void Tap::wrote(Listener& listener, std::size_t bytes) {
  const std::lock_guard lock(_mutex);
  if (listener.isOver) return;
  listener.frontWritten += bytes;
  const std::size_t length = listener.backlog.front()->size();
  if (listener.frontWritten < length) return;
  listener.frontWritten = 0;
  listener.backlogBytes -= length;
  listener.backlog.pop_front();
}

void Tap::waitForRoom(const SharedListener& listener) {
  try {
    listener->roomSource = _queue->makeWriteSource(
        listener->descriptor.get(),
        [self = shared_from_this(), listener] {
          listener->roomSource.reset();
          self->pump(listener);
        },
        [listener] { /* Kept open until nothing watches it. */ });
  } catch (const std::exception&) {
    remove(listener);
  }
}

void Tap::remove(const SharedListener& listener) {
  {
    const std::lock_guard lock(_mutex);
    if (std::exchange(listener->isOver, true)) return;
    listener->backlog.clear();
    std::erase(_listeners, listener);
    _isListening = !_listeners.empty();
  }
  try {
    _queue->async([listener] { listener->roomSource.reset(); });
  } catch (const std::bad_alloc&) {
    return;  // The source, if there is one, goes with its next event.
  }
}

}  // namespace tallyd
