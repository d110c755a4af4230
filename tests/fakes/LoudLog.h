// A log that also writes to standard error, where a test of how the process ends can read it.
#pragma once

#include <cstdio>

#include "fakes/FakeLog.h"

namespace tallyd::fakes {

class LoudLog : public FakeLog {
 public:
  void write(platform::LogLevel level, std::string_view message) override {
    FakeLog::write(level, message);
    std::fprintf(stderr, "<%d>%.*s\n", static_cast<int>(level), static_cast<int>(message.size()),
                 message.data());
  }
};

}  // namespace tallyd::fakes
