#include "tallyctl/Console.h"

#include <gtest/gtest.h>

#include <sstream>

namespace tallyd::tallyctl {
namespace {

class ConsoleTest : public testing::Test {
 protected:
  std::ostringstream _out;
  std::ostringstream _err;
};

TEST_F(ConsoleTest, KeepsResultsAndComplaintsApart) {
  Console console(_out, _err, Console::Progress::Hidden);
  console.print("result");
  console.complain("f:1: wrong");
  console.note("none");
  EXPECT_EQ(_out.str(), "result\n");
  EXPECT_EQ(_err.str(), "tallyctl: f:1: wrong\nnone\n");
}

TEST_F(ConsoleTest, ErasesProgressBeforeALine) {
  Console console(_out, _err, Console::Progress::Shown);
  console.showProgress("1 messages");
  console.showProgress("2 messages");
  console.print("result");
  console.print("another");
  console.clearProgress();
  EXPECT_EQ(_err.str(), "1 messages\r\x1B[K2 messages\r\x1B[K");
}

TEST_F(ConsoleTest, ShowsNoProgressWhereNobodyLooks) {
  Console console(_out, _err, Console::Progress::Hidden);
  console.showProgress("1 messages");
  EXPECT_EQ(_err.str(), "");
}

TEST_F(ConsoleTest, NoticesThatItsOutputIsNotTaken) {
  Console console(_out, _err, Console::Progress::Hidden);
  EXPECT_FALSE(console.failed());
  _out.setstate(std::ios::badbit);
  console.print("lost");
  EXPECT_TRUE(console.failed());
}

}  // namespace
}  // namespace tallyd::tallyctl
