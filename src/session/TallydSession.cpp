#include "session/TallydSession.h"

#include "backends/TallyBackend.h"
#include "framework/Tally.h"
#include "framework/TallyKeys.h"
#include "platform/Base64.h"
#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Randomness.h"
#include "session/TallydSessionDelegate.h"
#include "support/SessionBook.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;
using platform::Value;

namespace {

constexpr std::uint16_t kInternalMethod = 0;
constexpr std::uint16_t kSessionStart = 0;
constexpr std::uint16_t kSessionStop = 1;

std::string newSessionKey(platform::Randomness& randomness) {
  const platform::UUIDBytes uuid = randomness.uuid();
  return platform::base64Encoded({reinterpret_cast<const char*>(uuid.data()), uuid.size()});
}

std::uint32_t sessionIDOf(const TallydSession::Info& sessionInfo) {
  if (!sessionInfo) return 0;
  return static_cast<std::uint32_t>(sessionInfo->integer(kTallySessionInfoSessionID).value_or(0));
}

}  // namespace

TallydSession::TallydSession(TallydSessionDelegate& sessionDelegate, const platform::Platform& platform,
                             MessageLog& messageLog, BackendFactory newBackend,
                             std::shared_ptr<SessionBook> book)
    : _platform(platform),
      _messageLog(messageLog),
      _newBackend(std::move(newBackend)),
      _book(book ? std::move(book) : std::make_shared<SessionBook>()),
      _sessionDelegate(sessionDelegate) {
  asl_log(_platform.log, LogLevel::Debug, "TallydSession initWithSessionDelegate:{}",
          sessionDelegate.description());
  copyUniqueDeviceID(_platform, _deviceid);
  const std::string key = newSessionKey(_platform.randomness);
  _combinedSessionIDString.set(key);
  asl_log(_platform.log, LogLevel::Debug, "Initialized session with UUID {}", key);
}

TallydSession::~TallydSession() {
  asl_log(_platform.log, LogLevel::Debug, "TallydSession dealloc: {}", sessionID());
  const auto backends = _backends.copy();
  atEnd("stop record", [this, &backends] { sendStopRecord(backends.get()); });
  if (backends) {
    for (const auto& [name, backend] : *backends) atEnd("flush", [this, &each = *backend] { flush(each); });
    for (const auto& [name, backend] : *backends) atEnd("clean-up", [&each = *backend] { each.cleanup(); });
  } else {
    asl_log(_platform.log, LogLevel::Debug, "No backends available to send message");
  }
  _backends.set(nullptr);  // They refer to the device ID, which goes with the members.
}

template <class Step>
void TallydSession::atEnd(std::string_view what, const Step& step) const {
  try {
    step();
  } catch (const std::exception& exception) {
    asl_log(_platform.log, LogLevel::Critical, "TallydSession: {} of session {} left out: {}", what,
            sessionID(), exception.what());
  }
}

void TallydSession::sendStopRecord(const BackendSet* backends) {
  const timeval now = _platform.clock.timeOfDay();
  Dictionary record;
  if (const auto version = _sessionDelegate.storebagVersionForSession(*this))
    record.set("StorebagVersion", *version);
  if (!backends) return;
  for (const auto& [name, backend] : *backends) {
    atEnd("stop record", [this, &each = *backend, &record, &now] {
      sendInternally(each, record, now, kInternalMethod, kSessionStop);
    });
  }
}

void TallydSession::setSessionInfo(const Info& sessionInfo, const Info& userInfo, Names frameworksToCheck,
                                   const Reply<std::string>& reply) {
  setSessionID(sessionIDOf(sessionInfo));
  asl_log(_platform.log, LogLevel::Debug, "Configuring session {}", sessionID());
  if (userInfo && !(sessionInfo && sessionInfo->boolean(kTallySessionInfoRequireUserInfo))) {
    asl_log(_platform.log, LogLevel::Warning, "Configure session: user info provided without requiring it");
  }
  _sessionInfo = sessionInfo;
  _frameworks = std::move(frameworksToCheck);
  receivedUserInfo(userInfo);
  reply("received");
}

void TallydSession::startConfigWithCompletionHandler(const Reply<std::optional<Names>>& handler) {
  asl_log(_platform.log, LogLevel::Debug, "Starting configuration for session {}", sessionID());
  std::optional<Names> states;
  if (const auto storebag = _sessionDelegate.storebagForSession(*this)) {
    createBackendsWithStorebag(*storebag);
    receivedUserInfo(_userInfo);
    states = fetchReportingStates();
  }
  if (handler) handler(std::move(states));
}

