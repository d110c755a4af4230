#include <benchmark/benchmark.h>

#include <vector>

#include "Events.h"
#include "Samples.h"
#include "backends/https-post/EventRecord.h"

namespace tallyd::bench {
namespace {

using platform::Dictionary;

std::vector<Dictionary> payloads() {
  std::vector<Dictionary> made;
  for (std::size_t number = 0; number < kBatchSize; ++number) made.push_back(payload(number));
  return made;
}

/// As a session does: what all its records have in common is prepared once.
void record(benchmark::State& state) {
  const std::vector<Dictionary> batch = payloads();
  EventRecords records;
  std::size_t number = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(records.record(batch[number], eventFacts(number)));
    number = (number + 1) % kBatchSize;
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(record)->Name("event-record/record");

/// Each record is its session's first.
void recordFirst(benchmark::State& state) {
  const Dictionary fields = payload(0);
  for (auto _ : state) {
    EventRecords records;
    benchmark::DoNotOptimize(records.record(fields, eventFacts(0)));
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(recordFirst)->Name("event-record/first");

/// What a flush does with each record first.
void layOut(benchmark::State& state) {
  FreshFields fresh;
  for (auto _ : state) {
    fresh.renew();
    benchmark::DoNotOptimize(fresh.events());
  }
  state.SetItemsProcessed(state.iterations() * static_cast<std::int64_t>(kBatchSize));
}
BENCHMARK(layOut)->Name("event-record/fields-of-50");

}  // namespace
}  // namespace tallyd::bench
