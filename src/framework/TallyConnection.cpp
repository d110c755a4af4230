#include "framework/TallyConnection.h"

#include <algorithm>
#include <future>
#include <utility>

#include "framework/ClientSessionInterface.h"
#include "framework/ClientValues.h"
#include "framework/LinkThread.h"
#include "platform/Sandbox.h"

namespace tallyd {

using client::arrayOf;
using client::wrapped;
using platform::Array;
using platform::FileDescriptor;
using platform::Value;
using std::chrono::milliseconds;

namespace {

TallyConnection::UploadLogDataResult readUpload(const client::Results& results) {
  return {results[0].booleanValue(), client::readOptionalText({results[1]})};
}

TallyConnectionOptions oneConnection(const std::filesystem::path& socketPath, milliseconds timeout) {
  TallyConnectionOptions options;
  options.socketPath = socketPath;
  options.timeout = timeout;
  options.closeTimeout = std::min(options.closeTimeout, timeout);
  options.reconnect = TallyReconnect::Never;
  return options;
}

}  // namespace

/// Turns operations into calls of the link.
class OperationCalls {
 public:
  template <class T>
  using Completion = TallyConnection::Completion<T>;
  using Timeout = TallyConnection::Timeout;

  explicit OperationCalls(const TallyConnectionOptions& options)
      : _timeout(options.timeout), _thread(options) {}

  ServiceLink& link() { return _thread.link(); }

  template <class T>
  bool make(ServiceRequest request, T (*read)(const client::Results&), Completion<T> completion,
            Timeout timeout) {
    ServiceCompletion translated;
    if (completion) {
      translated = [read, completion = std::move(completion)](ServiceReply reply) {
        TallyReply<T> answer;
        answer.kind = reply.kind;
        if (reply.kind == TallyError::None) {
          answer.value = read(reply.results);
        } else {
          answer.error = std::move(reply.error);
        }
        completion(std::move(answer));
      };
    }
    return link().submit(std::move(request), timeout.value_or(_timeout), std::move(translated));
  }

  /// Makes the asynchronous call and waits for its completion, which may come when nobody waits any more.
  template <class T, class Call>
  TallyReply<T> wait(Timeout timeout, Call&& call) {
    if (link().isOwnThread())
      return {
          "a synchronous call from a completion or handler would wait for itself", {}, TallyError::OwnThread};
    constexpr milliseconds kLongest{std::chrono::hours(24 * 365)};  // Beyond it times would overflow.
    const auto patience = std::min(timeout.value_or(_timeout), kLongest);
    const auto end = std::chrono::steady_clock::now() + patience;
    const auto promise = std::make_shared<std::promise<TallyReply<T>>>();
    auto answer = promise->get_future();
    call(Completion<T>([promise](TallyReply<T> reply) { promise->set_value(std::move(reply)); }));
    // The link gives up at the same time, and knows why.
    constexpr milliseconds kGrace{20};
    if (answer.wait_until(end + kGrace) != std::future_status::ready)
      return {noAnswerText(patience), {}, TallyError::TimedOut};
    return answer.get();
  }

 private:
  const milliseconds _timeout;
  LinkThread _thread;
};

TallyConnection::TallyConnection(const TallyConnectionOptions& options)
    : _calls(std::make_unique<OperationCalls>(options)) {}

TallyConnection::TallyConnection(const std::filesystem::path& socketPath, milliseconds timeout)
    : TallyConnection(oneConnection(socketPath, timeout)) {}

TallyConnection::~TallyConnection() = default;

void TallyConnection::setInterruptionHandler(std::function<void()> handler) {
  _calls->link().setHandler(ServiceLink::Handler::Interruption, std::move(handler));
}

void TallyConnection::setInvalidationHandler(std::function<void()> handler) {
  _calls->link().setHandler(ServiceLink::Handler::Invalidation, std::move(handler));
}

void TallyConnection::setReconnectionHandler(std::function<void()> handler) {
  _calls->link().setHandler(ServiceLink::Handler::Reconnection, std::move(handler));
}

bool TallyConnection::setSessionInfo(std::optional<Dictionary> sessionInfo,
                                     std::optional<Dictionary> userInfo, Strings frameworksToCheck,
                                     Completion<std::string> completion, Timeout timeout) {
  return _calls->make(
      {ClientSessionMethod::SetSessionInfo,
       {wrapped(std::move(sessionInfo)), wrapped(std::move(userInfo)), arrayOf(std::move(frameworksToCheck))},
       {}},
      client::readText, std::move(completion), timeout);
}

TallyReply<std::string> TallyConnection::setSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                                            std::optional<Dictionary> userInfo,
                                                            Strings frameworksToCheck, Timeout timeout) {
  return _calls->wait<std::string>(timeout, [&](auto completion) {
    setSessionInfo(std::move(sessionInfo), std::move(userInfo), std::move(frameworksToCheck),
                   std::move(completion), timeout);
  });
}

bool TallyConnection::startConfig(Completion<std::optional<Strings>> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::StartConfig, {}, {}}, client::readOptionalTexts,
                      std::move(completion), timeout);
}

