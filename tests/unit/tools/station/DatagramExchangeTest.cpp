#include "station/DatagramExchange.h"

#include <arpa/inet.h>
#include <gmock/gmock.h>

#include "backends/dashboard/Datagram.h"
#include "station/Limits.h"
#include "unit/tools/station/StationFixture.h"

namespace tallyd::station {

using platform::Dictionary;
using std::chrono::milliseconds;
using testing::HasSubstr;

class DatagramExchangeTest : public StationFixture {
 protected:
  using TimePoint = DatagramExchange::TimePoint;
  static constexpr TimePoint kStart{};

  static Packet packet(std::uint16_t eventID, bool isReliable = true, std::uint16_t port = 4000) {
    const DatagramFacts facts{.compType = 5,
                              .timestamp = {1'772'366'401, 250'000},
                              .sessionID = 42,
                              .method = 7,
                              .respCode = 2,
                              .udid = "device",
                              .eventID = eventID,
                              .reliableUDP = isReliable,
                              .usingProfile = true};
    Packet packet{std::string(tallyd::Datagram(facts, Dictionary{{"note", "hello"}}).bytes()), {}};
    packet.peer.sin_family = AF_INET;
    packet.peer.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    packet.peer.sin_port = htons(port);
    return packet;
  }
  static Share all() { return Share::ofPercentage("100").value(); }
  DatagramExchange exchange(const BadNetwork& network = {}) { return {network, clock, journal, view}; }

