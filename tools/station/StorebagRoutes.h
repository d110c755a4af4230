// The requests for storebags.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <string>

#include "station/BagFolder.h"
#include "station/TerminalView.h"

namespace httplib {
class Server;
}

namespace tallyd::station {

/// GET /storebags/sorrel/NAME and /bags/sorrel/NAME: the storebag NAME.
///
/// Threading: any thread. Must outlive the servers.
class StorebagRoutes {
 public:
  /// Borrows the others.
  /// @param maxAge  For how long a storebag may be reused.
  StorebagRoutes(const BagFolder& bags, std::chrono::seconds maxAge, TerminalView& view);

  void addTo(httplib::Server& server);
  [[nodiscard]] std::uint64_t served() const { return _served; }

 private:
  const BagFolder& _bags;
  const std::string _cacheControl;
  TerminalView& _view;
  std::atomic<std::uint64_t> _served{0};
};

}  // namespace tallyd::station