TallyReply<std::optional<TallyConnection::Strings>> TallyConnection::startConfigSync(Timeout timeout) {
  return _calls->wait<std::optional<Strings>>(
      timeout, [&](auto completion) { startConfig(std::move(completion), timeout); });
}

bool TallyConnection::fetchStates(std::optional<Dictionary> userInfo,
                                  Completion<std::optional<Strings>> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::FetchStates, {wrapped(std::move(userInfo))}, {}},
                      client::readOptionalTexts, std::move(completion), timeout);
}

TallyReply<std::optional<TallyConnection::Strings>> TallyConnection::fetchStatesSync(
    std::optional<Dictionary> userInfo, Timeout timeout) {
  return _calls->wait<std::optional<Strings>>(
      timeout, [&](auto completion) { fetchStates(std::move(userInfo), std::move(completion), timeout); });
}

bool TallyConnection::fetchDisplayURL(Completion<std::string> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::FetchDisplayURL, {}, {}}, client::readText, std::move(completion),
                      timeout);
}

TallyReply<std::string> TallyConnection::fetchDisplayURLSync(Timeout timeout) {
  return _calls->wait<std::string>(timeout,
                                   [&](auto completion) { fetchDisplayURL(std::move(completion), timeout); });
}

bool TallyConnection::sendMessage(std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload,
                                  Completion<std::optional<std::string>> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::SendMessageWithCategory,
                       {Value(unsigned{category}), Value(unsigned{type}), wrapped(std::move(payload))},
                       {}},
                      client::readOptionalText, std::move(completion), timeout);
}

TallyReply<std::optional<std::string>> TallyConnection::sendMessageSync(std::uint16_t category,
                                                                        std::uint16_t type,
                                                                        std::optional<Dictionary> payload,
                                                                        Timeout timeout) {
  return _calls->wait<std::optional<std::string>>(timeout, [&](auto completion) {
    sendMessage(category, type, std::move(payload), std::move(completion), timeout);
  });
}

bool TallyConnection::flushMessages(Completion<std::optional<std::string>> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::FlushMessages, {}, {}}, client::readOptionalText,
                      std::move(completion), timeout);
}

TallyReply<std::optional<std::string>> TallyConnection::flushMessagesSync(Timeout timeout) {
  return _calls->wait<std::optional<std::string>>(
      timeout, [&](auto completion) { flushMessages(std::move(completion), timeout); });
}

bool TallyConnection::uploadFile(const std::filesystem::path& file, Completion<bool> completion,
                                 Timeout timeout) {
  const auto path = std::filesystem::absolute(file);
  auto grant = client::grantFor(path);
  Array placeholders(std::vector<Value>(grant.size()));
  return _calls->make(
      {ClientSessionMethod::UploadFileAtPath,
       {Value(client::fileURL(path.string())), Value(std::string(platform::kFileTokenPrefix) + path.string()),
        Value(std::move(placeholders))},
       std::move(grant)},
      client::readTruth, std::move(completion), timeout);
}

TallyReply<bool> TallyConnection::uploadFileSync(const std::filesystem::path& file, Timeout timeout) {
  return _calls->wait<bool>(timeout,
                            [&](auto completion) { uploadFile(file, std::move(completion), timeout); });
}

bool TallyConnection::uploadLogData(Array logData, Completion<UploadLogDataResult> completion,
                                    Timeout timeout) {
  return _calls->make({ClientSessionMethod::UploadLogData, {Value(std::move(logData))}, {}}, readUpload,
                      std::move(completion), timeout);
}

TallyReply<TallyConnection::UploadLogDataResult> TallyConnection::uploadLogDataSync(Array logData,
                                                                                    Timeout timeout) {
  return _calls->wait<UploadLogDataResult>(
      timeout, [&](auto completion) { uploadLogData(std::move(logData), std::move(completion), timeout); });
}

bool TallyConnection::sendMessageWithSessionInfo(std::optional<Dictionary> sessionInfo,
                                                 std::optional<Dictionary> userInfo, std::uint16_t category,
                                                 std::uint16_t type, std::optional<Dictionary> payload,
                                                 Completion<std::string> completion, Timeout timeout) {
  return _calls->make({ClientSessionMethod::SendMessageWithSessionInfo,
                       {wrapped(std::move(sessionInfo)), wrapped(std::move(userInfo)),
                        Value(unsigned{category}), Value(unsigned{type}), wrapped(std::move(payload))},
                       {}},
                      client::readText, std::move(completion), timeout);
}

TallyReply<std::string> TallyConnection::sendMessageWithSessionInfoSync(
    std::optional<Dictionary> sessionInfo, std::optional<Dictionary> userInfo, std::uint16_t category,
    std::uint16_t type, std::optional<Dictionary> payload, Timeout timeout) {
  return _calls->wait<std::string>(timeout, [&](auto completion) {
    sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), category, type,
                               std::move(payload), std::move(completion), timeout);
  });
}

}  // namespace tallyd
