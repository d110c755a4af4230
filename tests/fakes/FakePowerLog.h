// A power log that keeps its events for the test to read.
#pragma once

#include <mutex>
#include <ostream>
#include <string>
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
    _events.push_back({number, std::string(name), record});
  }

  [[nodiscard]] std::vector<Event> events() const {
    const std::lock_guard lock(_mutex);
    return _events;
  }

 private:
  mutable std::mutex _mutex;
  std::vector<Event> _events;
};

inline std::ostream& operator<<(std::ostream& out, const FakePowerLog::Event& event) {
  return out << event.number << " " << event.name << " " << platform::Value(event.record).description();
}

}  // namespace tallyd::fakes
