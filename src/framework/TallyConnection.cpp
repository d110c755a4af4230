#include "framework/TallyConnection.h"

#include <fcntl.h>
#include <fmt/format.h>

#include <future>
#include <utility>

#include "framework/ClientSessionInterface.h"
#include "platform/Sandbox.h"
#include "platform/ipc/SdBusClientConnection.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd {

using platform::Array;
using platform::FileDescriptor;
using platform::SdBusClientConnection;
using platform::Value;

namespace {

using Results = std::vector<Value>;

constexpr std::chrono::seconds kPatienceAtTheEnd{5};  ///< For what was sent to leave.

/// "Nothing" is an empty array, a value its only element.
template <class T>
Value wrapped(std::optional<T> value) {
  return value ? Value(Array{Value(std::move(*value))}) : Value(Array());
}

const Value* unwrapped(const Value& wrapper) {
  const auto* array = wrapper.array();
  return array && !array->empty() ? array->begin() : nullptr;
}

TallyConnection::Strings stringsOf(const Value& value) {
  TallyConnection::Strings strings;
  if (const auto* array = value.array()) {
    for (const Value& each : *array) strings.emplace_back(each.string().value_or(""));
  }
  return strings;
}

Value arrayOf(TallyConnection::Strings strings) {
  std::vector<Value> values;
  values.reserve(strings.size());
  for (auto& each : strings) values.emplace_back(std::move(each));
  return Value(Array(std::move(values)));
}

// How each kind of result is read; the types of the answer have been checked.

std::string readText(const Results& results) { return std::string(results[0].string().value_or("")); }

std::optional<std::string> readOptionalText(const Results& results) {
  const auto* text = unwrapped(results[0]);
  if (!text) return std::nullopt;
  return std::string(text->string().value_or(""));
}

std::optional<TallyConnection::Strings> readOptionalTexts(const Results& results) {
  const auto* texts = unwrapped(results[0]);
  if (!texts) return std::nullopt;
  return stringsOf(*texts);
}

bool readTruth(const Results& results) { return results[0].booleanValue(); }

TallyConnection::UploadLogDataResult readUpload(const Results& results) {
  return {results[0].booleanValue(), readOptionalText({results[1]})};
}

/// "file://" and the absolute path, escaped by the rules for a URL's path (RFC 3986, section 3.3).
std::string fileURL(const std::string& absolutePath) {
  constexpr std::string_view kUnescaped =
      "/-._~ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
  std::string url = "file://";
  for (const char byte : absolutePath) {
    if (kUnescaped.find(byte) != std::string_view::npos) {
      url.push_back(byte);
    } else {
      url += fmt::format("%{:02X}", static_cast<unsigned char>(byte));
    }
  }
  return url;
}

/// The file and its folder, or nothing when either cannot be opened.
std::vector<FileDescriptor> grantFor(const std::filesystem::path& file) {
  std::vector<FileDescriptor> grant;
  grant.emplace_back(::open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  grant.emplace_back(::open(file.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!grant[0] || !grant[1]) grant.clear();
  return grant;
}

}  // namespace

/// The connection and the thread that serves it.
class TallyConnection::Channel {
 public:
  Channel(const std::filesystem::path& socketPath, std::chrono::milliseconds timeout)
      : _timeout(timeout),
        _queues(1),
        _connection(SdBusClientConnection::connect(socketPath, clientSessionInterface(), _queues)) {}
  ~Channel() { _connection->close(kPatienceAtTheEnd); }
  Channel(const Channel&) = delete;
  Channel& operator=(const Channel&) = delete;

  SdBusClientConnection& connection() { return *_connection; }

  template <class T>
  void call(ClientSessionMethod method, std::vector<Value> arguments, T (*read)(const Results&),
            Completion<T> completion, std::vector<FileDescriptor> descriptors = {}) {
    SdBusClientConnection::Completion translated;
    if (completion) {
      translated = [read, completion = std::move(completion)](SdBusClientConnection::Reply reply) {
        TallyReply<T> answer{std::move(reply.error), {}};
        if (!answer.error) answer.value = read(reply.results);
        completion(std::move(answer));
      };
    }
    _connection->call({static_cast<std::size_t>(method), std::move(arguments), std::move(descriptors)},
                      _timeout, std::move(translated));
  }

  /// Makes the asynchronous call and waits for its completion.
  template <class T, class Call>
  TallyReply<T> wait(Call&& call) {
    const auto promise = std::make_shared<std::promise<TallyReply<T>>>();
    auto answer = promise->get_future();
    call(Completion<T>([promise](TallyReply<T> reply) { promise->set_value(std::move(reply)); }));
    // The call itself gives up a little earlier, except where the service does not even take it.
    constexpr std::chrono::milliseconds kGrace{500};
    if (answer.wait_for(_timeout + kGrace) != std::future_status::ready)
      return {"the service does not answer", {}};
    return answer.get();
  }

 private:
  const std::chrono::milliseconds _timeout;
  platform::AsioQueues _queues;
  const std::shared_ptr<SdBusClientConnection> _connection;
};

TallyConnection::TallyConnection(const std::filesystem::path& socketPath, std::chrono::milliseconds timeout)
    : _channel(std::make_unique<Channel>(socketPath, timeout)) {}

TallyConnection::~TallyConnection() = default;

void TallyConnection::setInterruptionHandler(std::function<void()> handler) {
  _channel->connection().setInterruptionHandler(std::move(handler));
}

void TallyConnection::setInvalidationHandler(std::function<void()> handler) {
  _channel->connection().setInvalidationHandler(std::move(handler));
}

void TallyConnection::setSessionInfo(std::optional<Dictionary> sessionInfo,
                                     std::optional<Dictionary> userInfo, Strings frameworksToCheck,
                                     Completion<std::string> completion) {
  _channel->call(
      ClientSessionMethod::SetSessionInfo,
      {wrapped(std::move(sessionInfo)), wrapped(std::move(userInfo)), arrayOf(std::move(frameworksToCheck))},
      readText, std::move(completion));
}

TallyReply<std::string> TallyConnection::setSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                                            std::optional<Dictionary> userInfo,
                                                            Strings frameworksToCheck) {
  return _channel->wait<std::string>([&](auto completion) {
    setSessionInfo(std::move(sessionInfo), std::move(userInfo), std::move(frameworksToCheck),
                   std::move(completion));
  });
}

void TallyConnection::startConfig(Completion<std::optional<Strings>> completion) {
  _channel->call(ClientSessionMethod::StartConfig, {}, readOptionalTexts, std::move(completion));
}

TallyReply<std::optional<TallyConnection::Strings>> TallyConnection::startConfigSync() {
  return _channel->wait<std::optional<Strings>>([&](auto completion) { startConfig(std::move(completion)); });
}

void TallyConnection::fetchStates(std::optional<Dictionary> userInfo,
                                  Completion<std::optional<Strings>> completion) {
  _channel->call(ClientSessionMethod::FetchStates, {wrapped(std::move(userInfo))}, readOptionalTexts,
                 std::move(completion));
}

TallyReply<std::optional<TallyConnection::Strings>> TallyConnection::fetchStatesSync(
    std::optional<Dictionary> userInfo) {
  return _channel->wait<std::optional<Strings>>(
      [&](auto completion) { fetchStates(std::move(userInfo), std::move(completion)); });
}

void TallyConnection::fetchDisplayURL(Completion<std::string> completion) {
  _channel->call(ClientSessionMethod::FetchDisplayURL, {}, readText, std::move(completion));
}

TallyReply<std::string> TallyConnection::fetchDisplayURLSync() {
  return _channel->wait<std::string>([&](auto completion) { fetchDisplayURL(std::move(completion)); });
}

void TallyConnection::sendMessage(std::uint16_t category, std::uint16_t type,
                                  std::optional<Dictionary> payload,
                                  Completion<std::optional<std::string>> completion) {
  _channel->call(ClientSessionMethod::SendMessageWithCategory,
                 {Value(unsigned{category}), Value(unsigned{type}), wrapped(std::move(payload))},
                 readOptionalText, std::move(completion));
}

TallyReply<std::optional<std::string>> TallyConnection::sendMessageSync(std::uint16_t category,
                                                                        std::uint16_t type,
                                                                        std::optional<Dictionary> payload) {
  return _channel->wait<std::optional<std::string>>(
      [&](auto completion) { sendMessage(category, type, std::move(payload), std::move(completion)); });
}

void TallyConnection::flushMessages(Completion<std::optional<std::string>> completion) {
  _channel->call(ClientSessionMethod::FlushMessages, {}, readOptionalText, std::move(completion));
}

TallyReply<std::optional<std::string>> TallyConnection::flushMessagesSync() {
  return _channel->wait<std::optional<std::string>>(
      [&](auto completion) { flushMessages(std::move(completion)); });
}

void TallyConnection::uploadFile(const std::filesystem::path& file, Completion<bool> completion) {
  const auto path = std::filesystem::absolute(file);
  auto grant = grantFor(path);
  const Array placeholders(std::vector<Value>(grant.size()));
  _channel->call(
      ClientSessionMethod::UploadFileAtPath,
      {Value(fileURL(path.string())), Value(std::string(platform::kFileTokenPrefix) + path.string()), placeholders},
      readTruth, std::move(completion), std::move(grant));
}

TallyReply<bool> TallyConnection::uploadFileSync(const std::filesystem::path& file) {
  return _channel->wait<bool>([&](auto completion) { uploadFile(file, std::move(completion)); });
}

void TallyConnection::uploadLogData(Array logData, Completion<UploadLogDataResult> completion) {
  _channel->call(ClientSessionMethod::UploadLogData, {Value(std::move(logData))}, readUpload,
                 std::move(completion));
}

TallyReply<TallyConnection::UploadLogDataResult> TallyConnection::uploadLogDataSync(Array logData) {
  return _channel->wait<UploadLogDataResult>(
      [&](auto completion) { uploadLogData(std::move(logData), std::move(completion)); });
}

void TallyConnection::sendMessageWithSessionInfo(std::optional<Dictionary> sessionInfo,
                                                 std::optional<Dictionary> userInfo, std::uint16_t category,
                                                 std::uint16_t type, std::optional<Dictionary> payload,
                                                 Completion<std::string> completion) {
  _channel->call(ClientSessionMethod::SendMessageWithSessionInfo,
                 {wrapped(std::move(sessionInfo)), wrapped(std::move(userInfo)), Value(unsigned{category}),
                  Value(unsigned{type}), wrapped(std::move(payload))},
                 readText, std::move(completion));
}

TallyReply<std::string> TallyConnection::sendMessageWithSessionInfoSync(std::optional<Dictionary> sessionInfo,
                                                                        std::optional<Dictionary> userInfo,
                                                                        std::uint16_t category,
                                                                        std::uint16_t type,
                                                                        std::optional<Dictionary> payload) {
  return _channel->wait<std::string>([&](auto completion) {
    sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), category, type,
                               std::move(payload), std::move(completion));
  });
}

}  // namespace tallyd
