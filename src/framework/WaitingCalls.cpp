#include "framework/WaitingCalls.h"

#include <algorithm>

namespace tallyd {

void WaitingCalls::add(ServiceCall call) {
  _deadlines.emplace(call.deadline, ++_lastNumber);
  _calls.emplace(_lastNumber, std::move(call));
}

ServiceCall WaitingCalls::take(std::map<Number, ServiceCall>::iterator place) {
  auto node = _calls.extract(place);
  _deadlines.erase({node.mapped().deadline, node.key()});
  return std::move(node.mapped());
}

std::optional<ServiceCall> WaitingCalls::takeFirst() {
  if (_calls.empty()) return std::nullopt;
  return take(_calls.begin());
}

std::vector<ServiceCall> WaitingCalls::takeExpired(SteadyTime now) {
  std::vector<Number> numbers;
  for (const auto& [deadline, number] : _deadlines) {
    if (deadline > now) break;
    numbers.push_back(number);
  }
  std::sort(numbers.begin(), numbers.end());
  std::vector<ServiceCall> expired;
  for (const Number number : numbers) expired.push_back(take(_calls.find(number)));
  return expired;
}

std::vector<ServiceCall> WaitingCalls::takeAll() {
  std::vector<ServiceCall> calls;
  for (auto& [number, call] : std::exchange(_calls, {})) calls.push_back(std::move(call));
  _deadlines.clear();
  return calls;
}

std::optional<SteadyTime> WaitingCalls::earliestDeadline() const {
  if (_deadlines.empty()) return std::nullopt;
  return _deadlines.begin()->first;
}

}  // namespace tallyd
