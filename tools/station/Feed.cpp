#include "station/Feed.h"

#include <algorithm>
#include <utility>

namespace tallyd::station {

void Feed::publish(Kind kind, std::string record) {
  auto shared = std::make_shared<const std::string>(std::move(record));
  {
    const std::lock_guard lock(_mutex);
    auto& entries = _entries.at(static_cast<std::size_t>(kind));
    entries.push_back({++_lastNumber, kind, std::move(shared)});
    if (entries.size() > _capacityPerKind) entries.pop_front();
  }
  _changed.notify_all();
}

std::vector<Feed::Entry> Feed::since(std::uint64_t number) const {
  const auto isAfter = [](std::uint64_t sought, const Entry& entry) { return sought < entry.number; };
  std::vector<Entry> found;
  {
    const std::lock_guard lock(_mutex);
    for (const auto& entries : _entries) {
      found.insert(found.end(), std::upper_bound(entries.begin(), entries.end(), number, isAfter),
                   entries.end());
    }
  }
  std::sort(found.begin(), found.end(), [](const Entry& a, const Entry& b) { return a.number < b.number; });
  return found;
}

bool Feed::waitForMore(std::uint64_t number, std::chrono::milliseconds patience) const {
  std::unique_lock lock(_mutex);
  _changed.wait_for(lock, patience, [&] { return _closed || _lastNumber > number; });
  return _lastNumber > number;
}

void Feed::close() {
  {
    const std::lock_guard lock(_mutex);
    _closed = true;
  }
  _changed.notify_all();
}

}  // namespace tallyd::station
