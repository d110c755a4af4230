#include "daemon/DaemonOptions.h"

#include <CLI/CLI.hpp>

namespace tallyd {

namespace {

constexpr const char* kFooter = R"(
Example, in a folder of one's own and without a service manager:
  tallyd --root "$HOME/tally" --log stderr --log-level info

Files, below the root:
  run/tallyd/com.quillon.tallyd           the socket that clients connect to
  run/tallyd/com.quillon.tallyd.inspection  the socket of "tallyctl stats" and "tallyctl tap"
  etc/tally/preferences/NAME.plist        preferences
  usr/share/tally/sandbox/                the sandbox's profile

Exit status: 0 never in normal operation; 1 the daemon could not start; 2 wrong usage; 255 the sandbox could not be
entered. See tallyd(8).)";

CLI::Validator validLogDestination() {
  return {[](const std::string& name) {
            return platform::logDestinationNamed(name)
                       ? ""
                       : "\"" + name + "\" is none of journal, syslog, stderr";
          },
          "journal|syslog|stderr"};
}

CLI::Validator validLogLevel() {
  return {[](const std::string& name) {
            return platform::logLevelNamed(name) ? ""
                                                 : "\"" + name + "\" is no log level, such as 4 or warning";
          },
          "0..7|NAME"};
}

}  // namespace

ParsedOptions parseDaemonOptions(int argumentCount, const char* const* arguments) {
  CLI::App app(
      "Reporting daemon: takes events from client programs and sends them where signed storebags say.",
      "tallyd");
  app.set_version_flag("--version", "tallyd " TALLYD_VERSION);
  app.footer(kFooter);

  DaemonOptions options;
  std::string root = "/";
  std::string log;
  std::string level;
  bool noSandbox = false;
  app.add_option("--root", root, "Folder below which every path lies")
      ->envname("TALLY_ROOT")
      ->check(CLI::ExistingDirectory);
  app.add_option("--log", log, "Where log lines go; by default the journal, else syslog, else standard error")
      ->envname("TALLY_LOG")
      ->check(validLogDestination());
  app.add_option("--log-level", level, "Leave out lines above this level; by default nothing is left out")
      ->check(validLogLevel());
  app.add_flag("--no-sandbox", noSandbox, "Run unconfined, for debugging");
  try {
    app.parse(argumentCount, arguments);
  } catch (const CLI::ParseError& error) {
    constexpr int kUsageError = 2;
    return {.options = std::nullopt, .exitStatus = app.exit(error) == 0 ? 0 : kUsageError};
  }
  options.root = std::filesystem::absolute(root).lexically_normal();
  options.logDestination =
      log.empty() ? platform::defaultLogDestination() : *platform::logDestinationNamed(log);
  if (!level.empty()) options.logLevel = *platform::logLevelNamed(level);
  options.sandbox = !noSandbox;
  return {.options = options};
}

}  // namespace tallyd
