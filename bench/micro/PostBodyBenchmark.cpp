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
  runOnFreshEvents(state, [&](Dictionary& event) { sanitizeEventForJSON(event, log); });
}
BENCHMARK(sanitize)->Name("post-body/sanitize");

/// One field is a date; setting it is measured too.
void sanitizeDate(benchmark::State& state) {
  constexpr platform::Date kDate{1'760'000'000.5};
  NoLog log;
  runOnFreshEvents(state, [&](Dictionary& event) {
    event.set("startedAt", kDate);
    sanitizeEventForJSON(event, log);
  });
}
BENCHMARK(sanitizeDate)->Name("post-body/sanitize-date");

}  // namespace
}  // namespace tallyd::bench
