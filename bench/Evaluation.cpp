#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <stdexcept>

#include "Device.h"
#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "Samples.h"
#include "backends/https-post/EventFilters.h"
#include "backends/https-post/HTTPSPostBackend.h"
#include "daemon/TallydAgent.h"
#include "fakes/FakeIPC.h"
#include "framework/TallyKeys.h"
#include "platform/Locale.h"

namespace tallyd::bench {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kEntries = 1000;
constexpr int kEvaluations = 10;
constexpr int kArrivals = 4;
constexpr int kBatches = 200;
constexpr int kQuickBatches = 30;
const Target kTarget = Target::figure(1);

double processorMilliseconds() { return processorSecondsOf(getpid()) * 1e3; }

Dictionary profileFor(const Device& device, std::size_t entries) {
  return postProfile(entries, device.platform().locale.countryCode().value_or("US"));
}

void require(bool condition, const char* what) {
  if (!condition) throw std::runtime_error(what);
}

/// A backend that a session has made of a profile, and told who the user is.
std::shared_ptr<HTTPSPostBackend> makeBackend(const Device& device, std::size_t entries) {
  auto backend = HTTPSPostBackend::initWithName(device.platform(), kTallyBackendHTTPPost,
                                                profileFor(device, entries), "Kasten");
  backend->setRequireUserInfo(true);
  backend->setUserInfoDict(userInfo());
  return backend;
}

/// Memory that drives everything else out of the processor's caches.
class CacheSweep {
 public:
  void run() {
    constexpr std::size_t kLine = 64;
    for (std::size_t place = 0; place < _memory.size(); place += kLine) ++_memory[place];
  }

 private:
  static std::size_t size() {
    constexpr long kLeast = 32 << 20;
    return 2 * static_cast<std::size_t>(std::max(sysconf(_SC_LEVEL3_CACHE_SIZE), kLeast));
  }
  std::vector<char> _memory = std::vector<char>(size());
};

/// Processor milliseconds for one evaluation that finds nothing in the caches: sessions start at long
/// intervals.
double evaluate(HTTPSPostBackend& backend, CacheSweep& sweep) {
  double spent = 0;
  for (int i = 0; i < kEvaluations; ++i) {
    sweep.run();
    const double start = processorMilliseconds();
    backend.updateState();
    spent += processorMilliseconds() - start;
  }
  require(backend.state() == ReportingStateOn && backend.eventThreshold() == kLastEventThreshold,
          "the last client entry is not the one that was chosen");
  return spent / kEvaluations;
}

void measureEvaluation(const Settings& settings, Figures& figures) {
  constexpr const char* kName = "storebag/evaluation-1000";
  if (!settings.wants(kName)) return;
  const Device device;
  const auto backend = makeBackend(device, kEntries);
  const auto floor = makeBackend(device, 1);
  Figure figure{.name = kName, .unit = "ms", .floorName = "one entry", .target = kTarget};
  CacheSweep sweep;
  evaluate(*backend, sweep);
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = evaluate(*backend, sweep);
    figure.add(value, evaluate(*floor, sweep));
  }
  figures.push_back(std::move(figure));
}

/// An optional argument that is there.
Value some(const Dictionary& dictionary) { return Array{dictionary}; }

/// Processor milliseconds for the start of a session that has the bag fetched; the network takes no time.
double arrive(const Device& device) {
  double spent = 0;
  for (int i = 0; i < kArrivals; ++i) {
    TallydAgent agent(device.platform());
    const auto connection = std::make_shared<fakes::FakeServiceConnection>();
    require(agent.shouldAcceptNewConnection(connection), "the agent refuses a connection");
    connection->call("SetSessionInfo", {some({{std::string(kTallySessionInfoSessionID), 1},
                                              {std::string(kTallySessionInfoClientType), 5},
                                              {std::string(kTallySessionInfoRequireUserInfo), true},
                                              {std::string(kTallySessionInfoBatchEvent), true}}),
                                        some(userInfo()), Array()});
    const double start = processorMilliseconds();
    const auto started = connection->call("StartConfig");
    spent += processorMilliseconds() - start;
    const Value states = Array{Array{std::string(kTallyBackendHTTPPost)}};
    require(started->replies == std::vector<std::vector<Value>>{{states}}, "the session does not report");
    connection->invalidate();
  }
  return spent / kArrivals;
}

void measureArrival(const Settings& settings, Figures& figures) {
  constexpr const char* kName = "storebag/arrival-1000";
  if (!settings.wants(kName)) return;
  Device device;
  Device floor;
  device.serve(storebag(profileFor(device, kEntries)));
  floor.serve(storebag(profileFor(floor, 1)));
  Figure figure{.name = kName, .unit = "ms", .floorName = "one entry"};
  arrive(device);
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = arrive(device);
    figure.add(value, arrive(floor));
  }
  figures.push_back(std::move(figure));
}

EventFilters filtersWith(std::size_t rules) {
  EventFilters filters;
  filters.createFiltersFromArray(filterRules(rules));
  return filters;
}

/// Processor microseconds for one event. Fields are laid out outside of what is measured, a batch at a time.
double filter(const EventFilters& filters, std::size_t fieldsAfter, int batches) {
  FreshFields fresh;
  double seconds = 0;
  for (int batch = 0; batch < batches; ++batch) {
    fresh.renew();
    const double start = processorSecondsOfThisThread();
    for (EventFields& event : fresh.events()) filters.filterEvent(event);
    seconds += processorSecondsOfThisThread() - start;
    for (const EventFields& event : fresh.events()) {
      require(event.size() == fieldsAfter, "the filters left other fields than they should");
    }
  }
  return seconds * 1e6 / (batches * static_cast<double>(kBatchSize));
}

void measureFilters(const Settings& settings, std::size_t rules, Figures& figures) {
  const std::string name = fmt::format("storebag/filter-{}", rules);
  if (!settings.wants(name)) return;
  const int batches = settings.quick ? kQuickBatches : kBatches;
  const EventFilters filters = filtersWith(rules);
  const EventFilters floor = filtersWith(1);
  Figure figure{.name = name, .unit = "us", .floorName = "one rule, fits nothing", .target = kTarget};
  for (int run = 0; run < settings.runs(); ++run) {
    const double value = filter(filters, kDecoratedFields - kRemovedFields, batches);
    figure.add(value, filter(floor, kDecoratedFields, batches));
  }
  figures.push_back(std::move(figure));
}

}  // namespace

void measureStorebags(const Settings& settings, Figures& figures) {
  if (!settings.wants("storebag/")) return;
  measureEvaluation(settings, figures);
  measureArrival(settings, figures);
  measureFilters(settings, 50, figures);
  measureFilters(settings, 1000, figures);
}

}  // namespace tallyd::bench
