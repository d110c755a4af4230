#include <fmt/format.h>

#include <exception>
#include <future>
#include <stdexcept>

#include "CurlFloor.h"
#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "Sessions.h"
#include "ZlibFloor.h"

namespace tallyd::bench {

namespace {

struct Scenario {
  std::string name;
  Posting posting = Posting::Batched;
  std::size_t connections = 1;
  std::size_t events = 0;  ///< Of all connections together; shared out evenly, in whole batches.
  std::optional<Target> rateTarget{};
  std::optional<Target> processorTarget{};

  [[nodiscard]] std::size_t flushEvery() const {
    return posting == Posting::Batched ? kBatchSize : ReplayingClient::kNoFlush;
  }
  [[nodiscard]] std::size_t posts() const {
    return posting == Posting::Batched ? events / kBatchSize : events;
  }
};

struct Run {
  double seconds = 0;
  double processorSeconds = 0;
  Memory before{};
  Memory after{};
  std::vector<std::string> documents{};
  std::vector<std::string> headers{};  ///< Of a post.
};

/// What the same documents take without the daemon.
struct Floor {
  double seconds = 0;
  double processorSeconds = 0;
};

/// The rows of one scenario.
struct Rows {
  Figure rate;
  Figure processor;
  Figure logged;  ///< Only where there are batches.
  Figure peak;    ///< Only of one scenario.
};

constexpr const char* kPeakScenario = "batched-4";

/// All clients at once; the first one's failure is thrown.
void sendAll(std::vector<ReplayingClient>& clients, const Scenario& scenario) {
  const std::size_t share = scenario.events / clients.size();
  std::vector<std::future<void>> sending;
  for (std::size_t i = 0; i < clients.size(); ++i) {
    sending.push_back(std::async(std::launch::async,
                                 [&, i] { clients[i].sendEvents(i * share, share, scenario.flushEvery()); }));
  }
  for (auto& each : sending) each.get();
}

Run runScenario(const Settings& settings, const Scenario& scenario, Logging logging) {
  Sessions sessions(settings,
                    {.posting = scenario.posting, .count = scenario.connections, .logging = logging});
  Run run;
  run.before = memoryOf(sessions.daemon().id());
  const double processorBefore = sessions.processorSeconds();
  const Stopwatch stopwatch;
  sendAll(sessions.clients(), scenario);
  sessions.collector().waitForPosts(scenario.posts());
  run.seconds = stopwatch.seconds();
  run.processorSeconds = sessions.processorSeconds() - processorBefore;
  run.after = memoryOf(sessions.daemon().id());
  run.headers = sessions.collector().headersOfLastPost();
  run.documents = sessions.takeDocuments();
  checkDocuments(run.documents, scenario.events);
  if (logging == Logging::Everything && sessions.daemon().logLines() < scenario.events) {
    throw std::runtime_error("the log lacks lines");
  }
  return run;
}

Floor floorOf(const Scenario& scenario, const Run& run) {
  if (scenario.posting == Posting::Batched) {
    return {zlibSecondsOnAllProcessors(run.documents), zlibProcessorSeconds(run.documents)};
  }
  const PostLoopTimes times = postLoopTimes(run.documents, run.headers);
  return {times.seconds, times.processorSeconds};
}

Rows rowsOf(const Scenario& scenario) {
  const bool batched = scenario.posting == Posting::Batched;
  Rows rows;
  rows.rate = {.name = fmt::format("throughput/{}", scenario.name),
               .unit = "events/s",
               .floorName = batched ? "zlib alone, all processors" : "zlib and libcurl, one thread",
               .better = Better::Higher,
               .target = scenario.rateTarget};
  rows.processor = {.name = fmt::format("cpu/{}", scenario.name),
                    .unit = "us/event",
                    .floorName = batched ? "zlib alone" : "zlib and libcurl",
                    .target = scenario.processorTarget};
  rows.logged = {.name = fmt::format("cpu/logged-{}", scenario.connections),
                 .unit = "us/event",
                 .floorName = rows.processor.name,
                 .target = Target::ratio(1.5)};
  rows.peak = {.name = "memory/peak-batched",
               .unit = "MiB",
               .floorName = "before the run",
               .target = Target::figure(24)};
  return rows;
}

void measureRun(const Settings& settings, const Scenario& scenario, bool withLog, Rows& rows) {
  constexpr double kMicroseconds = 1e6;
  constexpr double kMebibyte = 1 << 20;
  const auto events = static_cast<double>(scenario.events);
  const double perEvent = kMicroseconds / events;
  const Run run = runScenario(settings, scenario, Logging::Warnings);
  const Floor floor = floorOf(scenario, run);
  rows.rate.add(events / run.seconds, events / floor.seconds);
  rows.processor.add(run.processorSeconds * perEvent, floor.processorSeconds * perEvent);
  rows.peak.add(static_cast<double>(run.after.peakBytes) / kMebibyte,
                static_cast<double>(run.before.residentBytes) / kMebibyte);
  if (!withLog) return;
  const Run logged = runScenario(settings, scenario, Logging::Everything);
  rows.logged.add(logged.processorSeconds * perEvent, run.processorSeconds * perEvent);
}

void measureScenario(const Settings& settings, const Scenario& scenario, Figures& figures) {
  Rows rows = rowsOf(scenario);
  const bool withLog = scenario.posting == Posting::Batched && settings.wants(rows.logged.name);
  const bool withPeak = scenario.name == kPeakScenario && settings.wants(rows.peak.name);
  if (!settings.wants(rows.rate.name) && !settings.wants(rows.processor.name) && !withLog && !withPeak)
    return;
  for (int i = 0; i < settings.runs(); ++i) measureRun(settings, scenario, withLog, rows);
  figures.push_back(std::move(rows.rate));
  figures.push_back(std::move(rows.processor));
  if (withLog) figures.push_back(std::move(rows.logged));
  if (withPeak) figures.push_back(std::move(rows.peak));
}

}  // namespace

void measureThroughput(const Settings& settings, Figures& figures) {
  const std::size_t batched = settings.quick ? 10'000 : 50'000;
  const std::size_t unbatched = settings.quick ? 2'000 : 10'000;
  const Target batchedCost = Target::ratio(2);
  const Target unbatchedCost = Target::ratio(1.6);
  const Target rate = Target::ratio(1 / 0.75);
  for (const Scenario& scenario :
       {Scenario{"batched-1", Posting::Batched, 1, batched, {}, batchedCost},
        Scenario{kPeakScenario, Posting::Batched, 4, batched, rate, batchedCost},
        Scenario{"unbatched-1", Posting::Unbatched, 1, unbatched, {}, unbatchedCost},
        Scenario{"unbatched-4", Posting::Unbatched, 4, unbatched, {}, unbatchedCost}}) {
    measureScenario(settings, scenario, figures);
  }
}

}  // namespace tallyd::bench
