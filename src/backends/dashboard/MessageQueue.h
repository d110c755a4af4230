// Which datagrams are sent again when, and which are given up: reliable delivery without a socket or a clock.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <vector>

#include "backends/dashboard/UDPPacketToSend.h"
#include "support/Account.h"

namespace tallyd {

enum class Delivery {
  FireAndForget,  ///< A datagram is done when it was sent.
  Reliable,       ///< A datagram is done when it was acknowledged, or given up.
};

/// The datagrams of one server that wait, oldest first; at most 50, the oldest goes for one more.
///
/// A datagram that was sent and is not acknowledged is sent again 2 ticks later, then after 3, 5 and 9 more,
/// and given up on the tick after the last.
///
/// Books: what was not sent yet is held, what waits for its acknowledgement is in flight. Threading: one
/// thread at a time.
class MessageQueue {
 public:
  /// Sends a datagram and tells whether all of it went.
  using Send = std::function<bool(std::string_view bytes)>;

  static constexpr std::size_t kMaximumPackets = 50;

  MessageQueue() = default;  ///< Books nothing.
  explicit MessageQueue(std::shared_ptr<Account> account) : _account(std::move(account)) {}

  /// While the queue is empty.
  void setAccount(std::shared_ptr<Account> account) { _account = std::move(account); }

  /// Takes a datagram that is booked as being in flight. Throws std::bad_alloc, and has not taken it then.
  void append(UDPPacketToSend packet);
  /// Removes the oldest datagram of this event, if there is one.
  void acknowledge(std::uint16_t eventNumber);
  /// Sends what is due and removes what is done.
  void tick(Delivery delivery, const Send& send);

  /// Books all that waits as dropped and forgets it.
  void drop(DropReason reason);

  [[nodiscard]] bool empty() const { return _packets.empty(); }
  [[nodiscard]] const std::vector<UDPPacketToSend>& packets() const { return _packets; }

 private:
  void bookDrop(const UDPPacketToSend& packet, DropReason reason) const;

  std::shared_ptr<Account> _account;  ///< May be null.
  std::vector<UDPPacketToSend> _packets;
};

}  // namespace tallyd
