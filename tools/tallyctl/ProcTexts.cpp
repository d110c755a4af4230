#include "tallyctl/ProcTexts.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <functional>
#include <utility>
#include <vector>

namespace tallyd::tallyctl {

namespace {

using Words = std::vector<std::string_view>;

Words wordsOf(std::string_view line) {
  constexpr std::string_view kBlanks = " \t";
  Words words;
  while (true) {
    line.remove_prefix(std::min(line.find_first_not_of(kBlanks), line.size()));
    if (line.empty()) return words;
    const std::size_t length = std::min(line.find_first_of(kBlanks), line.size());
    words.push_back(line.substr(0, length));
    line.remove_prefix(length);
  }
}

/// Calls `visit` with each line until it says false; returns whether it never did.
bool forEachLine(std::string_view text, const std::function<bool(std::string_view)>& visit) {
  while (!text.empty()) {
    const std::size_t length = std::min(text.find('\n'), text.size());
    if (!visit(text.substr(0, length))) return false;
    text.remove_prefix(std::min(length + 1, text.size()));
  }
  return true;
}

template <class Number>
std::optional<Number> numberOf(std::string_view word) {
  Number number{};
  const char* const end = word.data() + word.size();
  const auto [stop, error] = std::from_chars(word.data(), end, number);
  if (error != std::errc() || stop != end) return std::nullopt;
  return number;
}

/// The words at the given places, all of them numbers.
template <std::size_t Count>
std::optional<std::array<std::uint64_t, Count>> countersAt(const Words& words,
                                                           const std::array<std::size_t, Count>& places) {
  std::array<std::uint64_t, Count> counters{};
  for (std::size_t i = 0; i < Count; ++i) {
    if (places[i] >= words.size()) return std::nullopt;
    const auto counter = numberOf<std::uint64_t>(words[places[i]]);
    if (!counter) return std::nullopt;
    counters[i] = *counter;
  }
  return counters;
}

bool isDigit(char character) { return character >= '0' && character <= '9'; }

/// Made of other disks or of memory; what is behind them would be counted twice, or is no disk.
bool isVirtualDisk(std::string_view name) {
  constexpr std::array<std::string_view, 9> kPrefixes{"loop", "ram",  "zram",   "dm-", "md",
                                                      "nbd",  "drbd", "bcache", "zd"};
  return std::any_of(kPrefixes.begin(), kPrefixes.end(), [name](std::string_view prefix) {
    return name.size() > prefix.size() && name.starts_with(prefix) && isDigit(name[prefix.size()]);
  });
}

/// Partitions are called after their disk: sda1, but nvme0n1p1 where the disk's name ends with a digit.
bool isPartitionOf(std::string_view name, std::string_view disk) {
  if (name.size() <= disk.size() || !name.starts_with(disk)) return false;
  std::string_view rest = name.substr(disk.size());
  if (isDigit(disk.back())) {
    if (rest.front() != 'p') return false;
    rest.remove_prefix(1);
  }
  return !rest.empty() && std::all_of(rest.begin(), rest.end(), isDigit);
}

void removePartitions(std::map<std::string, DiskCounters>& disks) {
  std::erase_if(disks, [names = disks](const auto& entry) {
    return std::any_of(names.begin(), names.end(),
                       [&entry](const auto& disk) { return isPartitionOf(entry.first, disk.first); });
  });
}

}  // namespace

std::optional<ProcessorTimes> parseStat(std::string_view text) {
  std::optional<ProcessorTimes> times;
  forEachLine(text, [&times](std::string_view line) {
    const Words words = wordsOf(line);
    if (words.empty() || words[0] != "cpu") return true;
    // user, nice, system, idle, iowait, irq, softirq, steal; guests' time is within user and nice.
    if (const auto ticks = countersAt<8>(words, {1, 2, 3, 4, 5, 6, 7, 8})) {
      const auto& [user, nice, system, idle, iowait, irq, softirq, steal] = *ticks;
      times = ProcessorTimes{user + nice, system + irq + softirq, idle, iowait, steal};
    }
    return false;
  });
  return times;
}

std::optional<MemoryFacts> parseMeminfo(std::string_view text) {
  constexpr std::uint64_t kKilobyte = 1024;  // The kernel's "kB".
  std::map<std::string_view, std::uint64_t> bytes;
  forEachLine(text, [&bytes](std::string_view line) {
    const Words words = wordsOf(line);
    if (words.size() < 2 || !words[0].ends_with(':')) return true;
    if (const auto number = numberOf<std::uint64_t>(words[1])) {
      bytes[words[0].substr(0, words[0].size() - 1)] = *number * kKilobyte;
    }
    return true;
  });
  const auto available = bytes.contains("MemAvailable") ? bytes.find("MemAvailable") : bytes.find("MemFree");
  if (!bytes.contains("MemTotal") || available == bytes.end()) return std::nullopt;
  return MemoryFacts{bytes["MemTotal"], available->second, bytes["SwapTotal"], bytes["SwapFree"]};
}

std::optional<std::map<std::string, DiskCounters>> parseDiskstats(std::string_view text) {
  std::map<std::string, DiskCounters> disks;
  const bool wellFormed = forEachLine(text, [&disks](std::string_view line) {
    const Words words = wordsOf(line);
    if (words.empty()) return true;
    // major, minor, name; reads, merged, sectors, time; writes, merged, sectors, time; …
    const auto counters = countersAt<4>(words, {3, 5, 7, 9});
    if (!counters) return false;
    const auto& [reads, readSectors, writes, writtenSectors] = *counters;
    if (!isVirtualDisk(words[2])) {
      disks[std::string(words[2])] = {reads, readSectors, writes, writtenSectors};
    }
    return true;
  });
  if (!wellFormed) return std::nullopt;
  removePartitions(disks);
  return disks;
}

std::optional<std::map<std::string, InterfaceCounters>> parseNetDev(std::string_view text) {
  std::map<std::string, InterfaceCounters> interfaces;
  const bool wellFormed = forEachLine(text, [&interfaces](std::string_view line) {
    if (line.empty() || line.find('|') != std::string_view::npos) return true;  // The two lines of heads.
    const std::size_t colon = line.rfind(':');
    if (colon == std::string_view::npos) return false;
    const Words name = wordsOf(line.substr(0, colon));
    // Received: bytes, packets, errors, and five more; sent: the same.
    const auto counters = countersAt<6>(wordsOf(line.substr(colon + 1)), {0, 1, 2, 8, 9, 10});
    if (name.size() != 1 || !counters) return false;
    const auto& [rxBytes, rxPackets, rxErrors, txBytes, txPackets, txErrors] = *counters;
    interfaces[std::string(name[0])] = {rxBytes, rxPackets, rxErrors, txBytes, txPackets, txErrors};
    return true;
  });
  if (!wellFormed) return std::nullopt;
  return interfaces;
}

std::optional<LoadAverages> parseLoadavg(std::string_view text) {
  const Words words = wordsOf(text);
  if (words.size() < 3) return std::nullopt;
  const auto one = numberOf<double>(words[0]);
  const auto five = numberOf<double>(words[1]);
  const auto fifteen = numberOf<double>(words[2]);
  if (!one || !five || !fifteen) return std::nullopt;
  return LoadAverages{*one, *five, *fifteen};
}

std::optional<double> parseUptime(std::string_view text) {
  const Words words = wordsOf(text);
  return words.empty() ? std::nullopt : numberOf<double>(words[0]);
}

}  // namespace tallyd::tallyctl
