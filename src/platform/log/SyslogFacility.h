// Facilities of the system log, and the shape of its lines.
#pragma once

#include <string_view>

namespace tallyd::platform {

/// The facility's code as openlog(3) takes it, by its name in any case ("Daemon" is LOG_DAEMON); LOG_USER,
/// which is syslog's own default, for a name that is none.
[[nodiscard]] int syslogFacility(std::string_view name);

/// The number that stands for the facility in messages (RFC 5424, section 6.2.1), such as 3 for LOG_DAEMON.
[[nodiscard]] constexpr int facilityNumber(int facility) { return facility >> 3; }

/// `message` without the one line feed that may end it.
[[nodiscard]] constexpr std::string_view withoutFinalLineFeed(std::string_view message) {
  if (message.ends_with('\n')) message.remove_suffix(1);
  return message;
}

}  // namespace tallyd::platform
