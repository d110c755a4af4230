// The log as entries of the systemd journal.
#pragma once

#include <sys/uio.h>

#include <string>

#include "platform/Log.h"

namespace tallyd::platform {

/// Sends each line as one journal entry with the fields MESSAGE, PRIORITY, SYSLOG_IDENTIFIER and
/// SYSLOG_FACILITY (systemd.journal-fields(7)). A line that the journal does not take is lost.
class JournalLog final : public Log {
 public:
  using Send = int (*)(const iovec* fields, int count);  ///< As sd_journal_sendv(3).

  explicit JournalLog(LogLevel highestLevel);
  JournalLog(LogLevel highestLevel, Send send) : Log(highestLevel), _send(send) {}

  void open(std::string_view identity, std::string_view facility) override;
  void close() override {}
  void write(LogLevel level, std::string_view message) override;

 private:
  Send _send;
  std::string _identifierField;
  std::string _facilityField;
};

}  // namespace tallyd::platform
