#include <benchmark/benchmark.h>

#include <string>
#include <vector>

#include "Events.h"
#include "Samples.h"
#include "platform/Value.h"

namespace tallyd::bench {
namespace {

using platform::Dictionary;

Dictionary event() { return FreshFields().events().front().dictionary(); }

/// Shares the entries.
void copy(benchmark::State& state) {
  const Dictionary original = event();
  for (auto _ : state) {
    Dictionary copied = original;
    benchmark::DoNotOptimize(copied);
  }
}
BENCHMARK(copy)->Name("value/copy");

/// The first change of a copy copies its top level.
void copyAndChange(benchmark::State& state) {
  const Dictionary original = event();
  for (auto _ : state) {
    Dictionary copied = original;
    copied.set("_status", 1);
    benchmark::DoNotOptimize(copied);
  }
}
BENCHMARK(copyAndChange)->Name("value/copy-and-change");

void change(benchmark::State& state) {
  Dictionary changed = event();
  std::int64_t number = 0;
  for (auto _ : state) changed.set("_status", ++number);
}
BENCHMARK(change)->Name("value/change");

/// All keys of an event, one after the other, and as many that it lacks.
void find(benchmark::State& state, const char* ending) {
  const Dictionary searched = event();
  std::vector<std::string> keys;
  for (const auto& [key, value] : searched) keys.push_back(key + ending);
  for (auto _ : state) {
    for (const std::string& key : keys) benchmark::DoNotOptimize(searched.find(key));
  }
  state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(keys.size()));
}
BENCHMARK_CAPTURE(find, present, "")->Name("value/find");
BENCHMARK_CAPTURE(find, missing, "?")->Name("value/find-missing");

/// User info, which others hold too, into an event.
void merge(benchmark::State& state) {
  const Dictionary info{{"accountKind", "family"}, {"householdSize", 4}};
  const Dictionary original = event();
  for (auto _ : state) {
    Dictionary merged = original;
    merged.merge(info);
    benchmark::DoNotOptimize(merged);
  }
}
BENCHMARK(merge)->Name("value/merge");

void make(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(payload(0));
}
BENCHMARK(make)->Name("value/make-payload");

}  // namespace
}  // namespace tallyd::bench
