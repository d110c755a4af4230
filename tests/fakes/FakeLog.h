// A log that keeps its lines for the test to read.
#pragma once

#include <algorithm>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Log.h"

namespace tallyd::fakes {

class FakeLog : public platform::Log {
 public:
  struct Line {
    platform::LogLevel level;
    std::string text;
    bool operator==(const Line&) const = default;
  };

  explicit FakeLog(platform::LogLevel highest = platform::LogLevel::Debug) : Log(highest) {}

  void open(std::string_view identity, std::string_view facility) override {
    const std::lock_guard lock(_mutex);
    _opened = std::string(identity) + "/" + std::string(facility);
  }
  void close() override {}
  void write(platform::LogLevel level, std::string_view message) override {
    const std::lock_guard lock(_mutex);
    _lines.push_back({level, std::string(message)});
  }

  [[nodiscard]] std::vector<Line> lines() const {
    const std::lock_guard lock(_mutex);
    return _lines;
  }
  [[nodiscard]] std::string opened() const {
    const std::lock_guard lock(_mutex);
    return _opened;
  }
  [[nodiscard]] bool has(platform::LogLevel level, std::string_view text) const {
    return count(level, text) > 0;
  }
  [[nodiscard]] std::size_t count(platform::LogLevel level, std::string_view text) const {
    const auto all = lines();
    return static_cast<std::size_t>(std::count_if(
        all.begin(), all.end(), [&](const Line& line) { return line.level == level && line.text == text; }));
  }
  [[nodiscard]] bool hasTextStartingWith(platform::LogLevel level, std::string_view start) const {
    const auto all = lines();
    return std::any_of(all.begin(), all.end(),
                       [&](const Line& line) { return line.level == level && line.text.starts_with(start); });
  }
  void clear() {
    const std::lock_guard lock(_mutex);
    _lines.clear();
  }

 private:
  mutable std::mutex _mutex;
  std::string _opened;
  std::vector<Line> _lines;
};

inline std::ostream& operator<<(std::ostream& out, const FakeLog::Line& line) {
  return out << "<" << static_cast<int>(line.level) << ">" << line.text;
}

}  // namespace tallyd::fakes
