#include <fmt/format.h>

#include <exception>
#include <future>

#include "Collector.h"
#include "Daemon.h"
#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "Recording.h"
#include "ZlibFloor.h"

namespace tallyd::bench {

namespace {

struct Scenario {
  const char* name;
  Posting posting;
  std::size_t connections;
  std::size_t events;  ///< Of all connections together; shared out evenly, in whole batches.

  [[nodiscard]] std::size_t posts() const {
    return posting == Posting::Batched ? events / kBatchSize : events;
  }
};

struct Run {
  double seconds = 0;
  double processorSeconds = 0;
  Memory before;
  Memory after;
  std::vector<std::string> documents;
};

constexpr const char* kPeak = "memory/peak-batched";
constexpr const char* kPeakScenario = "batched-4";

/// All clients at once; the first one's failure is thrown.
void sendAll(std::vector<ReplayingClient>& clients, const Scenario& scenario) {
  const std::size_t share = scenario.events / clients.size();
  std::vector<std::future<void>> sending;
  for (std::size_t i = 0; i < clients.size(); ++i) {
    sending.push_back(std::async(std::launch::async,
                                 [&, i] { clients[i].sendEvents(i * share, share, scenario.posting); }));
  }
  for (auto& each : sending) each.get();
}

Run runScenario(const Settings& settings, const Scenario& scenario) {
  Collector collector(signedStorebag());
  const Daemon daemon(settings, collector.url(""));
  const Recording recording = recordClient(scenario.posting);
  std::vector<ReplayingClient> clients;
  for (std::size_t i = 0; i < scenario.connections; ++i) {
    auto& client = clients.emplace_back(daemon.socket(), recording);
    client.call(recording.setSessionInfo);
    client.call(recording.startConfig);
  }
  // A session's start is an event of its own; in a batch it goes with the first fifty.
  if (scenario.posting == Posting::Unbatched) collector.waitForPosts(scenario.connections);
  (void)collector.takePosts();

  Run run;
  run.before = memoryOf(daemon.id());
  const double processorBefore = processorSecondsOf(daemon.id());
  const Stopwatch stopwatch;
  sendAll(clients, scenario);
  collector.waitForPosts(scenario.posts());
  run.seconds = stopwatch.seconds();
  run.processorSeconds = processorSecondsOf(daemon.id()) - processorBefore;
  run.after = memoryOf(daemon.id());
  for (const std::string& body : collector.takePosts()) run.documents.push_back(documentInBody(body));
  checkEvents(run.documents, scenario.events);
  return run;
}

void measureScenario(const Settings& settings, const Scenario& scenario, Figures& figures) {
  constexpr double kMicroseconds = 1e6;
  constexpr double kMebibyte = 1 << 20;
  Figure rate{.name = fmt::format("throughput/{}", scenario.name),
              .unit = "events/s",
              .floorName = "zlib alone, all processors",
              .better = Better::Higher};
  Figure processor{
      .name = fmt::format("cpu/{}", scenario.name), .unit = "us/event", .floorName = "zlib alone"};
  Figure peak{.name = kPeak, .unit = "MiB", .floorName = "before the run"};
  const bool wantsPeak = std::string_view(scenario.name) == kPeakScenario && settings.wants(kPeak);
  if (!settings.wants(rate.name) && !settings.wants(processor.name) && !wantsPeak) return;
  const auto events = static_cast<double>(scenario.events);
  for (int i = 0; i < settings.runs(); ++i) {
    const Run run = runScenario(settings, scenario);
    rate.add(events / run.seconds, events / zlibSecondsOnAllProcessors(run.documents));
    processor.add(run.processorSeconds / events * kMicroseconds,
                  zlibProcessorSeconds(run.documents) / events * kMicroseconds);
    peak.add(static_cast<double>(run.after.peakBytes) / kMebibyte,
             static_cast<double>(run.before.residentBytes) / kMebibyte);
  }
  figures.push_back(std::move(rate));
  figures.push_back(std::move(processor));
  if (wantsPeak) figures.push_back(std::move(peak));
}

}  // namespace

void measureThroughput(const Settings& settings, Figures& figures) {
  const std::size_t batched = settings.quick ? 10'000 : 50'000;
  const std::size_t unbatched = settings.quick ? 2'000 : 10'000;
  for (const Scenario& scenario : {Scenario{"batched-1", Posting::Batched, 1, batched},
                                   Scenario{kPeakScenario, Posting::Batched, 4, batched},
                                   Scenario{"unbatched-1", Posting::Unbatched, 1, unbatched},
                                   Scenario{"unbatched-4", Posting::Unbatched, 4, unbatched}}) {
    measureScenario(settings, scenario, figures);
  }
}

}  // namespace tallyd::bench
