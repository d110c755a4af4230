#include "backends/dashboard/MessageQueue.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <set>
#include <string>
#include <vector>

namespace tallyd {
namespace {

UDPPacketToSend packet(std::string_view bytes, std::uint16_t event, int state = PacketStateWaiting) {
  UDPPacketToSend made(bytes, event);
  made.setState(state);
  return made;
}

struct MessageQueueTest : testing::Test {
  /// The datagrams that this tick sends.
  std::vector<std::string> tick(Delivery delivery = Delivery::Reliable) {
    std::vector<std::string> sent;
    queue.tick(delivery, [&](std::string_view bytes) {
      sent.emplace_back(bytes);
      return sendsSucceed;
    });
    return sent;
  }
  [[nodiscard]] std::string waiting() const {
    std::string all;
    for (const auto& one : queue.packets()) all += one.data().bytes();
    return all;
  }

  using Sent = std::vector<std::string>;
  MessageQueue queue;
  bool sendsSucceed = true;
};

TEST_F(MessageQueueTest, APacketHoldsACopyOfItsBytesAndStartsAtZero) {
  std::string bytes("a\0b", 3);
  UDPPacketToSend one(bytes, 7);
  bytes = "xyz";
  EXPECT_EQ(one.data().bytes(), std::string_view("a\0b", 3));
  EXPECT_EQ(one.eventNumber(), 7);
  EXPECT_EQ(one.state(), 0);
  EXPECT_EQ(one.numberOfChecks(), 0);
  EXPECT_EQ(one.numberOfRetransmits(), 0);
  one.setEventNumber(8);
  one.setData(platform::Data("other"));
  EXPECT_EQ(one.eventNumber(), 8);
  EXPECT_EQ(one.data().bytes(), "other");
}

TEST_F(MessageQueueTest, SendsAgainOnTicks2And5And10And19AndGivesUpOnThe20th) {
  queue.append(packet("a", 1));
  std::vector<int> sentOn;
  int removedOn = 0;
  for (int number = 1; removedOn == 0 && number < 100; ++number) {
    if (!tick().empty()) sentOn.push_back(number);
    if (queue.empty()) removedOn = number;
  }
  EXPECT_EQ(sentOn, (std::vector<int>{2, 5, 10, 19}));
  EXPECT_EQ(removedOn, 20);
}

TEST_F(MessageQueueTest, TriesAFailedRetransmissionAgainOnTheNextTick) {
  queue.append(packet("a", 1));
  sendsSucceed = false;
  std::vector<std::size_t> attempts;
  for (int number = 1; number <= 4; ++number) attempts.push_back(tick().size());
  EXPECT_EQ(attempts, (std::vector<std::size_t>{0, 1, 1, 1}));
  EXPECT_EQ(queue.packets()[0].numberOfChecks(), 1);
  EXPECT_EQ(queue.packets()[0].numberOfRetransmits(), 0);
  sendsSucceed = true;
  EXPECT_EQ(tick(), Sent{"a"});
  EXPECT_EQ(queue.packets()[0].numberOfRetransmits(), 1);
  EXPECT_EQ(tick(), Sent{});
  EXPECT_EQ(tick(), Sent{});
  EXPECT_EQ(tick(), Sent{"a"});
}

TEST_F(MessageQueueTest, SendsWhatWasNotSentOnTheNextTick) {
  queue.append(packet("a", 1, PacketStateNotSent));
  sendsSucceed = false;
  EXPECT_EQ(tick(), Sent{"a"});
  EXPECT_EQ(queue.packets()[0].state(), PacketStateNotSent);
  sendsSucceed = true;
  EXPECT_EQ(tick(), Sent{"a"});
  EXPECT_EQ(queue.packets()[0].state(), PacketStateWaiting);
  EXPECT_EQ(tick(), Sent{});
  EXPECT_EQ(tick(), Sent{"a"});
}

TEST_F(MessageQueueTest, IsDoneWithWhatWasSentWithoutReliableDelivery) {
  queue.append(packet("a", 1, PacketStateNotSent));
  queue.append(packet("b", 2, PacketStateNotSent));
  sendsSucceed = false;
  EXPECT_EQ(tick(Delivery::FireAndForget), (Sent{"a", "b"}));
  EXPECT_EQ(waiting(), "ab");
  sendsSucceed = true;
  EXPECT_EQ(tick(Delivery::FireAndForget), (Sent{"a", "b"}));
  EXPECT_TRUE(queue.empty());
}

TEST_F(MessageQueueTest, LooksAtThePacketBehindOneThatItRemoved) {
  for (const char* bytes : {"a", "b", "c"}) queue.append(packet(bytes, 1));
  for (int number = 1; number <= 19; ++number) tick();
  queue.append(packet("d", 2, PacketStateNotSent));
  EXPECT_EQ(tick(), Sent{"d"});
  EXPECT_EQ(waiting(), "d");
}

TEST_F(MessageQueueTest, LeavesAPacketOfAnyOtherStateAlone) {
  queue.append(packet("a", 1, 2));
  for (int number = 1; number <= 30; ++number) EXPECT_EQ(tick(), Sent{});
  EXPECT_EQ(waiting(), "a");
}

TEST_F(MessageQueueTest, RemovesAPacketWhoseCountOfRetransmissionsIsOutOfRange) {
  for (const int count : {-1, 4, 5, 1000}) {
    auto odd = packet("a", 1);
    odd.setNumberOfRetransmits(count);
    queue.append(odd);
    EXPECT_EQ(tick(), Sent{});
    EXPECT_TRUE(queue.empty()) << count;
  }
}

TEST_F(MessageQueueTest, AnAcknowledgementRemovesTheOldestOfItsEventOnly) {
  queue.append(packet("a", 6));
  queue.append(packet("b", 7));
  queue.append(packet("c", 7));
  queue.append(packet("d", 8));
  queue.acknowledge(7);
  EXPECT_EQ(waiting(), "acd");
  queue.acknowledge(7);
  EXPECT_EQ(waiting(), "ad");
  queue.acknowledge(7);
  queue.acknowledge(0);
  EXPECT_EQ(waiting(), "ad");
}

TEST_F(MessageQueueTest, AnAcknowledgementAlsoRemovesWhatWasNotSentCompletely) {
  queue.append(packet("a", 7, PacketStateNotSent));
  queue.acknowledge(7);
  EXPECT_TRUE(queue.empty());
}

TEST_F(MessageQueueTest, The51stPacketPushesOutTheOldestSentOrNot) {
  for (std::uint16_t event = 1; event <= 50; ++event) {
    queue.append(packet("x", event, event % 2 == 0 ? PacketStateWaiting : PacketStateNotSent));
  }
  EXPECT_EQ(queue.packets().size(), 50U);
  EXPECT_EQ(queue.packets().front().eventNumber(), 1);
  queue.append(packet("x", 51));
  EXPECT_EQ(queue.packets().size(), 50U);
  EXPECT_EQ(queue.packets().front().eventNumber(), 2);
  EXPECT_EQ(queue.packets().back().eventNumber(), 51);
  queue.append(packet("x", 52));
  EXPECT_EQ(queue.packets().front().eventNumber(), 3);
}

/// A network that loses three of ten datagrams, each way.
struct LossyNetwork {
  static constexpr double kLoss = 0.3;

