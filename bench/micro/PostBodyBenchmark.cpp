#include <benchmark/benchmark.h>

#include "FreshEvents.h"
#include "Samples.h"
#include "backends/https-post/PostBody.h"

namespace tallyd::bench {
namespace {

using platform::Dictionary;

/// All fields are fit for JSON as they are.
void sanitize(benchmark::State& state) {
  NoLog log;
  runOnFreshEvents(state, [&](EventFields& event) { sanitizeEventForJSON(event, log); });
}
BENCHMARK(sanitize)->Name("post-body/sanitize");

/// One field is a date; setting it is measured too.
void sanitizeDate(benchmark::State& state) {
  const Dictionary started{{"startedAt", platform::Date{1'760'000'000.5}}};
  NoLog log;
  runOnFreshEvents(state, [&](EventFields& event) {
    event.merge(started);
    sanitizeEventForJSON(event, log);
  });
}
BENCHMARK(sanitizeDate)->Name("post-body/sanitize-date");

void appendFields(benchmark::State& state) {
  runOnFreshEvents(state, [](EventFields& event) {
    platform::JSONText json;
    appendEvent(json, event);
    benchmark::DoNotOptimize(json.view());
  });
}
BENCHMARK(appendFields)->Name("post-body/append-event");

}  // namespace
}  // namespace tallyd::bench
