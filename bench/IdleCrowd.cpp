#include "BareBus.h"
#include "Daemon.h"
#include "Figures.h"
#include "Measure.h"
#include "Recording.h"

namespace tallyd::bench {

namespace {

constexpr std::size_t kCrowd = 10'000;

/// Seconds until a crowd that comes at once has been accepted and authenticated.
template <class Server>
double acceptSeconds(const Server& server, const Recording& recording) {
  const Stopwatch stopwatch;
  const auto clients = ReplayingClient::crowd(kCrowd, server.socket(), recording);
  return stopwatch.seconds();
}

void measureAccept(const Settings& settings, const Recording& recording, Figure& figure) {
  for (int run = 0; run < settings.runs(); ++run) {
    const double seconds = acceptSeconds(Daemon(settings, kNowhere), recording);
    figure.add(seconds, acceptSeconds(BareServer(), recording));
  }
}

/// In microseconds. The first calls after other work find the scheduler in another mood.
double settledRoundTrip(BareClient& client) {
  constexpr int kCalls = 1000;
  const auto call = [&] { client.fetchDisplayURL(); };
  keep(medianMicroseconds(kCalls, call));
  return medianMicroseconds(kCalls, call);
}

void measureBeside(const Settings& settings, const Recording& recording, Figure& figure) {
  // On two processors a call's time depends on which of them the scheduler wakes.
  const OneProcessor oneProcessor;
  for (int run = 0; run < settings.runs(); ++run) {
    const Daemon daemon(settings, kNowhere);
    BareClient client(daemon.socket());
    const double alone = settledRoundTrip(client);
    const auto crowd = ReplayingClient::crowd(kCrowd, daemon.socket(), recording);
    figure.add(settledRoundTrip(client), alone);
  }
}

}  // namespace

void measureIdleCrowd(const Settings& settings, Figures& figures) {
  Figure accept{
      .name = "idle/accept-10000", .unit = "s", .floorName = "sd-bus alone", .target = Target::figure(2)};
  Figure beside{.name = "idle/round-trip-beside-10000",
                .unit = "us",
                .floorName = "before they came",
                .target = Target::ratio(1.1)};
  const auto measure = [&](Figure figure, const auto& work) {
    if (!settings.wants(figure.name)) return;
    figure.leftOut = whyTooMany(kCrowd);
    if (figure.leftOut.empty()) work(settings, recordClient(Posting::Unbatched), figure);
    figures.push_back(std::move(figure));
  };
  measure(std::move(accept), measureAccept);
  measure(std::move(beside), measureBeside);
}

}  // namespace tallyd::bench
