// Reads the machine's counters.
#pragma once

#include <filesystem>

#include "tallyctl/MachineSample.h"
#include "tallyctl/Pacer.h"

namespace tallyd::tallyctl {

/// Reads stat, meminfo, diskstats, net/dev, loadavg and uptime below `procFolder`; `now` is the reading's
/// time. Throws Failure, which names the file, when one cannot be read or is not of the expected form.
[[nodiscard]] MachineCounters readMachineCounters(const std::filesystem::path& procFolder, SteadyTime now);

}  // namespace tallyd::tallyctl
