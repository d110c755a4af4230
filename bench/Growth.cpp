#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <span>

#include "Datagrams.h"
#include "Events.h"
#include "Figures.h"
#include "Sessions.h"

namespace tallyd::bench {

namespace {

constexpr double kMicroseconds = 1e6;
constexpr int kLongRuns = 3;  ///< Of what takes long.

std::size_t eventsOf(const Settings& settings) { return settings.quick ? 10'000 : 50'000; }

/// The daemon's processor time for each of so many events while `send` sends them, in microseconds. They come
/// in so many posts.
template <class Send>
double costOfEvent(Sessions& sessions, std::size_t events, std::size_t posts, Send&& send) {
  const double before = sessions.processorSeconds();
  send();
  sessions.collector().waitForPosts(posts);
  const double seconds = sessions.processorSeconds() - before;
  checkDocuments(sessions.takeDocuments(), events);
  return seconds * kMicroseconds / static_cast<double>(events);
}

// Sessions

/// Each batch goes to another session, evenly over all of them, and in each run to others.
double costSpreadOverSessions(Sessions& sessions, std::size_t events, int run) {
  auto& clients = sessions.clients();
  const std::size_t batches = events / kBatchSize;
  const std::size_t step = std::max<std::size_t>(clients.size() / batches, 1);
  return costOfEvent(sessions, events, batches, [&] {
    for (std::size_t batch = 0; batch < batches; ++batch) {
      const std::size_t place = (batch * step + static_cast<std::size_t>(run)) % clients.size();
      clients[place].sendEvents(batch * kBatchSize, kBatchSize, kBatchSize);
    }
  });
}

void measureSessions(const Settings& settings, std::size_t count, Figures& figures) {
  Figure figure{
      .name = fmt::format("growth/sessions-{}", count), .unit = "us/event", .floorName = "1 session"};
  if (!settings.wants(figure.name)) return;
  figure.leftOut = whyTooMany(count);
  if (figure.leftOut.empty()) {
    const std::size_t events = eventsOf(settings);
    Sessions one(settings, {});
    Sessions many(settings, {.count = count});
    for (int run = 0; run < settings.runs(); ++run) {
      const double value = costSpreadOverSessions(many, events, run);
      figure.add(value, costSpreadOverSessions(one, events, run));
    }
  }
  figures.push_back(std::move(figure));
}

// Batches

double costInBatches(Sessions& sessions, std::size_t events, std::size_t batch) {
  return costOfEvent(sessions, events, events / batch,
                     [&] { sessions.clients().front().sendEvents(0, events, batch); });
}

void measureBatchSize(const Settings& settings, std::size_t size, Figures& figures) {
  Figure figure{.name = fmt::format("growth/batch-{}", size),
                .unit = "us/event",
                .floorName = fmt::format("batches of {}", kBatchSize)};
  if (!settings.wants(figure.name)) return;
  const std::size_t events = eventsOf(settings);
  Sessions sessions(settings, {});
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = costInBatches(sessions, events, size);
    figure.add(value, costInBatches(sessions, events, kBatchSize));
  }
  figures.push_back(std::move(figure));
}

// A run's length

void measureRunLength(const Settings& settings, Figures& figures) {
  constexpr std::size_t kTenths = 10;
  Figure figure{.name = "growth/run-length", .unit = "us/event", .floorName = "second tenth"};
  if (!settings.wants(figure.name)) return;
  const std::size_t events = (settings.quick ? 100'000 : 500'000) / kTenths;
  for (int run = 0; run < kLongRuns; ++run) {
    Sessions sessions(settings, {});
    std::vector<double> costs;
    for (std::size_t tenth = 0; tenth < kTenths; ++tenth) {
      costs.push_back(costInBatches(sessions, events, kBatchSize));
    }
    figure.add(costs.back(), costs[1]);
  }
  figures.push_back(std::move(figure));
}

// Backends

/// Those that one session can have, by the bag's names: two that post, and one of each other kind but the one
/// that needs an adaptor.
constexpr std::array<const char*, 5> kBackends{kFirstPoster, kSecondPoster, "dashboard", "power",
                                               "upload_server"};

platform::Dictionary settingsOf(std::span<const char* const> names, const DatagramReceiver& receiver) {
  const platform::Dictionary all{{kFirstPoster, httpsPostSettings()},
                                 {kSecondPoster, httpsPostSettings()},
                                 {"dashboard", dashboardSettings(receiver.port())},
                                 {"power", platform::Dictionary()},
                                 {"upload_server", platform::Dictionary{{"post_url", kNowhere}}}};
  platform::Dictionary backends;
  for (const char* name : names) backends.set(name, *all.find(name));
  return backends;
}

/// The daemon's processor time for an event that goes to these backends, in microseconds.
double costWithBackends(const Settings& settings, std::span<const char* const> names, std::size_t events) {
  const DatagramReceiver receiver;
  const platform::Dictionary backends = settingsOf(names, receiver);
  const std::size_t posters = postersIn(backends);
  const std::size_t dashboards = backends.contains("dashboard") ? 1 : 0;
  Sessions sessions(settings, {.backends = backends});
  EventCheck datagrams(events, dashboards);
  receiver.receive(dashboards, datagrams);  // The session's start.
  const double before = sessions.processorSeconds();
  sessions.sendPaced(events, kBatchSize,
                     [&](std::size_t count) { receiver.receive(count * dashboards, datagrams); });
  sessions.collector().waitForPosts(posters * events / kBatchSize);
  const double seconds = sessions.processorSeconds() - before;
  datagrams.finish();
  checkDocuments(sessions.takeDocuments(), events, posters);
  return seconds * kMicroseconds / static_cast<double>(events);
}

void measureBackends(const Settings& settings, Figures& figures) {
  Figure figure{.name = "growth/backends-5", .unit = "us/event", .floorName = "sum of each alone"};
  if (!settings.wants(figure.name)) return;
  const std::size_t events = eventsOf(settings) / 5;
  for (int run = 0; run < settings.runs(); ++run) {
    const double together = costWithBackends(settings, kBackends, events);
    double sum = 0;
    for (const char* const& name : kBackends) sum += costWithBackends(settings, {&name, 1}, events);
    figure.add(together, sum);
  }
  figures.push_back(std::move(figure));
}

}  // namespace

void measureGrowth(const Settings& settings, Figures& figures) {
  for (const std::size_t sessions : {100U, 10'000U}) measureSessions(settings, sessions, figures);
  for (const std::size_t size : {500U, 5'000U}) measureBatchSize(settings, size, figures);
  measureRunLength(settings, figures);
  measureBackends(settings, figures);
}

}  // namespace tallyd::bench
