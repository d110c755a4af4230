#include "replay/Simulation.h"

#include "replay/Clients.h"
#include "replay/Invariants.h"
#include "replay/World.h"

namespace tallyd::replay {

using std::chrono::hours;
using std::chrono::minutes;

namespace {

/// Longer than 21 ticks of any dashboard, a clean-up's last resort and the slowest post.
constexpr minutes kAfterTheDay{10};

class Simulation {
 public:
  explicit Simulation(const Scenario& scenario)
      : _scenario(scenario),
        _world(scenario),
        _tap(std::make_shared<Tap>(_world.platform().queues, _world.platform().clock)),
        _ledger(std::make_shared<Ledger>(_tap)),
        _ownQueues(_world.surroundings().queues.liveQueues()),
        _agent(_world.platform(), _ledger),
        _clients(_agent, _world),
        _invariants(*_ledger, _world.surroundings()) {
    _world.afterStep = [this] { _invariants.check(); };
  }

  Outcome run() {
    for (const Step& step : _scenario.steps) {
      _world.runUntil(step.at);
      std::visit([&](const auto& happening) { happen(step, happening); }, step.happening);
      _world.settle();
      _invariants.check();
      if (_world.messageLogFiles() > 1) _world.surroundings().violated("there is more than one message log");
    }
    endTheDay();
    return outcome();
  }

 private:
  void happen(const Step& step, const Connect&) { _clients.connect(step.client); }
  void happen(const Step& step, const Disconnect& end) { _clients.disconnect(step.client, end.ending); }
  void happen(const Step&, const SetPreference& change) {
    trace("preference {} {}", change.key, change.value.value_or(platform::Value()).description());
    _world.set(change);
  }
  void happen(const Step&, const SetCountry& change) {
    trace("country {}", change.country.value_or("(none)"));
    _world.set(change);
  }
  void happen(const Step&, const NewEdition& change) {
    trace("storebags of edition {}", change.edition);
    _world.surroundings().edition = change.edition;
  }
  void happen(const Step&, const ChangeWeather& change) {
    trace("the weather changes");
    _world.surroundings().weather = change.weather;
  }
  void happen(const Step&, const StepClock& change) {
    trace("the clock is set by {} ms", change.step.count());
    _world.surroundings().clock.skew += change.step;
  }
  void happen(const Step&, const Lose& loss) {
    trace("loss {}", static_cast<int>(loss.what));
    _world.lose(loss.what);
  }
  template <class Call>
  void happen(const Step& step, const Call& call) {
    _clients.make(step, call);
  }

  template <class... Arguments>
  void trace(fmt::format_string<Arguments...> format, Arguments&&... arguments) {
    _world.surroundings().trace.write(
        "world", std::string_view(fmt::format(format, std::forward<Arguments>(arguments)...)));
  }

  void endTheDay() {
    _world.runUntil(_scenario.length);
    _clients.disconnectAll();
    _world.settle();
    _invariants.check();
    _world.runUntil(_world.surroundings().queues.now() + kAfterTheDay);
    _invariants.checkEnd(_ownQueues);
  }

  Outcome outcome() {
    Surroundings& world = _world.surroundings();
    Outcome outcome{.trace = world.trace.text(),
                    .traceLines = world.trace.lines(),
                    .violationCount = world.violations.count(),
                    .violations = world.violations.kept(),
                    .received = world.received,
                    .connections = _clients.connections(),
                    .calls = _clients.calls()};
    for (auto found = outcome.trace.find("Deleting expired"); found != std::string::npos;
         found = outcome.trace.find("Deleting expired", found + 1)) {
      ++outcome.messageLogsDeleted;
    }
    const auto snapshot = _ledger->snapshot();
    for (const auto& row : *snapshot.dictionary("total")->array("backends")) {
      for (const auto& [reason, count] : *row.dictionary()->dictionary("dropped")) {
        outcome.dropped[reason] += static_cast<std::uint64_t>(count.integerValue().value_or(0));
      }
    }
    return outcome;
  }

  const Scenario& _scenario;
  World _world;
  const std::shared_ptr<Tap> _tap;
  const std::shared_ptr<Ledger> _ledger;
  const std::size_t _ownQueues;
  TallydAgent _agent;
  Clients _clients;
  Invariants _invariants;
};

}  // namespace

Outcome simulate(const Scenario& scenario) { return Simulation(scenario).run(); }

std::string summary(const Outcome& outcome) {
  const Received& received = outcome.received;
  std::string text = fmt::format(
      "{} sessions, {} calls, {} storebag fetches ({} failed), {} posts with {} events ({} refused, {} "
      "failed), "
      "{} datagrams and {} reliable ones ({} retransmissions, {} acknowledged), {} uploads ({} failed), "
      "{} log data, {} power records, {} adaptor messages, {} message logs deleted, {} lines of trace; "
      "dropped:",
      outcome.connections, outcome.calls, received.fetches, received.fetchesFailed, received.posts,
      received.eventsTaken + received.eventsRefused + received.eventsFailed + received.eventsWithoutRoom,
      received.eventsRefused, received.eventsFailed + received.eventsWithoutRoom, received.plainDatagrams,
      received.reliableDatagrams, received.retransmissions, received.acknowledged,
      received.uploads + received.uploadsFailed, received.uploadsFailed, received.logData,
      received.powerRecords, received.adaptorMessages, outcome.messageLogsDeleted, outcome.traceLines);
  for (const auto& [reason, count] : outcome.dropped) text += fmt::format(" {} {}", reason, count);
  return text;
}

Scenario dayOfSeed(std::uint64_t seed, hours length) {
  return withFaults(makeScenario(seed, length), seed + 1);
}

std::string commandFor(std::uint64_t seed, hours length) {
  return fmt::format("scripts/replay --seed {} --hours {}", seed, length.count());
}

}  // namespace tallyd::replay
