// The groups of figures; each function measures those of its group that are wanted.
#pragma once

#include <vector>

#include "Report.h"

namespace tallyd::bench {

using Figures = std::vector<Figure>;

/// "round-trip/…": one call and its answer, on a session without a backend.
void measureRoundTrips(const Settings& settings, Figures& figures);
/// "batch/…": from fifty payloads to the bytes that are posted, within this process.
void measureBatch(const Settings& settings, Figures& figures);
/// "throughput/…", "cpu/…" and "memory/peak-batched": from the socket to the collector. Throws
/// std::runtime_error when an event is lost or comes twice.
void measureThroughput(const Settings& settings, Figures& figures);
/// "memory/idle" and "memory/connection".
void measureMemory(const Settings& settings, Figures& figures);

}  // namespace tallyd::bench
