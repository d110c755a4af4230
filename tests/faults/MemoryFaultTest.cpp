// Memory that runs out: the daemon drops what it has none for, and serves everybody else.

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <cerrno>
#include <cstring>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

class MemoryFaultTest : public FaultFixture {
 protected:
  /// Leaves a process so many bytes of address space beside those that it has.
  static void limitMemory(pid_t process, std::size_t bytes) {
    const rlim_t all = figuresOf(process).addressBytes + bytes;
    const rlimit limit{all, all};
    ASSERT_EQ(::prlimit(process, RLIMIT_AS, &limit, nullptr), 0) << std::strerror(errno);
  }
};

/// Each message is taken as far as the memory goes: one costs its sender the connection while it is read,
/// another is dropped when its document is to be made, and the smallest is posted.
TEST_F(MemoryFaultTest, OutlivesMessagesForWhichThereIsNoMemory) {
  constexpr std::size_t kMebibyte = std::size_t{1} << 20U;
  TestDaemon daemon(root);
  const auto bystander = startedSession(daemon, sessionInfo(5));
  limitMemory(daemon.process().pid(), 100 * kMebibyte);
  std::size_t hungUp = 0;
  std::size_t sent = 0;
  // In small steps: whether another thread's heap has taken its share of the room is not known.
  for (const std::size_t mebibytes : {60, 50, 42, 36, 30, 26, 22, 19, 16, 14, 12, 10, 8, 2}) {
    ++sent;
    const auto session = startedSession(daemon, sessionInfo(7));
    const auto reply =
        session->sendMessageSync(kMethod, 0, Dictionary{{"text", std::string(mebibytes * kMebibyte, 'x')}});
    hungUp += reply.error ? 1 : 0;
  }
  EXPECT_GT(hungUp, 0U) << "there was memory for everything";
  EXPECT_LT(hungUp, sent) << "there was memory for nothing";
  sendMessages(*bystander, 3);
  expectServed(daemon);
  TallyInspection inspection(inspectionSocket());
  const Dictionary stats = statsWhen(inspection, [](const Dictionary& now) {
    return number(rowOf(*now.dictionary("total"), "splunk"), "inFlight") == 0;
  });
  EXPECT_GT(postsIn(stats).sent, 0);
  const Dictionary row = rowOf(*stats.dictionary("total"), "splunk");
  EXPECT_GT(row.dictionary("dropped")->integer("out-of-memory").value_or(0), 0) << Value(row).description();
}

}  // namespace
}  // namespace tallyd::test
