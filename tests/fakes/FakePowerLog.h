// A power log that keeps its events for the test to read.
#pragma once

#include <mutex>
#include <ostream>
#include <string>
#include <system_error>
#include <vector>

#include "platform/PowerLog.h"

namespace tallyd::fakes {

class FakePowerLog : public platform::PowerLog {
 public:
  struct Event {
    std::int32_t number;
    std::string name;
    platform::Dictionary record;
    bool operator==(const Event&) const = default;
  };

  void WBLogRegisteredEvent(std::int32_t number, std::string_view name,
                            const platform::Dictionary& record) override {
    const std::lock_guard lock(_mutex);
    if (_isFull) throw std::system_error(std::make_error_code(std::errc::no_space_on_device));
    _events.push_back({number, std::string(name), record});
  }

  /// Whether it has no room for further events.
  void setFull(bool isFull) {
    const std::lock_guard lock(_mutex);
    _isFull = isFull;
  }
  [[nodiscard]] std::vector<Event> events() const {
    const std::lock_guard lock(_mutex);
    return _events;
  }

 private:
  mutable std::mutex _mutex;
  std::vector<Event> _events;
  bool _isFull = false;
};

inline std::ostream& operator<<(std::ostream& out, const FakePowerLog::Event& event) {
  return out << event.number << " " << event.name << " " << platform::Value(event.record).description();
}

}  // namespace tallyd::fakes