void TallydSession::fetchStatesWithUserInfo(const Info& userInfo,
                                            const Reply<std::optional<Names>>& completionHandler) {
  asl_log(_platform.log, LogLevel::Debug, "Fetching states for session {}", sessionID());
  receivedUserInfo(userInfo);
  auto states = fetchReportingStates();
  if (completionHandler) completionHandler(std::move(states));
}

void TallydSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type, const Info& payload,
                                            const Reply<Result>& reply) {
  asl_log(_platform.log, LogLevel::Debug, "Sending message for session {}", sessionID());
  reply(sendMessageWithCategory(category, type, payload));
}

void TallydSession::flushMessagesWithReply(const Reply<Result>& reply) {
  asl_log(_platform.log, LogLevel::Debug, "Flushing messages for session {}", sessionID());
  reply(flushMessages());
}

void TallydSession::uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                                     const Reply<bool>& completionHandler) {
  asl_log(_platform.log, LogLevel::Debug, "Uploading file for session {}", sessionID());
  uploadFileWithURL(fileURL, extensionToken, completionHandler);
}

void TallydSession::sendMessageWithSessionInfo(const Info& sessionInfo, const Info& userInfo,
                                               std::uint16_t category, std::uint16_t type,
                                               const Info& payload, const Reply<std::string>& reply) {
  if (!sessionInfo || !sessionInfo->contains(kTallySessionInfoClientType) ||
      !sessionInfo->contains(kTallySessionInfoSessionID)) {
    asl_log(_platform.log, LogLevel::Critical, "Could not retrieve identifiers from sessionInfo");
    _book->messages().dropNew(DropReason::NoSessionInfo, 1, MessageNumbers{category});
    return;
  }
  setSessionID(sessionIDOf(sessionInfo));
  _sessionInfo = sessionInfo;
  receivedUserInfo(userInfo);
  asl_log(_platform.log, LogLevel::Debug, "Sending message with session info for session {}", sessionID());
  const auto storebag = _sessionDelegate.storebagForSession(*this);
  if (storebag) {
    sendMessageWithSessionInfo(_platform, _messageLog, sessionInfo, userInfo, storebag, category, type,
                               payload, _newBackend, _book.get());
  } else {
    _book->messages().dropNew(DropReason::NoStorebag, 1, MessageNumbers{category});
  }
  if (reply) reply(storebag ? "finished" : "storebag not available");
}

void TallydSession::createBackendsWithStorebag(const Dictionary& storebag) {
  asl_log(_platform.log, LogLevel::Debug, "Creating backends for session {}", sessionID());
  const timeval now = _platform.clock.timeOfDay();
  const Info startRecord = startRecordPayload();
  auto created = createBackendsFromStorebag(_platform, storebag, _sessionInfo, _userInfo, _deviceid.data(),
                                            _newBackend, _book.get());
  const SharedBackends backends = created ? std::make_shared<const BackendSet>(std::move(*created)) : nullptr;
  _backends.set(backends);
  if (backends) {
    for (const auto& [name, backend] : *backends)
      backend->setCombinedSessionIDString(combinedSessionIDString());
  }
  internalSendMessage(startRecord, now, kInternalMethod, kSessionStart);
}

void TallydSession::describeInBook() const {
  const auto clientType = _sessionInfo ? _sessionInfo->integer(kTallySessionInfoClientType) : std::nullopt;
  const auto clientName = _userInfo ? _userInfo->string(kTallyUserInfoClientName) : std::nullopt;
  _book->describe(sessionID(), static_cast<std::int32_t>(clientType.value_or(0)), clientName.value_or(""));
}

TallydSession::Info TallydSession::startRecordPayload() const {
  if (!isInternalBuild(_platform)) return std::nullopt;
  const auto orUnknown = [](std::optional<std::string> text) {
    return Value(std::move(text).value_or("Unknown"));
  };
  return Dictionary{
      {"SerialNum", orUnknown(deviceSerialNumber(_platform))},
      {"Version", orUnknown(deviceProductVersion(_platform))},
      {"Build", orUnknown(deviceBuildVersion(_platform))},
      {"Hardware", orUnknown(deviceHardwareModel(_platform))},
      {"Product", orUnknown(deviceName(_platform))},
      {"ReportVers", Tally(_platform).bundleVersion().value_or(std::string(kDefaultReportingVersion))},
  };
}

std::string TallydSession::description() const {
  return fmt::format("<TallydSession: {}>", fmt::ptr(static_cast<const void*>(this)));
}

}  // namespace tallyd
