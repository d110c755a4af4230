#include "session/Guarded.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <thread>

namespace tallyd {
namespace {

TEST(GuardedTest, HoldsWhatWasSetLast) {
  Guarded<std::string> text("first");
  EXPECT_EQ(text.copy(), "first");
  text.set("second");
  EXPECT_EQ(text.copy(), "second");
  EXPECT_EQ(text.withLock([](const std::string& value) { return value.size(); }), 6U);
}

TEST(GuardedTest, TheOldValueEndsOutsideTheLock) {
  Guarded<std::shared_ptr<int>> guarded;
  std::shared_ptr<int> seen;
  // The deleter reaches through the lock: it would wait for itself if the lock were still held.
  guarded.set(std::shared_ptr<int>(new int(1), [&](int* number) {
    delete number;
    seen = guarded.copy();
  }));
  guarded.set(std::make_shared<int>(2));
  ASSERT_TRUE(seen);
  EXPECT_EQ(*seen, 2);
}

TEST(GuardedTest, ThreadsSeeWholeValues) {
  Guarded<std::string> text(std::string(100, 'a'));
  std::thread writer([&] {
    for (int i = 0; i < 1000; ++i) text.set(std::string(100, static_cast<char>('a' + i % 26)));
  });
  for (int i = 0; i < 1000; ++i) {
    const std::string seen = text.copy();
    ASSERT_EQ(seen, std::string(100, seen[0]));
  }
  writer.join();
}

}  // namespace
}  // namespace tallyd
