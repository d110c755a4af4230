// A client program's connection to the daemon.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "framework/TallyConnectionOptions.h"
#include "framework/TallyReply.h"
#include "platform/Value.h"

namespace tallyd {

class OperationCalls;

/// One session with the daemon: the nine operations, each in two forms.
///
/// The asynchronous form returns at once, also while the daemon hangs or is away, and calls its completion
/// on the connection's own thread, once, with the value or an error; with an empty completion the call asks
/// for no answer and nobody hears what became of it. It returns false when the call is refused because too
/// many are unfinished; the completion is told the same. The synchronous form (…Sync) waits for the answer.
/// Either ends at the latest when its timeout is over: the given one, else the connection's.
///
/// A call that is under way when the connection breaks fails and is not sent again, since the daemon may have
/// heard it; one that waits still leaves with the next connection. With TallyReconnect::WhenLost that one is
/// made by itself, and before anything else the session is told again what it was told last: session info,
/// user info, frameworks, and to start. There is no need to repeat those calls, whatever became of them.
///
/// Life cycle: the session ends when the object is destroyed. The destructor lets what was called leave and
/// be answered, at most for TallyConnectionOptions::closeTimeout; the rest fails. When it returns every
/// completion has run. Nothing survives fork(2) in the child.
/// Threading: any thread; calls leave in the order in which they were made. Completions and handlers run one
/// at a time, hold up the connection while they run, and must not throw. They may make asynchronous calls;
/// synchronous ones fail there, and destroying the connection there is forbidden.
class TallyConnection {
 public:
  using Dictionary = platform::Dictionary;
  using Strings = std::vector<std::string>;
  using Timeout = std::optional<std::chrono::milliseconds>;
  template <class T>
  using Completion = std::function<void(TallyReply<T> reply)>;

  struct UploadLogDataResult {
    bool uploaded = false;
    std::optional<std::string> error;
  };

  static constexpr std::chrono::milliseconds kDefaultTimeout = TallyConnectionOptions::kDefaultTimeout;

  /// With TallyReconnect::WhenLost it touches nothing before it returns and the daemon need not be there yet.
  /// With TallyReconnect::Never it connects, waiting at most for the timeout while the daemon is too busy to
  /// take the connection, and throws std::system_error, naming the path, when it can't.
  explicit TallyConnection(const TallyConnectionOptions& options = {});
  /// One connection, which is not made again: TallyReconnect::Never, closing within the timeout.
  explicit TallyConnection(const std::filesystem::path& socketPath,
                           std::chrono::milliseconds timeout = kDefaultTimeout);
  ~TallyConnection();
  TallyConnection(const TallyConnection&) = delete;
  TallyConnection& operator=(const TallyConnection&) = delete;

  /// Called when the connection has broken and will be made again, each time. With TallyReconnect::Never:
  /// when it has broken within a message; invalidation follows.
  void setInterruptionHandler(std::function<void()> handler);
  /// Called once, when the connection is of no more use; at once when it is already. Not when this object is
  /// destroyed.
  void setInvalidationHandler(std::function<void()> handler);
  /// Called when a connection has been made again and the session is being configured as it was.
  void setReconnectionHandler(std::function<void()> handler);

  bool setSessionInfo(std::optional<Dictionary> sessionInfo, std::optional<Dictionary> userInfo,
                      Strings frameworksToCheck, Completion<std::string> completion, Timeout timeout = {});
  TallyReply<std::string> setSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                             std::optional<Dictionary> userInfo,
                                             Strings frameworksToCheck = {}, Timeout timeout = {});

  bool startConfig(Completion<std::optional<Strings>> completion, Timeout timeout = {});
  TallyReply<std::optional<Strings>> startConfigSync(Timeout timeout = {});

  bool fetchStates(std::optional<Dictionary> userInfo, Completion<std::optional<Strings>> completion,
                   Timeout timeout = {});
  TallyReply<std::optional<Strings>> fetchStatesSync(std::optional<Dictionary> userInfo,
                                                     Timeout timeout = {});

  bool fetchDisplayURL(Completion<std::string> completion, Timeout timeout = {});
  TallyReply<std::string> fetchDisplayURLSync(Timeout timeout = {});

  bool sendMessage(std::uint16_t category, std::uint16_t type, std::optional<Dictionary> payload,
                   Completion<std::optional<std::string>> completion, Timeout timeout = {});
  TallyReply<std::optional<std::string>> sendMessageSync(std::uint16_t category, std::uint16_t type,
                                                         std::optional<Dictionary> payload,
                                                         Timeout timeout = {});

  bool flushMessages(Completion<std::optional<std::string>> completion, Timeout timeout = {});
  TallyReply<std::optional<std::string>> flushMessagesSync(Timeout timeout = {});

  /// Opens the file and its folder at once and passes both along, so that the daemon can read it from within
  /// its sandbox.
  bool uploadFile(const std::filesystem::path& file, Completion<bool> completion, Timeout timeout = {});
  TallyReply<bool> uploadFileSync(const std::filesystem::path& file, Timeout timeout = {});

  bool uploadLogData(platform::Array logData, Completion<UploadLogDataResult> completion,
                     Timeout timeout = {});
  TallyReply<UploadLogDataResult> uploadLogDataSync(platform::Array logData, Timeout timeout = {});

  /// One message without a session of its own. The daemon gives no answer when `sessionInfo` lacks its
  /// identifiers: the call then runs into its timeout.
  bool sendMessageWithSessionInfo(std::optional<Dictionary> sessionInfo, std::optional<Dictionary> userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload, Completion<std::string> completion,
                                  Timeout timeout = {});
  TallyReply<std::string> sendMessageWithSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                                         std::optional<Dictionary> userInfo,
                                                         std::uint16_t category, std::uint16_t type,
                                                         std::optional<Dictionary> payload,
                                                         Timeout timeout = {});

 private:
  std::unique_ptr<OperationCalls> _calls;
};

}  // namespace tallyd
