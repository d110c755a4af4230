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

#include "platform/Value.h"

namespace tallyd {

/// What came back: an error (the call did not get an answer; the text says why), or the value.
template <class T>
struct TallyReply {
  std::optional<std::string> error;
  T value{};
};

/// One session with the daemon: the nine operations, each in two forms.
///
/// The asynchronous form returns at once and calls its completion on the connection's own thread, once; with
/// an empty completion the call asks for no answer. The synchronous form (…Sync) waits for the answer, at
/// most for the timeout.
///
/// Life cycle: connects at construction; the session ends when the object is destroyed, after what was sent
/// has left. When the daemon goes away every call under way fails and the invalidation handler runs.
/// Threading: any thread; calls leave in the order in which they were made. Handlers and completions must not
/// destroy the connection.
class TallyConnection {
 public:
  using Dictionary = platform::Dictionary;
  using Strings = std::vector<std::string>;
  template <class T>
  using Completion = std::function<void(TallyReply<T> reply)>;

  struct UploadLogDataResult {
    bool uploaded = false;
    std::optional<std::string> error;
  };

  static constexpr std::chrono::milliseconds kDefaultTimeout{
      60'000};  ///< Longer than a storebag fetch or an upload's stall.

  /// Connects to the daemon's socket. Throws std::system_error, naming the path, when it can't.
  explicit TallyConnection(const std::filesystem::path& socketPath,
                           std::chrono::milliseconds timeout = kDefaultTimeout);
  ~TallyConnection();
  TallyConnection(const TallyConnection&) = delete;
  TallyConnection& operator=(const TallyConnection&) = delete;

  /// Called on the connection's thread when the connection breaks within a message; invalidation follows.
  void setInterruptionHandler(std::function<void()> handler);
  /// Called on the connection's thread once, when the connection is of no more use; not when this object is
  /// destroyed.
  void setInvalidationHandler(std::function<void()> handler);

  void setSessionInfo(std::optional<Dictionary> sessionInfo, std::optional<Dictionary> userInfo,
                      Strings frameworksToCheck, Completion<std::string> completion);
  TallyReply<std::string> setSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                             std::optional<Dictionary> userInfo,
                                             Strings frameworksToCheck = {});

  void startConfig(Completion<std::optional<Strings>> completion);
  TallyReply<std::optional<Strings>> startConfigSync();

  void fetchStates(std::optional<Dictionary> userInfo, Completion<std::optional<Strings>> completion);
  TallyReply<std::optional<Strings>> fetchStatesSync(std::optional<Dictionary> userInfo);

  void fetchDisplayURL(Completion<std::string> completion);
  TallyReply<std::string> fetchDisplayURLSync();

  void sendMessage(std::uint16_t category, std::uint16_t type, std::optional<Dictionary> payload,
                   Completion<std::optional<std::string>> completion);
  TallyReply<std::optional<std::string>> sendMessageSync(std::uint16_t category, std::uint16_t type,
                                                         std::optional<Dictionary> payload);

  void flushMessages(Completion<std::optional<std::string>> completion);
  TallyReply<std::optional<std::string>> flushMessagesSync();

  /// Opens the file and its folder and passes both along, so that the daemon can read it from within its
  /// sandbox.
  void uploadFile(const std::filesystem::path& file, Completion<bool> completion);
  TallyReply<bool> uploadFileSync(const std::filesystem::path& file);

  void uploadLogData(platform::Array logData, Completion<UploadLogDataResult> completion);
  TallyReply<UploadLogDataResult> uploadLogDataSync(platform::Array logData);

  /// One message without a session of its own. The daemon gives no answer when `sessionInfo` lacks its
  /// identifiers: the synchronous form then runs into its timeout.
  void sendMessageWithSessionInfo(std::optional<Dictionary> sessionInfo, std::optional<Dictionary> userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload, Completion<std::string> completion);
  TallyReply<std::string> sendMessageWithSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                                         std::optional<Dictionary> userInfo,
                                                         std::uint16_t category, std::uint16_t type,
                                                         std::optional<Dictionary> payload);

 private:
  class Channel;
  std::unique_ptr<Channel> _channel;
};

}  // namespace tallyd
