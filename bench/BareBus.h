// Server and client that use sd-bus and nothing else: the floor of a call's round trip and of a connection's
// memory.
#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "fakes/TemporaryFolder.h"
#include "platform/Value.h"

struct sd_bus;

namespace tallyd::bench {

class ServerProcess;

/// The program of BareServerMain.cpp.
class BareServer {
 public:
  BareServer();
  ~BareServer();

  [[nodiscard]] std::filesystem::path socket() const { return _folder.path() / "bus"; }
  [[nodiscard]] int id() const;

 private:
  fakes::TemporaryFolder _folder;
  std::unique_ptr<ServerProcess> _process;
};

/// A connection to either server; calls block. Throws std::system_error.
class BareClient {
 public:
  explicit BareClient(const std::filesystem::path& socketPath);
  ~BareClient();
  BareClient(const BareClient&) = delete;
  BareClient& operator=(const BareClient&) = delete;

  void fetchDisplayURL();
  /// @param payload  strings, integers, reals and booleans only.
  void sendMessage(const platform::Dictionary& payload);

 private:
  sd_bus* _bus = nullptr;
};

}  // namespace tallyd::bench
