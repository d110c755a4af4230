#include "backends/dashboard/MessageQueue.h"

#include <algorithm>
#include <array>

#include "backends/dashboard/Datagram.h"

namespace tallyd {

namespace {

enum class Verdict {
  Keep,
  Sent,     ///< Was not sent before; stays to be acknowledged.
  Done,     ///< Was not sent before; needs nothing more.
  GivenUp,  ///< Never acknowledged.
};

/// Ticks until the next retransmission, by the number of those done.
constexpr std::array kTicksUntilRetransmission = {2, 3, 5, 9};

Verdict checkWaiting(UDPPacketToSend& packet, const MessageQueue::Send& send) {
  const auto retransmits = static_cast<std::size_t>(packet.numberOfRetransmits());
  if (retransmits >= kTicksUntilRetransmission.size()) return Verdict::GivenUp;
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
  if (delivery == Delivery::FireAndForget) return Verdict::Done;
  packet.setState(PacketStateWaiting);
  return Verdict::Sent;
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
  if (_account && _packets.back().state() == PacketStateNotSent) _account->holdBack();
  if (_packets.size() <= kMaximumPackets) return;
  bookDrop(_packets.front(), DropReason::QueueFull);
  _packets.erase(_packets.begin());
}

void MessageQueue::acknowledge(std::uint16_t eventNumber) {
  const auto found = std::find_if(_packets.begin(), _packets.end(), [eventNumber](const auto& packet) {
    return packet.eventNumber() == eventNumber;
  });
  if (found == _packets.end()) return;
  // A server may acknowledge what was never sent to it.
  if (_account && found->state() == PacketStateNotSent) _account->startHeld();
  if (_account) _account->finish();
  _packets.erase(found);
}

void MessageQueue::tick(Delivery delivery, const Send& send) {
  for (auto packet = _packets.begin(); packet != _packets.end();) {
    const Verdict verdict = check(*packet, delivery, send);
    if (_account && (verdict == Verdict::Sent || verdict == Verdict::Done)) _account->startHeld();
    if (_account && verdict == Verdict::Done) _account->finish();
    if (verdict == Verdict::GivenUp) bookDrop(*packet, DropReason::GivenUp);
    const bool stays = verdict == Verdict::Keep || verdict == Verdict::Sent;
    packet = stays ? packet + 1 : _packets.erase(packet);
  }
}

void MessageQueue::drop(DropReason reason) {
  for (const UDPPacketToSend& packet : _packets) bookDrop(packet, reason);
  _packets.clear();
}

void MessageQueue::bookDrop(const UDPPacketToSend& packet, DropReason reason) const {
  if (!_account) return;
  const std::string_view bytes = packet.data().bytes();
  std::optional<MessageNumbers> numbers;
  if (bytes.size() >= DatagramText) {
    numbers = MessageNumbers{datagramNumber16(bytes, DatagramMethod), packet.eventNumber()};
  }
  if (packet.state() == PacketStateNotSent) return _account->dropHeld(reason, 1, numbers);
  _account->drop(reason, 1, numbers);
}

}  // namespace tallyd
