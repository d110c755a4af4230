// What most of the station's parts need around them in a test.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "fakes/FakeClock.h"
#include "fakes/TemporaryFolder.h"
#include "platform/JSON.h"
#include "platform/Value.h"
#include "station/Feed.h"
#include "station/Files.h"
#include "station/Journal.h"
#include "station/TerminalView.h"

namespace tallyd::station {

class StationFixture : public testing::Test {
 protected:
  /// The records of a file of JSON lines; none when there is no file.
  static std::vector<platform::Dictionary> recordsIn(const std::filesystem::path& file) {
    std::vector<platform::Dictionary> records;
    if (!std::filesystem::exists(file)) return records;
    std::istringstream lines(readFile(file));
    for (std::string line; std::getline(lines, line);) {
      const auto value = platform::valueFromJSON(line).value;
      EXPECT_TRUE(value && value->dictionary()) << line;
      if (value && value->dictionary()) records.push_back(*value->dictionary());
    }
    return records;
  }
  /// The records of the feed, a line each.
  [[nodiscard]] std::string published() const {
    std::string lines;
    for (const Feed::Entry& entry : feed.since(0)) lines += *entry.record + "\n";
    return lines;
  }

  fakes::TemporaryFolder folder;
  fakes::FakeClock clock;
  std::ostringstream output;
  std::ostringstream problems;
  TerminalView view{output, problems, TerminalView::Records::Readable};
  Feed feed{100};
};

}  // namespace tallyd::station
