#include "BareBus.h"
#include "Daemon.h"
#include "Figures.h"
#include "Measure.h"
#include "Recording.h"

namespace tallyd::bench {

namespace {

constexpr std::size_t kConnections = 1000;
constexpr double kKibibyte = 1024;
constexpr double kMebibyte = 1024 * kKibibyte;

struct IdleMemory {
  double idleBytes = 0;
  double bytesPerConnection = 0;
};

/// Each connection has authenticated and has had one call answered.
template <class Server>
IdleMemory idleMemoryOf(const Server& server, const Recording& recording) {
  const auto idle = static_cast<double>(memoryOf(server.id()).residentBytes);
  std::vector<ReplayingClient> clients;
  for (std::size_t i = 0; i < kConnections; ++i) {
    clients.emplace_back(server.socket(), recording).call(recording.fetchDisplayURL);
  }
  const auto loaded = static_cast<double>(memoryOf(server.id()).residentBytes);
  return {idle, (loaded - idle) / kConnections};
}

}  // namespace

void measureMemory(const Settings& settings, Figures& figures) {
  Figure idle{
      .name = "memory/idle", .unit = "MiB", .floorName = "sd-bus alone", .target = Target::figure(12)};
  Figure connection{
      .name = "memory/connection", .unit = "KiB", .floorName = "sd-bus alone", .target = Target::figure(16)};
  if (!settings.wants(idle.name) && !settings.wants(connection.name)) return;
  const Recording recording = recordClient(Posting::Unbatched);
  for (int run = 0; run < settings.runs(); ++run) {
    const IdleMemory daemon = idleMemoryOf(Daemon(settings, kNowhere), recording);
    const IdleMemory floor = idleMemoryOf(BareServer(), recording);
    idle.add(daemon.idleBytes / kMebibyte, floor.idleBytes / kMebibyte);
    connection.add(daemon.bytesPerConnection / kKibibyte, floor.bytesPerConnection / kKibibyte);
  }
  figures.push_back(std::move(idle));
  figures.push_back(std::move(connection));
}

}  // namespace tallyd::bench
