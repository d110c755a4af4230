// What the station's web page shows, kept up to date.
#pragma once

#include <array>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

#include "platform/Clock.h"
#include "station/Feed.h"
#include "station/PageRecord.h"
#include "station/SessionsModel.h"

namespace tallyd::station {

/// How far a page has come: what the model held when it last got something.
struct PagePosition {
  std::string station;  ///< Differs from one station to the next, whose numbers begin anew.
  std::uint64_t number = 0;
  std::uint64_t revision = 0;
};

/// "STATION.NUMBER.REVISION"; nothing for any other text.
[[nodiscard]] std::optional<PagePosition> pagePositionFrom(std::string_view text);
[[nodiscard]] std::string textOfPosition(const PagePosition& position);

/// What is new after a position.
struct PageUpdate {
  PagePosition position;  ///< Where the next update goes on.
  /// {"position", "reset" (forget what came before), "uncounted" (records that the feed dropped before they
  /// were read), "sessions", "records"} in one line.
  std::string json;
};

/// Follows a feed: sums up its sessions and holds its latest records of each kind, as many as given.
///
/// Threading: any thread; a thread of its own follows the feed.
class PageModel {
 public:
  static constexpr std::size_t kRecordsPerUpdate = 500;

  /// Borrows both.
  PageModel(Feed& feed, const platform::Clock& clock, std::size_t recordsPerKind);
  /// Closes the feed.
  ~PageModel();
  PageModel(const PageModel&) = delete;
  PageModel& operator=(const PageModel&) = delete;

  /// Everything that is new since a position, the oldest records first, but no more than kRecordsPerUpdate
  /// of them; of a position that is not this station's, everything, with "reset".
  [[nodiscard]] PageUpdate updateSince(const PagePosition& position) const;
  /// Everything there is.
  [[nodiscard]] std::string snapshot() const;

  /// Waits until there is something after the position; false when `patience` is over, or the model
  /// stopped, without it.
  [[nodiscard]] bool waitForMore(const PagePosition& position, std::chrono::milliseconds patience) const;
  /// Lets a while pass; false when the model stopped.
  [[nodiscard]] bool rest(std::chrono::milliseconds time) const;

  /// Ends the following, closes the feed and wakes all that wait; from now on nobody waits.
  void stop();

 private:
  struct Held {
    std::uint64_t number;
    std::string json;
  };

  void follow();
  void take(const Feed::Entry& entry);
  [[nodiscard]] PageUpdate makeUpdate(const PagePosition& position, std::size_t mostRecords) const;

  Feed& _feed;
  const platform::Clock& _clock;
  const std::size_t _recordsPerKind;
  const std::string _station;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  SessionsModel _sessions;
  std::array<std::deque<Held>, Feed::kKinds> _records;
  std::uint64_t _lastNumber = 0;
  std::uint64_t _uncounted = 0;
  bool _isStopped = false;
  std::thread _follower;  ///< Last: it uses the others.
};

}  // namespace tallyd::station
