// What the station shows while it runs.
#pragma once

#include <mutex>
#include <ostream>
#include <string_view>

namespace tallyd::station {

/// Lines of what was taken in and of notices to one stream, of problems to another; control characters become
/// question marks.
///
/// Threading: any thread; lines stay whole.
class TerminalView {
 public:
  enum class Records {
    Readable,
    JSON,  ///< The stream then carries nothing but records; notices go with the problems.
    Hidden
  };

  /// Borrows the streams.
  TerminalView(std::ostream& output, std::ostream& problems, Records records)
      : _output(output), _problems(problems), _records(records) {}

  /// @param readable  One line or more, for people.
  /// @param record    The same as it is kept: a JSON object in one line, without the line feed.
  void showRecord(std::string_view readable, std::string_view record);
  /// A line for people only.
  void showAside(std::string_view line);
  void showNotice(std::string_view line);
  void showProblem(std::string_view line);

 private:
  void writeLine(std::ostream& stream, std::string_view line);

  std::ostream& _output;
  std::ostream& _problems;
  const Records _records;
  std::mutex _mutex;
};

}  // namespace tallyd::station
