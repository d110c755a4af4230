// The sessions that reported to the station, in sums.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

#include "station/EventNumbers.h"
#include "station/PageRecord.h"

namespace tallyd::station {

/// Sums up records by session. Sessions are told apart by their own ID, the last part of a combined one:
/// datagrams and uploads carry no other.
///
/// Holds kMaximumSessions; the one that was silent for longest makes room, and is new when it reports again.
///
/// Threading: one thread.
class SessionsModel {
 public:
  static constexpr std::size_t kMaximumSessions = 500;
  /// Different senders, clients or devices of one session that are named.
  static constexpr std::size_t kMaximumNames = 3;
  static constexpr std::size_t kShownGaps = 8;

  /// @param now  Seconds since 1970.
  void take(const PageRecord& record, double now);

  /// Grows with every change.
  [[nodiscard]] std::uint64_t revision() const { return _revision; }
  /// Sessions that changed after that revision, one JSON object each: {"session", "parent", "senders",
  /// "clients", "devices", "first", "last" (seconds since 1970), "events": {"received", "distinct",
  /// "repeated", "missing", "gaps"}, "datagrams": the same and "lost", "retried", "uploads", "uploadBytes",
  /// "logData"}.
  [[nodiscard]] std::vector<std::string> changedSince(std::uint64_t revision) const;

 private:
  using Names = std::set<std::string>;

  struct Delivery {
    EventNumbers numbers;
    std::uint64_t received = 0;
    std::uint64_t lost = 0;
    std::uint64_t retried = 0;
  };

  struct Session {
    std::uint64_t revision = 0;
    std::string parent;
    std::string started;
    Names senders;
    Names clients;
    Names devices;
    double first = 0;
    double last = 0;
    Delivery events;
    Delivery datagrams;
    std::uint64_t uploads = 0;
    std::uint64_t uploadBytes = 0;
    std::uint64_t logData = 0;
  };

  void makeRoom();
  static void count(Delivery& delivery, const PageRecord& record);
  static std::string jsonOf(const std::string& id, const Session& session);

  std::map<std::string, Session> _sessions;
  std::uint64_t _revision = 0;
};

}  // namespace tallyd::station
