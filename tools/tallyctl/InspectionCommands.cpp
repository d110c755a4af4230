// The commands that look into the daemon.
#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>

#include <array>
#include <cerrno>
#include <system_error>

#include "framework/TallyInspection.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatsReport.h"
#include "tallyctl/TapText.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

using platform::Array;
using platform::FileDescriptor;
using platform::Value;

namespace {

constexpr int kPollMs = 100;  ///< How long a signal may wait to be noticed.

void printStats(const platform::Dictionary& stats, const StatsReport& report, Console& console) {
  if (console.isJSON()) {
    platform::Dictionary object = stats;
    object.set("ok", report.imbalances.empty());
    if (!report.imbalances.empty()) object.set("error", "the books do not balance");
    object.set("imbalances", Array(std::vector<Value>(report.imbalances.begin(), report.imbalances.end())));
    return console.printObject(object);
  }
  for (const auto& line : report.lines) console.print(line);
  for (const auto& imbalance : report.imbalances) console.print("does not balance: " + imbalance);
  if (report.imbalances.empty()) console.print("balance: exact");
}

struct Pipe {
  FileDescriptor reading;
  FileDescriptor writing;
};

Pipe makePipe() {
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
    throw std::system_error(errno, std::generic_category(), "cannot make a pipe");
  }
  return {FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

/// Prints the lines that come out of the pipe.
class TapReader {
 public:
  TapReader(FileDescriptor pipe, Console& console) : _pipe(std::move(pipe)), _console(console) {}

  /// Waits a little for lines; false at the end of the pipe.
  bool readSome() {
    pollfd readable{.fd = _pipe.get(), .events = POLLIN, .revents = 0};
    if (::poll(&readable, 1, kPollMs) <= 0) return true;
    const ssize_t length = ::read(_pipe.get(), _buffer.data(), _buffer.size());
    if (length < 0) return errno == EINTR;
    _text.append(_buffer.data(), static_cast<std::size_t>(length));
    printLines();
    return length > 0;
  }

 private:
  void printLines() {
    std::size_t start = 0;
    for (auto end = _text.find('\n'); end != std::string::npos; end = _text.find('\n', start)) {
      const auto line = std::string_view(_text).substr(start, end - start);
      _console.print(_console.isJSON() ? line : tapText(line));
      start = end + 1;
    }
    _text.erase(0, start);
  }

  const FileDescriptor _pipe;
  Console& _console;
  std::array<char, 65'536> _buffer{};
  std::string _text;  ///< The beginning of a line.
};

}  // namespace

int runCommand(const ConnectionOptions& connection, const StatsOptions&, const Surroundings&,
               Console& console) {
  TallyInspection inspection(connection.inspectionSocket, connection.timeout);
  const auto reply = inspection.statsSync();
  if (reply.error) throw Failure(fmt::format("{}: {}", connection.inspectionSocket.string(), *reply.error));
  const StatsReport report = reportOf(reply.stats);
  printStats(reply.stats, report, console);
  return report.imbalances.empty() ? kSucceeded : kFailed;
}

int runCommand(const ConnectionOptions& connection, const TapOptions&, const Surroundings& surroundings,
               Console& console) {
  const auto pacer = surroundings.makePacer();
  const std::string socket = connection.inspectionSocket.string();
  TallyInspection inspection(connection.inspectionSocket, connection.timeout);
  Pipe pipe = makePipe();
  if (const auto error = inspection.tapSync(std::move(pipe.writing))) {
    throw Failure(fmt::format("{}: {}", socket, *error));
  }
  console.note("listening at " + socket);
  TapReader reader(std::move(pipe.reading), console);
  while (pacer->waitUntil(pacer->now())) {
    if (!reader.readSome()) throw Failure(socket + ": the daemon closed the connection");
    if (console.failed()) return kFailed;
  }
  if (console.isJSON()) console.printObject({{"ok", true}});
  return kSucceeded;
}

}  // namespace tallyd::tallyctl
