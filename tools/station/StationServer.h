// The station's HTTP servers.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>

#include "station/BagFolder.h"
#include "station/EventCollector.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// Serves storebags and collects events over HTTPS on 127.0.0.1; on request, collects events over plain HTTP
/// too.
///
///  - GET /storebags/sorrel/NAME and /bags/sorrel/NAME: the storebag NAME.
///  - POST /events and below: a post, plain or with Content-Encoding gzip; 400 for what can't be read.
///
/// Listens from construction to destruction, which waits for requests under way and up to a second for idle
/// connections.
class StationServer {
 public:
  struct Settings {
    std::filesystem::path certificateFile;
    std::filesystem::path certificateKeyFile;
    int httpsPort = 0;            ///< 0 lets the system choose.
    std::optional<int> httpPort;  ///< Nothing: no plain HTTP.
    std::chrono::seconds maxAge{0};
  };

  /// Borrows the others. Throws std::runtime_error with the file or address at fault.
  StationServer(const Settings& settings, const BagFolder& bags, EventCollector& collector,
                TerminalView& view);
  ~StationServer();
  StationServer(const StationServer&) = delete;
  StationServer& operator=(const StationServer&) = delete;

  [[nodiscard]] int httpsPort() const;
  [[nodiscard]] std::optional<int> httpPort() const;
  [[nodiscard]] std::uint64_t servedStorebags() const;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace tallyd::station
