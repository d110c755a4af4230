// tally-station: stands in for the servers that the daemon reports to while somebody develops.

#include <pthread.h>
#include <csignal>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <iostream>

#include "station/Options.h"
#include "station/Station.h"
#include "station/TerminalView.h"

namespace {

namespace station = tallyd::station;

constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

/// The signals that the station obeys, held back in every thread until wait() takes one.
class Signals {
 public:
  Signals() {
    ::sigemptyset(&_signals);
    for (const int number : {SIGINT, SIGTERM, SIGUSR1}) ::sigaddset(&_signals, number);
    ::pthread_sigmask(SIG_BLOCK, &_signals, nullptr);
  }
  [[nodiscard]] int wait() const {
    int received = 0;
    ::sigwait(&_signals, &received);
    return received;
  }

 private:
  sigset_t _signals{};
};

void run(const station::Options& options) {
  const Signals signals;  // Before any thread starts.
  station::TerminalView view(std::cout, std::cerr, options.records());
  const station::Station station(options, view);
  while (signals.wait() == SIGUSR1) station.showTotals();
}

}  // namespace

int main(int argc, char** argv) {
  try {
    station::Options options;
    CLI::App app;
    app.set_version_flag("--version", "tally-station " TALLYD_VERSION);
    station::declareOptions(app, options);
    try {
      app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : kExitUsage;
    }
    run(options);
    return 0;
  } catch (const std::exception& exception) {
    std::fprintf(stderr, "tally-station: %s\n", exception.what());
    return kExitFailure;
  }
}
