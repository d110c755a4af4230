// The station's HTTP servers.
#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

namespace httplib {
class Server;
}

namespace tallyd::station {

/// Answers over HTTPS on 127.0.0.1 and, on request, over plain HTTP too; what it answers are the groups of
/// routes that it is given.
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
  };

  /// Some requests and who answers them.
  struct RouteGroup {
    enum class Reach { HTTPSOnly, HTTPSAndHTTP };
    Reach reach;
    /// Declares the group's handlers; called once for each server, before it listens. The handlers are called
    /// on any thread; what they throw is answered with 500.
    std::function<void(httplib::Server&)> addTo;
  };

  /// What the handlers use must outlive this object. Throws std::runtime_error with the file or address at
  /// fault.
  StationServer(const Settings& settings, const std::vector<RouteGroup>& groups);
  ~StationServer();
  StationServer(const StationServer&) = delete;
  StationServer& operator=(const StationServer&) = delete;

  [[nodiscard]] int httpsPort() const;
  [[nodiscard]] std::optional<int> httpPort() const;

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace tallyd::station
