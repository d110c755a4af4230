#include <unistd.h>

#include <iostream>

#include "tallyctl/SignalPacer.h"
#include "tallyctl/Tool.h"

int main(int argumentCount, char** arguments) {
  using namespace tallyd::tallyctl;
  const Surroundings surroundings{
      .version = TALLYD_VERSION,
      .out = std::cout,
      .err = std::cerr,
      .standardInput = STDIN_FILENO,
      .progress = ::isatty(STDERR_FILENO) != 0 ? Console::Progress::Shown : Console::Progress::Hidden,
      .makePacer = [] { return std::make_unique<SignalPacer>(); },
  };
  return runTool(argumentCount, arguments, surroundings);
}
