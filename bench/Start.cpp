#include "BareBus.h"
#include "Daemon.h"
#include "Figures.h"
#include "Measure.h"
#include "Recording.h"

namespace tallyd::bench {

namespace {

constexpr int kStarts = 5;

/// The median of what a few starts took, in milliseconds. `start` returns seconds.
template <class Start>
double medianMilliseconds(Start&& start) {
  constexpr double kMilliseconds = 1e3;
  std::vector<double> times;
  times.reserve(kStarts);
  for (int i = 0; i < kStarts; ++i) times.push_back(start() * kMilliseconds);
  return median(std::move(times));
}

/// From the process's creation to the first client's acceptance. What the daemon finds on its disk is there
/// before.
double daemonSeconds(const Settings& settings, const Recording& recording) {
  const DaemonRoot root(settings, kNowhere);
  const Stopwatch stopwatch;
  const ServerProcess daemon(root.arguments(settings, Logging::Warnings), root.path());
  const ReplayingClient client(root.socket(), recording);
  return stopwatch.seconds();
}

double floorSeconds(const Recording& recording) {
  const Stopwatch stopwatch;
  const BareServer server;
  const ReplayingClient client(server.socket(), recording);
  return stopwatch.seconds();
}

}  // namespace

void measureStart(const Settings& settings, Figures& figures) {
  Figure figure{
      .name = "start/first-accept", .unit = "ms", .floorName = "sd-bus alone", .target = Target::figure(30)};
  if (!settings.wants(figure.name)) return;
  const Recording recording = recordClient(Posting::Unbatched);
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = medianMilliseconds([&] { return daemonSeconds(settings, recording); });
    figure.add(value, medianMilliseconds([&] { return floorSeconds(recording); }));
  }
  figures.push_back(std::move(figure));
}

}  // namespace tallyd::bench
