#include "backends/dashboard/MessageQueue.h"

#include <algorithm>
#include <array>

namespace tallyd {

namespace {

enum class Verdict { Keep, Remove };

/// Ticks until the next retransmission, by the number of those done.
constexpr std::array kTicksUntilRetransmission = {2, 3, 5, 9};

Verdict checkWaiting(UDPPacketToSend& packet, const MessageQueue::Send& send) {
  const auto retransmits = static_cast<std::size_t>(packet.numberOfRetransmits());
  if (retransmits >= kTicksUntilRetransmission.size()) return Verdict::Remove;
  const int checks = packet.numberOfChecks() + 1;
  if (checks < kTicksUntilRetransmission[retransmits]) {
    packet.setNumberOfChecks(checks);
  } else if (send(packet.data().bytes())) {
    packet.setNumberOfChecks(0);
    packet.setNumberOfRetransmits(packet.numberOfRetransmits() + 1);
  }
  return Verdict::Keep;
}

Verdict checkNotSent(UDPPacketToSend& packet, Delivery delivery, const MessageQueue::Send& send) {
  if (!send(packet.data().bytes())) return Verdict::Keep;
  if (delivery == Delivery::FireAndForget) return Verdict::Remove;
  packet.setState(PacketStateWaiting);
  return Verdict::Keep;
}

Verdict check(UDPPacketToSend& packet, Delivery delivery, const MessageQueue::Send& send) {
  switch (packet.state()) {
    case PacketStateWaiting:
      return checkWaiting(packet, send);
    case PacketStateNotSent:
      return checkNotSent(packet, delivery, send);
    default:
      return Verdict::Keep;
  }
}

}  // namespace

void MessageQueue::append(UDPPacketToSend packet) {
  _packets.push_back(std::move(packet));
  if (_packets.size() > kMaximumPackets) _packets.erase(_packets.begin());
}

void MessageQueue::acknowledge(std::uint16_t eventNumber) {
  const auto found = std::find_if(_packets.begin(), _packets.end(), [eventNumber](const auto& packet) {
    return packet.eventNumber() == eventNumber;
  });
  if (found != _packets.end()) _packets.erase(found);
}

void MessageQueue::tick(Delivery delivery, const Send& send) {
  for (auto packet = _packets.begin(); packet != _packets.end();) {
    packet = check(*packet, delivery, send) == Verdict::Remove ? _packets.erase(packet) : packet + 1;
  }
}

}  // namespace tallyd
