// How messages, flushes and uploads reach a session's backends.

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"
#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "session/FileURL.h"
#include "session/TallydSession.h"
#include "support/MessageLog.h"
#include "support/SessionBook.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

/// Writes what a backend reported to the message log, under the operation's name.
void writeResult(MessageLog& messageLog, const TallyBackend& backend, std::string_view operation,
                 const TallyBackend::Result& result) {
  if (result) messageLog.writeMessageLog("[{} -> {}] {}", backend.name(), operation, *result);
}

/// The client hears the HTTPS post backend's text, else the dashboard's, whichever comes first.
void applyPrecedence(std::optional<std::string>& chosen, const TallyBackend& backend,
                     TallyBackend::Result result) {
  if (backend.name() == kTallyBackendHTTPPost) {
    if (result) chosen = std::move(result);
  } else if (backend.name() == kTallyBackendDashboard && !chosen) {
    chosen = std::move(result);
  }
}

/// Books a message or an upload that is about to be given to the backends.
void bookOffer(Account& account, const BackendSet* backends,
               const std::optional<MessageNumbers>& numbers = {}) {
  if (backends && !backends->empty()) return account.send();
  account.dropNew(DropReason::NoBackends, 1, numbers);
}

}  // namespace

TallydSession::Result TallydSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                             const Info& payload) {
  const auto backends = _backends.copy();
  bookOffer(_book->messages(), backends.get(), MessageNumbers{category});
  if (!backends) {
    asl_log(_platform.log, LogLevel::Debug, "No backends available to send message");
    return std::nullopt;
  }
  const timeval now = _platform.clock.timeOfDay();
  Result chosen;
  for (const auto& [name, backend] : *backends) {
    auto result = backend->sendMessage(payload, now, category, type);
    writeResult(_messageLog, *backend, "sendMessageWithCategory", result);
    applyPrecedence(chosen, *backend, std::move(result));
  }
  return chosen;
}

void TallydSession::internalSendMessage(const Info& payload, const timeval& timestamp, std::uint16_t method,
                                        std::uint16_t respCode) {
  const auto backends = _backends.copy();
  if (!backends) return;
  for (const auto& [name, backend] : *backends)
    sendInternally(*backend, payload, timestamp, method, respCode);
}

void TallydSession::sendInternally(TallyBackend& backend, const Info& payload, const timeval& timestamp,
                                   std::uint16_t method, std::uint16_t respCode) {
  writeResult(_messageLog, backend, "internalSendMessage",
              backend.sendMessage(payload, timestamp, method, respCode));
  asl_log(_platform.log, LogLevel::Debug, "Sent internal message (method:{} respCode:{})", method, respCode);
}

TallydSession::Result TallydSession::flushMessages() {
  const auto backends = _backends.copy();
  if (!backends) {
    asl_log(_platform.log, LogLevel::Debug, "No backends available to send message");
    return std::nullopt;
  }
  Result chosen;
  for (const auto& [name, backend] : *backends) applyPrecedence(chosen, *backend, flush(*backend));
  return chosen;
}

TallydSession::Result TallydSession::flush(TallyBackend& backend) {
  auto result = backend.flushMessages();
  writeResult(_messageLog, backend, "flushMessages", result);
  return result;
}

void TallydSession::uploadFileWithURL(const std::string& url, const std::string& extensionToken,
                                      const Reply<bool>& completionHandler) {
  const std::string path = pathOfFileURL(url);
  bool uploaded = false;
  const auto backends = _backends.copy();
  bookOffer(_book->uploads(), backends.get());
  if (backends) {
    for (const auto& [name, backend] : *backends) {
      uploaded = backend->uploadFileAtPath(path, extensionToken) || uploaded;
    }
  }
  if (uploaded) {
    asl_log(_platform.log, LogLevel::Debug, "File upload successful for {}", path);
  } else {
    asl_log(_platform.log, LogLevel::Critical, "File upload failed for {}", path);
  }
  _messageLog.writeMessageLog("[uploadFileWithURL] Upload {} for file {}", uploaded ? "succeeded" : "failed",
                              url);
  completionHandler(uploaded);
}

void TallydSession::uploadLogData(const platform::Array& logData,
                                  const Reply<bool, Result>& completionHandler) {
  if (_platform.log.takes(LogLevel::Debug)) {
    asl_log(_platform.log, LogLevel::Debug, "TallydSession: Uploading log data array: {}",
            platform::Value(logData).description());
  }
  bool uploaded = false;
  const auto backends = _backends.copy();
  bookOffer(_book->uploads(), backends.get());
  if (backends) {
    for (const auto& [name, backend] : *backends) uploaded = backend->uploadLogData(logData) || uploaded;
  }
  if (uploaded) {
    asl_log(_platform.log, LogLevel::Debug, "Log data array upload successful");
  } else {
    asl_log(_platform.log, LogLevel::Critical, "Log data array upload failed");
  }
  completionHandler(uploaded, std::nullopt);
}

void TallydSession::sendMessageWithSessionInfo(const platform::Platform& platform, MessageLog& messageLog,
                                               const Info& sessionInfo, const Info& userInfo,
                                               const Info& storebag, std::uint16_t category,
                                               std::uint16_t type, const Info& payload,
                                               const BackendFactory& newBackend, SessionBook* book) {
  asl_log(platform.log, LogLevel::Debug, "TallydSession: Sending single message with sessionID {}",
          sessionInfo ? sessionInfo->integer(kTallySessionInfoSessionID).value_or(0) : 0);
  if (!storebag || !sessionInfo) {
    asl_log(platform.log, LogLevel::Critical,
            "TallydSession: Attempted to send message with one or more nil parameters");
    return;
  }
  DeviceIDBuffer deviceID{};
  copyUniqueDeviceID(platform, deviceID);
  const auto backends = createBackendsFromStorebag(platform, storebag, sessionInfo, userInfo, deviceID.data(),
                                                   newBackend, book);
  if (!backends) {
    asl_log(platform.log, LogLevel::Critical, "TallydSession: No backends available to send single message");
    return;
  }
  if (userInfo && !sessionInfo->boolean(kTallySessionInfoRequireUserInfo)) {
    asl_log(platform.log, LogLevel::Warning,
            "sendMessageWithSessionInfo: user info provided without requiring it.");
  }
  if (book) bookOffer(book->messages(), &*backends, MessageNumbers{category});
  const timeval now = platform.clock.timeOfDay();
  for (const auto& [name, backend] : *backends) {
    backend->updateState();
    writeResult(messageLog, *backend, "sendMessageWithSessionInfo",
                backend->sendMessage(payload, now, category, type));
  }
  for (const auto& [name, backend] : *backends) backend->cleanup();
}

}  // namespace tallyd
