#include "station/LogDataReceiver.h"

#include <gmock/gmock.h>

#include "platform/property-list/KeyedArchive.h"
#include "station/Limits.h"
#include "unit/tools/station/Gzipped.h"
#include "unit/tools/station/StationFixture.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using testing::HasSubstr;

class LogDataReceiverTest : public StationFixture {
 protected:
  const std::filesystem::path file = folder.path() / "logdata.jsonl";
  Journal journal{file, Feed::Kind::LogData, view, feed};
  const Array logData{"line", Dictionary{{"k", true}}};
  const std::string archive = platform::archivedDataWithRootObject(logData).value();
};

TEST_F(LogDataReceiverTest, KeepsShowsAndPublishesLogData) {
  LogDataReceiver receiver(clock, journal, view);
  const Answer answer = receiver.receive(archive);
  EXPECT_EQ(answer.status, 200);
  EXPECT_EQ(answer.body, file.string() + ":1");
  const auto records = recordsIn(file);
  ASSERT_EQ(records.size(), 1U);
  EXPECT_EQ(records[0].real("time"), 1'768'478'400.0);
  EXPECT_EQ(records[0].string("location"), answer.body);
  EXPECT_EQ(records[0].integer("bytes"), static_cast<std::int64_t>(archive.size()));
  ASSERT_NE(records[0].array("logData"), nullptr);
  EXPECT_EQ(*records[0].array("logData"), logData);
  EXPECT_EQ(published(), readFile(file));
  EXPECT_THAT(output.str(), HasSubstr("\n  [0] \"line\"\n  [1] {\"k\":true}\n"));
  EXPECT_EQ(receiver.totals().archives, 1U);
}

TEST_F(LogDataReceiverTest, TakesACompressedArchive) {
  LogDataReceiver receiver(clock, journal, view);
  EXPECT_EQ(receiver.receive(gzipped(archive)).status, 200);
  EXPECT_EQ(receiver.receive(gzipped(archive).substr(0, 20)).status, 400);
  EXPECT_EQ(receiver.totals().archives, 1U);
  EXPECT_EQ(receiver.totals().refused, 1U);
}

TEST_F(LogDataReceiverTest, NumbersLocationsFromOneRunToTheNext) {
  { EXPECT_EQ(LogDataReceiver(clock, journal, view).receive(archive).status, 200); }
  EXPECT_EQ(LogDataReceiver(clock, journal, view).receive(archive).body, file.string() + ":2");
}

TEST_F(LogDataReceiverTest, RefusesWhatIsNoArchive) {
  LogDataReceiver receiver(clock, journal, view);
  const Answer answer = receiver.receive("junk {");
  EXPECT_EQ(answer.status, 400);
  EXPECT_THAT(answer.body, HasSubstr("not a property list"));
  EXPECT_THAT(problems.str(), HasSubstr("refused log data: "));
  EXPECT_FALSE(std::filesystem::exists(file));
}

TEST_F(LogDataReceiverTest, RefusesLogDataThatItCannotKeep) {
  const std::filesystem::path missing = folder.path() / "missing" / "logdata.jsonl";
  Journal homeless(missing, Feed::Kind::LogData, view, feed);
  LogDataReceiver receiver(clock, homeless, view);
  const Answer answer = receiver.receive(archive);
  EXPECT_EQ(answer.status, 500);
  EXPECT_THAT(answer.body, HasSubstr(missing.string()));
  EXPECT_EQ(receiver.totals().archives, 0U);
}

TEST_F(LogDataReceiverTest, ShowsTheBeginningOfMuchLogData) {
  Array many;
  for (std::size_t i = 0; i < kShownElements + 3; ++i) many.append(std::string(10'000, 'x'));
  const std::string lines = readableElements(many);
  EXPECT_THAT(lines, HasSubstr("…\n  … 3 more"));
  EXPECT_LT(lines.size(), (kShownElements + 1) * (kShownElementBytes + 20));
  EXPECT_EQ(readableElements(Value(5)), "\n  [0] 5");
}

}  // namespace tallyd::station
