// A device that exists only as the command line describes it.
#pragma once

#include <chrono>
#include <map>
#include <optional>
#include <string>

#include "platform/Clock.h"
#include "platform/Locale.h"
#include "platform/Platform.h"
#include "platform/Sandbox.h"
#include "platform/Settings.h"
#include "tally-storebag/Files.h"
#include "tally-storebag/Recorder.h"
#include "tally-storebag/StillQueues.h"

namespace tallyd::storebagtool {

/// What the daemon would find on the device. The texts are stand-ins, not this machine's.
struct DeviceDescription {
  std::optional<std::string> family = "desktop";
  std::optional<std::string> productType = "Generic1,1";
  std::optional<std::string> productVersion = "1.0";
  std::optional<std::string> buildVersion = "1A1";
  std::optional<std::string> hardwareModel;
  std::optional<std::string> serialNumber;
  std::optional<std::string> frameworkVersion = "7.0";
  std::string deviceID = std::string(40, '0');
  platform::UUIDBytes clientID{};  ///< Whatever the terms of consent.
  std::optional<std::string> countryCode;
  std::chrono::seconds timezoneOffset{0};
  bool consented = false;
  bool internal = false;
  std::optional<std::uint32_t> environmentType;
  std::optional<std::string> httpsPostURL;  ///< As the device's preferences give it.
  double samplingFactor = 0;
};

/// Gives `first` once, then `later`.
class SteppingClock final : public platform::Clock {
 public:
  void set(platform::TimePoint first, platform::TimePoint later) {
    _next = first;
    _later = later;
  }
  [[nodiscard]] platform::TimePoint now() const override { return std::exchange(_next, _later); }

 private:
  mutable platform::TimePoint _next;
  platform::TimePoint _later;
};

/// Everything that a device would give to the daemon. Threading: one thread.
class DescribedDevice {
 public:
  /// Keeps the public key as the framework's.
  DescribedDevice(const DeviceDescription& description, std::string publicKeyDER);
  ~DescribedDevice();
  DescribedDevice(const DescribedDevice&) = delete;
  DescribedDevice& operator=(const DescribedDevice&) = delete;

  [[nodiscard]] SteppingClock& clock();
  [[nodiscard]] StillQueues& queues();

  /// The device with these four in place of its own; they must outlive whoever takes the platform.
  [[nodiscard]] platform::Platform platformWith(platform::Log& log, platform::HTTPClient& http,
                                                platform::PowerLog& powerLog,
                                                platform::CodeBundles& codeBundles);

 private:
  struct Services;
  std::unique_ptr<Services> _services;
};

/// The device for one user of it, whose doings are recorded apart from all others'.
class RecordedPlatform {
 public:
  explicit RecordedPlatform(DescribedDevice& device)
      : _platform(device.platformWith(_log, _http, _powerLog, _codeBundles)) {}
  RecordedPlatform(const RecordedPlatform&) = delete;
  RecordedPlatform& operator=(const RecordedPlatform&) = delete;

  [[nodiscard]] const platform::Platform& platform() const { return _platform; }
  /// What was recorded since the last call.
  [[nodiscard]] Recorded take() { return std::exchange(_recorded, {}); }

 private:
  Recorded _recorded;
  RecordingLog _log{_recorded.lines};
  RecordingHTTPClient _http{_recorded.posts};
  RecordingPowerLog _powerLog{_recorded.powerEvents};
  RecordingCodeBundles _codeBundles{_recorded.adaptorCalls};
  platform::Platform _platform;
};

}  // namespace tallyd::storebagtool
