// What a storebag's entry may say, well-formed and not.

#include <climits>

#include "DashboardFixture.h"

namespace tallyd {
namespace {

using platform::Data;
using platform::Date;
using platform::Value;

class DashboardProfileTest : public DashboardFixture {
 protected:
  using IDs = std::vector<std::uint16_t>;

  Dictionary profileWith(std::string_view key, Value value) const {
    Dictionary entry = profile();
    entry.set(key, std::move(value));
    return entry;
  }
  Dictionary profileWithout(std::string_view key) const {
    Dictionary entry = profile();
    entry.remove(key);
    return entry;
  }
  void expectRefused(const TallyBackend::Payload& entry, const char* line) {
    fake.log.clear();
    EXPECT_EQ(made(entry), nullptr) << line;
    EXPECT_EQ(fake.log.lines(), (Lines{{Level::Error, line}}));
    EXPECT_EQ(openDescriptors(), descriptors);
    EXPECT_EQ(fake.queues.armedTimers(), 0U);
  }
  /// Expects that the second tick comes after twice this time, and no sooner.
  void expectPeriod(const Value& reliable, Milliseconds period) {
    const auto backend = made(profileWith("reliable", reliable));
    ASSERT_NE(backend, nullptr);
    send(*backend, 1);
    fake.queues.run();
    EXPECT_EQ(receivedEventIDs(), IDs{1});
    fake.queues.advance(2 * period - Milliseconds(1));
    EXPECT_EQ(receivedEventIDs(), IDs{}) << reliable.description();
    fake.queues.advance(Milliseconds(1));
    EXPECT_EQ(receivedEventIDs(), IDs{1}) << reliable.description();
    fake.queues.advance(20 * period);  // The datagram is given up.
    receivedEventIDs();
  }

