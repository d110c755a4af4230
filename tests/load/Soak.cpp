// The long form of the load tests: the same two runs for as long as asked, and a table of what they took.

#include <fmt/format.h>
#include <gtest/gtest.h>
#include <CLI/CLI.hpp>
#include <stdexcept>

#include "load/LoadBench.h"

namespace {

using tallyd::test::Crowd;
using tallyd::test::Days;
using tallyd::test::LoadBench;
using tallyd::test::LoadResult;
using tallyd::test::ProcessFigures;

double mebibytes(double bytes) { return bytes / (1024 * 1024); }
double mebibytes(std::size_t bytes) { return mebibytes(static_cast<double>(bytes)); }

void showCourse(const LoadResult& result) {
  fmt::print("{}: resident memory over the run, in MiB:", result.name);
  constexpr std::size_t kColumns = 20;
  const std::size_t step = std::max<std::size_t>(result.samples.size() / kColumns, 1);
  for (std::size_t i = 0; i < result.samples.size(); i += step) {
    fmt::print(" {:.1f}", mebibytes(result.samples[i].residentBytes));
  }
  fmt::print("\n");
}

void showTable(const LoadResult& crowd, const LoadResult& days) {
  const auto row = [&](std::string_view name, auto&& figure) {
    fmt::print("{:<34} {:>14} {:>14}\n", name, figure(crowd), figure(days));
  };
  const auto memory = [](double bytes) { return fmt::format("{:.1f} MiB", mebibytes(bytes)); };
  const auto change = [](std::size_t before, std::size_t after) {
    return fmt::format("{} -> {}", before, after);
  };
  fmt::print("\n{:<34} {:>14} {:>14}\n", "", crowd.name, days.name);
  row("connections at a time", [](const LoadResult& run) { return run.connections; });
  row("sessions started", [](const LoadResult& run) { return run.sessions; });
  row("messages sent", [](const LoadResult& run) { return run.messages; });
  row("seconds", [](const LoadResult& run) { return fmt::format("{:.1f}", run.seconds); });
  row("messages a second", [](const LoadResult& run) {
    return fmt::format("{:.0f}", static_cast<double>(run.messages) / run.seconds);
  });
  row("events accepted, by the books", [](const LoadResult& run) { return run.accepted; });
  row("events sent, by the books", [](const LoadResult& run) { return run.sent; });
  row("events that arrived", [](const LoadResult& run) { return run.arrived; });
  row("books balanced in every look", [](const LoadResult& run) { return run.balanced ? "yes" : "NO"; });
  row("memory before",
      [&](const LoadResult& run) { return memory(static_cast<double>(run.before.residentBytes)); });
  row("memory, tenths 2 and 3",
      [&](const LoadResult& run) { return memory(static_cast<double>(run.earlyBytes())); });
  row("memory, tenths 9 and 10",
      [&](const LoadResult& run) { return memory(static_cast<double>(run.lateBytes())); });
  row("memory after",
      [&](const LoadResult& run) { return memory(static_cast<double>(run.after.residentBytes)); });
  row("descriptors, before -> after",
      [&](const LoadResult& run) { return change(run.before.descriptors, run.after.descriptors); });
  row("threads, before -> after",
      [&](const LoadResult& run) { return change(run.before.threads, run.after.threads); });
  row("processor seconds",
      [](const LoadResult& run) { return fmt::format("{:.1f}", run.after.processorSeconds); });
}

bool isSound(const LoadResult& result) {
  return result.balanced && result.accepted == result.messages + 2 * result.sessions &&
         result.sent == result.accepted && result.arrived == result.accepted && result.hasFlatMemory() &&
         result.leavesNothing();
}

}  // namespace

int main(int argc, char** argv) {
  testing::InitGoogleTest(&argc, argv);  // The daemon's wrapper reports by its means.
  CLI::App app(
      "Runs the daemon under load for a long time: half of it ten thousand clients at once, half of it "
      "a busy device's days.");
  double minutes = 10;
  app.add_option("--minutes", minutes, "How long both runs together take, at least")
      ->check(CLI::Range(0.0, 1e5));
  CLI11_PARSE(app, argc, argv);
  const std::chrono::seconds half(static_cast<long>(minutes * 60 / 2));

  Crowd crowd;
  crowd.atLeast = half;
  try {
    takeDescriptorsFor(crowd);
  } catch (const std::runtime_error& error) {
    fmt::print(stderr, "tally-soak: {}\n", error.what());
    return EXIT_FAILURE;
  }
  fmt::print("{} connections, {} of them active, for {} s\n", crowd.connections, crowd.active, half.count());
  std::fflush(stdout);
  const LoadResult crowdResult = LoadBench().run(crowd);
  showCourse(crowdResult);
  fmt::print("busy days for {} s\n", half.count());
  std::fflush(stdout);
  Days days;
  days.atLeast = half;
  const LoadResult daysResult = LoadBench().run(days);
  showCourse(daysResult);
  showTable(crowdResult, daysResult);
  const bool sound = isSound(crowdResult) && isSound(daysResult);
  fmt::print("{}\n", sound ? "nothing was lost, memory was flat, nothing was left over" : "NOT SOUND");
  return sound ? EXIT_SUCCESS : EXIT_FAILURE;
}
