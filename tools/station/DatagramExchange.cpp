#include "station/DatagramExchange.h"

#include <arpa/inet.h>
#include <fmt/format.h>

#include <algorithm>
#include <exception>
#include <utility>

#include "station/Limits.h"
#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Dictionary;
using platform::Value;

namespace {

LossModel::Shares sharesOf(const BadNetwork& network, Share lost) {
  return {.lost = lost, .duplicated = network.duplicate, .reordered = network.reorder};
}

std::string textOf(const sockaddr_in& address) {
  char text[INET_ADDRSTRLEN] = "";
  ::inet_ntop(AF_INET, &address.sin_addr, text, sizeof text);
  return fmt::format("{}:{}", text, ntohs(address.sin_port));
}

/// Sessions of one number may live at the same time, behind different sockets.
std::string identityOf(const Packet& packet) {
  return textOf(packet.peer) + std::string(datagramHeader(packet.bytes));
}

}  // namespace

DatagramExchange::DatagramExchange(const BadNetwork& network, const platform::Clock& clock, Journal& journal,
                                   TerminalView& view)
    : _clock(clock),
      _journal(journal),
      _view(view),
      _wayIn(sharesOf(network, network.lose), network.delay, network.seed),
      // Lots of its own: how many acknowledgements there are must not change what happens on the way in.
      _wayOut(sharesOf(network, network.loseAcks), network.delay, ~network.seed),
      _history(kRememberedDatagrams) {}

void DatagramExchange::arrive(Packet packet, TimePoint now) {
  ++_totals.received;
  const DatagramResult decoded = decodeDatagram(packet.bytes);
  if (!decoded.datagram) {
    ++_totals.refused;
    _view.showProblem(fmt::format("refused a datagram from {}: {}", textOf(packet.peer), decoded.problem));
    return;
  }
  packet.earlierArrivals = _history.noteArrival(identityOf(packet));
  if (packet.earlierArrivals > 0) ++_totals.retransmissions;
  const Packet origin{"", packet.peer, packet.earlierArrivals};
  if (!_wayIn.put(std::move(packet), now)) {
    Dictionary record = recordFor(*decoded.datagram, origin);
    record.set("lost", true);
    _journal.tell(recordOf(record));
    _view.showAside(readableDatagram(*decoded.datagram, "datagram, lost on purpose"));
  }
}

std::vector<Packet> DatagramExchange::advance(TimePoint now) {
  for (const Packet& packet : _wayIn.take(now)) deliver(packet, now);
  return _wayOut.take(now);
}

std::optional<DatagramExchange::TimePoint> DatagramExchange::nextDue() const {
  const auto in = _wayIn.nextDue();
  const auto out = _wayOut.nextDue();
  return in && out ? std::min(in, out) : in ? in : out;
}

DatagramTotals DatagramExchange::totals() const {
  DatagramTotals totals = _totals;
  totals.lost = _wayIn.lost();
  totals.acknowledgementsLost = _wayOut.lost();
  return totals;
}

void DatagramExchange::deliver(const Packet& packet, TimePoint now) {
  const auto datagram = decodeDatagram(packet.bytes).datagram;
  if (!datagram) return;
  const std::string identity = identityOf(packet);
  const bool isDuplicate = _history.deliveries(identity) > 0;
  try {
    _journal.keep({itemFor(*datagram, packet, isDuplicate)});
  } catch (const std::exception& exception) {
    _view.showProblem(fmt::format("can't keep a datagram: {}", exception.what()));
    return;
  }
  _history.noteDelivery(identity);
  ++_totals.delivered;
  if (isDuplicate) ++_totals.duplicates;
  if (!datagram->isReliable) return;
  ++_totals.acknowledgements;
  _wayOut.put({std::string(acknowledgementOf(packet.bytes)), packet.peer}, now);
}

Dictionary DatagramExchange::recordFor(const ReceivedDatagram& datagram, const Packet& packet) const {
  return {{"time", platform::secondsSince1970(_clock.now())},
          {"from", textOf(packet.peer)},
          {"sentTime", datagram.sentTime},
          {"sender", senderNamed(datagram.clientType)},
          {"clientType", static_cast<int>(datagram.clientType)},
          {"clientVersion", static_cast<int>(datagram.clientVersion)},
          {"selfVersion", static_cast<int>(datagram.selfVersion)},
          {"session", datagram.session},
          {"method", static_cast<int>(datagram.method)},
          {"status", static_cast<int>(datagram.status)},
          {"eventNumber", static_cast<int>(datagram.eventNumber)},
          {"device", datagram.device},
          {"fields", fieldsOfText(datagram.text)},
          {"text", datagram.text},
          {"mayBeCut", mayBeCut(datagram.text)},
          {"reliable", datagram.isReliable},
          {"noProfile", datagram.hasNoProfile},
          {"retransmission", packet.earlierArrivals > 0}};
}

Journal::Item DatagramExchange::itemFor(const ReceivedDatagram& datagram, const Packet& packet,
                                        bool isDuplicate) const {
  const bool isRetransmission = packet.earlierArrivals > 0;
  Dictionary record = recordFor(datagram, packet);
  record.set("duplicate", isDuplicate);
  std::string remarks = "datagram";
  if (datagram.isReliable) remarks += ", reliable";
  if (isRetransmission) remarks += ", retransmission";
  if (isDuplicate) remarks += ", duplicate";
  if (mayBeCut(datagram.text)) remarks += ", cut";
  return {readableDatagram(datagram, remarks), recordOf(record)};
}

std::string readableDatagram(const ReceivedDatagram& datagram, std::string_view remarks) {
  const Value sentTime(datagram.sentTime);
  const Dictionary fields = fieldsOfText(datagram.text);
  return fmt::format("{}  {}  session {}  method {}  status {}  #{}{}{}  [{}]", readableTime(&sentTime),
                     senderNamed(datagram.clientType), datagram.session, datagram.method, datagram.status,
                     datagram.eventNumber, fields.empty() ? "" : " ", readableFields(fields), remarks);
}

std::string readableTotals(const DatagramTotals& totals) {
  return fmt::format(
      "datagrams: {} received, {} refused, {} retransmissions, {} lost on purpose, {} delivered, "
      "{} duplicates, {} distinct events; acknowledgements: {} made, {} lost on purpose",
      totals.received, totals.refused, totals.retransmissions, totals.lost, totals.delivered,
      totals.duplicates, totals.distinct(), totals.acknowledgements, totals.acknowledgementsLost);
}

}  // namespace tallyd::station