  static constexpr const char* kNoIP = "Tally(DashboardBackend): can't resolve server IP";
  static constexpr const char* kNoPort = "Tally(DashboardBackend): can't resolve server port";
  static constexpr const char* kConnectFailed =
      "Tally (DashboardBackend): initWitName socket connect failed.";
};

TEST_F(DashboardProfileTest, HoldsTheDisplayURL) {
  EXPECT_EQ(made(profile({{"display_url", "https://show.example"}}))->displayURL(), "https://show.example");
  EXPECT_EQ(made(profile())->displayURL(), std::nullopt);
  EXPECT_EQ(made(profile({{"display_url", 5}}))->displayURL(), std::nullopt);
}

TEST_F(DashboardProfileTest, MustHoldAnAddress) {
  expectRefused(Dictionary(), kNoIP);
  expectRefused(profileWithout("ip"), kNoIP);
  for (const Value& ip :
       {Value(5), Value(Array{"127.0.0.1"}), Value(Dictionary()), Value(Data("127.0.0.1"))}) {
    expectRefused(profileWith("ip", ip), kNoIP);
  }
}

TEST_F(DashboardProfileTest, MustHoldAPort) {
  expectRefused(profileWithout("port"), kNoPort);
  for (const Value& port :
       {Value(Array{5}), Value(Dictionary()), Value(Data("5")), Value(Date{5}), Value()}) {
    expectRefused(profileWith("port", port), kNoPort);
  }
}

TEST_F(DashboardProfileTest, TakesAPortOfAnyKindThatReadsAsANumber) {
  const auto port = static_cast<std::int64_t>(server.port());
  for (const Value& one : {Value(port), Value(std::to_string(port)), Value(static_cast<double>(port) + 0.5),
                           Value(port + 65'536), Value(port - 65'536)}) {
    const auto backend = made(profileWith("port", one));
    ASSERT_NE(backend, nullptr) << one.description();
    send(*backend, 3);
    fake.queues.run();
    EXPECT_EQ(receivedEventIDs(), IDs{3}) << one.description();
  }
}

TEST_F(DashboardProfileTest, GoesOnWithAPortThatNobodyListensOn) {
  for (const Value& one : {Value(0), Value("no number"), Value(true), Value(false), Value(-1)}) {
    const auto backend = made(profileWith("port", one));
    ASSERT_NE(backend, nullptr) << one.description();
    for (std::uint16_t event = 0; event < 60; ++event) send(*backend, event);
    fake.queues.advance(Seconds(100));
    backend->cleanup();
    fake.queues.advance(Seconds(20));
    EXPECT_EQ(openDescriptors(), descriptors) << one.description();
  }
  EXPECT_EQ(receivedEventIDs(), IDs{});
}

TEST_F(DashboardProfileTest, RefusesWhatIsNoAddress) {
  for (const char* ip : {"", "localhost", "127.0.0.256", "1.2.3.4.5", "::1", "collect.example", "127.0.0.1x",
                         "255.255.255.255", "-1"}) {
    expectRefused(profileWith("ip", ip), kConnectFailed);
  }
}

TEST_F(DashboardProfileTest, RefusesItAlsoWithReliableDelivery) {
  Dictionary entry = profileWith("ip", "nowhere");
  entry.set("reliable", 20);
  EXPECT_EQ(made(entry), nullptr);
  fake.queues.run();
  EXPECT_EQ(fake.log.lines(), (Lines{{Level::Error, kConnectFailed}}));
  EXPECT_EQ(openDescriptors(), descriptors);
}

TEST_F(DashboardProfileTest, ReadsAddressesAsTheSystemDoes) {
  // inet_addr(3): fewer parts, and parts in other bases.
  for (const char* ip : {"127.1", "127.0.1", "0x7f.0.0.1", "0177.0.0.1", "2130706433"}) {
    const auto backend = made(profileWith("ip", ip));
    ASSERT_NE(backend, nullptr) << ip;
    send(*backend, 3);
    fake.queues.run();
    EXPECT_EQ(receivedEventIDs(), IDs{3}) << ip;
  }
}

TEST_F(DashboardProfileTest, MayBeMissingWhenAServerIsGiven) {
  EXPECT_EQ(made(std::nullopt), nullptr);
  EXPECT_EQ(fake.log.lines(),
            (Lines{{Level::Error, "Tally (DashboardBackend): initWitName will all null params."}}));
  EXPECT_EQ(madeWithServer("nowhere", server.port()), nullptr);
  EXPECT_EQ(fake.log.count(Level::Error, kConnectFailed), 1U);
  fake.queues.run();
  EXPECT_EQ(openDescriptors(), descriptors);
  EXPECT_NE(madeWithServer("127.0.0.1", server.port()), nullptr);
}

TEST_F(DashboardProfileTest, SetsThePeriodOfReliableDelivery) {
  expectPeriod(20, Milliseconds(20));
  expectPeriod(1, Milliseconds(1));
  expectPeriod(12'345, Milliseconds(12'345));
  expectPeriod("30", Milliseconds(30));
  expectPeriod(2.9, Milliseconds(2));
  expectPeriod(true, Milliseconds(1));
}

TEST_F(DashboardProfileTest, KeepsTheDefaultPeriodForOneThatIsNone) {
  for (const Value& reliable : {Value(0), Value(-1), Value(-20'000), Value("soon"), Value(""), Value(false),
                                Value(0.9), Value(Array{20}), Value(Dictionary()), Value(Data("20"))}) {
    expectPeriod(reliable, Milliseconds(8000));
  }
}

TEST_F(DashboardProfileTest, ClampsAPeriodThatTimersCantHold) {
  for (const Value& reliable : {Value(std::int64_t{INT32_MAX} + 1), Value(INT64_MAX), Value(1e300)}) {
    expectPeriod(reliable, Milliseconds(INT32_MAX));
  }
}

TEST_F(DashboardProfileTest, AnExplicitServerKeepsTheDefaultPeriod) {
  const auto backend = madeWithServer("127.0.0.1", server.port());
  send(*backend, 1);
  fake.queues.advance(Milliseconds(15'999));
  EXPECT_EQ(receivedEventIDs(), IDs{1});
  fake.queues.advance(Milliseconds(1));
  EXPECT_EQ(receivedEventIDs(), IDs{1});
}

TEST_F(DashboardProfileTest, DrawsASamplingFactorOnlyOnceThereIsASocket) {
  fake.randomness.draws = {0.125, 0.25};
  EXPECT_EQ(made(profileWithout("ip")), nullptr);
  EXPECT_EQ(made(profile())->samplingFactor(), 0.125);
}

}  // namespace
}  // namespace tallyd
