#include "tallyctl/Tool.h"

#include <exception>

namespace tallyd::tallyctl {

namespace {

int runCommand(const Options& options, const Surroundings& surroundings, Console& console) {
  const ConnectionOptions& connection = options.connection;
  if (const auto* report = std::get_if<ReportOptions>(&options.command)) {
    return runReport(connection, *report, surroundings, console);
  }
  if (const auto* once = std::get_if<OnceOptions>(&options.command))
    return runOnce(connection, *once, console);
  if (const auto* states = std::get_if<StatesOptions>(&options.command)) {
    return runStates(connection, *states, surroundings, console);
  }
  if (const auto* flush = std::get_if<FlushOptions>(&options.command)) {
    return runFlush(connection, *flush, console);
  }
  return runWatch(connection, std::get<WatchOptions>(options.command), surroundings, console);
}

}  // namespace

int runTool(int argumentCount, const char* const* arguments, const Surroundings& surroundings) {
  const auto parsed =
      parseOptions(argumentCount, arguments, surroundings.version, surroundings.out, surroundings.err);
  if (!parsed.options) return parsed.exitStatus;
  Console console(surroundings.out, surroundings.err, surroundings.progress);
  int status = kFailed;
  try {
    status = runCommand(*parsed.options, surroundings, console);
  } catch (const std::exception& error) {
    console.complain(error.what());
  }
  if (console.failed()) {
    console.complain("the standard output does not take what is written");
    return kFailed;
  }
  return status;
}

}  // namespace tallyd::tallyctl
