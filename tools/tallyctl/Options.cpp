#include "tallyctl/Options.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include <limits>

#include "framework/ClientSessionInterface.h"
#include "platform/Root.h"
#include "tallyctl/OptionTexts.h"

namespace tallyd::tallyctl {

namespace {

constexpr double kLongestSeconds = 86'400;
constexpr double kShortestTimeout = 0.001;
constexpr double kShortestInterval = 0.1;  ///< Processor times are counted in hundredths of a second.

std::chrono::milliseconds fromSeconds(double seconds) {
  return std::chrono::ceil<std::chrono::milliseconds>(std::chrono::duration<double>(seconds));
}

CLI::Validator secondsFrom(double least) {
  // A range that "nan" is not in; the option's own text says it better than a description here.
  return CLI::Validator(
      [least](const std::string& text) {
        double seconds = 0;
        const bool inRange =
            CLI::detail::lexical_cast(text, seconds) && seconds >= least && seconds <= kLongestSeconds;
        return inRange
                   ? std::string()
                   : fmt::format("{} is no number of seconds from {} to {}", text, least, kLongestSeconds);
      },
      "");
}

/// Signed, as a minus sign in front of an unsigned number is no error to the library.
CLI::Validator countFrom(std::int64_t least) {
  CLI::Range range(least, std::numeric_limits<std::int64_t>::max());
  range.description("");
  return range;
}

CLI::Validator isAssignment() {
  return {[](const std::string& text) { return parseAssignment(text).error; }, ""};
}

platform::Dictionary dictionaryFrom(const std::string& what, const std::vector<std::string>& assignments) {
  auto parsed = parseAssignments(assignments);
  if (!parsed.value) throw CLI::ValidationError(what, parsed.error);
  return std::move(*parsed.value);
}

/// The options that say what a session is.
class SessionArguments {
 public:
  enum class ClientType { Chosen, Fixed };

  void addTo(CLI::App& command, ClientType clientType = ClientType::Chosen) {
    if (clientType == ClientType::Chosen) {
      command.add_option("--client-type", _options.clientType, kClientTypeText)
          ->type_name("N")
          ->capture_default_str();
    }
    command.add_option("--session-id", _options.sessionID, "Session number; by default a random one")
        ->type_name("N");
    command.add_option("--client-version", _options.clientVersion, "Client version, 0 to 65535")
        ->type_name("N");
    command.add_flag("--require-user-info", _options.requireUserInfo,
                     "Let backends report only once the user info is known");
    command.add_flag("--batch", _options.batchEvent, "Let events be batched");
    command.add_option("--client-name", _options.clientName, "User info: the client's name")
        ->type_name("NAME");
    command.add_option("--service-name", _options.serviceName, "User info: the service's name")
        ->type_name("NAME");
    command.add_option("--user-info", _userInfo, "User info: a further KEY=VALUE or KEY:=JSON; repeatable")
        ->type_name("KEY=VALUE")
        ->allow_extra_args(false)
        ->check(isAssignment());
    command.add_option("--framework", _options.frameworks, "A framework to check; repeatable")
        ->type_name("NAME")
        ->allow_extra_args(false);
  }

  [[nodiscard]] SessionOptions options() const {
    SessionOptions options = _options;
    options.furtherUserInfo = dictionaryFrom("--user-info", _userInfo);
    return options;
  }

 private:
  SessionOptions _options;
  std::vector<std::string> _userInfo;
};

/// The options that spell out one message.
class MessageArguments {
 public:
  void addTo(CLI::App& command) {
    _category = command.add_option("--category", _message.category, "Category of the message, 0 to 65535")
                    ->type_name("N");
    _type = command.add_option("--type", _message.type, "Type of the message, 0 to 65535")->type_name("N");
    _payload = command.add_option("payload", _assignments, kPayloadText)
                   ->type_name("KEY=VALUE")
                   ->check(isAssignment());
  }

  void require() {
    _category->required();
    _type->required();
  }

  void exclude(CLI::Option* other) {
    for (CLI::Option* option : {_category, _type, _payload}) option->excludes(other);
  }

  [[nodiscard]] Message message() const {
    if (_category->empty()) throw CLI::RequiredError("--category");
    if (_type->empty()) throw CLI::RequiredError("--type");
    Message message = _message;
    if (!_assignments.empty()) message.payload = dictionaryFrom("payload", _assignments);
    return message;
  }

 private:
  Message _message;
  std::vector<std::string> _assignments;
  CLI::Option* _category = nullptr;
  CLI::Option* _type = nullptr;
  CLI::Option* _payload = nullptr;
};

struct ReportArguments {
  SessionArguments session;
  MessageArguments message;
  ReportOptions options;
  bool strict = false;

  void addTo(CLI::App& command) {
    command.footer(kReportFooter);
    session.addTo(command);
    message.addTo(command);
    message.exclude(command
                        .add_option("--messages", options.messagesFile,
                                    "File with a message in JSON on each line; - is the standard input")
                        ->type_name("FILE"));
    command.add_option("--flush-every", options.flushEvery, "Flush after every N messages")
        ->type_name("N")
        ->check(countFrom(1));
    command.add_flag("--strict", strict, "Stop at the first line or message that fails");
  }

