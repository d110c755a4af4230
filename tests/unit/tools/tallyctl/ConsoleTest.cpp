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

TEST_F(ConsoleTest, TellsInTheFormThatIsAskedFor) {
  const platform::Dictionary object{{"ok", true}, {"text", "a\n\"b\""}};
  Console(_out, _err, Console::Progress::Hidden).tell("line", object);
  Console(_out, _err, Console::Progress::Hidden, OutputForm::JSON).tell("line", object);
  EXPECT_EQ(_out.str(), "line\n{\"ok\":true,\"text\":\"a\\n\\\"b\\\"\"}\n");
}

TEST_F(ConsoleTest, ShowsHowLongSomethingTakes) {
  Console console(_out, _err, Console::Progress::Shown);
  console.showElapsed("uploading a.log, 1.0 KiB", std::chrono::milliseconds(12'300));
  console.clearProgress();
  EXPECT_EQ(_err.str(), "uploading a.log, 1.0 KiB, 12 s\r\x1B[K");
  EXPECT_EQ(_out.str(), "");
}

}  // namespace
}  // namespace tallyd::tallyctl
