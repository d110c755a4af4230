#include "platform/Log.h"

#include <iterator>
#include <new>

namespace tallyd::platform {

void writeLogLine(Log& log, LogLevel level, fmt::string_view format, fmt::format_args arguments) {
  try {
    fmt::memory_buffer line;
    fmt::vformat_to(std::back_inserter(line), format, arguments);
    log.write(level, std::string_view(line.data(), line.size()));
  } catch (const std::bad_alloc&) {
    return;  // What is logged must not fail for the log's sake.
  }
}

}  // namespace tallyd::platform
