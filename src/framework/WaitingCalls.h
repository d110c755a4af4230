// The calls that no channel has taken yet.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "framework/ServiceChannel.h"

namespace tallyd {

using SteadyTime = std::chrono::steady_clock::time_point;

struct ServiceCall {
  ServiceRequest request;
  SteadyTime deadline;
  std::chrono::milliseconds timeout{};  ///< What the deadline was made of.
  ServiceCompletion completion{};       ///< Empty: no answer is wanted.
};

/// Calls in the order in which they were made, each with a time at which it is to be given up.
///
/// Holds what its owner adds; the owner bounds that. Threading: one thread at a time.
class WaitingCalls {
 public:
  void add(ServiceCall call);
  [[nodiscard]] bool empty() const { return _calls.empty(); }

  [[nodiscard]] std::optional<ServiceCall> takeFirst();
  /// Those whose time is over, in the order of the calls.
  [[nodiscard]] std::vector<ServiceCall> takeExpired(SteadyTime now);
  [[nodiscard]] std::vector<ServiceCall> takeAll();
  [[nodiscard]] std::optional<SteadyTime> earliestDeadline() const;

 private:
  using Number = std::uint64_t;
  [[nodiscard]] ServiceCall take(std::map<Number, ServiceCall>::iterator place);

  Number _lastNumber = 0;
  std::map<Number, ServiceCall> _calls;
  std::set<std::pair<SteadyTime, Number>> _deadlines;
};

}  // namespace tallyd
