// What the station does with the datagrams that it receives, without the socket.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "platform/Clock.h"
#include "station/DatagramHistory.h"
#include "station/Journal.h"
#include "station/LossyPath.h"
#include "station/ReceivedDatagram.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// How bad a network the station plays; by default, it is a good one.
struct BadNetwork {
  Share lose{};       ///< Of the datagrams.
  Share loseAcks{};   ///< Of the acknowledgements.
  Share duplicate{};  ///< Of both, like the others below.
  Share reorder{};
  std::chrono::milliseconds delay{0};  ///< Of each one.
  std::uint64_t seed = 0;
};

struct DatagramTotals {
  std::uint64_t received = 0;         ///< From the network, whatever became of it then.
  std::uint64_t refused = 0;          ///< Was no datagram of the daemon's.
  std::uint64_t retransmissions = 0;  ///< Received before.
  std::uint64_t lost = 0;             ///< On purpose.
  std::uint64_t delivered = 0;
  std::uint64_t duplicates = 0;        ///< Delivered before.
  std::uint64_t acknowledgements = 0;  ///< Made, and then sent or lost.
  std::uint64_t acknowledgementsLost = 0;
  [[nodiscard]] std::uint64_t distinct() const { return delivered - duplicates; }
};

/// Puts what arrives on the way in; what comes out there is delivered (kept, shown, published) and, where it
/// asks for that, acknowledged, and the acknowledgement goes the way out. What can't be kept is not
/// acknowledged, so that it comes again.
///
/// Threading: one thread; time on the ways comes in from outside.
class DatagramExchange {
 public:
  using TimePoint = LossyPath::TimePoint;

  /// Borrows the others. The clock stamps the records.
  DatagramExchange(const BadNetwork& network, const platform::Clock& clock, Journal& journal,
                   TerminalView& view);

  void arrive(Packet packet, TimePoint now);
  /// Delivers what is due; what is to be sent now.
  [[nodiscard]] std::vector<Packet> advance(TimePoint now);
  /// When advance() has something to do next; nothing: when something arrives.
  [[nodiscard]] std::optional<TimePoint> nextDue() const;

  [[nodiscard]] DatagramTotals totals() const;

 private:
  void deliver(const Packet& packet, TimePoint now);
  [[nodiscard]] platform::Dictionary recordFor(const ReceivedDatagram& datagram, const Packet& packet) const;
  [[nodiscard]] Journal::Item itemFor(const ReceivedDatagram& datagram, const Packet& packet,
                                      bool isDuplicate) const;

  const platform::Clock& _clock;
  Journal& _journal;
  TerminalView& _view;
  LossyPath _wayIn;
  LossyPath _wayOut;
  DatagramHistory _history;
  DatagramTotals _totals;
};

/// One line: the sender's time, sender, session, method, status, number, fields, and in brackets what came of
/// it.
[[nodiscard]] std::string readableDatagram(const ReceivedDatagram& datagram, std::string_view remarks);

/// "datagrams: 3 received, …".
[[nodiscard]] std::string readableTotals(const DatagramTotals& totals);

}  // namespace tallyd::station
