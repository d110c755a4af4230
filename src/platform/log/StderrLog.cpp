#include "platform/log/StderrLog.h"

#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <iterator>

#include "platform/log/SyslogFacility.h"

namespace tallyd::platform {
namespace {

using namespace std::string_view_literals;

constexpr std::string_view kColourEnd = "\x1b[0m";

// Select Graphic Rendition sequences (ECMA-48, section 8.3.117).
std::string_view colour(LogLevel level) {
  if (level <= LogLevel::Critical) return "\x1b[1;31m";  // Bold red.
  if (level == LogLevel::Error) return "\x1b[31m";
  if (level == LogLevel::Warning) return "\x1b[33m";
  if (level >= LogLevel::Debug) return "\x1b[2m";  // Faint.
  return "";
}

// What a client sent must not steer the terminal of who reads the log.
bool isControl(char c) { return (static_cast<unsigned char>(c) < 0x20 && c != '\t') || c == 0x7F; }

}  // namespace

StderrLog::StderrLog(LogLevel highestLevel, const Clock& clock, int descriptor,
                     std::chrono::milliseconds patience)
    : Log(highestLevel),
      _clock(clock),
      _descriptor(descriptor),
      _patience(patience),
      _terminal(::isatty(descriptor)) {}

void StderrLog::open(std::string_view identity, std::string_view /*facility*/) {
  _identity = identity;
  struct sigaction action {};
  if (::sigaction(SIGPIPE, nullptr, &action) == 0 && action.sa_handler == SIG_DFL)
    std::signal(SIGPIPE, SIG_IGN);
}

void StderrLog::write(LogLevel level, std::string_view message) {
  fmt::memory_buffer output;
  std::string_view rest = withoutFinalLineFeed(message);
  while (true) {
    const std::size_t end = std::min(rest.find('\n'), rest.size());
    const std::string_view line = rest.substr(0, end);
    appendPrefix(output, level);
    if (_terminal) {
      std::replace_copy_if(line.begin(), line.end(), std::back_inserter(output), isControl, '?');
      output.append(kColourEnd);
    } else {
      output.append(line);
    }
    output.push_back('\n');
    if (end == rest.size()) break;
    rest.remove_prefix(end + 1);
  }
  writeAll({output.data(), output.size()});
}

void StderrLog::appendPrefix(fmt::memory_buffer& line, LogLevel level) const {
  if (!_terminal) {
    fmt::format_to(std::back_inserter(line), "<{}>", static_cast<int>(level));
    return;
  }
  const timeval now = _clock.timeOfDay();
  std::tm local{};
  ::localtime_r(&now.tv_sec, &local);
  fmt::format_to(std::back_inserter(line), "{}{:02}:{:02}:{:02}.{:03} {}: ", colour(level), local.tm_hour,
                 local.tm_min, local.tm_sec, now.tv_usec / 1000, _identity);
}

void StderrLog::writeAll(std::string_view bytes) {
  const std::lock_guard lock(_mutex);
  std::string whole;
  if (_cutLine) bytes = whole.append("\n"sv).append(bytes);
  const std::size_t size = bytes.size();
  while (!bytes.empty()) {
    const ssize_t written = ::write(_descriptor, bytes.data(), bytes.size());
    if (written >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(written));
    } else if (errno == EAGAIN ? !waitForRoom() : errno != EINTR) {
      break;
    }
  }
  if (bytes.size() < size) _cutLine = !bytes.empty();
}

bool StderrLog::waitForRoom() const {
  pollfd room{_descriptor, POLLOUT, 0};
  return ::poll(&room, 1, static_cast<int>(_patience.count())) > 0;
}

}  // namespace tallyd::platform
