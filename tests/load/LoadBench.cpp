#include "load/LoadBench.h"

#include <fmt/format.h>
#include <sys/resource.h>
#include <zlib.h>

#include <algorithm>
#include <exception>
#include <functional>
#include <memory>
#include <stdexcept>
#include <thread>

#include "framework/InspectionInterface.h"
#include "framework/TallyInspection.h"
#include "support/BusClient.h"

namespace tallyd::test {

using platform::Dictionary;
using platform::Value;
using std::chrono::steady_clock;

namespace {

constexpr std::size_t kLanes = 4;

/// Runs `lane(i)` for each lane on a thread of its own; an exception of one is thrown here.
void inLanes(const std::function<void(std::size_t lane)>& lane) {
  std::vector<std::thread> threads;
  std::vector<std::exception_ptr> failures(kLanes);
  for (std::size_t i = 0; i < kLanes; ++i) {
    threads.emplace_back([&, i] {
      try {
        lane(i);
      } catch (...) {
        failures[i] = std::current_exception();
      }
    });
  }
  for (auto& thread : threads) thread.join();
  for (const auto& failure : failures) {
    if (failure) std::rethrow_exception(failure);
  }
}

/// What a gzip member, or text as it is, says.
std::string decoded(std::string_view body) {
  constexpr std::string_view kGzip("\x1f\x8b", 2);
  if (!body.starts_with(kGzip)) return std::string(body);
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(body.data()));
  stream.avail_in = static_cast<uInt>(body.size());
  constexpr int kGzipWindow = 15 + 16;
  if (inflateInit2(&stream, kGzipWindow) != Z_OK) throw std::runtime_error("can't decode");
  std::string text;
  char piece[16'384];
  int status = Z_OK;
  while (status == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(piece);
    stream.avail_out = sizeof piece;
    status = inflate(&stream, Z_NO_FLUSH);
    text.append(piece, sizeof piece - stream.avail_out);
  }
  inflateEnd(&stream);
  return text;
}

std::uint64_t eventsIn(std::string_view document) {
  constexpr std::string_view kOnceAnEvent = "\"_eventNumber\":";
  std::uint64_t count = 0;
  for (std::size_t at = 0; (at = document.find(kOnceAnEvent, at)) != std::string_view::npos; ++at) ++count;
  return count;
}

Dictionary userInfo() { return {{"ClientName", "load"}, {"ServiceName", "test"}}; }

Dictionary payload(std::size_t number) {
  return {{"number", static_cast<std::int64_t>(number)},
          {"speed", 2.5},
          {"ok", true},
          {"screen", "workshop/main"},
          {"note", "a text as long as most of them are"}};
}

void expectBalance(const Dictionary& row, LoadResult& result) {
  std::int64_t sum = 0;
  for (const char* place : {"sent", "held", "inFlight"}) sum += row.integer(place).value_or(-1);
  for (const auto& [reason, count] : *row.dictionary("dropped")) sum += count.integerValue().value_or(0);
  if (row.integer("accepted") != sum) result.balanced = false;
}

struct Look {
  bool nobodyIsConnected = false;
  bool nothingIsUnderWay = true;
};

/// Takes a look at the books.
Look lookAtBooks(TallyInspection& inspection, LoadResult& result) {
  const StatsReply reply = inspection.statsSync();
  if (reply.error) throw std::runtime_error(*reply.error);
  Look look;
  look.nobodyIsConnected =
      reply.stats.dictionary("connections")->integer("open") == 0 && reply.stats.array("sessions")->empty();
  for (const Value& value : *reply.stats.dictionary("total")->array("backends")) {
    const Dictionary& row = *value.dictionary();
    expectBalance(row, result);
    if (row.integer("held") != 0 || row.integer("inFlight") != 0) look.nothingIsUnderWay = false;
    result.accepted = static_cast<std::uint64_t>(row.integer("accepted").value_or(0));
    result.sent = static_cast<std::uint64_t>(row.integer("sent").value_or(0));
  }
  return look;
}

double secondsSince(steady_clock::time_point start) {
  return std::chrono::duration<double>(steady_clock::now() - start).count();
}

}  // namespace

// CountingCollector

CountingCollector::CountingCollector() : _server([this](RawConnection& connection) { serve(connection); }) {}

void CountingCollector::serve(RawConnection& connection) {
  for (std::string request = connection.readRequest(); !request.empty(); request = connection.readRequest()) {
    _events += eventsIn(decoded(std::string_view(request).substr(request.find("\r\n\r\n") + 4)));
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
  }
}

// What is asked and what came of it

void takeDescriptorsFor(const Crowd& crowd) {
  constexpr std::size_t kForOtherThings = 200;
  const rlim_t needed = crowd.connections + kForOtherThings;
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) throw std::runtime_error("getrlimit");
  limit.rlim_max = std::max(limit.rlim_max, needed);  // Root may raise it.
  limit.rlim_cur = limit.rlim_max;
  if (::setrlimit(RLIMIT_NOFILE, &limit) == 0) return;
  ::getrlimit(RLIMIT_NOFILE, &limit);
  throw std::runtime_error(fmt::format(
      "{} connections need a hard limit of {} open files (ulimit -n {}, as root or where the limit is set); "
      "it is {}",
      crowd.connections, needed, needed, limit.rlim_max));
}

std::size_t LoadResult::medianBytes(std::size_t fromTenth, std::size_t toTenth) const {
  const std::size_t end = std::max<std::size_t>(samples.size() * toTenth / 10, 1);
  std::vector<std::size_t> bytes;
  for (std::size_t i = samples.size() * fromTenth / 10; i < end; ++i)
    bytes.push_back(samples.at(i).residentBytes);
  const auto median = bytes.begin() + static_cast<std::ptrdiff_t>(bytes.size() / 2);
  std::nth_element(bytes.begin(), median, bytes.end());
  return *median;
}

