#include "tallyctl/ProcReader.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "platform/FileDescriptor.h"
#include "tallyctl/Session.h"

namespace tallyd::tallyctl {

namespace {

[[noreturn]] void failToRead(const std::filesystem::path& path) {
  throw Failure(fmt::format("{}: {}", path.string(), std::generic_category().message(errno)));
}

std::string readWhole(const std::filesystem::path& path) {
  const platform::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) failToRead(path);
  std::string text;
  std::array<char, 16384> buffer;
  while (true) {
    const ssize_t count = ::read(file.get(), buffer.data(), buffer.size());
    if (count > 0) text.append(buffer.data(), static_cast<std::size_t>(count));
    if (count == 0) return text;
    if (count < 0 && errno != EINTR) failToRead(path);
  }
}

template <class T>
T readFile(const std::filesystem::path& path, std::optional<T> (*parse)(std::string_view)) {
  auto parsed = parse(readWhole(path));
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
