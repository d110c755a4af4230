#include "tallyctl/SignalPacer.h"

#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <ctime>

namespace tallyd::tallyctl {

SignalPacer::SignalPacer() {
  sigemptyset(&_signals);
  sigaddset(&_signals, SIGINT);
  sigaddset(&_signals, SIGTERM);
  pthread_sigmask(SIG_BLOCK, &_signals, &_maskBefore);
}

SignalPacer::~SignalPacer() { release(); }

bool SignalPacer::waitUntil(SteadyTime time) {
  using std::chrono::nanoseconds;
  while (!_stopped) {
    const auto left = std::max(nanoseconds(0), std::chrono::duration_cast<nanoseconds>(time - now()));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(left);
    const timespec timeout{seconds.count(), (left - seconds).count()};
    if (sigtimedwait(&_signals, nullptr, &timeout) > 0) {
      _stopped = true;
      release();
    } else if (errno == EAGAIN && now() >= time) {
      return true;
    }
  }
  return false;
}

void SignalPacer::release() { pthread_sigmask(SIG_SETMASK, &_maskBefore, nullptr); }

}  // namespace tallyd::tallyctl
