// The commands that ask the daemon one thing.
#include <fmt/format.h>

#include "tallyctl/LineReader.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatesText.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

namespace {

constexpr std::string_view kFinished = "finished";  ///< The daemon's reply to a one-shot send that it made.

std::uint32_t sessionIDOf(const SessionOptions& options) {
  return options.sessionID.value_or(randomSessionID());
}

void printStates(const std::optional<Strings>& states, Console& console) {
  if (!states) return console.print(statesText(states));
  if (states->empty()) return console.note("no backend reports");
  for (const auto& name : *states) console.print(name);
}

[[noreturn]] void failAtLine(std::uint64_t line, std::string_view reason) {
  throw Failure(fmt::format("standard input:{}: {}", line, reason));
}

/// What the options say, and the lines of the standard input up to its end over it.
platform::Dictionary awaitUserInfo(const SessionOptions& options, int standardInput) {
  platform::Dictionary info = userInfo(options).value_or(platform::Dictionary());
  LineReader lines(standardInput);
  std::string line;
  while (true) {
    const auto status = lines.next(line);
    if (status == LineReader::Status::End) return info;
    if (status == LineReader::Status::TooLong) failAtLine(lines.lineNumber(), "too long");
    if (line.empty()) continue;
    auto assignment = parseAssignment(line);
    if (!assignment.value) failAtLine(lines.lineNumber(), assignment.error);
    info.set(assignment.value->key, std::move(assignment.value->value));
  }
}

}  // namespace

int runOnce(const ConnectionOptions& connection, const OnceOptions& options, Console& console) {
  Session session(connection);
  const auto& [category, type, payload] = options.message;
  const auto reply =
      session.answer("the one-shot send", session.connection().sendMessageWithSessionInfoSync(
                                              sessionInfo(options.session, sessionIDOf(options.session)),
                                              userInfo(options.session), category, type, payload));
  console.print(reply);
  return reply == kFinished ? kSucceeded : kFailed;
}

int runStates(const ConnectionOptions& connection, const StatesOptions& options,
              const Surroundings& surroundings, Console& console) {
  Session session(connection);
  const bool waits = options.waitForUserInfo;
  const auto states = session.start(options.session, sessionIDOf(options.session),
                                    waits ? std::nullopt : userInfo(options.session));
  printStates(states, console);
  if (!waits) return kSucceeded;
  auto info = awaitUserInfo(options.session, surroundings.standardInput);
  printStates(session.answer("fetching the states", session.connection().fetchStatesSync(std::move(info))),
              console);
  return kSucceeded;
}

int runFlush(const ConnectionOptions& connection, const FlushOptions& options, Console& console) {
  Session session(connection);
  const auto states = session.start(options.session, sessionIDOf(options.session), userInfo(options.session));
  if (!states) console.complain(noStorebagText(options.session.clientType));
  const auto result = session.answer("the flush", session.connection().flushMessagesSync());
  console.print(result.value_or("no result"));
  return states ? kSucceeded : kFailed;
}

}  // namespace tallyd::tallyctl
