#include <fmt/format.h>

#include "tallyctl/MachineSample.h"
#include "tallyctl/MessageSender.h"
#include "tallyctl/ProcReader.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatesText.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

namespace {

constexpr std::uint16_t kQualityCategory = 1;
constexpr std::uint16_t kSampleType = 0;

/// As JSON, the output holds samples alone as long as nothing fails.
void tellBesideSamples(const std::string& text, Console& console) {
  console.isJSON() ? console.note(text) : console.print(text);
}

/// Samples and sends until the count is reached, the pacer stops, or the daemon is gone.
class Watch {
 public:
  Watch(Session& session, const WatchOptions& options, const std::filesystem::path& procFolder, Pacer& pacer,
        Console& console)
      : _session(session),
        _options(options),
        _procFolder(procFolder),
        _pacer(pacer),
        _console(console),
        _sender(session.connection(), [this](const MessageSender::Answer& answer) { tell(answer); }) {}

  /// False when a send failed.
  bool run() {
    MachineCounters before = readMachineCounters(_procFolder, _pacer.now());
    const Ticks ticks(before.time, _options.interval);
    for (std::uint64_t number = 1; !isEnough(number) && _pacer.waitUntil(ticks.next(_pacer.now()));
         ++number) {
      MachineCounters now = readMachineCounters(_procFolder, _pacer.now());
      report(sampleBetween(before, now, number));
      before = std::move(now);
    }
    return finish();
  }

 private:
  [[nodiscard]] bool isEnough(std::uint64_t number) const {
    return _session.lost() || _console.failed() || (_options.count > 0 && number > _options.count);
  }

  void report(const MachineSample& sample) {
    const auto payload = payloadOf(sample);
    _sender.send(sample.number, {kQualityCategory, kSampleType, payload});
    _console.tell(lineOf(sample), payload);
  }

  bool finish() {
    if (!_session.lost()) _sender.flush(0);
    const auto totals = _sender.drain();
    if (_session.lost()) _console.complain(_session.lostText());
    const auto text = fmt::format("sent {} samples, {} failed", totals.sent, totals.failed);
    tellBesideSamples(text, _console);
    const bool succeeded = !totals.anyFailed() && !_session.lost();
    if (!succeeded && _console.isJSON()) {
      _console.printObject({{"ok", false}, {"error", _session.lost() ? _session.lostText() : text}});
    }
    return succeeded;
  }

  /// On the connection's thread.
  void tell(const MessageSender::Answer& answer) {
    if (!answer.reply.error) return;
    const bool isFlush = answer.kind == MessageSender::Kind::Flush;
    _console.complain(isFlush ? fmt::format("flush: {}", *answer.reply.error)
                              : fmt::format("sample {}: {}", answer.number, *answer.reply.error));
  }

  Session& _session;
  const WatchOptions& _options;
  const std::filesystem::path& _procFolder;
  Pacer& _pacer;
  Console& _console;
  MessageSender _sender;  ///< Last, as its handler uses the rest.
};

}  // namespace

int runCommand(const ConnectionOptions& connection, const WatchOptions& options,
               const Surroundings& surroundings, Console& console) {
  const auto pacer = surroundings.makePacer();
  Session session(connection);
  const auto sessionID = options.session.sessionID.value_or(randomSessionID());
  const auto states = session.start(options.session, sessionID, userInfo(options.session));
  tellBesideSamples(fmt::format("session {}, states: {}", sessionID, statesText(states)), console);
  if (!states) console.complain(noStorebagText(options.session.clientType));
  return Watch(session, options, surroundings.procFolder, *pacer, console).run() ? kSucceeded : kFailed;
}

}  // namespace tallyd::tallyctl
