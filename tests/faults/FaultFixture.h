// The real daemon among things that go wrong, its books, and a session that must notice nothing.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "integration/InspectionFixture.h"
#include "support/BusClient.h"
#include "support/ProcessFigures.h"

namespace tallyd::test {

/// A sanitizer's own memory, as a multiple of the program's.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
inline constexpr std::size_t kSanitizersShare = 10;
#else
inline constexpr std::size_t kSanitizersShare = 1;
#endif

/// A name that no resolver asks anybody about: a label has at most 63 octets (RFC 1035, section 2.3.4).
inline const std::string kUnresolvableHost = std::string(64, 'x') + ".example";

class FaultFixture : public InspectionFixture {
 protected:
  /// What the books say about the posts of all sessions, once nothing is under way any more.
  struct Posts {
    std::int64_t accepted = 0;
    std::int64_t sent = 0;
    std::int64_t refused = 0;
    std::int64_t failed = 0;  ///< Dropped as their post ended with an error.
  };

  static Posts postsIn(const Dictionary& stats) {
    const Dictionary row = rowOf(*stats.dictionary("total"), "splunk");
    if (row.empty()) return {};
    return {number(row, "accepted"), number(row, "sent"), number(row, "refused"),
            row.dictionary("dropped")->integer("post-failed").value_or(0)};
  }
  /// Waits for the end of all sessions and of what they sent. Books that don't balance fail the test.
  [[nodiscard]] Posts settledPosts() const {
    TallyInspection inspection(inspectionSocket());
    return postsIn(statsWhen(inspection, nothingUnderWay));
  }

  /// Each message is numbered and waits for its answer.
  static void sendMessages(TallyConnection& session, int count) {
    for (int i = 0; i < count; ++i) {
      EXPECT_EQ(session.sendMessageSync(kMethod, 0, Dictionary{{"number", i}}).error, std::nullopt);
    }
  }
  /// A whole session: a start record, `count` messages and a stop record.
  static void runSession(TestDaemon& daemon, std::uint32_t sessionID, int count) {
    const auto session = startedSession(daemon, sessionInfo(sessionID));
    sendMessages(*session, count);
  }
  static constexpr int kRecordsOfASession = 2;

  /// A session that posts to the fixture's own collector and whose every message arrives there.
  void expectServed(TestDaemon& daemon) {
    postTo(collector.url("/events"));
    const auto session = startedSession(daemon, sessionInfo(999));
    const int first = _nextProbe;
    for (; _nextProbe < first + kProbes; ++_nextProbe) {
      session->sendMessageSync(kProbeMethod, 0, Dictionary{{"probe", _nextProbe}});
    }
    std::size_t looked = 0;
    std::size_t arrived = 0;
    do {
      looked = collector.requests().size();
      arrived = probesFrom(first);
    } while (arrived < kProbes && collector.waitForRequests(looked + 1));
    EXPECT_EQ(arrived, kProbes);
  }

  /// How many of the daemon's lines start with `start` and hold `part`, once there are `awaited` of them or
  /// no more come: what it has written is read a little later.
  static std::size_t linesWith(TestDaemon& daemon, const std::string& start, const std::string& part,
                               std::size_t awaited) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    std::size_t found = 0;
    do {
      const auto lines = daemon.process().lines();
      found = static_cast<std::size_t>(std::count_if(lines.begin(), lines.end(), [&](const auto& line) {
        return line.starts_with(start) && line.find(part) != std::string::npos;
      }));
    } while (found < awaited && std::chrono::steady_clock::now() < deadline);
    return found;
  }

  static constexpr std::uint16_t kMethod = 4;

 private:
  static constexpr int kProbes = 3;
  static constexpr std::uint16_t kProbeMethod = 77;

  /// How many of the probes from this number on have come to the collector.
  std::size_t probesFrom(int first) {
    std::set<std::int64_t> numbers;
    for (const Dictionary& event : receivedEvents(collector)) {
      const bool isProbe = event.string("_method") == std::to_string(kProbeMethod);
      if (isProbe && *event.integer("probe") >= first) numbers.insert(*event.integer("probe"));
    }
    return numbers.size();
  }

  int _nextProbe = 0;
};

/// A response as bytes.
[[nodiscard]] inline std::string httpText(const ServedResponse& response) {
  std::string text = "HTTP/1.1 " + std::to_string(response.status) + " Status\r\n";
  for (const auto& [name, value] : response.headers) text += name + ": " + value + "\r\n";
  return text + "Content-Length: " + std::to_string(response.body.size()) + "\r\n\r\n" + response.body;
}

}  // namespace tallyd::test
