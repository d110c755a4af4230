// What every backend has and can be asked; most of it does nothing until a backend overrides it.
#pragma once

#include <sys/time.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"
#include "support/Account.h"

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

// Names under which a storebag lists its backends.
inline constexpr std::string_view kTallyBackendDashboard = "dashboard";
inline constexpr std::string_view kTallyBackendUploadServer = "upload_server";
inline constexpr std::string_view kTallyBackendHTTPPost = "splunk";
inline constexpr std::string_view kTallyBackendWattbook = "power";
inline constexpr std::string_view kTallyBackendPith = "pith";

enum ReportingState : std::int32_t {
  ReportingStatePending = 0,  ///< Not known yet.
  ReportingStateOff = 1,
  ReportingStateOn = 2,
};

/// One way out of the daemon for one session's messages.
///
/// Life cycle: made by the factory from a storebag's entry, configured through its setters, told to update
/// its state, given messages and flushes, cleaned up, dropped. Threading: the session's queue; `hierarchy`
/// may be read from anywhere. Work of its own a backend does on its own queues.
class TallyBackend {
 public:
  using Dictionary = platform::Dictionary;
  using Payload = std::optional<Dictionary>;
  using Result = std::optional<std::string>;  ///< What the message log and the client hear; nothing when
                                              ///< there is nothing.

