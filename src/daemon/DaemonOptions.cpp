#include "daemon/DaemonOptions.h"

#include <CLI/CLI.hpp>

namespace tallyd {

namespace {

constexpr int kLongestDrainSeconds = 600;  ///< No service manager waits longer for a stop.
constexpr int kMostRetries = 10;           ///< As many as fit into the time that a post is tried for.

constexpr const char* kFooter = R"(
Example, in a folder of one's own and without a service manager:
  tallyd --root "$HOME/tally" --log stderr --log-level info

Files, below the root:
  run/tallyd/com.quillon.tallyd           the socket that clients connect to
  run/tallyd/com.quillon.tallyd.inspection  the socket of "tallyctl stats" and "tallyctl tap"
  etc/tally/preferences/NAME.plist        preferences
  usr/share/tally/sandbox/                the sandbox's profile

Exit status: 0 drained, else never in normal operation; 1 the daemon could not start; 2 wrong usage;
255 the sandbox could not be entered. See tallyd(8).)";

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
  int drainSeconds = 0;
  bool resilient = false;
  bool recheckConsent = false;
  app.add_option("--root", root, "Folder below which every path lies")
      ->envname("TALLY_ROOT")
      ->check(CLI::ExistingDirectory);
  app.add_option("--log", log, "Where log lines go; by default the journal, else syslog, else standard error")
      ->envname("TALLY_LOG")
      ->check(validLogDestination());
  app.add_option("--log-level", level, "Leave out lines above this level; by default nothing is left out")
      ->check(validLogLevel());
  app.add_flag("--no-sandbox", noSandbox, "Run unconfined, for debugging");
  app.add_option(
         "--drain", drainSeconds,
         "End in order on SIGTERM: let sessions end and what is under way finish, for at most this long")
      ->type_name("SECONDS")
      ->check(CLI::Range(1, kLongestDrainSeconds));
  app.add_flag("--resilient", resilient,
               "Fail only the request where a client or a server would otherwise end the daemon");
  app.add_option("--retry-posts", options.retryPosts,
                 "Give a post that failed for a while up to N further attempts; 0, the default, is none")
      ->type_name("N")
      ->check(CLI::Range(0, kMostRetries));
  app.add_flag("--recheck-consent", recheckConsent,
               "Read the user's consent also before each post and each further attempt of one; a withdrawal "
               "stops it");
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
  if (drainSeconds > 0) options.drain = std::chrono::seconds(drainSeconds);
  if (resilient) options.agent.fatalFailures = platform::FatalFailures::FailRequest;
  if (recheckConsent) options.agent.consentChecks = ConsentChecks::BeforeEachPost;
  return {.options = options};
}

}  // namespace tallyd