  bool carries() { return std::uniform_real_distribution<>(0, 1)(generator) >= kLoss; }
  /// Tells whether the acknowledgement came back.
  bool exchange(std::size_t message) {
    ++transmissions;
    if (!carries()) return false;
    delivered.insert(message);
    return carries();
  }

  std::mt19937_64 generator{20'240'607};
  std::set<std::size_t> delivered;
  std::size_t transmissions = 0;
};

TEST_F(MessageQueueTest, DeliversTheShareThatTheTableGivesOverALossyNetwork) {
  // A message is sent at most five times, so it arrives with probability 1 - 0.3^5 = 0.99757. Each try comes
  // back acknowledged with probability 0.7 * 0.7 = 0.49, so that there are (1 - 0.51^5) / 0.49 = 1.97040
  // tries a message. No message stays for more than 20 ticks: two a tick never fill the queue.
  constexpr std::size_t kMessages = 10'000;
  constexpr std::size_t kMessagesPerTick = 2;
  LossyNetwork network;
  std::vector<std::uint16_t> acknowledged;
  const auto exchange = [&](std::string_view bytes) {
    const std::size_t message = std::stoul(std::string(bytes));
    if (network.exchange(message)) acknowledged.push_back(static_cast<std::uint16_t>(message));
    return true;
  };
  for (std::size_t sent = 0; sent < kMessages || !queue.empty();) {
    for (std::size_t i = 0; i < kMessagesPerTick && sent < kMessages; ++i, ++sent) {
      const std::string bytes = std::to_string(sent);
      exchange(bytes);
      queue.append(packet(bytes, static_cast<std::uint16_t>(sent)));
    }
    ASSERT_LE(queue.packets().size(), 20 * kMessagesPerTick + kMessagesPerTick);
    for (const std::uint16_t event : std::exchange(acknowledged, {})) queue.acknowledge(event);
    queue.tick(Delivery::Reliable, exchange);
    for (const std::uint16_t event : std::exchange(acknowledged, {})) queue.acknowledge(event);
  }

  constexpr double kStandardDeviations = 5;
  const double arrives = 1 - std::pow(LossyNetwork::kLoss, 5);
  EXPECT_NEAR(arrives, 0.99757, 1e-6);
  EXPECT_NEAR(static_cast<double>(network.delivered.size()), kMessages * arrives,
              kStandardDeviations * std::sqrt(kMessages * arrives * (1 - arrives)));
  const double fails = 1 - std::pow(1 - LossyNetwork::kLoss, 2);
  const double tries = (1 - std::pow(fails, 5)) / (1 - fails);
  EXPECT_NEAR(tries, 1.97040, 1e-5);
  double variance = -tries * tries;  // Of the tries of one message: 1 to 4 with success on the last, or 5.
  for (int n = 1; n <= 5; ++n) variance += n * n * std::pow(fails, n - 1) * (n < 5 ? 1 - fails : 1);
  EXPECT_NEAR(static_cast<double>(network.transmissions), kMessages * tries,
              kStandardDeviations * std::sqrt(kMessages * variance));
}

TEST_F(MessageQueueTest, LosesTheOldestOfMessagesThatComeFasterThanTheQueueHolds) {
  // Nothing is acknowledged: ten a tick fill the queue within five ticks, before a second retransmission.
  std::vector<std::size_t> tries(500);
  std::size_t sent = 0;
  while (sent < tries.size() || !queue.empty()) {
    for (int i = 0; i < 10 && sent < tries.size(); ++i, ++sent) {
      ++tries[sent];
      queue.append(packet(std::to_string(sent), static_cast<std::uint16_t>(sent)));
      EXPECT_LE(queue.packets().size(), MessageQueue::kMaximumPackets);
    }
    for (const std::string& bytes : tick()) ++tries[std::stoul(bytes)];
  }
  for (std::size_t i = 0; i < 450; ++i) EXPECT_EQ(tries[i], 3U) << i;
  for (std::size_t i = 450; i < 500; ++i) EXPECT_EQ(tries[i], 5U) << i;
}

}  // namespace
}  // namespace tallyd
