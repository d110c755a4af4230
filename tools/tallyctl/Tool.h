// The tool as a function of its command line and its surroundings.
#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <ostream>
#include <string>

#include "tallyctl/Console.h"
#include "tallyctl/Options.h"
#include "tallyctl/Pacer.h"

namespace tallyd::tallyctl {

/// What main() gives and a test replaces.
struct Surroundings {
  std::string version;
  std::ostream& out;
  std::ostream& err;
  int standardInput = 0;
  Console::Progress progress = Console::Progress::Hidden;
  std::filesystem::path procFolder = "/proc";
  std::function<std::unique_ptr<Pacer>()> makePacer;  ///< Called before the first thread starts.
};

/// Runs one command; the result is the exit status.
[[nodiscard]] int runTool(int argumentCount, const char* const* arguments, const Surroundings& surroundings);

// One function for each command; what they throw, runTool() reports.

int runCommand(const ConnectionOptions& connection, const ReportOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const OnceOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const StatesOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const FlushOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const DisplayURLOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const UploadOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const UploadLogOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const StatsOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const TapOptions& options,
               const Surroundings& surroundings, Console& console);
int runCommand(const ConnectionOptions& connection, const WatchOptions& options,
               const Surroundings& surroundings, Console& console);

}  // namespace tallyd::tallyctl
