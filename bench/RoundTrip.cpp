#include "BareBus.h"
#include "Daemon.h"
#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "framework/TallyConnection.h"

namespace tallyd::bench {

namespace {

constexpr int kCalls = 1000;
constexpr int kQuickCalls = 200;
constexpr const char* kNowhere =
    "http://127.0.0.1:9";  // No session is started: nothing is fetched or posted.

/// The median of this many calls, in microseconds.
template <class Call>
double medianTime(int calls, Call&& call) {
  constexpr double kMicroseconds = 1e6;
  std::vector<double> times;
  for (int i = 0; i < calls; ++i) {
    const Stopwatch stopwatch;
    call();
    times.push_back(stopwatch.seconds() * kMicroseconds);
  }
  return median(std::move(times));
}

template <class Call, class FloorCall>
void measure(const Settings& settings, Figures& figures, const char* name, Call&& call,
             FloorCall&& floorCall) {
  if (!settings.wants(name)) return;
  const int calls = settings.quick ? kQuickCalls : kCalls;
  Figure figure{.name = name, .unit = "us", .floorName = "sd-bus alone"};
  medianTime(calls / 10, call);
  medianTime(calls / 10, floorCall);
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = medianTime(calls, call);
    figure.add(value, medianTime(calls, floorCall));
  }
  figures.push_back(std::move(figure));
}

template <class Reply>
void checkReply(const Reply& reply) {
  if (reply.error) throw std::runtime_error("the daemon does not answer: " + *reply.error);
}

}  // namespace

void measureRoundTrips(const Settings& settings, Figures& figures) {
  if (!settings.wants("round-trip/")) return;
  // On two processors a call's time depends on which of them the scheduler wakes.
  const OneProcessor oneProcessor;
  const Daemon daemon(settings, kNowhere);
  const BareServer bareServer;
  const platform::Dictionary event = payload(1);
  TallyConnection client(daemon.socket());
  BareClient bareClient(daemon.socket());
  BareClient floorClient(bareServer.socket());
  const auto floorFetch = [&] { floorClient.fetchDisplayURL(); };
  const auto floorSend = [&] { floorClient.sendMessage(event); };

  measure(
      settings, figures, "round-trip/fetch-display-url", [&] { checkReply(client.fetchDisplayURLSync()); },
      floorFetch);
  measure(
      settings, figures, "round-trip/send-message",
      [&] { checkReply(client.sendMessageSync(kCategory, kType, event)); }, floorSend);
  measure(
      settings, figures, "round-trip/bare-fetch-display-url", [&] { bareClient.fetchDisplayURL(); },
      floorFetch);
  measure(
      settings, figures, "round-trip/bare-send-message", [&] { bareClient.sendMessage(event); }, floorSend);
}

}  // namespace tallyd::bench
