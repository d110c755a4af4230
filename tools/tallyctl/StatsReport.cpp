#include "tallyctl/StatsReport.h"

#include <fmt/format.h>

#include "tallyctl/PlainText.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::int64_t numberOf(const Dictionary& dictionary, std::string_view key) {
  return dictionary.integer(key).value_or(0);
}

std::string textOf(const Dictionary& dictionary, std::string_view key) {
  return plainText(dictionary.string(key).value_or(""));
}

struct Dropped {
  std::int64_t count = 0;
  std::string reasons;
};

Dropped droppedOf(const Dictionary& counts) {
  Dropped dropped;
  const Dictionary* reasons = counts.dictionary("dropped");
  if (!reasons) return dropped;
  for (const auto& [reason, value] : *reasons) {
    const auto count = value.integerValue().value_or(0);
    dropped.count += count;
    dropped.reasons += fmt::format("{}{} {}", dropped.reasons.empty() ? "" : ", ", plainText(reason), count);
  }
  return dropped;
}

class Table {
 public:
  StatsReport take() { return std::move(_report); }

  void print(std::string line) { _report.lines.push_back(std::move(line)); }

  void header() {
    print(fmt::format("  {:<20} {:<11} {:>9} {:>9} {:>9} {:>9} {:>9} {:>9}", "", "KIND", "ACCEPTED", "SENT",
                      "REFUSED", "HELD", "UNDERWAY", "DROPPED"));
  }

  /// What one session, or several together, have counted.
  void sums(const std::string& title, const Dictionary& sums) {
    print(title);
    for (const char* offered : {"messages", "uploads"}) {
      const Dictionary* counts = sums.dictionary(offered);
      if (counts && numberOf(*counts, "accepted") > 0) row(title, offered, "offered", *counts);
    }
    const platform::Array* backends = sums.array("backends");
    if (!backends) return;
    for (const Value& backend : *backends) {
      if (const Dictionary* counts = backend.dictionary()) {
        row(title, textOf(*counts, "name"), textOf(*counts, "kind"), *counts);
      }
    }
  }

 private:
  void row(const std::string& title, const std::string& name, const std::string& kind,
           const Dictionary& counts) {
    const Dropped dropped = droppedOf(counts);
    const auto accepted = numberOf(counts, "accepted");
    const auto sent = numberOf(counts, "sent");
    const auto held = numberOf(counts, "held");
    const auto inFlight = numberOf(counts, "inFlight");
    print(fmt::format("  {:<20} {:<11} {:>9} {:>9} {:>9} {:>9} {:>9} {:>9}{}", name, kind, accepted, sent,
                      numberOf(counts, "refused"), held, inFlight, dropped.count,
                      dropped.reasons.empty() ? "" : "  " + dropped.reasons));
    const auto elsewhere = sent + held + inFlight + dropped.count;
    if (accepted != elsewhere) {
      _report.imbalances.push_back(
          fmt::format("{}, {}: accepted {}, accounted for {}", title, name, accepted, elsewhere));
    }
  }

  StatsReport _report;
};

std::string titleOf(const Dictionary& session) {
  const std::string name = textOf(session, "clientName");
  return fmt::format("session {} (ID {}, client type {}{})", numberOf(session, "session"),
                     numberOf(session, "sessionID"), numberOf(session, "clientType"),
                     name.empty() ? "" : ", " + name);
}

}  // namespace

StatsReport reportOf(const Dictionary& stats) {
  Table table;
  if (const Dictionary* connections = stats.dictionary("connections")) {
    table.print(fmt::format("connections: {} open, {} accepted", numberOf(*connections, "open"),
                            numberOf(*connections, "accepted")));
  }
  table.header();
  if (const platform::Array* sessions = stats.array("sessions")) {
    for (const Value& session : *sessions) {
      if (const Dictionary* sums = session.dictionary()) table.sums(titleOf(*sums), *sums);
    }
  }
  if (const auto notShown = numberOf(stats, "sessionsNotShown"); notShown > 0) {
    table.print(fmt::format("{} more sessions", notShown));
  }
  if (const Dictionary* ended = stats.dictionary("ended")) {
    table.sums(fmt::format("ended sessions ({})", numberOf(*ended, "sessions")), *ended);
  }
  if (const Dictionary* total = stats.dictionary("total")) table.sums("total", *total);
  return table.take();
}

}  // namespace tallyd::tallyctl
