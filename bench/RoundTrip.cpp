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

int callsOf(const Settings& settings) { return settings.quick ? kQuickCalls : kCalls; }

template <class Call, class FloorCall>
void measure(const Settings& settings, Figures& figures, Figure figure, Call&& call, FloorCall&& floorCall) {
  if (!settings.wants(figure.name)) return;
  const int calls = callsOf(settings);
  keep(medianMicroseconds(calls / 10, call));
  keep(medianMicroseconds(calls / 10, floorCall));
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = medianMicroseconds(calls, call);
    figure.add(value, medianMicroseconds(calls, floorCall));
  }
  figures.push_back(std::move(figure));
}

template <class Reply>
void checkReply(const Reply& reply) {
  if (reply.error) throw std::runtime_error("the daemon does not answer: " + *reply.error);
}

/// Microseconds a message, from the first call until a call behind the last one is answered.
double microsecondsWithoutReply(TallyConnection& client, int messages, const platform::Dictionary& event) {
  constexpr double kMicroseconds = 1e6;
  const Stopwatch stopwatch;
  for (int i = 0; i < messages; ++i) {
    if (!client.sendMessage(kCategory, kType, event, nullptr)) {
      throw std::runtime_error("the client library refuses a message");
    }
  }
  checkReply(client.fetchDisplayURLSync());
  return stopwatch.seconds() * kMicroseconds / messages;
}

void measureWithoutReply(const Settings& settings, Figures& figures, TallyConnection& client,
                         const platform::Dictionary& event) {
  Figure figure{.name = "round-trip/no-reply-send",
                .unit = "us",
                .floorName = "send-message",
                .target = Target::ratio(0.4)};
  if (!settings.wants(figure.name)) return;
  const int calls = callsOf(settings);
  keep(microsecondsWithoutReply(client, calls, event));
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = microsecondsWithoutReply(client, calls, event);
    figure.add(value, medianMicroseconds(
                          calls, [&] { checkReply(client.sendMessageSync(kCategory, kType, event)); }));
  }
  figures.push_back(std::move(figure));
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

  const auto row = [](const char* name, std::optional<Target> target = {}) {
    return Figure{.name = name, .unit = "us", .floorName = "sd-bus alone", .target = target};
  };
  const Target bare = Target::ratio(1.4);
  measure(
      settings, figures, row("round-trip/fetch-display-url"),
      [&] { checkReply(client.fetchDisplayURLSync()); }, floorFetch);
  measure(
      settings, figures, row("round-trip/send-message"),
      [&] { checkReply(client.sendMessageSync(kCategory, kType, event)); }, floorSend);
  measureWithoutReply(settings, figures, client, event);
  measure(
      settings, figures, row("round-trip/bare-fetch-display-url", bare),
      [&] { bareClient.fetchDisplayURL(); }, floorFetch);
  measure(
      settings, figures, row("round-trip/bare-send-message", bare), [&] { bareClient.sendMessage(event); },
      floorSend);
}

}  // namespace tallyd::bench
