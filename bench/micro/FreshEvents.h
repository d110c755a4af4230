// Benchmarks of what changes the event that it is given.
#pragma once

#include <benchmark/benchmark.h>

#include "Events.h"
#include "Samples.h"

namespace tallyd::bench {

/// One iteration is one call of `work` with an event's fields that nobody has touched. They are laid out a
/// batch at a time while the clock stands; stopping it costs some 10 ns an event.
template <class Work>
void runOnFreshEvents(benchmark::State& state, Work&& work) {
  FreshFields fresh;
  while (state.KeepRunningBatch(kBatchSize)) {
    state.PauseTiming();
    fresh.renew();
    state.ResumeTiming();
    for (EventFields& event : fresh.events()) work(event);
  }
  state.SetItemsProcessed(state.iterations());
}

}  // namespace tallyd::bench
