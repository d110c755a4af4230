#include <fcntl.h>
#include <unistd.h>

#include <csignal>
#include <iostream>

#include "tallyctl/SignalPacer.h"
#include "tallyctl/Tool.h"

namespace {

/// What is opened later must not come to lie where output goes. What is written to these fails as it would
/// have.
void occupyStandardDescriptors() {
  int descriptor = 0;
  do {
    descriptor = ::open("/dev/null", O_RDONLY);
  } while (descriptor >= STDIN_FILENO && descriptor <= STDERR_FILENO);
  if (descriptor > STDERR_FILENO) ::close(descriptor);
}

}  // namespace

int main(int argumentCount, char** arguments) {
  using namespace tallyd::tallyctl;
  occupyStandardDescriptors();
  std::signal(SIGPIPE, SIG_IGN);  // A write that nobody reads fails, and the session ends in order.
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