  /// A backend of the kind that `name` stands for; null for an unknown name (one error line) and for what the
  /// kind itself refuses. Borrows the platform.
  [[nodiscard]] static std::shared_ptr<TallyBackend> newBackendWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily, std::int32_t clientType);
  virtual ~TallyBackend() = default;
  TallyBackend(const TallyBackend&) = delete;
  TallyBackend& operator=(const TallyBackend&) = delete;

  /// SHA-256 (FIPS 180-4) in lower-case hexadecimal over as many of the text's UTF-8 bytes as the text has
  /// UTF-16 units: the receiving side counts the same way.
  [[nodiscard]] static std::string convertIntoSHA256(std::string_view text);

  /// What the daemon's books call backends of this class, such as "https-post".
  [[nodiscard]] virtual std::string_view kind() const { return "other"; }
  /// Where this backend books what it takes and what becomes of it; one of its own unless set. Everything
  /// that is given to the backend ends in exactly one place of the account.
  [[nodiscard]] Account& account() const { return *_account; }
  /// Before the first message.
  virtual void setAccount(std::shared_ptr<Account> account) { _account = std::move(account); }

  /// From now on, consent that is withdrawn stops what needs it. Before the first message.
  virtual void recheckConsent() {}

  /// Called once, before the session drops the backend.
  virtual void cleanup() {}
  /// Takes "MAJOR.MINOR…"; each part is cut to 8 bits, a part that is no number is 0.
  void setSelfVersion(std::string_view version);
  /// Decides anew whether this backend reports.
  virtual void updateState() { _state = ReportingStateOn; }
  void setStartTimestamp(const timeval& timestamp);

  /// Numbers the message and passes it on to the five-argument form.
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode);
  virtual Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                             std::uint16_t respCode, std::uint16_t eventID);
  virtual Result flushMessages() { return std::nullopt; }
  /// Whether the file was sent. Blocks for the request.
  virtual bool uploadFileAtPath(std::string_view path, std::string_view extensionToken);
  /// Whether the data was accepted. Blocks for the request.
  virtual bool uploadLogData(const platform::Array& logData);
  virtual void setCorrelatedSessionID(const std::string& correlatedSessionID) {
    setCombinedSessionIDString(correlatedSessionID);
  }

  [[nodiscard]] std::int32_t state() const { return _state; }
  void setState(std::int32_t state) { _state = state; }
  [[nodiscard]] std::uint32_t sessionID() const { return _sessionID; }
  void setSessionID(std::uint32_t sessionID) { _sessionID = sessionID; }
  [[nodiscard]] const std::optional<std::string>& combinedSessionIDString() const {
    return _combinedSessionIDString;
  }
  void setCombinedSessionIDString(std::optional<std::string> value) {
    _combinedSessionIDString = std::move(value);
  }
  [[nodiscard]] std::int32_t hierarchy() const { return _hierarchy; }
  void setHierarchy(std::int32_t hierarchy) { _hierarchy = hierarchy; }
  [[nodiscard]] std::int32_t compType() const { return _compType; }
  void setCompType(std::int32_t compType) { _compType = compType; }
  [[nodiscard]] std::uint16_t clientVersion() const { return _clientVersion; }
  void setClientVersion(std::uint16_t clientVersion) { _clientVersion = clientVersion; }
  [[nodiscard]] const char* udid() const { return _udid; }
  /// Borrows the terminated text, which must outlive the backend.
  void setUdid(const char* udid) { _udid = udid; }
  [[nodiscard]] const std::string& name() const { return _name; }
  [[nodiscard]] const std::optional<std::string>& displayURL() const { return _displayURL; }
  [[nodiscard]] const std::optional<std::string>& productVersion() const { return _productVersion; }
  void setProductVersion(std::optional<std::string> value) { _productVersion = std::move(value); }
  [[nodiscard]] const std::optional<std::string>& buildVersion() const { return _buildVersion; }
  void setBuildVersion(std::optional<std::string> value) { _buildVersion = std::move(value); }
  [[nodiscard]] const std::optional<std::string>& hardwareType() const { return _hardwareType; }
  void setHardwareType(std::optional<std::string> value) { _hardwareType = std::move(value); }
  [[nodiscard]] const std::optional<std::string>& productFamily() const { return _productFamily; }
  [[nodiscard]] const Payload& userInfoDict() const { return _userInfoDict; }
  void setUserInfoDict(Payload userInfo) { _userInfoDict = std::move(userInfo); }
  [[nodiscard]] bool isInternal() const { return _isInternal; }
  void setIsInternal(bool isInternal) { _isInternal = isInternal; }
  [[nodiscard]] bool requireUserInfo() const { return _requireUserInfo; }
  void setRequireUserInfo(bool requireUserInfo) { _requireUserInfo = requireUserInfo; }
  [[nodiscard]] bool batchEvents() const { return _batchEvents; }
  void setBatchEvents(bool batchEvents) { _batchEvents = batchEvents; }
  [[nodiscard]] double samplingFactor() const { return _samplingFactor; }
  void setSamplingFactor(double samplingFactor) { _samplingFactor = samplingFactor; }
  [[nodiscard]] double startTimeStamp() const { return _startTimeStamp; }
  [[nodiscard]] std::uint8_t selfVersionMajor() const { return _selfVersionMajor; }
  [[nodiscard]] std::uint8_t selfVersionMinor() const { return _selfVersionMinor; }
  [[nodiscard]] std::uint16_t eventID() const { return _eventID; }

 protected:
  /// Draws the sampling factor. Borrows the platform.
  TallyBackend(const platform::Platform& platform, std::string_view name, Payload profile,
               std::optional<std::string> productFamily);

  const platform::Platform& _platform;
  std::shared_ptr<Account> _account = std::make_shared<Account>();
  const Payload _profile;
  const std::string _name;
  std::int32_t _state = ReportingStatePending;
  std::optional<std::string> _productVersion;
  std::optional<std::string> _buildVersion;
  std::optional<std::string> _hardwareType;
  const std::optional<std::string> _productFamily;
  double _startTimeStamp = 0;  ///< Seconds since 1970.
  std::uint32_t _sessionID = 0;
  std::optional<std::string> _combinedSessionIDString;
  std::atomic<std::int32_t> _hierarchy = 0;
  std::int32_t _compType = 0;
  std::uint16_t _clientVersion = 0;
  std::uint16_t _eventID = 0;  ///< Of the last message; wraps.
  std::uint8_t _selfVersionMajor = 0;
  std::uint8_t _selfVersionMinor = 0;
  bool _isInternal = false;
  bool _requireUserInfo = false;
  Payload _userInfoDict;
  bool _batchEvents = false;
  const char* _udid = "";
  std::optional<std::string> _displayURL;
  double _samplingFactor;
};

/// Seconds since 1970 with the microseconds as fraction.
[[nodiscard]] double secondsFromTimeval(const timeval& time);

/// The code of a client type (0 to 11) in records and log lines; empty for every other type.
[[nodiscard]] std::string_view codeForClientType(std::int32_t clientType);

}  // namespace tallyd
