#include "platform/log/SyslogFacility.h"

#include <strings.h>

#include <string>

#define SYSLOG_NAMES  // Has the header define the table of names.
#include <syslog.h>

namespace tallyd::platform {

int syslogFacility(std::string_view name) {
  const std::string wanted(name);
  for (const CODE* facility = facilitynames; facility->c_name; ++facility) {
    if (::strcasecmp(facility->c_name, wanted.c_str()) == 0) return facility->c_val;
  }
  return LOG_USER;
}

}  // namespace tallyd::platform
