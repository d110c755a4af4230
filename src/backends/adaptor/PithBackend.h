// Hands messages to an adaptor out of the client's own code bundle.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/TallyBackend.h"

struct PithAdaptorClass;

namespace tallyd::platform {
class CodeBundle;
}

namespace tallyd {

/// Loads the bundle that belongs to the client type, makes one instance of its adaptor class
/// (framework/PithAdaptor.h) and calls it with every message. A bundle that can't be loaded and a class that
/// lacks something are no reason not to exist: each message then costs one error line.
///
/// Books: messages; one is sent when the adaptor has returned.
///
/// What the adaptor throws is caught and logged. Threading: the session's queue, which waits for the adaptor.
class PithBackend final : public TallyBackend {
 public:
  /// Null for a client type without a bundle (one error line).
  [[nodiscard]] static std::shared_ptr<PithBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily, std::int32_t clientType);
  /// For client type 0, which has no bundle: always null.
  [[nodiscard]] static std::shared_ptr<PithBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily);
  ~PithBackend() override;

  [[nodiscard]] std::string_view kind() const override { return "adaptor"; }
  using TallyBackend::sendMessage;
  /// Always nothing. Neither the timestamp nor the event ID is passed on.
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode, std::uint16_t eventID) override;

 private:
  using TallyBackend::TallyBackend;

  [[nodiscard]] bool loadAdaptor(std::int32_t clientType);
  void makeAdaptor();
  void forward(const Payload& payload, std::uint16_t method, std::uint16_t respCode,
               std::uint16_t eventID) const;
  /// "<PithAdaptor: ADDRESS>", or "(null)" without one.
  [[nodiscard]] std::string adaptorDescription() const;

  std::shared_ptr<platform::CodeBundle> _clientBundle;
  const PithAdaptorClass* _pithAdaptorClass = nullptr;  ///< Null when the bundle has none that is usable.
  void* _pithAdaptor = nullptr;                         ///< The class's; null when it made none.
};

}  // namespace tallyd
