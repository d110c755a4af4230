#include "station/TerminalView.h"

#include <gtest/gtest.h>

#include <sstream>

namespace tallyd::station {

using platform::Dictionary;
using platform::Value;

namespace {

const Dictionary kEvent{{"_sender", "PH"}, {"_sessionID", "42"},  {"_method", "7"},
                        {"_status", "2"},  {"_eventNumber", "3"}, {"_osVersion", "12"},
                        {"count", 5},      {"name", "two words"}, {"eventTime", "1772366401.250"}};

struct Streams {
  std::ostringstream output;
  std::ostringstream problems;
};

}  // namespace

TEST(TerminalViewTest, ShowsTheFieldsOfAnEventInOneLine) {
  EXPECT_EQ(readableEvent(kEvent),
            "2026-03-01 12:00:01.250  PH  session 42  method 7  status 2  #3  count=5 name=\"two words\"");
}

TEST(TerminalViewTest, ShowsWhatIsMissingOrOddAsItIs) {
  EXPECT_EQ(readableEvent(Dictionary{}), "-  -  session -  method -  status -  #-");
  EXPECT_EQ(
      readableEvent(Dictionary{{"eventTime", "soon"}, {"list", platform::Array{Value(1), Value(true)}}}),
      "soon  -  session -  method -  status -  #-  list=\"[1,true]\"");
  EXPECT_EQ(readableEvent(Dictionary{{"eventTime", "1e300"}}), "1e300  -  session -  method -  status -  #-");
}

TEST(TerminalViewTest, EscapesWhatATerminalWouldObey) {
  const std::string line = readableEvent(Dictionary{{"key\x1b[2J", "value\n\x1b[31m"}});
  EXPECT_EQ(line.find('\x1b'), std::string::npos);
  EXPECT_EQ(line.find('\n'), std::string::npos);
  Streams streams;
  TerminalView(streams.output, streams.problems, TerminalView::Events::Readable).showNotice("a\x1b[31mb\x7f");
  EXPECT_EQ(streams.output.str(), "a?[31mb?\n");
}

TEST(TerminalViewTest, KeepsTheOutputPureInJSON) {
  Streams streams;
  TerminalView view(streams.output, streams.problems, TerminalView::Events::JSON);
  view.showNotice("listening");
  view.showEvent(kEvent, "{}");
  view.showProblem("oh");
  EXPECT_EQ(streams.output.str(), "{}\n");
  EXPECT_EQ(streams.problems.str(), "listening\ntally-station: oh\n");
}

TEST(TerminalViewTest, HidesEventsWhenAskedTo) {
  Streams streams;
  TerminalView view(streams.output, streams.problems, TerminalView::Events::Hidden);
  view.showNotice("listening");
  view.showEvent(kEvent, "{}");
  EXPECT_EQ(streams.output.str(), "listening\n");
}

}  // namespace tallyd::station
