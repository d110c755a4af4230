#include "station/PageModel.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>
#include <random>
#include <utility>
#include <vector>

namespace tallyd::station {

namespace {

std::string newStationName() {
  std::random_device random;
  return fmt::format("{:08x}{:08x}", random(), random());
}

std::optional<std::uint64_t> numberFrom(std::string_view text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

void appendList(std::string& json, const std::vector<std::string>& elements) {
  for (std::size_t i = 0; i < elements.size(); ++i) {
    if (i > 0) json += ',';
    json += elements[i];
  }
}

}  // namespace

std::optional<PagePosition> pagePositionFrom(std::string_view text) {
  const std::size_t first = text.find('.');
  if (first == std::string_view::npos) return std::nullopt;
  const std::size_t second = text.find('.', first + 1);
  if (second == std::string_view::npos) return std::nullopt;
  const auto number = numberFrom(text.substr(first + 1, second - first - 1));
  const auto revision = numberFrom(text.substr(second + 1));
  if (!number || !revision) return std::nullopt;
  return PagePosition{std::string(text.substr(0, first)), *number, *revision};
}

std::string textOfPosition(const PagePosition& position) {
  return fmt::format("{}.{}.{}", position.station, position.number, position.revision);
}

PageModel::PageModel(Feed& feed, const platform::Clock& clock, std::size_t recordsPerKind)
    : _feed(feed),
      _clock(clock),
      _recordsPerKind(recordsPerKind),
      _station(newStationName()),
      _follower([this] { follow(); }) {}

PageModel::~PageModel() {
  stop();
  _follower.join();
}

void PageModel::stop() {
  {
    const std::lock_guard lock(_mutex);
    _isStopped = true;
  }
  _feed.close();
  _changed.notify_all();
}

void PageModel::follow() {
  constexpr std::chrono::seconds kPatience{10};
  std::uint64_t number = 0;
  while (rest(std::chrono::milliseconds(0))) {
    if (!_feed.waitForMore(number, kPatience)) {
      // At once, when somebody else closed the feed: then there is only the end to wait for.
      if (!rest(std::chrono::milliseconds(100))) return;
      continue;
    }
    for (const Feed::Entry& entry : _feed.since(number)) {
      take(entry);
      number = entry.number;
    }
    _changed.notify_all();
  }
}

void PageModel::take(const Feed::Entry& entry) {
  PageRecord record = pageRecordOf(entry);
  const std::lock_guard lock(_mutex);
  _sessions.take(record, platform::secondsSince1970(_clock.now()));
  auto& records = _records.at(static_cast<std::size_t>(entry.kind));
  records.push_back({entry.number, std::move(record.json)});
  if (records.size() > _recordsPerKind) records.pop_front();
  _uncounted += entry.number - _lastNumber - 1;
  _lastNumber = entry.number;
}

PageUpdate PageModel::updateSince(const PagePosition& position) const {
  return makeUpdate(position, kRecordsPerUpdate);
}

std::string PageModel::snapshot() const { return makeUpdate({}, Feed::kKinds * _recordsPerKind).json; }

PageUpdate PageModel::makeUpdate(const PagePosition& position, std::size_t mostRecords) const {
  const bool isOurs = position.station == _station;
  const std::uint64_t number = isOurs ? position.number : 0;
  std::vector<const Held*> records;
  const std::lock_guard lock(_mutex);
  for (const auto& held : _records) {
    auto next = std::upper_bound(held.begin(), held.end(), number,
                                 [](std::uint64_t sought, const Held& one) { return sought < one.number; });
    for (; next != held.end(); ++next) records.push_back(&*next);
  }
  std::sort(records.begin(), records.end(), [](auto* a, auto* b) { return a->number < b->number; });
  if (records.size() > mostRecords) records.resize(mostRecords);

  PageUpdate update;
  update.position = {_station, records.empty() ? std::max(number, _lastNumber) : records.back()->number,
                     _sessions.revision()};
  const auto sessions = _sessions.changedSince(isOurs ? position.revision : 0);
  update.json = fmt::format(R"({{"position":"{}","reset":{},"uncounted":{},"sessions":[)",
                            textOfPosition(update.position), isOurs ? "false" : "true", _uncounted);
  appendList(update.json, sessions);
  update.json += "],\"records\":[";
  for (const Held* record : records) {
    if (record != records.front()) update.json += ',';
    update.json += record->json;
  }
  update.json += "]}";
  return update;
}

bool PageModel::waitForMore(const PagePosition& position, std::chrono::milliseconds patience) const {
  std::unique_lock lock(_mutex);
  const auto hasMore = [&] {
    return position.station != _station || _lastNumber > position.number ||
           _sessions.revision() > position.revision;
  };
  _changed.wait_for(lock, patience, [&] { return _isStopped || hasMore(); });
  return !_isStopped && hasMore();
}

bool PageModel::rest(std::chrono::milliseconds time) const {
  std::unique_lock lock(_mutex);
  _changed.wait_for(lock, time, [this] { return _isStopped; });
  return !_isStopped;
}

}  // namespace tallyd::station
