// A device on which nothing that an input says reaches a file or the network.
#pragma once

#include <unistd.h>

#include <cerrno>
#include <memory>
#include <span>

#include "fakes/FakePlatform.h"
#include "platform/DatagramSocket.h"

namespace tallyd::fuzz {

/// Takes every datagram and hears nothing.
class MuteSockets final : public platform::DatagramSockets {
 public:
  std::unique_ptr<platform::DatagramSocket> makeSocket() override { return std::make_unique<Socket>(); }

 private:
  class Socket final : public platform::DatagramSocket {
   public:
    int bindToAnyPort() override { return 0; }
    int connect(const sockaddr_in& server) override {
      return server.sin_addr.s_addr == INADDR_NONE ? EACCES : 0;
    }
    bool send(std::string_view) override { return true; }
    std::size_t receive(std::span<char>) override { return 0; }
    [[nodiscard]] int descriptor() const override { return -1; }  // poll(2) passes it over.
  };
};

/// Opens no file by its path.
class BlindSandbox final : public fakes::FakeSandbox {
 public:
  platform::FileDescriptor openForReading(std::string_view) override {
    errno = EACCES;
    return {};
  }
};

struct ClosedPlatform {
  fakes::FakePlatform fake;
  BlindSandbox sandbox;
  MuteSockets sockets;
  platform::Platform platform{
      fake.root,     fake.log,         fake.clock,    fake.randomness, fake.locale,          fake.queues,
      fake.http,     fake.preferences, fake.defaults, fake.device,     fake.frameworkBundle, sandbox,
      fake.powerLog, fake.codeBundles, fake.process,  sockets};
};

}  // namespace tallyd::fuzz
