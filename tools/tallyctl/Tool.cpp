#include "tallyctl/Tool.h"

#include <fmt/format.h>

#include <cerrno>
#include <exception>
#include <sstream>
#include <string>
#include <system_error>
#include <variant>

namespace tallyd::tallyctl {

namespace {

int runAnyCommand(const Options& options, const Surroundings& surroundings, Console& console) {
  try {
    return std::visit(
        [&](const auto& command) { return runCommand(options.connection, command, surroundings, console); },
        options.command);
  } catch (const std::exception& error) {
    console.complain(error.what());
    if (console.isJSON()) console.printObject({{"ok", false}, {"error", error.what()}});
    return kFailed;
  }
}

/// What could not be written makes every run a failure; a reader that has gone is told nothing.
int finish(Console& console, int status) {
  if (!console.failed()) return status;
  const int error = console.outputError();
  if (error == EPIPE) return kClosedPipe;
  console.complain(fmt::format("standard output: {}", error == 0 ? "does not take what is written"
                                                                 : std::generic_category().message(error)));
  return kFailed;
}

}  // namespace

int runTool(int argumentCount, const char* const* arguments, const Surroundings& surroundings) {
  std::ostringstream help;
  const auto parsed = parseOptions(argumentCount, arguments, surroundings.version, help, surroundings.err);
  const auto form = parsed.options ? parsed.options->form : OutputForm::Text;
  Console console(surroundings.out, surroundings.err, surroundings.progress, form);
  if (parsed.options) return finish(console, runAnyCommand(*parsed.options, surroundings, console));
  if (const std::string text = help.str(); !text.empty()) console.print(text.substr(0, text.size() - 1));
  return finish(console, parsed.exitStatus);
}

}  // namespace tallyd::tallyctl
