#include "replay/Simulation.h"

#include "daemon/Drain.h"
#include "replay/Clients.h"
#include "replay/Invariants.h"
#include "replay/World.h"

namespace tallyd::replay {

using std::chrono::hours;

namespace {

/// All ends within it, 21 ticks of any dashboard and a clean-up's last resort included.
constexpr auto kAfterTheDay = kLongDrain;

AgentOptions agentOptions(const OptIns& optIns) {
  return {.fatalFailures = optIns.fatalFailures, .consentChecks = optIns.consentChecks};
}

class Simulation {
 public:
  explicit Simulation(const Scenario& scenario)
      : _scenario(scenario),
        _world(scenario),
        _tap(std::make_shared<Tap>(_world.platform().queues, _world.platform().clock)),
        _ledger(std::make_shared<Ledger>(_tap)),
        _ownQueues(_world.surroundings().queues.liveQueues()),
        _agent(_world.platform(), _ledger, agentOptions(scenario.optIns)),
        _model(_world.surroundings()),
        _clients(_agent, _world, _model),
        _invariants(*_ledger, _world.surroundings(), _model) {
    trace("opt-ins: {}", description(scenario.optIns));
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
    if (_scenario.optIns.drain) {
      drain(*_scenario.optIns.drain);
    } else {
      _clients.disconnectAll();
    }
    _world.settle();
    _invariants.check();
    _world.runUntil(_world.surroundings().queues.now() + kAfterTheDay);
    _invariants.checkEnd(_ownQueues);
  }

  /// As the daemon ends: nobody leaves by himself.
  void drain(Milliseconds time) {
    trace("the daemon ends the sessions");
    _agent.endSessions();
    _clients.disconnectEnded();
    if (_clients.open() > 0) _world.surroundings().violated("a drain left connections open");
    std::optional<Drain::End> ended;
    Drain drain(_world.platform().queues, *_ledger);
    const Milliseconds begun = now();
    drain.start(time, [&](Drain::End end) {
      checkDrain(end, now() - begun, time);
      ended = end;
    });
    _world.runUntil(begun + time);
    if (!ended) _world.surroundings().violated("a drain did not end in its time");
    _isDrainSettled = ended == Drain::End::Settled;
  }

  void checkDrain(Drain::End end, Milliseconds elapsed, Milliseconds time) {
    const SessionCounts totals = _ledger->totals();
    trace("{}", balanceLine(totals));
    Surroundings& world = _world.surroundings();
    const bool isSettled = end == Drain::End::Settled;
    const Received& received = world.received;
    const bool isUnderWay = unfinishedOf(totals) > 0 || received.postsUnderWay > 0;
    if (isSettled && isUnderWay) world.violated("a drain ended with something under way");
    // A dashboard without datagrams ends with its next tick.
    if (!isSettled && !isUnderWay && received.openSockets == 0) world.violated("a drain waited for nothing");
    if (!isSettled && elapsed != time) world.violated("a drain was given up early");
    if (!isSettled && time >= kLongDrain) world.violated("a long drain left something unfinished");
  }

  [[nodiscard]] Milliseconds now() { return _world.surroundings().queues.now(); }

  Outcome outcome() {
    Surroundings& world = _world.surroundings();
    Outcome outcome{.trace = world.trace.text(),
                    .traceLines = world.trace.lines(),
                    .violationCount = world.violations.count(),
                    .violations = world.violations.kept(),
                    .received = world.received,
                    .connections = _clients.connections(),
                    .calls = _clients.calls(),
                    .isDrainSettled = _isDrainSettled};
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
  PostModel _model;
  Clients _clients;
  Invariants _invariants;
  std::optional<bool> _isDrainSettled;
};

}  // namespace

Outcome simulate(const Scenario& scenario) { return Simulation(scenario).run(); }

std::string summary(const Outcome& outcome) {
  const Received& received = outcome.received;
  std::string text = fmt::format(
      "{} sessions, {} calls, {} storebag fetches ({} failed), {} posts with {} events ({} refused, {} "
      "failed, {} withdrawn, {} saved by {} further attempts), "
      "{} datagrams and {} reliable ones ({} retransmissions, {} acknowledged), {} uploads ({} failed), "
      "{} log data, {} power records, {} adaptor messages, {} message logs deleted, {} lines of trace; "
      "dropped:",
      outcome.connections, outcome.calls, received.fetches, received.fetchesFailed, received.posts,
      received.eventsTaken + received.eventsRefused + received.eventsFailed + received.eventsWithoutRoom +
          received.eventsWithdrawn,
      received.eventsRefused, received.eventsFailed + received.eventsWithoutRoom, received.eventsWithdrawn,
      received.eventsSaved, received.furtherAttempts, received.plainDatagrams, received.reliableDatagrams,
      received.retransmissions, received.acknowledged, received.uploads + received.uploadsFailed,
      received.uploadsFailed, received.logData, received.powerRecords, received.adaptorMessages,
      outcome.messageLogsDeleted, outcome.traceLines);
  for (const auto& [reason, count] : outcome.dropped) text += fmt::format(" {} {}", reason, count);
  return text;
}

Scenario dayOfSeed(std::uint64_t seed, hours length) {
  return scenarioOf({.seed = seed, .length = length, .faults = seed + 1});
}

std::optional<std::string> commandFor(const Scenario& scenario) {
  if (!scenario.recipe) return std::nullopt;
  const Recipe& recipe = *scenario.recipe;
  const std::string faults = recipe.faults ? fmt::format("--faults {}", *recipe.faults) : "--fine";
  return fmt::format("scripts/replay --seed {} --hours {} {}", recipe.seed, recipe.length.count(), faults);
}

}  // namespace tallyd::replay
