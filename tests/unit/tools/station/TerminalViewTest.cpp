#include "station/TerminalView.h"

#include <gtest/gtest.h>

#include <sstream>

namespace tallyd::station {

namespace {

struct Streams {
  std::ostringstream output;
  std::ostringstream problems;
};

}  // namespace

TEST(TerminalViewTest, ReplacesWhatATerminalWouldObey) {
  Streams streams;
  TerminalView view(streams.output, streams.problems, TerminalView::Records::Readable);
  view.showNotice("a\x1b[31mb\x7f\nc");
  view.showRecord("first\n  second\r", "{}");
  EXPECT_EQ(streams.output.str(), "a?[31mb??c\nfirst\n  second?\n");
}

TEST(TerminalViewTest, KeepsTheOutputPureInJSON) {
  Streams streams;
  TerminalView view(streams.output, streams.problems, TerminalView::Records::JSON);
  view.showNotice("listening");
  view.showRecord("readable", "{}");
  view.showAside("lost");
  view.showProblem("oh");
  EXPECT_EQ(streams.output.str(), "{}\n");
  EXPECT_EQ(streams.problems.str(), "listening\ntally-station: oh\n");
}

TEST(TerminalViewTest, HidesRecordsWhenAskedTo) {
  Streams streams;
  TerminalView view(streams.output, streams.problems, TerminalView::Records::Hidden);
  view.showNotice("listening");
  view.showRecord("readable", "{}");
  view.showAside("lost");
  EXPECT_EQ(streams.output.str(), "listening\n");
}

}  // namespace tallyd::station