  [[nodiscard]] ReportOptions result() const {
    ReportOptions result = options;
    result.session = session.options();
    result.atFault = strict ? AtFault::Stop : AtFault::GoOn;
    if (!result.messagesFile) result.message = message.message();
    return result;
  }
};

struct OnceArguments {
  SessionArguments session;
  MessageArguments message;

  void addTo(CLI::App& command) {
    command.footer(kOnceFooter);
    session.addTo(command);
    message.addTo(command);
    message.require();
  }

  [[nodiscard]] OnceOptions result() const { return {session.options(), message.message()}; }
};

struct StatesArguments {
  SessionArguments session;
  bool waitForUserInfo = false;

  void addTo(CLI::App& command) {
    command.footer(kStatesFooter);
    session.addTo(command);
    command.add_flag("--wait-for-user-info", waitForUserInfo, kWaitForUserInfoText);
  }

  [[nodiscard]] StatesOptions result() const { return {session.options(), waitForUserInfo}; }
};

struct FlushArguments {
  SessionArguments session;

  void addTo(CLI::App& command) {
    command.footer(kFlushFooter);
    session.addTo(command);
  }

  [[nodiscard]] FlushOptions result() const { return {session.options()}; }
};

struct WatchArguments {
  SessionArguments session;
  WatchOptions options;
  double intervalSeconds = 1;

  void addTo(CLI::App& command) {
    command.footer(kWatchFooter);
    session.addTo(command, SessionArguments::ClientType::Fixed);
    command.add_option("--interval", intervalSeconds, "Seconds between two samples, 0.1 or more")
        ->type_name("SECONDS")
        ->check(secondsFrom(kShortestInterval))
        ->capture_default_str();
    command.add_option("--count", options.count, "End after N samples; by default at SIGINT or SIGTERM")
        ->type_name("N")
        ->check(countFrom(1));
    command.add_flag("--json", options.json, "Print each sample as a JSON object on a line");
  }

  [[nodiscard]] WatchOptions result() const {
    WatchOptions result = options;
    result.session = session.options();
    result.interval = fromSeconds(intervalSeconds);
    return result;
  }
};

/// The whole command line; declared once, read once.
class CommandLine {
 public:
  explicit CommandLine(const std::string& version) : _app(kAppText, "tallyctl") {
    _app.set_version_flag("--version", "tallyctl " + version);
    _app.footer(kAppFooter);
    _app.failure_message([](const CLI::App* app, const CLI::Error& error) {
      return "tallyctl: " + CLI::FailureMessage::simple(app, error);
    });
    _app.require_subcommand(1);
    _app.fallthrough();
    _app.add_option("--root", _root, "Folder below which the daemon's socket lies")
        ->envname("TALLY_ROOT")
        ->type_name("DIR")
        ->capture_default_str();
    _app.add_option("--socket", _socket, "The daemon's socket, in place of the one below the root")
        ->type_name("PATH");
    _app.add_option("--timeout", _timeoutSeconds, "Seconds to wait for each answer")
        ->type_name("SECONDS")
        ->check(secondsFrom(kShortestTimeout))
        ->capture_default_str();
    _report.addTo(*_app.add_subcommand("report", kReportText));
    _once.addTo(*_app.add_subcommand("once", kOnceText));
    _states.addTo(*_app.add_subcommand("states", kStatesText));
    _flush.addTo(*_app.add_subcommand("flush", kFlushText));
    _watch.addTo(*_app.add_subcommand("watch", kWatchText));
  }

  CLI::App& app() { return _app; }

  [[nodiscard]] Options result() const {
    const auto socket =
        _socket.empty() ? tallydSocketPath(platform::Root(_root)) : std::filesystem::path(_socket);
    const ConnectionOptions connection{socket, fromSeconds(_timeoutSeconds)};
    if (_app.got_subcommand("report")) return {connection, _report.result()};
    if (_app.got_subcommand("once")) return {connection, _once.result()};
    if (_app.got_subcommand("states")) return {connection, _states.result()};
    if (_app.got_subcommand("flush")) return {connection, _flush.result()};
    return {connection, _watch.result()};
  }

 private:
  CLI::App _app;
  std::string _root = "/";
  std::string _socket;
  double _timeoutSeconds = 60;
  ReportArguments _report;
  OnceArguments _once;
  StatesArguments _states;
  FlushArguments _flush;
  WatchArguments _watch;
};

}  // namespace

ParsedOptions parseOptions(int argumentCount, const char* const* arguments, const std::string& version,
                           std::ostream& out, std::ostream& err) {
  CommandLine line(version);
  try {
    line.app().parse(argumentCount, arguments);
    return {line.result()};
  } catch (const CLI::ParseError& error) {
    return {std::nullopt, line.app().exit(error, out, err) == 0 ? kSucceeded : kWrongUsage};
  }
}

}  // namespace tallyd::tallyctl
