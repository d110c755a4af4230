// The log as lines of syslog(3).
#pragma once

#include <string>

#include "platform/Log.h"

namespace tallyd::platform {

/// Hands each line to the C library's syslog, which sends it to /dev/log with the process ID. There is one
/// such connection in a process, so there should be one object of this class.
class SyslogLog final : public Log {
 public:
  using Send = void (*)(int priority, std::string_view message);

  explicit SyslogLog(LogLevel highestLevel);
  SyslogLog(LogLevel highestLevel, Send send) : Log(highestLevel), _send(send) {}
  ~SyslogLog() override;

  void open(std::string_view identity, std::string_view facility) override;
  void close() override;
  void write(LogLevel level, std::string_view message) override;

 private:
  Send _send;
  std::string _identity;  ///< The C library keeps a pointer into it until close().
};

}  // namespace tallyd::platform
