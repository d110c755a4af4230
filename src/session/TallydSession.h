// The object that one client connection talks to.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Value.h"
#include "session/BackendSetup.h"
#include "session/Guarded.h"
#include "support/DeviceIdentity.h"

struct timeval;

namespace tallyd {

class MessageLog;
class SessionBook;
class TallydSessionDelegate;

/// Keeps a client's session info, owns the backends that its storebag makes, and hands every message to all
/// of them.
///
/// Life cycle: created with its connection, configured and started by its client; when the last reference
/// goes, after the connection's invalidation, it sends the stop record, flushes and cleans its backends up.
/// Threading: one call at a time, on the connection's queue; reply blocks are called before the operation
/// returns. What the agent reads of other sessions (`getSessionHierarchy`, `combinedSessionIDString`,
/// `sessionID`) may be read from anywhere.
class TallydSession : public std::enable_shared_from_this<TallydSession> {
 public:
  using Dictionary = platform::Dictionary;
  using Info = std::optional<Dictionary>;
  using Names = std::vector<std::string>;
  using Result = std::optional<std::string>;
  template <class... Arguments>
  using Reply = std::function<void(Arguments...)>;

  /// Borrows the delegate, the platform and the message log; all outlive every session. Without a book the
  /// session keeps one of its own.
  TallydSession(TallydSessionDelegate& sessionDelegate, const platform::Platform& platform,
                MessageLog& messageLog, BackendFactory newBackend = TallyBackend::newBackendWithName,
                std::shared_ptr<SessionBook> book = nullptr);
  ~TallydSession();
  TallydSession(const TallydSession&) = delete;
  TallydSession& operator=(const TallydSession&) = delete;

  // The client's operations. A reply that may be empty is not called then; the others must be there.

  void setSessionInfo(const Info& sessionInfo, const Info& userInfo, Names frameworksToCheck,
                      const Reply<std::string>& reply);
  /// Builds the backends. The handler, which may be empty, gets the names of those that report, or nothing
  /// without a storebag.
  void startConfigWithCompletionHandler(const Reply<std::optional<Names>>& handler);
  /// The handler may be empty.
  void fetchStatesWithUserInfo(const Info& userInfo, const Reply<std::optional<Names>>& completionHandler);
  void fetchDisplayURL(const Reply<std::string>& reply);
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, const Info& payload,
                               const Reply<Result>& reply);
  void flushMessagesWithReply(const Reply<Result>& reply);
  void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                        const Reply<bool>& completionHandler);
  void uploadLogData(const platform::Array& logData, const Reply<bool, Result>& completionHandler);
  /// The reply may be empty; it is not called when the session info lacks its identifiers.
  void sendMessageWithSessionInfo(const Info& sessionInfo, const Info& userInfo, std::uint16_t category,
                                  std::uint16_t type, const Info& payload, const Reply<std::string>& reply);

  // What the operations are made of.

  void createBackendsWithStorebag(const Dictionary& storebag);
  void updateReportingStates();
  /// Names of the backends that report; nothing without backends.
  [[nodiscard]] std::optional<Names> fetchReportingStates() const;
  void receivedUserInfo(const Info& userInfo);
  /// The "splunk" backend's hierarchy; 0 without one.
  [[nodiscard]] std::int32_t getSessionHierarchy() const;
  Result sendMessageWithCategory(std::uint16_t category, std::uint16_t type, const Info& payload);
  void internalSendMessage(const Info& payload, const timeval& timestamp, std::uint16_t method,
                           std::uint16_t respCode);
  Result flushMessages();
  void uploadFileWithURL(const std::string& url, const std::string& extensionToken,
                         const Reply<bool>& completionHandler);
  /// Sends one message through backends of its own that live for this call only; their accounts are in
  /// `book`, if there is one.
  static void sendMessageWithSessionInfo(const platform::Platform& platform, MessageLog& messageLog,
                                         const Info& sessionInfo, const Info& userInfo, const Info& storebag,
                                         std::uint16_t category, std::uint16_t type, const Info& payload,
                                         const BackendFactory& newBackend = TallyBackend::newBackendWithName,
                                         SessionBook* book = nullptr);

  [[nodiscard]] std::uint32_t sessionID() const { return _sessionID; }
  void setSessionID(std::uint32_t sessionID) { _sessionID = sessionID; }
  [[nodiscard]] std::string combinedSessionIDString() const { return _combinedSessionIDString.copy(); }
  void setCombinedSessionIDString(std::string value) { _combinedSessionIDString.set(std::move(value)); }
  [[nodiscard]] const Info& userInfo() const { return _userInfo; }
  [[nodiscard]] const Info& sessionInfo() const { return _sessionInfo; }
  [[nodiscard]] std::string description() const;

 private:
  using SharedBackends = std::shared_ptr<const BackendSet>;  ///< Null until the session is started.

  /// Tells the book who the session is now.
  void describeInBook() const;
  bool userInfoChanged(const Dictionary& userInfo) const;
  Info startRecordPayload() const;
  void sendInternally(TallyBackend& backend, const Info& payload, const timeval& timestamp,
                      std::uint16_t method, std::uint16_t respCode);
  Result flush(TallyBackend& backend);
  void sendStopRecord(const BackendSet* backends);
  /// The end of a session is nobody's call: what throws is left out, after a line in the log.
  template <class Step>
  void atEnd(std::string_view what, const Step& step) const;

  const platform::Platform& _platform;
  MessageLog& _messageLog;
  const BackendFactory _newBackend;
  const std::shared_ptr<SessionBook> _book;
  std::atomic<std::uint32_t> _sessionID = 0;
  Info _sessionInfo;
  Info _userInfo;
  Names _frameworks;
  Guarded<SharedBackends> _backends;
  TallydSessionDelegate& _sessionDelegate;
  Guarded<std::string> _combinedSessionIDString;
  DeviceIDBuffer _deviceid{};
};

}  // namespace tallyd
