// Waiting that SIGINT and SIGTERM end.
#pragma once

#include <csignal>

#include "tallyctl/Pacer.h"

namespace tallyd::tallyctl {

/// Takes the two signals while it lives. Once one of them has ended a wait, they have their ordinary effect
/// again, so that a second one ends a program that does not come to its end.
///
/// Threading: made before any other thread, so that every thread leaves the signals to it; used on its own.
class SignalPacer final : public Pacer {
 public:
  SignalPacer();
  ~SignalPacer() override;
  SignalPacer(const SignalPacer&) = delete;
  SignalPacer& operator=(const SignalPacer&) = delete;

  [[nodiscard]] SteadyTime now() override { return std::chrono::steady_clock::now(); }
  [[nodiscard]] bool waitUntil(SteadyTime time) override;

 private:
  void release();

  sigset_t _signals{};
  sigset_t _maskBefore{};
  bool _stopped = false;
};

}  // namespace tallyd::tallyctl
