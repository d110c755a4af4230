// Measures the daemon against floors that are measured in the same run.

#include <CLI/CLI.hpp>
#include <algorithm>
#include <csignal>
#include <fstream>
#include <iostream>

#include "Figures.h"
#include "ServerProcess.h"

namespace {

using tallyd::bench::Figure;
using tallyd::bench::Figures;
using tallyd::bench::Settings;

constexpr const char* kFooter = R"(
Figures: round-trip, batch, throughput, cpu, dashboard, growth, hanging, idle, start, memory, storebag; bench/README.md
says what each means. Every figure is the median of several runs, beside its floor from the same runs; the ratio is how
many times the floor's cost it is. A target is for the ratio where it has no unit, else for the figure itself.

Example, the throughput and the processor time of unbatched events, for a first impression:
  tallyd-bench --quick --only throughput/unbatched --json figures.json

Exit status: 0 measured; 1 the daemon failed, or an event was lost or came twice; 2 wrong usage.)";

constexpr int kUsageError = 2;

struct Options {
  Settings settings;
  bool noSandbox = false;
  std::string jsonFile;
};

int run(const Options& options) {
  const Settings& settings = options.settings;
  Figures figures;
  for (const auto measure :
       {tallyd::bench::measureRoundTrips, tallyd::bench::measureBatch, tallyd::bench::measureThroughput,
        tallyd::bench::measureDashboard, tallyd::bench::measureGrowth, tallyd::bench::measureHanging,
        tallyd::bench::measureIdleCrowd, tallyd::bench::measureStart, tallyd::bench::measureMemory,
        tallyd::bench::measureStorebags}) {
    measure(settings, figures);
  }
  std::erase_if(figures, [&](const Figure& figure) { return !settings.wants(figure.name); });
  if (figures.empty()) {
    std::cerr << "No figure is called \"" << settings.only << "\".\n";
    return kUsageError;
  }
  std::cout << tallyd::bench::tableOf(figures);
  if (options.jsonFile.empty()) return EXIT_SUCCESS;
  std::ofstream file(options.jsonFile);
  file << tallyd::bench::jsonOf(figures) << std::flush;
  if (file) return EXIT_SUCCESS;
  std::cerr << options.jsonFile << " can't be written.\n";
  return EXIT_FAILURE;
}

}  // namespace

int main(int argumentCount, char** arguments) {
  Options options;
  Settings& settings = options.settings;
  settings.program = tallyd::bench::programBeside("tallyd");
  settings.sources = TALLYD_SOURCE_DIR;
  CLI::App app("Measures the daemon against floors that are measured in the same run.", "tallyd-bench");
  app.footer(kFooter);
  app.add_flag("--quick", settings.quick, "Fewer and shorter runs, for a first impression");
  app.add_option("--only", settings.only, "Measure only figures whose names begin like this");
  app.add_option("--json", options.jsonFile, "Also write the figures, with every run's value, to this file");
  app.add_flag("--no-sandbox", options.noSandbox,
               "Run the daemon unconfined, on a kernel that can't confine it");
  try {
    app.parse(argumentCount, arguments);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? EXIT_SUCCESS : kUsageError;
  }
  settings.sandbox = !options.noSandbox;
  std::signal(SIGPIPE, SIG_IGN);
  try {
    tallyd::bench::raiseDescriptorLimit();
    return run(options);
  } catch (const std::exception& error) {
    std::cerr << "tallyd-bench: " << error.what() << "\n";
    return EXIT_FAILURE;
  }
}
