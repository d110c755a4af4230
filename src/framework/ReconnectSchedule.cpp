#include "framework/ReconnectSchedule.h"

#include <algorithm>

namespace tallyd {

ReconnectSchedule::ReconnectSchedule(const TallyConnectionOptions& options)
    : _first(std::max(options.firstPause, Milliseconds(1))),
      _maximum(std::max(options.maximumPause, _first)),
      _maximumAttempts(options.maximumAttempts),
      _pause(_first) {}

std::optional<ReconnectSchedule::Milliseconds> ReconnectSchedule::next(double draw) {
  if (_maximumAttempts && _attempts >= *_maximumAttempts) return std::nullopt;
  ++_attempts;
  const auto pause = _pause;
  _pause = _pause > _maximum / 2 ? _maximum : _pause * 2;
  const auto shortened = static_cast<double>(pause.count()) * (1.0 - draw / 2.0);
  return std::max(Milliseconds(static_cast<Milliseconds::rep>(shortened)), Milliseconds(1));
}

void ReconnectSchedule::reset() {
  _pause = _first;
  _attempts = 0;
}

}  // namespace tallyd
