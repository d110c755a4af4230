// Sends each message to a dashboard server as one UDP datagram.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/TallyBackend.h"

namespace tallyd::platform {
class DatagramSocket;
struct HTTPResult;
}  // namespace tallyd::platform

namespace tallyd {

class DatagramSender;

/// Builds a message's datagram and the line that stands for it, and uploads log data over HTTP.
///
/// Sending is fire-and-forget unless the profile asks for reliable delivery. At most 50 datagrams wait. The
/// socket, the timer and the queue outlive this object by what its datagrams still need: after cleanup() a
/// tick and 9.5 s, without it 21 ticks.
///
/// Books: datagrams, and log data that is uploaded. A datagram is sent when the network took it, with
/// reliable delivery when it was acknowledged; log data when the server has answered, with whatever status.
///
/// Threading: the session's queue; no message touches the network there. Uploads block it.
class DashboardBackend final : public TallyBackend {
 public:
  /// With the server that the profile names ("ip", "port"). Null, and one error line, when the profile names
  /// none or the server can't be connected to. Borrows the platform.
  [[nodiscard]] static std::shared_ptr<DashboardBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily);
  /// With the given server, and with reliable delivery. Null, and one error line, without a `serverIP`.
  [[nodiscard]] static std::shared_ptr<DashboardBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const std::optional<std::string>& serverIP,
      std::uint16_t serverPort, const std::optional<std::string>& productFamily);
  /// With the profile's server when there is a profile, else with the given one.
  [[nodiscard]] static std::shared_ptr<DashboardBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& serverIP, std::uint16_t serverPort,
      const std::optional<std::string>& productFamily);
  /// Lets the datagrams that wait run out.
  ~DashboardBackend() override;

  [[nodiscard]] std::string_view kind() const override { return "dashboard"; }
  void setAccount(std::shared_ptr<Account> account) override;
  void cleanup() override;
  using TallyBackend::sendMessage;
  /// The line for the message log.
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode, std::uint16_t eventID) override;
  /// Posts the data as a keyed archive and reports where the server put it as a message of its own.
  bool uploadLogData(const platform::Array& logData) override;

 private:
  DashboardBackend(const platform::Platform& platform, std::string_view name, const Payload& profile,
                   const std::optional<std::string>& productFamily,
                   std::unique_ptr<platform::DatagramSocket> socket);

  [[nodiscard]] bool startWithProfile();
  [[nodiscard]] bool startWithServer(const std::optional<std::string>& serverIP, std::uint16_t serverPort);
  /// Nothing, after a line in the log, when there is nothing to send or nowhere. Throws std::bad_alloc before
  /// anything was sent only.
  [[nodiscard]] std::optional<platform::HTTPResult> postLogData(const platform::Array& logData) const;
  void reportUpload(std::string_view location);

  const std::shared_ptr<DatagramSender> _sender;
  bool _usingProfile = false;
  std::optional<std::string> _postURL;
};

}  // namespace tallyd