  const std::filesystem::path file = folder.path() / "datagrams.jsonl";
  Journal journal{file, Feed::Kind::Datagram, view, feed};
};

TEST_F(DatagramExchangeTest, KeepsShowsPublishesAndAcknowledges) {
  auto desk = exchange();
  desk.arrive(packet(3), kStart);
  const auto answers = desk.advance(kStart);
  ASSERT_EQ(answers.size(), 1U);
  EXPECT_EQ(acknowledgedEventID(answers[0].bytes), 3);
  EXPECT_EQ(ntohs(answers[0].peer.sin_port), 4000);
  EXPECT_EQ(
      output.str(),
      "2026-03-01 12:00:01.248  PH  session 42  method 7  status 2  #3  note=hello  [datagram, reliable]\n");
  const auto records = recordsIn(file);
  ASSERT_EQ(records.size(), 1U);
  EXPECT_EQ(records[0].real("time"), 1'768'478'400.0);
  EXPECT_EQ(records[0].string("from"), "127.0.0.1:4000");
  EXPECT_EQ(records[0].integer("session"), 42);
  EXPECT_EQ(records[0].integer("method"), 7);
  EXPECT_EQ(records[0].integer("status"), 2);
  EXPECT_EQ(records[0].integer("eventNumber"), 3);
  EXPECT_EQ(records[0].string("device"), "device");
  EXPECT_EQ(records[0].string("sender"), "PH");
  ASSERT_NE(records[0].dictionary("fields"), nullptr);
  EXPECT_EQ(*records[0].dictionary("fields"), (Dictionary{{"note", "hello"}}));
  EXPECT_TRUE(records[0].boolean("reliable"));
  EXPECT_FALSE(records[0].boolean("retransmission"));
  EXPECT_FALSE(records[0].boolean("duplicate"));
  EXPECT_EQ(published(), readFile(file));
}

TEST_F(DatagramExchangeTest, AnswersNothingThatAsksForNothing) {
  auto desk = exchange();
  desk.arrive(packet(3, false), kStart);
  EXPECT_TRUE(desk.advance(kStart).empty());
  EXPECT_EQ(desk.totals().delivered, 1U);
  EXPECT_EQ(desk.totals().acknowledgements, 0U);
}

TEST_F(DatagramExchangeTest, TellsWhatCameBefore) {
  auto desk = exchange();
  desk.arrive(packet(3), kStart);
  desk.arrive(packet(3), kStart);
  desk.arrive(packet(4), kStart);
  desk.arrive(packet(3, true, 4001), kStart);  // Another session of the same number.
  EXPECT_EQ(desk.advance(kStart).size(), 4U);  // A duplicate's sender missed the first answer.
  const auto totals = desk.totals();
  EXPECT_EQ(totals.received, 4U);
  EXPECT_EQ(totals.retransmissions, 1U);
  EXPECT_EQ(totals.delivered, 4U);
  EXPECT_EQ(totals.duplicates, 1U);
  EXPECT_EQ(totals.distinct(), 3U);
  const auto records = recordsIn(file);
  ASSERT_EQ(records.size(), 4U);
  EXPECT_TRUE(records[1].boolean("retransmission"));
  EXPECT_TRUE(records[1].boolean("duplicate"));
  EXPECT_FALSE(records[3].boolean("duplicate"));
  EXPECT_THAT(output.str(), HasSubstr("[datagram, reliable, retransmission, duplicate]\n"));
}

TEST_F(DatagramExchangeTest, LosesDatagrams) {
  auto desk = exchange({.lose = all()});
  desk.arrive(packet(3), kStart);
  EXPECT_TRUE(desk.advance(kStart).empty());
  EXPECT_EQ(desk.totals().received, 1U);
  EXPECT_EQ(desk.totals().lost, 1U);
  EXPECT_EQ(desk.totals().delivered, 0U);
  EXPECT_FALSE(std::filesystem::exists(file));
  EXPECT_THAT(output.str(), HasSubstr("#3  note=hello  [datagram, lost on purpose]\n"));
}

TEST_F(DatagramExchangeTest, LosesAcknowledgements) {
  auto desk = exchange({.loseAcks = all()});
  desk.arrive(packet(3), kStart);
  EXPECT_TRUE(desk.advance(kStart).empty());
  EXPECT_EQ(desk.totals().delivered, 1U);
  EXPECT_EQ(desk.totals().acknowledgements, 1U);
  EXPECT_EQ(desk.totals().acknowledgementsLost, 1U);
}

TEST_F(DatagramExchangeTest, DelaysBothWays) {
  auto desk = exchange({.delay = milliseconds(40)});
  EXPECT_EQ(desk.nextDue(), std::nullopt);
  desk.arrive(packet(3), kStart);
  EXPECT_EQ(desk.nextDue(), kStart + milliseconds(40));
  EXPECT_TRUE(desk.advance(kStart + milliseconds(39)).empty());
  EXPECT_EQ(desk.totals().delivered, 0U);
  EXPECT_TRUE(desk.advance(kStart + milliseconds(40)).empty());
  EXPECT_EQ(desk.totals().delivered, 1U);
  EXPECT_EQ(desk.nextDue(), kStart + milliseconds(80));
  EXPECT_EQ(desk.advance(kStart + milliseconds(80)).size(), 1U);
  EXPECT_EQ(desk.nextDue(), std::nullopt);
}

TEST_F(DatagramExchangeTest, DoublesBothWays) {
  auto desk = exchange({.duplicate = all()});
  desk.arrive(packet(3), kStart);
  EXPECT_EQ(desk.advance(kStart).size(), 4U);
  EXPECT_EQ(desk.totals().delivered, 2U);
  EXPECT_EQ(desk.totals().distinct(), 1U);
  const auto records = recordsIn(file);
  ASSERT_EQ(records.size(), 2U);
  EXPECT_TRUE(records[1].boolean("duplicate"));
  EXPECT_FALSE(records[1].boolean("retransmission"));
}

TEST_F(DatagramExchangeTest, RefusesWhatIsNoDatagram) {
  auto desk = exchange();
  Packet broken = packet(3);
  broken.bytes.pop_back();
  desk.arrive(broken, kStart);
  EXPECT_TRUE(desk.advance(kStart).empty());
  EXPECT_EQ(desk.totals().refused, 1U);
  EXPECT_THAT(problems.str(), HasSubstr("refused a datagram from 127.0.0.1:4000: "));
}

TEST_F(DatagramExchangeTest, AcknowledgesNothingThatItCannotKeep) {
  Journal homeless(folder.path() / "missing" / "datagrams.jsonl", Feed::Kind::Datagram, view, feed);
  DatagramExchange desk({}, clock, homeless, view);
  desk.arrive(packet(3), kStart);
  EXPECT_TRUE(desk.advance(kStart).empty());
  EXPECT_EQ(desk.totals().delivered, 0U);
  EXPECT_THAT(problems.str(), HasSubstr((folder.path() / "missing").string()));
}

TEST_F(DatagramExchangeTest, CountsInOneLine) {
  auto desk = exchange();
  desk.arrive(packet(3), kStart);
  desk.arrive(packet(3), kStart);
  (void)desk.advance(kStart);
  EXPECT_EQ(
      readableTotals(desk.totals()),
      "datagrams: 2 received, 0 refused, 1 retransmissions, 0 lost on purpose, 2 delivered, 1 duplicates, "
      "1 distinct events; acknowledgements: 2 made, 0 lost on purpose");
}

TEST(DatagramHistoryTest, CountsArrivalsAndDeliveries) {
  DatagramHistory history(2);
  EXPECT_EQ(history.noteArrival("a"), 0U);
  EXPECT_EQ(history.noteArrival("a"), 1U);
  EXPECT_EQ(history.deliveries("a"), 0U);
  history.noteDelivery("a");
  EXPECT_EQ(history.deliveries("a"), 1U);
}

TEST(DatagramHistoryTest, ForgetsTheOldest) {
  DatagramHistory history(2);
  for (const char* identity : {"a", "b", "c"}) EXPECT_EQ(history.noteArrival(identity), 0U);
  EXPECT_EQ(history.noteArrival("b"), 1U);
  EXPECT_EQ(history.noteArrival("a"), 0U);
  EXPECT_EQ(history.noteArrival("b"), 0U);
}

}  // namespace tallyd::station
