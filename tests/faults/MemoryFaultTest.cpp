// Memory that runs out: the daemon drops what it has none for, and serves everybody else.

#include <gtest/gtest.h>
#include <sys/resource.h>

#include "faults/FaultFixture.h"

namespace tallyd::test {
namespace {

using MemoryFaultTest = FaultFixture;

/// Each message is taken as far as the memory goes: one costs its sender the connection while it is read,
/// another is dropped when its document is to be made, and the smallest is posted.
TEST_F(MemoryFaultTest, OutlivesMessagesForWhichThereIsNoMemory) {
  std::size_t usual = 0;
  {
    TestDaemon daemon(root);
    expectServed(daemon);
    usual = figuresOf(daemon.process().pid()).addressBytes;
  }
  constexpr std::size_t kMebibyte = std::size_t{1} << 20U;
  TestDaemon daemon(root, {.limits = {{RLIMIT_AS, usual + 100 * kMebibyte}}});
  const auto bystander = startedSession(daemon, sessionInfo(5));
  std::size_t hungUp = 0;
  for (const std::size_t mebibytes : {60, 40, 28, 20, 14, 10, 2}) {
    const auto session = startedSession(daemon, sessionInfo(7));
    const auto reply =
        session->sendMessageSync(kMethod, 0, Dictionary{{"text", std::string(mebibytes * kMebibyte, 'x')}});
    hungUp += reply.error ? 1 : 0;
  }
  EXPECT_GT(hungUp, 0U) << "there was memory for everything";
  EXPECT_LT(hungUp, 7U) << "there was memory for nothing";
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
