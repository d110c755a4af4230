#include <benchmark/benchmark.h>

#include "FreshEvents.h"
#include "Samples.h"
#include "backends/https-post/EventFilters.h"

namespace tallyd::bench {
namespace {

using platform::Array;
using platform::Dictionary;

void filterWith(benchmark::State& state, const Array& rules) {
  EventFilters filters;
  filters.createFiltersFromArray(rules);
  runOnFreshEvents(state, [&](EventFields& event) { filters.filterEvent(event); });
}

void filter(benchmark::State& state, Hashing hashing) {
  filterWith(state, filterRules(static_cast<std::size_t>(state.range(0)), hashing));
}
BENCHMARK_CAPTURE(filter, remove, Hashing::No)
    ->Name("filters/remove")
    ->ArgName("rules")
    ->Arg(0)
    ->Arg(1)
    ->Arg(50)
    ->Arg(1000);
BENCHMARK_CAPTURE(filter, hash, Hashing::Yes)->Name("filters/hash")->ArgName("rules")->Arg(50)->Arg(1000);

/// One rule that fits one field.
void filterOneField(benchmark::State& state, const char* action) {
  filterWith(state, Array{Dictionary{{"key", "referrer"}, {"action", action}}});
}
BENCHMARK_CAPTURE(filterOneField, none, "none")->Name("filters/one-field-none");
BENCHMARK_CAPTURE(filterOneField, remove, "remove")->Name("filters/one-field-remove");
BENCHMARK_CAPTURE(filterOneField, hash, "sha256")->Name("filters/one-field-hash");

/// All rules name one field of the event, each for another method: the one thing that a field's cost grows
/// with.
void filterManyOfOneField(benchmark::State& state) {
  std::vector<platform::Value> rules;
  for (std::int64_t number = 0; number < state.range(0); ++number) {
    constexpr std::int64_t kFirstMethod = 100;
    rules.emplace_back(
        Dictionary{{"key", "referrer"}, {"action", "remove"}, {"method", kFirstMethod + number}});
  }
  filterWith(state, Array(std::move(rules)));
}
BENCHMARK(filterManyOfOneField)->Name("filters/same-field")->ArgName("rules")->Arg(1)->Arg(50)->Arg(1000);

void compileRules(benchmark::State& state) {
  const Array rules = filterRules(static_cast<std::size_t>(state.range(0)));
  EventFilters filters;
  for (auto _ : state) filters.createFiltersFromArray(rules);
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(compileRules)->Name("filters/compile")->ArgName("rules")->Arg(10)->Arg(50)->Arg(1000);

}  // namespace
}  // namespace tallyd::bench
