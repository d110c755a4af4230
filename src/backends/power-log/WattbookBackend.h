// Records messages as events of the system's power log.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/TallyBackend.h"

namespace tallyd {

/// Hands each message that has a method and a payload to the power log: the payload with the method, the
/// response code and the event ID on top. Needs no profile and keeps nothing.
///
/// Books: records; one is sent when the power log has it, and dropped when the log says that it has not.
/// Threading: the session's queue, which waits for the power log's disk.
class WattbookBackend final : public TallyBackend {
 public:
  static constexpr std::int32_t kEventNumber = 28;  ///< Under which the power log knows these events.
  static constexpr std::string_view kEventName = "StagehostD-RTC";

  [[nodiscard]] static std::shared_ptr<WattbookBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily);

  [[nodiscard]] std::string_view kind() const override { return "power-log"; }
  using TallyBackend::sendMessage;
  /// Always nothing.
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode, std::uint16_t eventID) override;

 private:
  using TallyBackend::TallyBackend;
};

}  // namespace tallyd
