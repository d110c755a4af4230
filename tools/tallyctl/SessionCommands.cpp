// The commands that ask the daemon one thing.
#include <fmt/format.h>

#include "tallyctl/LineReader.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatesText.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kFinished = "finished";  ///< The daemon's reply to a one-shot send that it made.
constexpr std::string_view kNoDisplayURL = "URL not available";  ///< The daemon's reply in place of a URL.

std::uint32_t sessionIDOf(const SessionOptions& options) {
  return options.sessionID.value_or(randomSessionID());
}

/// What of it is the command's result is for the caller to say, with a further entry.
void printStates(const std::optional<Strings>& states, Console& console, Dictionary object) {
  object.set("states", statesValue(states));
  if (console.isJSON()) return console.printObject(object);
  if (!states) return console.print(statesText(states));
  if (states->empty()) return console.note("no backend reports");
  for (const auto& name : *states) console.print(name);
}

[[noreturn]] void failAtLine(std::uint64_t line, std::string_view reason) {
  throw Failure(fmt::format("standard input:{}: {}", line, reason));
}

/// What the options say, and the lines of the standard input up to its end over it.
Dictionary awaitUserInfo(const SessionOptions& options, int standardInput) {
  Dictionary info = userInfo(options).value_or(Dictionary());
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

int runCommand(const ConnectionOptions& connection, const OnceOptions& options, const Surroundings&,
               Console& console) {
  Session session(connection);
  const auto& [category, type, payload] = options.message;
  const auto reply =
      session.answer("the one-shot send", session.connection().sendMessageWithSessionInfoSync(
                                              sessionInfo(options.session, sessionIDOf(options.session)),
                                              userInfo(options.session), category, type, payload));
  const bool succeeded = reply == kFinished;
  Dictionary result{{"ok", succeeded}, {"reply", reply}};
  if (!succeeded) result.set("error", reply);
  console.tell(reply, result);
  return succeeded ? kSucceeded : kFailed;
}

int runCommand(const ConnectionOptions& connection, const StatesOptions& options,
               const Surroundings& surroundings, Console& console) {
  Session session(connection);
  const bool waits = options.waitForUserInfo;
  const auto states = session.start(options.session, sessionIDOf(options.session),
                                    waits ? std::nullopt : userInfo(options.session));
  const Dictionary succeeded{{"ok", true}};
  printStates(states, console, waits ? Dictionary() : succeeded);
  if (!waits) return kSucceeded;
  auto info = awaitUserInfo(options.session, surroundings.standardInput);
  printStates(session.answer("fetching the states", session.connection().fetchStatesSync(std::move(info))),
              console, succeeded);
  return kSucceeded;
}

int runCommand(const ConnectionOptions& connection, const FlushOptions& options, const Surroundings&,
               Console& console) {
  Session session(connection);
  const auto states = session.start(options.session, sessionIDOf(options.session), userInfo(options.session));
  if (!states) console.complain(noStorebagText(options.session.clientType));
  const auto text = session.answer("the flush", session.connection().flushMessagesSync());
  Dictionary result{{"ok", states.has_value()}, {"result", text ? Value(*text) : Value()}};
  if (!states) result.set("error", noStorebagText(options.session.clientType));
  console.tell(text.value_or("no result"), result);
  return states ? kSucceeded : kFailed;
}

int runCommand(const ConnectionOptions& connection, const DisplayURLOptions& options, const Surroundings&,
               Console& console) {
  Session session(connection);
  session.start(options.session, sessionIDOf(options.session), userInfo(options.session));
  const auto url = session.answer("fetching the display URL", session.connection().fetchDisplayURLSync());
  if (url == kNoDisplayURL) throw Failure(url);
  console.tell(url, {{"ok", true}, {"url", url}});
  return kSucceeded;
}

}  // namespace tallyd::tallyctl
