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
/// "throughput/…", "cpu/…" and "memory/peak-batched": from the socket to the collector. Like all that follow,
/// throws std::runtime_error when an event is lost or comes twice.
void measureThroughput(const Settings& settings, Figures& figures);
/// "dashboard/…": from the socket to the datagram.
void measureDashboard(const Settings& settings, Figures& figures);
/// "growth/…": what an event costs when there is more of something.
void measureGrowth(const Settings& settings, Figures& figures);
/// "hanging/…": what a client notices of a collector that does not answer.
void measureHanging(const Settings& settings, Figures& figures);
/// "idle/…": thousands of connections that call nothing.
void measureIdleCrowd(const Settings& settings, Figures& figures);
/// "start/…": until the first client is served.
void measureStart(const Settings& settings, Figures& figures);
/// "memory/idle" and "memory/connection".
void measureMemory(const Settings& settings, Figures& figures);
/// "storebag/…": what a bag's client entries and filter rules cost, within this process.
void measureStorebags(const Settings& settings, Figures& figures);

}  // namespace tallyd::bench
