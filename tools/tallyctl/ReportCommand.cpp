#include <fmt/format.h>

#include <algorithm>
#include <utility>
#include <vector>

#include "tallyctl/MessageSender.h"
#include "tallyctl/MessageSource.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatesText.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

namespace {

constexpr std::chrono::milliseconds kProgressInterval{200};

/// More than fail when the daemon goes: a window, and a flush.
constexpr std::size_t kMaximumHeldFailures = 2 * MessageSender::kWindow;

struct FailedCall {
  std::string subject;
  std::string error;
  std::uint64_t number = 0;
};

/// One report from the first message to the totals.
class Report {
 public:
  Report(Session& session, const ReportOptions& options, std::optional<MessageSource>& source,
         Console& console)
      : _session(session),
        _options(options),
        _source(source),
        _console(console),
        _progressTicks(std::chrono::steady_clock::now(), kProgressInterval),
        _sender(session.connection(), [this](const MessageSender::Answer& answer) { tell(answer); }) {}

  struct Outcome {
    std::uint64_t sent = 0;
    std::uint64_t failed = 0;          ///< Lines and messages.
    std::optional<std::string> error;  ///< Nothing when nothing failed.
  };

  Outcome run() {
    if (_options.message) send(0, *_options.message);
    if (_source) sendAll();
    if (!_session.lost()) _sender.flush(_source ? _source->lineNumber() : 0);
    const auto totals = _sender.drain();
    _console.clearProgress();
    Outcome outcome{totals.sent, totals.failed + _faultyLines, std::nullopt};
    if (_session.lost()) {
      outcome.error = lossText();
      _console.complain(*outcome.error);
    } else {
      tellFailures();
      if (outcome.failed > 0 || totals.failedFlushes > 0) {
        outcome.error = fmt::format("{} messages, {} flushes failed", outcome.failed, totals.failedFlushes);
      }
    }
    return outcome;
  }

 private:
  void sendAll() {
    while (mayGoOn()) {
      auto next = _source->next();
      if (!next) return;
      if (auto* message = std::get_if<Message>(&*next)) {
        send(_source->lineNumber(), std::move(*message));
      } else {
        ++_faultyLines;
        const auto& fault = std::get<MessageSource::Fault>(*next);
        tellFailure(fault.place, fault.text);
      }
      showProgress();
    }
  }

  void send(std::uint64_t line, Message message) {
    _sender.send(line, std::move(message));
    ++_handedOver;
    if (_options.flushEvery > 0 && _handedOver % _options.flushEvery == 0) _sender.flush(line);
  }

  [[nodiscard]] bool mayGoOn() const {
    if (_session.lost()) return false;
    return _options.atFault == AtFault::GoOn || (_faultyLines == 0 && !_sender.totals().anyFailed());
  }

  /// On the connection's thread.
  void tell(const MessageSender::Answer& answer) {
    if (answer.reply.error) {
      _failures.push_back({subjectOf(answer), *answer.reply.error, answer.number});
      if (_failures.size() > kMaximumHeldFailures) tellFailures();
      return;
    }
    tellFailures();
    if (!answer.reply.value.value_or("").empty()) {
      _console.tell(fmt::format("{}: {}", subjectOf(answer), *answer.reply.value),
                    {{"subject", subjectOf(answer)}, {"result", *answer.reply.value}});
    }
  }

  [[nodiscard]] std::string subjectOf(const MessageSender::Answer& answer) const {
    if (answer.kind == MessageSender::Kind::Flush) return "flush";
    return _source ? _source->placeOf(answer.number) : "message";
  }

  void tellFailures() {
    for (const auto& failure : std::exchange(_failures, {})) tellFailure(failure.subject, failure.error);
  }

  void tellFailure(const std::string& subject, const std::string& error) {
    _console.complain(fmt::format("{}: {}", subject, error));
    if (_console.isJSON()) _console.printObject({{"subject", subject}, {"error", error}});
  }

  /// When the daemon goes, everything under way fails at once, for this one reason.
  [[nodiscard]] std::string lossText() const {
    std::string text = _session.lostText();
    const auto first = std::min_element(_failures.begin(), _failures.end(),
                                        [](const auto& a, const auto& b) { return a.number < b.number; });
    if (_source && first != _failures.end()) {
      text += fmt::format("; what was sent from {} on may be lost", _source->placeOf(first->number));
    }
    return text;
  }

  void showProgress() {
    const auto now = std::chrono::steady_clock::now();
    if (!_console.showsProgress() || now < _progressDue) return;
    // The first look only sets the time, so that a short input shows nothing.
    if (_progressDue != SteadyTime()) {
      const auto share = _source->share();
      _console.showProgress(share ? fmt::format("{} messages, {:.0f} %", _handedOver, *share * 100)
                                  : fmt::format("{} messages", _handedOver));
    }
    _progressDue = _progressTicks.next(now);
  }

  Session& _session;
  const ReportOptions& _options;
  std::optional<MessageSource>& _source;
  Console& _console;
  std::uint64_t _handedOver = 0;
  std::uint64_t _faultyLines = 0;
  const Ticks _progressTicks;
  SteadyTime _progressDue;
  /// Not told yet, as it is not clear whether the daemon has gone; the connection's thread has them.
  std::vector<FailedCall> _failures;
  MessageSender _sender;  ///< Last, as its handler uses the rest.
};

int finish(const Report::Outcome& outcome, const std::optional<std::string>& noStorebag, Console& console) {
  const auto error = outcome.error ? outcome.error : noStorebag;
  platform::Dictionary result{
      {"ok", !error}, {"sent", platform::Value(outcome.sent)}, {"failed", platform::Value(outcome.failed)}};
  if (error) result.set("error", *error);
  console.tell(fmt::format("sent {} messages, {} failed", outcome.sent, outcome.failed), result);
  return error ? kFailed : kSucceeded;
}

}  // namespace

int runCommand(const ConnectionOptions& connection, const ReportOptions& options,
               const Surroundings& surroundings, Console& console) {
  std::optional<MessageSource> source;
  if (options.messagesFile) source.emplace(*options.messagesFile, surroundings.standardInput);
  Session session(connection);
  const auto sessionID = options.session.sessionID.value_or(randomSessionID());
  const auto states = session.start(options.session, sessionID, userInfo(options.session));
  console.tell(fmt::format("session {}\nstates: {}", sessionID, statesText(states)),
               {{"session", platform::Value(sessionID)}, {"states", statesValue(states)}});
  std::optional<std::string> noStorebag;
  if (!states) noStorebag = noStorebagText(options.session.clientType);
  if (noStorebag) console.complain(*noStorebag);
  return finish(Report(session, options, source, console).run(), noStorebag, console);
}

}  // namespace tallyd::tallyctl
