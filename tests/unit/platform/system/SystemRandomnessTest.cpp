#include "platform/system/SystemRandomness.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <set>
#include <thread>
#include <vector>

namespace tallyd::platform {
namespace {

constexpr std::size_t kDraws = 200;

/// What drand48(3) itself gives in a process where nobody has called it.
std::vector<double> drawsOfAFreshProcess() {
  int ends[2];
  EXPECT_EQ(::pipe(ends), 0);
  const pid_t child = ::fork();
  if (child == 0) {
    double draws[kDraws];
    for (double& draw : draws) draw = ::drand48();
    const bool written = ::write(ends[1], draws, sizeof draws) == static_cast<ssize_t>(sizeof draws);
    ::_exit(written ? 0 : 1);
  }
  ::close(ends[1]);
  std::vector<double> draws(kDraws);
  EXPECT_EQ(::read(ends[0], draws.data(), kDraws * sizeof(double)),
            static_cast<ssize_t>(kDraws * sizeof(double)));
  ::close(ends[0]);
  int status = -1;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  return draws;
}

TEST(SystemRandomnessTest, DrawsTheSequenceOfAnUnseededProcess) {
  SystemRandomness randomness;
  std::vector<double> draws(kDraws);
  for (double& draw : draws) draw = randomness.drand48();
  EXPECT_EQ(draws, drawsOfAFreshProcess());
  EXPECT_EQ(draws[0], std::ldexp(11, -48)) << "the first step of the generator from state zero";
}

TEST(SystemRandomnessTest, SeedingTheCLibraryChangesNothing) {
  SystemRandomness randomness;
  ::srand48(4711);
  EXPECT_EQ(randomness.drand48(), std::ldexp(11, -48));
}

TEST(SystemRandomnessTest, ConcurrentDrawsLoseNoValue) {
  SystemRandomness expected;
  std::vector<double> all(4 * kDraws);
  for (double& draw : all) draw = expected.drand48();
  std::sort(all.begin(), all.end());

  SystemRandomness randomness;
  std::vector<double> drawn(4 * kDraws);
  std::vector<std::thread> threads;
  for (std::size_t t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      for (std::size_t i = 0; i < kDraws; ++i) drawn[t * kDraws + i] = randomness.drand48();
    });
  }
  for (auto& thread : threads) thread.join();
  std::sort(drawn.begin(), drawn.end());
  EXPECT_EQ(drawn, all);
}

TEST(SystemRandomnessTest, UUIDsAreOfVersionFourAndDiffer) {
  SystemRandomness randomness;
  std::set<UUIDBytes> seen;
  for (int i = 0; i < 1000; ++i) {
    const UUIDBytes uuid = randomness.uuid();
    EXPECT_EQ(uuid[6] >> 4, 4);
    EXPECT_EQ(uuid[8] >> 6, 2);
    seen.insert(uuid);
  }
  EXPECT_EQ(seen.size(), 1000U);
}

TEST(SystemRandomnessTest, EveryFreeBitOfAUUIDIsDrawn) {
  SystemRandomness randomness;
  UUIDBytes ones{};
  UUIDBytes zeros{};
  for (int i = 0; i < 200; ++i) {
    const UUIDBytes uuid = randomness.uuid();
    for (std::size_t b = 0; b < uuid.size(); ++b) {
      ones[b] = static_cast<std::uint8_t>(ones[b] | uuid[b]);
      zeros[b] = static_cast<std::uint8_t>(zeros[b] | ~uuid[b]);
    }
  }
  UUIDBytes all{};
  all.fill(0xFF);
  UUIDBytes everSet = all;
  everSet[6] = 0x4F;
  everSet[8] = 0xBF;
  UUIDBytes everClear = all;
  everClear[6] = 0xBF;
  everClear[8] = 0x7F;
  EXPECT_EQ(ones, everSet);
  EXPECT_EQ(zeros, everClear);
}

}  // namespace
}  // namespace tallyd::platform
