#include "platform/http/TransferLoop.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <new>
#include <system_error>

namespace tallyd::platform {

namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

int checked(int descriptor, const char* what) {
  if (descriptor < 0) throw std::system_error(errno, std::generic_category(), what);
  return descriptor;
}

std::uint32_t epollEvents(int what) {
  std::uint32_t events = 0;
  if ((what & CURL_POLL_IN) != 0) events |= EPOLLIN;
  if ((what & CURL_POLL_OUT) != 0) events |= EPOLLOUT;
  return events;
}

int curlEvents(std::uint32_t events) {
  int bits = 0;
  if ((events & EPOLLIN) != 0) bits |= CURL_CSELECT_IN;
  if ((events & EPOLLOUT) != 0) bits |= CURL_CSELECT_OUT;
  if ((events & (EPOLLERR | EPOLLHUP)) != 0) bits |= CURL_CSELECT_ERR;
  return bits;
}

}  // namespace

TransferLoop::TransferLoop()
    : _epoll(checked(::epoll_create1(EPOLL_CLOEXEC), "epoll_create1")),
      _wakeUp(checked(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK), "eventfd")),
      _multi(curl_multi_init()) {
  if (!_multi) throw std::bad_alloc();
  epoll_event event{.events = EPOLLIN, .data = {.fd = _wakeUp.get()}};
  checked(::epoll_ctl(_epoll.get(), EPOLL_CTL_ADD, _wakeUp.get(), &event), "epoll_ctl");
  curl_multi_setopt(_multi.get(), CURLMOPT_SOCKETFUNCTION, &TransferLoop::onSocket);
  curl_multi_setopt(_multi.get(), CURLMOPT_SOCKETDATA, this);
  curl_multi_setopt(_multi.get(), CURLMOPT_TIMERFUNCTION, &TransferLoop::onTimer);
  curl_multi_setopt(_multi.get(), CURLMOPT_TIMERDATA, this);
}

void TransferLoop::turn(milliseconds longest) {
  if (_hasLostSockets) return turnWithoutSockets(longest);
  if (actIfDue()) return;
  constexpr int kEventsAtATime = 32;
  std::array<epoll_event, kEventsAtATime> events{};
  const int count = ::epoll_wait(_epoll.get(), events.data(), kEventsAtATime, waitTime(longest));
  for (int i = 0; i < count; ++i) {
    const epoll_event& event = events[static_cast<std::size_t>(i)];
    if (event.data.fd == _wakeUp.get()) {
      eventfd_t ignored = 0;
      ::eventfd_read(_wakeUp.get(), &ignored);
    } else {
      act(event.data.fd, curlEvents(event.events));
    }
  }
  actIfDue();
}

/// Whether a time of libcurl's had come.
bool TransferLoop::actIfDue() {
  if (!_due || *_due > steady_clock::now()) return false;
  _due.reset();
  act(CURL_SOCKET_TIMEOUT, 0);
  return true;
}

void TransferLoop::wake() const { ::eventfd_write(_wakeUp.get(), 1); }

int TransferLoop::waitTime(milliseconds longest) const {
  if (_due) longest = std::min(longest, std::chrono::ceil<milliseconds>(*_due - steady_clock::now()));
  return static_cast<int>(std::max(longest, milliseconds::zero()).count());
}

void TransferLoop::act(curl_socket_t socket, int events) {
  int running = 0;
  if (curl_multi_socket_action(_multi.get(), socket, events, &running) != CURLM_OK) _hasLostSockets = true;
}

void TransferLoop::turnWithoutSockets(milliseconds longest) {
  curl_waitfd wakeUp{.fd = _wakeUp.get(), .events = CURL_WAIT_POLLIN, .revents = 0};
  curl_multi_poll(_multi.get(), &wakeUp, 1, waitTime(longest), nullptr);
  eventfd_t ignored = 0;
  ::eventfd_read(_wakeUp.get(), &ignored);
  int running = 0;
  curl_multi_perform(_multi.get(), &running);
  _hasLostSockets = running > 0;
}

int TransferLoop::onSocket(CURL*, curl_socket_t socket, int what, void* self, void* known) {
  auto& loop = *static_cast<TransferLoop*>(self);
  if (what == CURL_POLL_REMOVE) {
    ::epoll_ctl(loop._epoll.get(), EPOLL_CTL_DEL, socket, nullptr);
    return 0;
  }
  epoll_event event{.events = epollEvents(what), .data = {.fd = socket}};
  const int operation = known == nullptr ? EPOLL_CTL_ADD : EPOLL_CTL_MOD;
  if (known == nullptr) curl_multi_assign(loop.multi(), socket, self);
  return ::epoll_ctl(loop._epoll.get(), operation, socket, &event) == 0 ? 0 : -1;
}

int TransferLoop::onTimer(CURLM*, long milliseconds, void* self) {
  auto& due = static_cast<TransferLoop*>(self)->_due;
  if (milliseconds < 0) {
    due.reset();
  } else {
    due = steady_clock::now() + std::chrono::milliseconds(milliseconds);
  }
  return 0;
}

}  // namespace tallyd::platform
