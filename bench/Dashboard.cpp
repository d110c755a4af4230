#include <stdexcept>

#include "Datagrams.h"
#include "Figures.h"
#include "Sessions.h"

namespace tallyd::bench {

namespace {

/// From the message on the socket to its datagram, its local line and its line in the message log.
double processorSecondsOfDashboard(const Settings& settings, std::size_t messages) {
  const DatagramReceiver receiver;
  Sessions sessions(settings, {.posting = Posting::Unbatched,
                               .backends = {{"dashboard", dashboardSettings(receiver.port())}}});
  EventCheck check(messages);
  receiver.receive(1, check);  // The session's start.
  const double before = sessions.processorSeconds();
  sessions.sendPaced(messages, ReplayingClient::kNoFlush,
                     [&](std::size_t count) { receiver.receive(count, check); });
  const double seconds = sessions.processorSeconds() - before;
  check.finish();
  if (sessions.daemon().messageLogLines() != messages + 1) {
    throw std::runtime_error("the message log lacks lines");
  }
  return seconds;
}

}  // namespace

void measureDashboard(const Settings& settings, Figures& figures) {
  constexpr double kMicroseconds = 1e6;
  Figure figure{
      .name = "dashboard/message", .unit = "us", .floorName = "sendto alone", .target = Target::ratio(3.75)};
  if (!settings.wants(figure.name)) return;
  const std::size_t messages = settings.quick ? 4'000 : 20'000;
  const double perMessage = kMicroseconds / static_cast<double>(messages);
  for (int run = 0; run < settings.runs(); ++run) {
    const double seconds = processorSecondsOfDashboard(settings, messages);
    figure.add(seconds * perMessage, sendingProcessorSeconds(messages) * perMessage);
  }
  figures.push_back(std::move(figure));
}

}  // namespace tallyd::bench
