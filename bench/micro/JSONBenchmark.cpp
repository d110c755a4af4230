#include <benchmark/benchmark.h>

#include <string>

#include "Events.h"
#include "Samples.h"
#include "platform/JSON.h"

namespace tallyd::bench {
namespace {

using platform::Value;

std::size_t eventsOf(const benchmark::State& state) { return static_cast<std::size_t>(state.range(0)); }

void countIn(benchmark::State& state, std::size_t documentBytes) {
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(documentBytes));
  state.SetItemsProcessed(state.iterations() * state.range(0));
}

void writeDocument(benchmark::State& state) {
  const std::string document = documentOf(eventsOf(state));
  const Value value = *platform::valueFromJSON(document).value;
  for (auto _ : state) benchmark::DoNotOptimize(platform::jsonFromValue(value));
  countIn(state, document.size());
}
BENCHMARK(writeDocument)->Name("json/write")->ArgName("events")->Arg(1)->Arg(kBatchSize);

void readDocument(benchmark::State& state) {
  const std::string document = documentOf(eventsOf(state));
  for (auto _ : state) benchmark::DoNotOptimize(platform::valueFromJSON(document));
  countIn(state, document.size());
}
BENCHMARK(readDocument)->Name("json/read")->ArgName("events")->Arg(1)->Arg(kBatchSize);

}  // namespace
}  // namespace tallyd::bench
