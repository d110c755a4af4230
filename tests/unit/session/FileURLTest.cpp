#include "session/FileURL.h"

#include <gtest/gtest.h>

namespace tallyd {
namespace {

TEST(FileURLTest, GivesThePathOfAFileURL) {
  EXPECT_EQ(pathOfFileURL("file:///tmp/a.log"), "/tmp/a.log");
  EXPECT_EQ(pathOfFileURL("file:/tmp/a.log"), "/tmp/a.log");
  EXPECT_EQ(pathOfFileURL("file://localhost/tmp/a.log"), "/tmp/a.log");
  EXPECT_EQ(pathOfFileURL("file:///"), "/");
  EXPECT_EQ(pathOfFileURL("FILE:///tmp/a.log"), "/tmp/a.log");
}

TEST(FileURLTest, UndoesEscapes) {
  EXPECT_EQ(pathOfFileURL("file:///tmp/a%20b%2Fc%25.log"), "/tmp/a b/c%.log");
  EXPECT_EQ(pathOfFileURL("file:///tmp/%C3%A4"), "/tmp/\xC3\xA4");
  EXPECT_EQ(pathOfFileURL("file:///tmp/%3F%23"), "/tmp/?#");
}

TEST(FileURLTest, LeavesWhatIsNoEscape) {
  EXPECT_EQ(pathOfFileURL("file:///100%"), "/100%");
  EXPECT_EQ(pathOfFileURL("file:///a%2"), "/a%2");
  EXPECT_EQ(pathOfFileURL("file:///a%zz"), "/a%zz");
  EXPECT_EQ(pathOfFileURL("file:///a%-1"), "/a%-1");
  EXPECT_EQ(pathOfFileURL("file:///a%00b"), "/a%00b");
}

TEST(FileURLTest, CutsQueryAndFragment) {
  EXPECT_EQ(pathOfFileURL("file:///tmp/a?b=c"), "/tmp/a");
  EXPECT_EQ(pathOfFileURL("file:///tmp/a#b"), "/tmp/a");
}

TEST(FileURLTest, AURLWithoutPathHasAnEmptyOne) {
  EXPECT_EQ(pathOfFileURL("file:"), "");
  EXPECT_EQ(pathOfFileURL("file://"), "");
  EXPECT_EQ(pathOfFileURL("file://host"), "");
}

TEST(FileURLTest, TakesATextThatIsNoURLAsThePathItself) {
  EXPECT_EQ(pathOfFileURL("/tmp/a%20b?c#d"), "/tmp/a%20b?c#d");
  EXPECT_EQ(pathOfFileURL(""), "");
}

}  // namespace
}  // namespace tallyd
