#include "tallyctl/ProcReader.h"

#include <fmt/format.h>

#include "tallyctl/Input.h"
#include "tallyctl/Session.h"

namespace tallyd::tallyctl {

namespace {

constexpr std::size_t kMaximumFileBytes = std::size_t{16} << 20;  ///< Far above what the kernel writes.
constexpr int kNoStandardInput = -1;

template <class T>
T readFile(const std::filesystem::path& path, std::optional<T> (*parse)(std::string_view)) {
  auto parsed = parse(Input(path.string(), kNoStandardInput).readWhole(kMaximumFileBytes));
  if (!parsed) throw Failure(fmt::format("{}: not of the form that is known", path.string()));
  return std::move(*parsed);
}

}  // namespace

MachineCounters readMachineCounters(const std::filesystem::path& procFolder, SteadyTime now) {
  MachineCounters counters;
  counters.time = now;
  counters.processors = readFile(procFolder / "stat", parseStat);
  counters.memory = readFile(procFolder / "meminfo", parseMeminfo);
  counters.disks = readFile(procFolder / "diskstats", parseDiskstats);
  counters.interfaces = readFile(procFolder / "net/dev", parseNetDev);
  counters.load = readFile(procFolder / "loadavg", parseLoadavg);
  counters.uptimeSeconds = readFile(procFolder / "uptime", parseUptime);
  return counters;
}

}  // namespace tallyd::tallyctl
