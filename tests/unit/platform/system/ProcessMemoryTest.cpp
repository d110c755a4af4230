#include "platform/system/ProcessMemory.h"

#include <gtest/gtest.h>

#include <fstream>
#include <string>

namespace tallyd::platform {
namespace {

const char kWritten[] = "constant";
std::string written = "variable";

/// Resident kibibytes of files' pages (proc(5): RssFile).
long residentFileKibibytes() {
  std::ifstream status("/proc/self/status");
  for (std::string field; status >> field;) {
    long kibibytes = -1;
    if (field == "RssFile:" && status >> kibibytes) return kibibytes;
  }
  return -1;
}

TEST(ProcessMemoryTest, GivesBackFilePagesAndLeavesEverythingUsable) {
  written += " and changed";
  const long before = residentFileKibibytes();
  releaseStartPages();
  EXPECT_LT(residentFileKibibytes(), before);
  EXPECT_STREQ(kWritten, "constant");
  EXPECT_EQ(written, "variable and changed");
  EXPECT_THROW(throw std::string("still unwinds"), std::string);
}

TEST(ProcessMemoryTest, StillGivesLargePiecesOfMemory) {
  keepFreedMemory();
  const std::string large(3'000'000, 'x');
  EXPECT_EQ(large.back(), 'x');
}

}  // namespace
}  // namespace tallyd::platform
