// A client of the daemon that costs next to nothing: a socket, and calls as bytes.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd::test {

/// Whether a call asks for an answer.
enum class Answer { Wanted, NotWanted };

/// Calls of "com.quillon.tallyd.ClientSessionInterface" as a little-endian client writes them (D-Bus
/// Specification, "Message Format"). Dictionaries hold strings, integers, reals and booleans only.
namespace bus_calls {

/// What comes before the first call (D-Bus Specification, "Authentication Protocol").
[[nodiscard]] std::string authentication();
[[nodiscard]] std::string setSessionInfo(std::uint32_t serial, const platform::Dictionary& sessionInfo,
                                         const platform::Dictionary& userInfo, Answer answer);
/// A call without arguments: StartConfig, FlushMessages, FetchDisplayURL.
[[nodiscard]] std::string plain(std::uint32_t serial, std::string_view member, Answer answer);
[[nodiscard]] std::string sendMessage(std::uint32_t serial, std::uint16_t category, std::uint16_t type,
                                      const platform::Dictionary& payload, Answer answer);

}  // namespace bus_calls

/// One connection, without a thread; calls block.
///
/// Threading: one thread at a time. Throws std::runtime_error when the connection breaks or an answer does
/// not come within kPatience.
class BusClient {
 public:
  static constexpr std::chrono::seconds kPatience{60};

  /// Connects; says nothing yet.
  explicit BusClient(const std::filesystem::path& socketPath);

  void authenticate();
  /// A configured and started session.
  void startSession(const platform::Dictionary& sessionInfo, const platform::Dictionary& userInfo);
  void sendMessage(std::uint16_t category, std::uint16_t type, const platform::Dictionary& payload,
                   Answer answer);
  /// Calls a method without arguments and waits for the answer.
  void call(std::string_view member);

  /// Bytes as they are.
  void write(std::string_view bytes) const;
  /// Writes what is taken without waiting; how many bytes that was.
  [[nodiscard]] std::size_t writeSome(std::string_view bytes) const;
  /// Waits until there is room to write, or until this time has passed.
  void waitForRoom(std::chrono::milliseconds time) const;
  /// Waits for the answer of this call; an answer that is an error throws.
  void awaitAnswer(std::uint32_t serial);
  /// Waits until the daemon closes the connection; what it sent before is passed over. False after kPatience.
  [[nodiscard]] bool isClosedByDaemon() const;
  [[nodiscard]] std::uint32_t nextSerial() { return ++_serial; }
  void close() { _socket.reset(); }

 private:
  void readMore();

  platform::FileDescriptor _socket;
  std::string _received;
  std::uint32_t _serial = 0;
};

}  // namespace tallyd::test
