// What the world outside the daemon got, and what it saw going wrong.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

namespace tallyd::replay {

enum class Channel { Post, Datagram, PowerLog, Adaptor };

/// Counted by the world's clients and servers, without a look at the daemon's books.
struct Received {
  // What clients offered.
  std::uint64_t messagesOffered = 0;
  std::uint64_t uploadsOffered = 0;  ///< Files and log data.
  // Events in posts, by what became of the post.
  std::uint64_t posts = 0;            ///< Handed over; their further attempts are no posts of their own.
  std::uint64_t furtherAttempts = 0;  ///< Of posts that failed.
  std::uint64_t eventsSaved = 0;      ///< Of those taken: by a further attempt.
  std::uint64_t postsUnderWay = 0;    ///< Some have no events.
  std::uint64_t eventsUnderWay = 0;
  std::uint64_t eventsTaken = 0;
  std::uint64_t eventsRefused = 0;
  std::uint64_t eventsFailed = 0;
  std::uint64_t eventsWithoutRoom = 0;
  std::uint64_t eventsWithdrawn = 0;  ///< Their post failed, and consent had gone before it was tried again.
  // Requests that a session waits for.
  std::uint64_t fetches = 0;
  std::uint64_t fetchesFailed = 0;
  std::uint64_t fatalAnswers = 0;  ///< Of those: they end a daemon that is not resilient.
  std::uint64_t uploads = 0;       ///< Answered, with whatever status; so below.
  std::uint64_t uploadsRefused = 0;
  std::uint64_t uploadsFailed = 0;
  std::uint64_t logData = 0;
  std::uint64_t logDataRefused = 0;
  std::uint64_t logDataFailed = 0;
  // Datagrams.
  std::uint64_t plainDatagrams = 0;     ///< Sent once and forgotten.
  std::uint64_t reliableDatagrams = 0;  ///< Each counted once.
  std::uint64_t retransmissions = 0;
  std::uint64_t pushedOut = 0;            ///< Of a full queue, by newer ones.
  std::uint64_t acknowledged = 0;         ///< Whose first acknowledgement the daemon read.
  std::uint64_t surelyAcknowledged = 0;   ///< Of those: in time.
  std::uint64_t perhapsAcknowledged = 0;  ///< Of those: at the instant at which the datagram is given up.
  std::uint64_t openSockets = 0;
  // What never leaves the device.
  std::uint64_t powerRecords = 0;
  std::uint64_t adaptorMessages = 0;
  std::uint64_t adaptorThrows = 0;
  std::uint64_t adaptors = 0;  ///< Instances that exist.

  /// How often each message arrived, by the serial number in its payload.
  std::map<std::pair<Channel, std::int64_t>, int> arrivals;
};

/// What must not happen and did, with the simulated time.
class Violations {
 public:
  static constexpr std::size_t kMostKept = 20;

  void add(const std::string& time, const std::string& text) {
    ++_count;
    if (_kept.size() < kMostKept) _kept.push_back(time + " " + text);
  }
  [[nodiscard]] std::size_t count() const { return _count; }
  [[nodiscard]] const std::vector<std::string>& kept() const { return _kept; }

 private:
  std::size_t _count = 0;
  std::vector<std::string> _kept;
};

}  // namespace tallyd::replay
