#include "station/DatagramReceiver.h"

#include <gmock/gmock.h>

#include "backends/dashboard/Datagram.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"
#include "unit/tools/station/StationFixture.h"

namespace tallyd::station {

using testing::HasSubstr;

class DatagramReceiverTest : public StationFixture {
 protected:
  static std::string datagram(std::uint16_t eventID) {
    const DatagramFacts facts{.sessionID = 42, .eventID = eventID, .reliableUDP = true, .usingProfile = true};
    return std::string(tallyd::Datagram(facts, platform::Dictionary{}).bytes());
  }

  Journal journal{folder.path() / "datagrams.jsonl", Feed::Kind::Datagram, view, feed};
  test::LoopbackDashboard sender;
};

TEST_F(DatagramReceiverTest, AnswersOverTheNetwork) {
  DatagramReceiver receiver(0, {.delay = std::chrono::milliseconds(1)}, clock, journal, view);
  for (const std::uint16_t eventID : {std::uint16_t{7}, std::uint16_t{8}}) {
    sender.send(datagram(eventID), static_cast<std::uint16_t>(receiver.port()));
    const auto answer = sender.waitForDatagram();
    ASSERT_TRUE(answer);
    EXPECT_EQ(acknowledgedEventID(*answer), eventID);
  }
  EXPECT_EQ(receiver.totals().acknowledgements, 2U);
}

TEST_F(DatagramReceiverTest, EndsWhileDatagramsAreHeld) {
  {
    DatagramReceiver receiver(0, {.delay = std::chrono::minutes(1)}, clock, journal, view);
    sender.send(datagram(7), static_cast<std::uint16_t>(receiver.port()));
  }
  EXPECT_FALSE(std::filesystem::exists(journal.file()));
}

TEST_F(DatagramReceiverTest, NamesTheAddressThatIsTaken) {
  try {
    const DatagramReceiver receiver(sender.port(), {}, clock, journal, view);
    FAIL() << "two receivers on one port";
  } catch (const std::exception& exception) {
    EXPECT_THAT(exception.what(), HasSubstr("127.0.0.1:" + std::to_string(sender.port())));
  }
}

}  // namespace tallyd::station
