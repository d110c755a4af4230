#include "station/LossyPath.h"

#include "station/Limits.h"

namespace tallyd::station {

bool LossyPath::put(Packet packet, TimePoint now) {
  const LossModel::Fate fate = _model.next();
  if (fate.isLost || _held.size() >= kMaximumHeldPackets) {
    ++_lost;
    return false;
  }
  const TimePoint due = now + _delay;
  if (fate.isReordered) {
    if (fate.isDuplicated) hold(packet, due);
    _reordered.emplace_back(due + kReorderPatience, _nextOrder);
    hold(std::move(packet), due + kReorderPatience);
    return true;
  }
  if (fate.isDuplicated) hold(packet, due);
  hold(std::move(packet), due);
  letReorderedFollow(due);
  return true;
}

void LossyPath::letReorderedFollow(TimePoint due) {
  for (const Place& place : std::exchange(_reordered, {})) {
    auto node = _held.extract(place);
    if (node.empty()) continue;  // Its patience was over.
    node.key() = {due, _nextOrder++};
    _held.insert(std::move(node));
  }
}

std::vector<Packet> LossyPath::take(TimePoint now) {
  std::vector<Packet> due;
  while (!_held.empty() && _held.begin()->first.first <= now) {
    due.push_back(std::move(_held.begin()->second));
    _held.erase(_held.begin());
  }
  if (_held.empty()) _reordered.clear();
  return due;
}

std::optional<LossyPath::TimePoint> LossyPath::nextDue() const {
  if (_held.empty()) return std::nullopt;
  return _held.begin()->first.first;
}

}  // namespace tallyd::station
