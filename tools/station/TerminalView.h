// What the station shows while it runs.
#pragma once

#include <mutex>
#include <ostream>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::station {

/// One event as a line of text: time (UTC), sender, session, method, status, number, then the payload's
/// fields. Whatever is not plain is quoted and escaped, so that no event can play tricks on the terminal.
[[nodiscard]] std::string readableEvent(const platform::Dictionary& event);

/// Lines of events and notices to one stream, of problems to another; control characters become question
/// marks.
///
/// Threading: any thread; lines stay whole.
class TerminalView {
 public:
  enum class Events {
    Readable,
    JSON,  ///< The stream then carries nothing but events; notices go with the problems.
    Hidden
  };

  /// Borrows the streams.
  TerminalView(std::ostream& output, std::ostream& problems, Events events)
      : _output(output), _problems(problems), _events(events) {}

  /// @param record  The event as it is kept: a JSON object in one line, without the line feed.
  void showEvent(const platform::Dictionary& event, std::string_view record);
  void showNotice(std::string_view line);
  void showProblem(std::string_view line);

 private:
  void writeLine(std::ostream& stream, std::string_view line);

  std::ostream& _output;
  std::ostream& _problems;
  const Events _events;
  std::mutex _mutex;
};

}  // namespace tallyd::station
