#include "replay/Invariants.h"

#include <fmt/format.h>

#include "replay/Scenario.h"
#include "replay/Storebags.h"
#include "support/Ledger.h"

namespace tallyd::replay {

using platform::Dictionary;

namespace {

std::uint64_t number(const Dictionary& counts, std::string_view key) {
  return static_cast<std::uint64_t>(counts.integer(key).value_or(0));
}

constexpr std::size_t kMostWaitingDatagrams = 50;
constexpr std::uint64_t kMostPostBackends = 2;

}  // namespace

std::uint64_t Invariants::Row::droppedFor(std::string_view reason) const { return number(dropped, reason); }

std::uint64_t Invariants::Row::droppedInAll() const {
  std::uint64_t all = 0;
  for (const auto& entry : dropped) all += static_cast<std::uint64_t>(entry.value.integerValue().value_or(0));
  return all;
}

Invariants::Row Invariants::rowOf(const Dictionary& counts, std::string what) {
  const Dictionary* dropped = counts.dictionary("dropped");
  return {std::move(what),
          number(counts, "accepted"),
          number(counts, "sent"),
          number(counts, "refused"),
          number(counts, "held"),
          number(counts, "inFlight"),
          dropped ? *dropped : Dictionary()};
}

void Invariants::add(Row& sum, const Row& row) {
  sum.accepted += row.accepted;
  sum.sent += row.sent;
  sum.refused += row.refused;
  sum.held += row.held;
  sum.inFlight += row.inFlight;
  for (const auto& [reason, count] : row.dropped) {
    sum.dropped.set(reason, sum.droppedFor(reason) + row.droppedFor(reason));
  }
}

Invariants::Row Invariants::sumOf(const Dictionary& snapshot, std::string_view kind) {
  Row sum{std::string(kind)};
  for (const auto& entry : *snapshot.dictionary("total")->array("backends")) {
    const Dictionary& counts = *entry.dictionary();
    if (counts.string("kind") == kind) add(sum, rowOf(counts, ""));
  }
  return sum;
}

void Invariants::check() {
  if (_world.trace.lines() == _linesChecked) return;
  _linesChecked = _world.trace.lines();
  const Dictionary snapshot = _ledger.snapshot();
  checkBalances(*snapshot.dictionary("total"), "total");
  checkBalances(*snapshot.dictionary("ended"), "ended");
  checkOffers(*snapshot.dictionary("total"));
  for (const auto& session : *snapshot.array("sessions")) checkSession(*session.dictionary());
  checkPosts(sumOf(snapshot, "https-post"));
  checkUploads(sumOf(snapshot, "upload"));
  checkDashboards(sumOf(snapshot, "dashboard"));
  checkOnDevice(snapshot);
}

void Invariants::checkBalances(const Dictionary& part, const std::string& what) {
  checkBalance(rowOf(*part.dictionary("messages"), what + " messages"));
  checkBalance(rowOf(*part.dictionary("uploads"), what + " uploads"));
  for (const auto& entry : *part.array("backends")) {
    const Dictionary& counts = *entry.dictionary();
    checkBalance(rowOf(counts, what + " " + std::string(counts.string("name").value_or(""))));
  }
}

void Invariants::checkBalance(const Row& row) {
  equal(row.what + ": accepted", row.accepted, row.sent + row.held + row.inFlight + row.droppedInAll());
  atMost(row.what + ": refused", row.refused, row.sent);
}

void Invariants::checkOffers(const Dictionary& total) {
  const Row messages = rowOf(*total.dictionary("messages"), "");
  const Row uploads = rowOf(*total.dictionary("uploads"), "");
  // A one-shot message is booked once its storebag is there: it may be waiting for that.
  atMost("messages booked", messages.accepted, _world.received.messagesOffered);
  atMost("messages offered", _world.received.messagesOffered, messages.accepted + _world.callsWaiting);
  equal("uploads offered", uploads.accepted, _world.received.uploadsOffered);
}

void Invariants::checkSession(const Dictionary& session) {
  const std::string what = fmt::format("session {}", number(session, "session"));
  checkBalances(session, what);
  for (const auto& entry : *session.array("backends")) {
    const Row row = rowOf(*entry.dictionary(), what);
    const auto kind = entry.dictionary()->string("kind");
    if (kind == "https-post") {
      const std::uint64_t methods = kHighestCategory + 1;
      atMost(what + ": held events", row.held, methods * (kHighestEventThreshold + 1));
    } else if (kind != "dashboard") {
      equal(what + ": held by a backend that holds nothing", row.held, 0);
    }
  }
}

void Invariants::checkPosts(const Row& posts) {
  const Received& received = _world.received;
  equal("events under way", posts.inFlight, received.eventsUnderWay);
  equal("events sent", posts.sent, received.eventsTaken + received.eventsRefused);
  equal("events refused", posts.refused, received.eventsRefused);
  equal("events of failed posts", posts.droppedFor("post-failed"), received.eventsFailed);
  equal("events without room", posts.droppedFor("memory-bound"), received.eventsWithoutRoom);
  checkForecast(posts);
}

void Invariants::checkForecast(const Row& posts) {
  const PostForecast& forecast = _model.forecast();
  equal("events accepted", posts.accepted, forecast.accepted);
  equal("events of backends that do not report", posts.droppedFor("state-off"), forecast.stateOff);
  equal("events above their method's limit", posts.droppedFor("method-limit"), forecast.methodLimit);
  equal("events held", posts.held, forecast.held);
  equal("events held to the end", posts.droppedFor("clean-up"), forecast.cleanUp);
  const std::uint64_t withdrawn = posts.droppedFor("consent-withdrawn");
  const std::uint64_t known = forecast.consentWithdrawn + _world.received.eventsWithdrawn;
  // A post that waits for another attempt may be the first to see that consent has gone, and end its session.
  if (mayStopFurtherAttempts(_world.optIns)) {
    atMost("events without consent any more", known, withdrawn);
  } else {
    equal("events without consent any more", withdrawn, known);
  }
}

void Invariants::checkUploads(const Row& uploads) {
  const Received& received = _world.received;
  equal("uploads", uploads.sent, received.uploads);
  equal("uploads refused", uploads.refused, received.uploadsRefused);
  equal("uploads that failed", uploads.droppedFor("upload-failed"), received.uploadsFailed);
}

void Invariants::checkDashboards(const Row& dashboards) {
  const Received& received = _world.received;
  equal("log data refused", dashboards.refused, received.logDataRefused);
  equal("log data that failed", dashboards.droppedFor("upload-failed"), received.logDataFailed);
  // A late acknowledgement of what was given up or pushed out meanwhile changes nothing.
  within("datagrams sent", dashboards.sent,
         received.logData + received.plainDatagrams + received.surelyAcknowledged,
         received.perhapsAcknowledged);
  equal("datagrams pushed out of a full queue", dashboards.droppedFor("queue-full"), received.pushedOut);
  // One more for the upload that a session waits for.
  atMost("datagrams that wait", dashboards.held + dashboards.inFlight,
         kMostWaitingDatagrams * received.openSockets + 1);
}

void Invariants::checkOnDevice(const Dictionary& snapshot) {
  const Received& received = _world.received;
  equal("power records", sumOf(snapshot, "power-log").sent, received.powerRecords);
  const Row adaptors = sumOf(snapshot, "adaptor");
  equal("adaptor messages", adaptors.sent, received.adaptorMessages);
  equal("adaptor messages that threw", adaptors.droppedFor("adaptor-threw"), received.adaptorThrows);
}

void Invariants::checkEnd(std::size_t ownQueues) {
  check();
  const Dictionary snapshot = _ledger.snapshot();
  equal("open connections", number(*snapshot.dictionary("connections"), "open"), 0);
  equal("sessions", snapshot.array("sessions")->size(), 0);
  for (const char* kind : {"https-post", "dashboard", "upload", "power-log", "adaptor"}) {
    const Row row = sumOf(snapshot, kind);
    equal(row.what + ": held at the end", row.held, 0);
    equal(row.what + ": in flight at the end", row.inFlight, 0);
  }
  equal("sockets", _world.received.openSockets, 0);
  equal("adaptors", _world.received.adaptors, 0);
  equal("timers", _world.queues.armedTimers(), 0);
  equal("queues", _world.queues.liveQueues(), ownQueues);
}

void Invariants::equal(std::string_view what, std::uint64_t booked, std::uint64_t seen) {
  if (booked != seen) _world.violated(fmt::format("{}: {} instead of {}", what, booked, seen));
}

void Invariants::within(std::string_view what, std::uint64_t booked, std::uint64_t seen,
                        std::uint64_t uncertain) {
  if (booked < seen || booked > seen + uncertain) {
    _world.violated(
        fmt::format("{}: {} instead of {}, of which {} more are uncertain", what, booked, seen, uncertain));
  }
}

void Invariants::atMost(std::string_view what, std::uint64_t number, std::uint64_t most) {
  if (number > most) _world.violated(fmt::format("{}: {} and at most {}", what, number, most));
}

}  // namespace tallyd::replay