bool LoadResult::hasFlatMemory() const {
  constexpr double kShare = 0.03;
  constexpr double kBytes = 1024 * 1024;
  return static_cast<double>(lateBytes()) <= static_cast<double>(earlyBytes()) * (1 + kShare) + kBytes;
}

bool LoadResult::leavesNothing() const {
  constexpr std::size_t kIdleConnections = 8;  // HTTPLimits: what posts to one collector share.
  constexpr std::size_t kInspection = 1;
  return after.threads <= before.threads &&
         after.descriptors <= before.descriptors + kIdleConnections + kInspection;
}

// LoadBench

LoadBench::LoadBench()
    : _prepared([this] {
        _storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
        _root.setPreferences("com.quillon.tally", {{"tally_storebag_url", _storebags.baseURL()},
                                                   {"httpsPostURL", _collector.url()}});
        _root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
        return 0;
      }()),
      _daemon(_root, {.arguments = {"--log-level", "critical"}}) {}

void LoadBench::runFirstSession() {
  BusClient client(_root.socket());
  client.authenticate();
  client.startSession(sessionInfo(1), userInfo());
  client.sendMessage(1, 0, payload(0), Answer::Wanted);
}

LoadResult LoadBench::run(const Crowd& crowd) {
  takeDescriptorsFor(crowd);
  LoadResult result;
  result.name = "crowd";
  result.connections = crowd.connections;
  result.sessions = 1 + crowd.active;
  runFirstSession();
  result.before = figures();
  const auto start = steady_clock::now();
  std::vector<std::unique_ptr<BusClient>> clients(crowd.connections);
  inLanes([&](std::size_t lane) {
    for (std::size_t i = lane; i < clients.size(); i += kLanes) {
      clients[i] = std::make_unique<BusClient>(_root.socket());
      clients[i]->authenticate();
      if (i < crowd.active) {
        clients[i]->startSession(sessionInfo(static_cast<std::uint32_t>(2 + i)), userInfo());
      } else {
        clients[i]->call("FetchDisplayURL");
      }
    }
  });
  std::size_t rounds = 0;
  for (; rounds < crowd.rounds || steady_clock::now() < start + crowd.atLeast; ++rounds) {
    inLanes([&](std::size_t lane) {
      for (std::size_t i = lane; i < crowd.active; i += kLanes) {
        clients[i]->sendMessage(static_cast<std::uint16_t>(1 + rounds % 3), 0, payload(rounds),
                                Answer::Wanted);
      }
    });
    waitForPosts(result);
    result.samples.push_back(figures());
  }
  result.messages = 1 + rounds * crowd.active;
  clients.clear();
  result.seconds = secondsSince(start);
  finish(result);
  return result;
}

LoadResult LoadBench::run(const Days& days) {
  LoadResult result;
  result.name = "days";
  result.connections = kLanes;
  result.sessions = 1;
  result.messages = 1;
  runFirstSession();
  result.before = figures();
  const auto start = steady_clock::now();
  const auto runSession = [&](std::size_t number, bool batches) {
    constexpr std::size_t kFlushAfter = 30;
    BusClient client(_root.socket());
    client.authenticate();
    client.startSession(sessionInfo(static_cast<std::uint32_t>(2 + number), 5, {{"BatchEvent", batches}}),
                        userInfo());
    const std::size_t events = batches ? days.eventsOfABatchingSession : days.eventsOfAPostingSession;
    for (std::size_t i = 1; i <= events; ++i) {
      const auto answer = batches ? Answer::NotWanted : Answer::Wanted;
      client.sendMessage(static_cast<std::uint16_t>(1 + i % 3), 0, payload(i), answer);
      if (batches && i % kFlushAfter == 0) client.call("FlushMessages");
    }
  };
  const std::size_t sessionsAnHour = days.postingSessions + days.batchingSessions;
  std::size_t hours = 0;
  const std::size_t least = days.firstHours + days.hours;
  for (; hours < least || steady_clock::now() < start + days.atLeast; ++hours) {
    inLanes([&](std::size_t lane) {
      for (std::size_t i = lane; i < sessionsAnHour; i += kLanes) {
        runSession(hours * sessionsAnHour + i, i >= days.postingSessions);
      }
    });
    waitForPosts(result);
    if (hours >= days.firstHours) result.samples.push_back(figures());
  }
  result.sessions += hours * sessionsAnHour;
  result.messages += hours * (days.postingSessions * days.eventsOfAPostingSession +
                              days.batchingSessions * days.eventsOfABatchingSession);
  result.seconds = secondsSince(start);
  finish(result);
  return result;
}

void LoadBench::waitForPosts(LoadResult& result) {
  TallyInspection inspection(inspectionSocketPath(_root.root()));
  const auto deadline = steady_clock::now() + WatchedProcess::kPatience;
  while (!lookAtBooks(inspection, result).nothingIsUnderWay && steady_clock::now() < deadline) {
  }
}

void LoadBench::finish(LoadResult& result) {
  TallyInspection inspection(inspectionSocketPath(_root.root()));
  const auto deadline = steady_clock::now() + WatchedProcess::kPatience;
  const auto isSettled = [&] {
    const Look look = lookAtBooks(inspection, result);
    return look.nobodyIsConnected && look.nothingIsUnderWay;
  };
  while (!isSettled() && steady_clock::now() < deadline) {
  }
  // Threads that blocking calls have called for go after a while.
  do {
    result.after = figures();
  } while (result.after.threads > result.before.threads && isSettled() && steady_clock::now() < deadline);
  result.arrived = _collector.events();
}

}  // namespace tallyd::test
