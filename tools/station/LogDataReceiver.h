// Takes archives of log data.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/Clock.h"
#include "platform/Value.h"
#include "station/Answer.h"
#include "station/Journal.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// Reads each archive and keeps what it holds as one record. The answer is its location, FILE:LINE, which the
/// daemon reports.
///
/// Threading: any thread; archives are kept one at a time.
class LogDataReceiver {
 public:
  struct Totals {
    std::uint64_t archives = 0;
    std::uint64_t refused = 0;
  };

  /// Borrows the others. Counts the lines of the journal's file; throws std::system_error that names it when
  /// it is there and can't be read.
  LogDataReceiver(const platform::Clock& clock, Journal& journal, TerminalView& view);

  /// Takes a request's body, which may be compressed with gzip whatever its headers said: 200 and the
  /// location; 400 for what is no archive, 413 for too large a one, 500 when it can't be kept.
  [[nodiscard]] Answer receive(std::string_view body);
  /// Counts and shows a request that was not taken; the answer to it.
  Answer refuse(int status, const std::string& problem);

  [[nodiscard]] Totals totals() const;

 private:
  [[nodiscard]] Answer keep(const platform::Value& logData, std::size_t archiveBytes);

  const platform::Clock& _clock;
  Journal& _journal;
  TerminalView& _view;
  mutable std::mutex _mutex;
  std::uint64_t _lines = 0;  ///< Of the file. Guarded by `_mutex`, like the totals.
  Totals _totals;
};

/// The elements of log data in a line each, or their beginning, with how many more there are.
[[nodiscard]] std::string readableElements(const platform::Value& logData);

}  // namespace tallyd::station
