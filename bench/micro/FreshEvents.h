// Benchmarks of what changes the event that it is given.
#pragma once

#include <benchmark/benchmark.h>

#include <vector>

#include "Events.h"
#include "Samples.h"

namespace tallyd::bench {

/// One iteration is one call of `work` with a decorated event that nobody has touched. Events are made and
/// dropped a batch at a time while the clock stands; stopping it costs some 10 ns an event.
template <class Work>
void runOnFreshEvents(benchmark::State& state, Work&& work) {
  std::vector<platform::Dictionary> events;
  while (state.KeepRunningBatch(kBatchSize)) {
    state.PauseTiming();
    events = decoratedEvents(kBatchSize);
    state.ResumeTiming();
    for (platform::Dictionary& event : events) work(event);
  }
  state.SetItemsProcessed(state.iterations());
}

}  // namespace tallyd::bench
