// The tool as a function of its command line.
#pragma once

#include <ostream>
#include <string>

#include "platform/Clock.h"
#include "tally-storebag/Finding.h"
#include "tally-storebag/Options.h"

namespace tallyd::storebagtool {

/// What main() gives and a test replaces.
struct Surroundings {
  std::string version;
  std::ostream& out;
  std::ostream& err;
  platform::TimePoint now;
};

/// Runs one command; the result is the exit status.
[[nodiscard]] int runTool(int argumentCount, const char* const* arguments, const Surroundings& surroundings);

// One function for each command; what they throw, runTool() reports.

int runCommand(const NewOptions& options, const Surroundings& surroundings);
int runCommand(const KeygenOptions& options, const Surroundings& surroundings);
int runCommand(const SignOptions& options, const Surroundings& surroundings);
int runCommand(const VerifyOptions& options, const Surroundings& surroundings);
int runCommand(const ShowOptions& options, const Surroundings& surroundings);
int runCommand(const LintOptions& options, const Surroundings& surroundings);
int runCommand(const KeysOptions& options, const Surroundings& surroundings);
int runCommand(const ExplainOptions& options, const Surroundings& surroundings);
int runCommand(const DiffOptions& options, const Surroundings& surroundings);

/// "error release/splunk: text; effect".
[[nodiscard]] std::string textOf(const Finding& finding);

void complain(const Surroundings& surroundings, std::string_view text);

}  // namespace tallyd::storebagtool
