#include "tallyctl/Options.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include <functional>
#include <utility>
#include <vector>

#include "framework/ClientSessionInterface.h"
#include "framework/InspectionInterface.h"
#include "platform/Root.h"
#include "tallyctl/CommandArguments.h"
#include "tallyctl/OptionTexts.h"

namespace tallyd::tallyctl {

namespace {

constexpr double kShortestTimeout = 0.001;

std::string commandNames(const CLI::App& app) {
  std::vector<std::string> names;
  for (const CLI::App* command : app.get_subcommands([](const CLI::App*) { return true; })) {
    names.push_back(command->get_name());
  }
  return fmt::format("{}", fmt::join(names, ", "));
}

/// What is said of the first argument that nothing takes.
std::string strangerText(const CLI::App& app, const std::string& argument) {
  const auto commands = app.get_subcommands();
  const bool isOption = argument.size() > 1 && argument.front() == '-';
  if (commands.empty() && isOption) return "there is no option " + argument;
  if (commands.empty()) {
    return fmt::format("there is no command \"{}\"; the commands are {}", argument, commandNames(app));
  }
  const std::string command = commands.front()->get_name();
  if (!isOption) return fmt::format("{} takes no argument \"{}\"", command, argument);
  const bool isMisplaced = commands.front()->get_option_no_throw(argument) != nullptr;
  return isMisplaced ? fmt::format("{} must stand behind {}", argument, command)
                     : fmt::format("{} has no option {}", command, argument);
}

bool isA(const CLI::Error& error, CLI::ExitCodes kind) {
  return error.get_exit_code() == static_cast<int>(kind);
}

std::string complaint(const CLI::App& app, const CLI::Error& error) {
  const auto strangers = app.remaining(true);
  const bool hasCommand = !app.get_subcommands().empty();
  std::string text = error.what();
  if (!strangers.empty() && (!hasCommand || isA(error, CLI::ExitCodes::ExtrasError))) {
    text = strangerText(app, strangers.front());
  } else if (!hasCommand && isA(error, CLI::ExitCodes::RequiredError)) {
    text = fmt::format("a command is missing; the commands are {}", commandNames(app));
  }
  return fmt::format("tallyctl: {}\nRun with --help for more information.\n", text);
}

/// The whole command line; declared once, read once.
class CommandLine {
 public:
  explicit CommandLine(const std::string& version) : _app(kAppText, "tallyctl") {
    _app.set_version_flag("--version", "tallyctl " + version);
    _app.footer(kAppFooter);
    _app.failure_message([](const CLI::App* app, const CLI::Error& error) { return complaint(*app, error); });
    _app.require_subcommand(1);
    _app.fallthrough();
    addGeneralOptions();
    addCommand("report", kReportText, _report);
    addCommand("once", kOnceText, _once);
    addCommand("states", kStatesText, _states);
    addCommand("flush", kFlushText, _flush);
    addCommand("display-url", kDisplayURLText, _displayURL);
    addCommand("upload", kUploadText, _upload);
    addCommand("upload-log", kUploadLogText, _uploadLog);
    addCommand("watch", kWatchText, _watch);
    addCommand("stats", kStatsText, _stats);
    addCommand("tap", kTapText, _tap);
  }

  CLI::App& app() { return _app; }

  [[nodiscard]] Options result() const {
    const auto socket =
        _socket.empty() ? tallydSocketPath(platform::Root(_root)) : std::filesystem::path(_socket);
    const auto inspectionSocket = _inspectionSocket.empty() ? inspectionSocketPath(platform::Root(_root))
                                                            : std::filesystem::path(_inspectionSocket);
    const auto form = _json ? OutputForm::JSON : OutputForm::Text;
    for (const auto& [app, options] : _commands) {
      if (app->parsed()) return {{socket, _timeout, inspectionSocket}, form, options()};
    }
    throw CLI::RequiredError("A command");
  }

 private:
  struct Command {
    const CLI::App* app = nullptr;
    std::function<CommandOptions()> options;
  };

  void addGeneralOptions() {
    addText(_app, "--root", "Folder below which the daemon's socket lies", _root)
        ->envname("TALLY_ROOT")
        ->type_name("DIR");
    addText(_app, "--socket", "The daemon's socket, in place of the one below the root", _socket)
        ->type_name("PATH");
    addText(_app, "--inspection-socket", kInspectionSocketText, _inspectionSocket)->type_name("PATH");
    addSeconds(_app, "--timeout", "Seconds to wait for each answer", kShortestTimeout, _timeout);
    _app.add_flag("--json", _json, "Print results in JSON, one object on a line");
  }

  template <class Arguments>
  void addCommand(const std::string& name, const std::string& text, Arguments& arguments) {
    CLI::App* const command = _app.add_subcommand(name, text);
    arguments.addTo(*command);
    _commands.push_back({command, [&arguments] { return CommandOptions(arguments.result()); }});
  }

  CLI::App _app;
  std::string _root = "/";
  std::string _socket;
  std::string _inspectionSocket;
  std::chrono::milliseconds _timeout{60'000};
  bool _json = false;
  std::vector<Command> _commands;
  ReportArguments _report;
  OnceArguments _once;
  StatesArguments _states;
  FlushArguments _flush;
  DisplayURLArguments _displayURL;
  UploadArguments _upload;
  UploadLogArguments _uploadLog;
  WatchArguments _watch;
  StatsArguments _stats;
  TapArguments _tap;
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
