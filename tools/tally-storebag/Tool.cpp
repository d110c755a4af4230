#include "tally-storebag/Tool.h"

#include <exception>

namespace tallyd::storebagtool {

void complain(const Surroundings& surroundings, std::string_view text) {
  surroundings.err << "tally-storebag: " << text << '\n';
}

int runTool(int argumentCount, const char* const* arguments, const Surroundings& surroundings) {
  const auto parsed = parseOptions(argumentCount, arguments, surroundings.version, surroundings.now,
                                   surroundings.out, surroundings.err);
  if (!parsed.options) return parsed.exitStatus;
  int status = kFailed;
  try {
    status =
        std::visit([&](const auto& options) { return runCommand(options, surroundings); }, *parsed.options);
  } catch (const std::exception& error) {
    complain(surroundings, error.what());
    // As diff(1) has it: 1 says that there are differences.
    if (std::holds_alternative<DiffOptions>(*parsed.options)) status = kWrongUsage;
  }
  surroundings.out << std::flush;
  if (!surroundings.out) {
    complain(surroundings, "the standard output does not take what is written");
    return kFailed;
  }
  return status;
}

}  // namespace tallyd::storebagtool
