#include "tallyctl/CommandArguments.h"

#include <CLI/CLI.hpp>

#include "tallyctl/OptionTexts.h"

namespace tallyd::tallyctl {

namespace {
constexpr double kShortestInterval = 0.1;  ///< Processor times are counted in hundredths of a second.
}

void ReportArguments::addTo(CLI::App& command) {
  command.footer(kReportFooter);
  _session.addTo(command);
  _message.addTo(command);
  _message.exclude(command
                       .add_option("--messages", _options.messagesFile,
                                   "File with a message in JSON on each line; - is the standard input")
                       ->type_name("FILE"));
  addCount(command, "--flush-every", "Flush after every N messages", _options.flushEvery);
  command.add_flag("--strict", _strict, "Stop at the first line or message that fails");
}

ReportOptions ReportArguments::result() const {
  ReportOptions result = _options;
  result.session = _session.options();
  result.atFault = _strict ? AtFault::Stop : AtFault::GoOn;
  if (!result.messagesFile) result.message = _message.message();
  return result;
}

void OnceArguments::addTo(CLI::App& command) {
  command.footer(kOnceFooter);
  _session.addTo(command);
  _message.addTo(command);
  _message.require();
}

void StatesArguments::addTo(CLI::App& command) {
  command.footer(kStatesFooter);
  _session.addTo(command);
  command.add_flag("--wait-for-user-info", _waitForUserInfo, kWaitForUserInfoText);
}

void FlushArguments::addTo(CLI::App& command) {
  command.footer(kFlushFooter);
  _session.addTo(command);
}

void DisplayURLArguments::addTo(CLI::App& command) {
  command.footer(kDisplayURLFooter);
  _session.addTo(command);
}

void UploadArguments::addTo(CLI::App& command) {
  command.footer(kUploadFooter);
  _session.addTo(command);
  command.add_option("file", _file, "The file to upload, whole")->type_name("FILE")->required();
}

void UploadLogArguments::addTo(CLI::App& command) {
  command.footer(kUploadLogFooter);
  _session.addTo(command);
  command.add_option("files", _files, kLogFilesText)->type_name("FILE")->required();
}

void StatsArguments::addTo(CLI::App& command) { command.footer(kStatsFooter); }

void TapArguments::addTo(CLI::App& command) { command.footer(kTapFooter); }

void WatchArguments::addTo(CLI::App& command) {
  command.footer(kWatchFooter);
  _session.addTo(command, SessionArguments::ClientType::Fixed);
  addSeconds(command, "--interval", "Seconds between two samples, 0.1 or more", kShortestInterval,
             _options.interval);
  addCount(command, "--count", "End after N samples; by default at SIGINT or SIGTERM", _options.count);
}

WatchOptions WatchArguments::result() const {
  WatchOptions result = _options;
  result.session = _session.options();
  return result;
}

}  // namespace tallyd::tallyctl
