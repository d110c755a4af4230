#include "station/SessionsModel.h"

#include <algorithm>

#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

void addName(std::set<std::string>& names, const std::string& name, std::size_t most) {
  if (!name.empty() && names.size() < most) names.insert(name);
}

Array arrayOf(const std::set<std::string>& names) {
  return Array(std::vector<Value>(names.begin(), names.end()));
}

}  // namespace

void SessionsModel::take(const PageRecord& record, double now) {
  if (record.session.empty()) return;
  if (!_sessions.contains(record.session)) makeRoom();
  Session& session = _sessions[record.session];
  session.revision = ++_revision;
  if (session.first == 0) session.first = now;
  session.last = now;
  if (!record.parent.empty()) session.parent = record.parent;
  addName(session.senders, record.sender, kMaximumNames);
  addName(session.clients, record.client, kMaximumNames);
  addName(session.devices, record.device, kMaximumNames);
  switch (record.kind) {
    case Feed::Kind::Event:
      if (session.started != record.started) session.events.numbers.beginRound();
      session.started = record.started;
      count(session.events, record);
      break;
    case Feed::Kind::Datagram:
      count(session.datagrams, record);
      break;
    case Feed::Kind::Upload:
      ++session.uploads;
      session.uploadBytes += record.bytes;
      break;
    case Feed::Kind::LogData:
      ++session.logData;
      break;
  }
}

std::vector<std::string> SessionsModel::changedSince(std::uint64_t revision) const {
  std::vector<std::string> changed;
  for (const auto& [id, session] : _sessions)
    if (session.revision > revision) changed.push_back(jsonOf(id, session));
  return changed;
}

void SessionsModel::makeRoom() {
  if (_sessions.size() < kMaximumSessions) return;
  _sessions.erase(std::min_element(_sessions.begin(), _sessions.end(), [](const auto& a, const auto& b) {
    return a.second.revision < b.second.revision;
  }));
}

void SessionsModel::count(Delivery& delivery, const PageRecord& record) {
  ++delivery.received;
  if (record.isLost) {
    ++delivery.lost;
    return;
  }
  if (record.isRetried) ++delivery.retried;
  if (record.eventNumber) delivery.numbers.add(*record.eventNumber);
}

std::string SessionsModel::jsonOf(const std::string& id, const Session& session) {
  const auto deliveryOf = [](const Delivery& delivery) {
    return Dictionary{{"received", delivery.received},
                      {"distinct", delivery.numbers.distinct()},
                      {"repeated", delivery.numbers.repeated()},
                      {"lost", delivery.lost},
                      {"retried", delivery.retried},
                      {"missing", delivery.numbers.missing()},
                      {"gaps", delivery.numbers.missingText(kShownGaps)}};
  };
  return recordOf({{"session", id},
                   {"parent", session.parent},
                   {"senders", arrayOf(session.senders)},
                   {"clients", arrayOf(session.clients)},
                   {"devices", arrayOf(session.devices)},
                   {"first", session.first},
                   {"last", session.last},
                   {"events", deliveryOf(session.events)},
                   {"datagrams", deliveryOf(session.datagrams)},
                   {"uploads", session.uploads},
                   {"uploadBytes", session.uploadBytes},
                   {"logData", session.logData}});
}

}  // namespace tallyd::station
