// Everything that a simulated day did, line by line.
#pragma once

#include <fmt/format.h>

#include <cstddef>
#include <string>
#include <string_view>

#include "fakes/FakeQueues.h"
#include "platform/Log.h"

namespace tallyd::replay {

/// Lines "HH:MM:SS.mmm KIND TEXT" in simulated time.
///
/// Two things of the real machine are left out, as no two runs share them: addresses of objects, and the
/// folder that the day's files are in. Threading: the simulation's thread.
class Trace {
 public:
  /// Borrows the queues, whose time it is.
  explicit Trace(const fakes::FakeQueues& queues) : _queues(queues) {}

  void setRoot(std::string root) { _root = std::move(root); }
  void write(std::string_view kind, std::string_view text);
  template <class... Arguments>
  void write(std::string_view kind, fmt::format_string<Arguments...> format,
             Arguments&&... arguments) requires(sizeof...(Arguments) > 0) {
    write(kind, std::string_view(fmt::format(format, std::forward<Arguments>(arguments)...)));
  }

  [[nodiscard]] const std::string& text() const { return _text; }
  [[nodiscard]] std::size_t lines() const { return _lines; }
  /// "HH:MM:SS.mmm" of now.
  [[nodiscard]] std::string time() const;

 private:
  const fakes::FakeQueues& _queues;
  std::string _root;
  std::string _text;
  std::size_t _lines = 0;
};

/// The daemon's log, as lines of the trace.
class TraceLog : public platform::Log {
 public:
  explicit TraceLog(Trace& trace) : Log(platform::LogLevel::Debug), _trace(trace) {}

  void open(std::string_view, std::string_view) override {}
  void close() override {}
  void write(platform::LogLevel level, std::string_view message) override {
    _trace.write("log", "<{}>{}", static_cast<int>(level), message);
  }

 private:
  Trace& _trace;
};

}  // namespace tallyd::replay
