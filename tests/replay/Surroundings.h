// What the parts of the simulated world share.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>

#include "fakes/FakeQueues.h"
#include "platform/Clock.h"
#include "replay/Draws.h"
#include "replay/Received.h"
#include "replay/Scenario.h"
#include "replay/Trace.h"
#include "replay/Weather.h"

namespace tallyd::replay {

/// The time of day on the simulation's timeline, which `skew` sets forwards and backwards.
///
/// The day lies in the past of every machine: the age of a real file is never reached by it.
class SimulatedClock : public platform::Clock {
 public:
  explicit SimulatedClock(const fakes::FakeQueues& queues) : _queues(queues) {}

  [[nodiscard]] platform::TimePoint now() const override {
    constexpr std::chrono::seconds kStart{1'590'969'600};  // 2020-06-01 00:00:00 UTC.
    return platform::TimePoint(kStart + _queues.now() + skew);
  }

  std::chrono::milliseconds skew{0};

 private:
  const fakes::FakeQueues& _queues;
};

/// Borrowed by each part; lives in the World.
struct Surroundings {
  explicit Surroundings(const Scenario& scenario) : optIns(scenario.optIns), draws(scenario.seed ^ 0x5EEDU) {}

  const OptIns optIns;

  fakes::FakeQueues queues;
  SimulatedClock clock{queues};
  Draws draws;
  Weather weather;
  Trace trace{queues};
  Received received;
  Violations violations;
  std::uint64_t callsWaiting = 0;  ///< Clients' calls in which time passes at the moment.
  bool isOneShotCall = false;      ///< Sockets that are made now are for one message.
  bool isSessionEnding = false;    ///< What is sent now is a session's last record.
  int edition = 0;                 ///< Of the storebags that the servers give out.
  std::map<std::string, int, std::less<>> editionsTaken;  ///< By storebag: what the daemon has of it.
  bool hasConsent = false;                                ///< As the preferences stand.
  std::optional<std::string> country;
  double samplingFactor = 0;  ///< Of all backends that are made within one call.
  /// Lets time pass within a call that waits: everything else goes on meanwhile.
  std::function<void(std::chrono::milliseconds)> elapse;

  /// A duration from one millisecond to `longest`.
  std::chrono::milliseconds upTo(std::chrono::milliseconds longest) {
    return std::chrono::milliseconds(draws.between(1, longest.count()));
  }
  void violated(const std::string& text) { violations.add(trace.time(), text); }
  /// A message reached the end of a channel.
  void arrived(Channel channel, std::int64_t serial, int most) {
    const int times = ++received.arrivals[{channel, serial}];
    if (times > most) {
      violated("message " + std::to_string(serial) + " came " + std::to_string(times) +
               " times through channel " + std::to_string(static_cast<int>(channel)));
    }
  }
};

}  // namespace tallyd::replay
