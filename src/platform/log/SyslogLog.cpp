#include "platform/log/SyslogLog.h"

#include <syslog.h>

#include "platform/log/SyslogFacility.h"

namespace tallyd::platform {
namespace {

void sendToSyslog(int priority, std::string_view message) {
  ::syslog(priority, "%.*s", static_cast<int>(message.size()), message.data());
}

}  // namespace

SyslogLog::SyslogLog(LogLevel highestLevel) : SyslogLog(highestLevel, &sendToSyslog) {}

SyslogLog::~SyslogLog() { close(); }

void SyslogLog::open(std::string_view identity, std::string_view facility) {
  close();
  _identity = identity;
  ::openlog(_identity.c_str(), LOG_PID | LOG_NDELAY, syslogFacility(facility));
}

void SyslogLog::close() { ::closelog(); }

void SyslogLog::write(LogLevel level, std::string_view message) {
  _send(static_cast<int>(level), withoutFinalLineFeed(message));
}

}  // namespace tallyd::platform
