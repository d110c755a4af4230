// The clock of the real daemon is set while it runs.

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include "faults/FaultFixture.h"
#include "faults/ShiftedTime.h"

namespace tallyd::test {
namespace {

using std::chrono::hours;

class ClockSetTest : public FaultFixture {
 protected:
  static constexpr hours kTwoDays{48};
  static constexpr int kMessages = 3;

  /// Each storebag comes over a connection of its own, on which the server has to prove itself.
  ClockSetTest() {
    ServedResponse response = storebags.signedBag(
        Dictionary{{"version", "1.0"}, {"release", storebagWithHTTPSPost()}}, "max-age=600");
    response.headers.emplace_back("Connection", "close");
    storebags.serveWith("playhall", [response](const ReceivedRequest&) { return response; });
  }

  /// The paths of the message log's files; with one log there is one.
  [[nodiscard]] std::vector<std::filesystem::path> messageLogFiles() const {
    std::vector<std::filesystem::path> files;
    for (const auto& entry :
         std::filesystem::directory_iterator(root.under("/var/mobile/Library/Logs/CrashReporter/Retired"))) {
      files.push_back(entry.path());
    }
    return files;
  }
  /// Waits for so many posts in all. What came since the first `known` ones was told the time between `from`
  /// and now: in the document itself, and, but for the shift to the session's minute, in its events.
  void expectPostsSince(std::size_t known, std::size_t count, std::int64_t from) const {
    ASSERT_TRUE(collector.waitForRequests(known + count));
    const auto documents = receivedDocuments(collector);
    ASSERT_EQ(documents.size(), known + count);
    const auto start = static_cast<double>(from);
    const auto end = static_cast<double>(time.now() + 1);
    constexpr double kMinute = 60;
    for (std::size_t i = known; i < documents.size(); ++i) {
      const double postTime = std::stod(std::string(*documents[i].string("postTime")));
      EXPECT_GE(postTime, start);
      EXPECT_LE(postTime, end);
      for (const Value& event : *documents[i].array("events")) {
        const double eventTime = std::stod(std::string(*event.dictionary()->string("_clientTS")));
        EXPECT_GE(eventTime, start - kMinute);
        EXPECT_LE(eventTime, end);
      }
    }
  }
  std::size_t fetches() { return storebags.http().requests().size(); }
  /// Everybody has left: nothing is missing, nothing failed.
  void expectAllSent(std::int64_t events) const {
    const Posts posts = settledPosts();
    EXPECT_EQ(posts.accepted, events);
    EXPECT_EQ(posts.sent, events);
    EXPECT_EQ(posts.refused, 0);
  }

  ShiftedTime time;
};

constexpr std::size_t kEventsOfTwoSessions = 2 + 2 * 3 + 2 + 3;

TEST_F(ClockSetTest, GoesOnWithTheNewTimeAfterTwoDaysForward) {
  TestDaemon daemon(root, {.environment = time.environment()});
  {
    const std::int64_t early = time.now();
    const auto session = startedSession(daemon, sessionInfo(7));
    sendMessages(*session, kMessages);
    expectPostsSince(0, 1 + kMessages, early);
    const auto oldFiles = messageLogFiles();
    ASSERT_EQ(oldFiles.size(), 1U);
    EXPECT_EQ(fetches(), 1U);

    time.advance(kTwoDays);
    const std::int64_t late = time.now();
    sendMessages(*session, kMessages);
    expectPostsSince(1 + kMessages, kMessages, late);
    // A file named by the new time is all there is. It is replaced once more with each line, as the kernel
    // dates it by its own clock, which is two days behind.
    const auto newFiles = messageLogFiles();
    ASSERT_EQ(newFiles.size(), 1U);
    EXPECT_NE(newFiles, oldFiles);
    const std::string name = newFiles.front().filename().string();
    EXPECT_GE(std::atoll(name.c_str() + name.find('_') + 1), late);
    EXPECT_EQ(root.messageLog().size(), 1U);

    const auto second = startedSession(daemon, sessionInfo(8));
    EXPECT_EQ(fetches(), 2U) << "the storebag is two days old";
    sendMessages(*second, kMessages);
    expectPostsSince(1 + 2 * kMessages, 1 + kMessages, late);
  }
  expectAllSent(kEventsOfTwoSessions);
  expectServed(daemon);
}

/// The certificates of the storebag server are good from the day before the test on.
TEST_F(ClockSetTest, GoesOnWithTheNewTimeAfterTwoDaysBackward) {
  TestDaemon daemon(root, {.environment = time.environment()});
  {
    const auto session = startedSession(daemon, sessionInfo(7));
    sendMessages(*session, kMessages);
    ASSERT_TRUE(collector.waitForRequests(1 + kMessages));
    const auto files = messageLogFiles();
    const std::size_t lines = root.messageLog().size();

    time.advance(-kTwoDays);
    const std::int64_t early = time.now();
    sendMessages(*session, kMessages);
    expectPostsSince(1 + kMessages, kMessages, early);
    EXPECT_EQ(messageLogFiles(), files) << "not a day old";
    EXPECT_EQ(root.messageLog().size(), lines + kMessages);

    // The old storebag serves while no server can be believed.
    const auto second = startedSession(daemon, sessionInfo(8));
    EXPECT_EQ(linesWith(daemon, "<2>sendSynchronousRequest error ", "certificate is not yet valid", 1), 1U);
    EXPECT_EQ(fetches(), 1U);
    sendMessages(*second, kMessages);
    expectPostsSince(1 + 2 * kMessages, 1 + kMessages, early);
  }
  expectAllSent(kEventsOfTwoSessions);

  time.advance(kTwoDays);
  expectServed(daemon);
  EXPECT_EQ(fetches(), 2U) << "the right time makes an attempt that failed two days ago an old one";
}

}  // namespace
}  // namespace tallyd::test
