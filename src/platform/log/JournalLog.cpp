#include "platform/log/JournalLog.h"

#define SD_JOURNAL_SUPPRESS_LOCATION  // Every line would name the same place in this file.
#include <systemd/sd-journal.h>

#include <array>

#include "platform/log/SyslogFacility.h"

namespace tallyd::platform {
namespace {

template <class Characters>
iovec field(Characters& characters) {
  return {characters.data(), characters.size()};
}

}  // namespace

JournalLog::JournalLog(LogLevel highestLevel) : JournalLog(highestLevel, &::sd_journal_sendv) {}

void JournalLog::open(std::string_view identity, std::string_view facility) {
  _identifierField = fmt::format("SYSLOG_IDENTIFIER={}", identity);
  _facilityField = fmt::format("SYSLOG_FACILITY={}", facilityNumber(syslogFacility(facility)));
}

void JournalLog::write(LogLevel level, std::string_view message) {
  using namespace std::string_view_literals;
  fmt::memory_buffer text;
  text.append("MESSAGE="sv);
  text.append(withoutFinalLineFeed(message));
  fmt::memory_buffer priority;
  fmt::format_to(std::back_inserter(priority), "PRIORITY={}", static_cast<int>(level));

  const std::array fields{field(text), field(priority), field(_identifierField), field(_facilityField)};
  // Before open() the journal would refuse the empty fields, so they stay out.
  const int count = _identifierField.empty() ? 2 : static_cast<int>(fields.size());
  static_cast<void>(_send(fields.data(), count));
}

}  // namespace tallyd::platform
