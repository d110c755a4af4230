#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "framework/TallyConnection.h"
#include "framework/c/Boundary.h"
#include "framework/c/Options.h"
#include "framework/c/Reply.h"
#include "framework/c/tally.h"

using tallyd::TallyConnection;
using tallyd::TallyError;
using tallyd::TallyReply;
using tallyd::c::ArgumentError;
using tallyd::c::object;
using tallyd::c::replyFrom;
using tallyd::c::required;
using tallyd::c::setLastError;
using tallyd::c::status;
using tallyd::platform::Array;
using tallyd::platform::Dictionary;

struct tally_connection {
  explicit tally_connection(const tallyd::TallyConnectionOptions& options) : connection(options) {}
  TallyConnection connection;
};

namespace {

TallyConnection& connectionOf(tally_connection* connection) {
  return required(connection, "the connection").connection;
}

std::optional<Dictionary> dictionaryOf(const tally_value* value) {
  if (!value) return std::nullopt;
  if (!value->value.dictionary()) throw ArgumentError("not a dictionary");
  return *value->value.dictionary();
}

Array arrayOf(const tally_value* value) {
  const auto* array = required(value, "the array").value.array();
  if (!array) throw ArgumentError("not an array");
  return *array;
}

TallyConnection::Strings stringsOf(const char* const* texts, size_t count) {
  TallyConnection::Strings strings;
  if (count > 0) required(texts, "the list of frameworks");
  for (size_t i = 0; i < count; ++i) strings.emplace_back(&required(texts[i], "a framework"));
  return strings;
}

TallyConnection::Timeout timeoutOf(int64_t milliseconds) {
  if (milliseconds == TALLY_DEFAULT_TIMEOUT) return std::nullopt;
  if (milliseconds < 0) throw ArgumentError("a time is negative");
  return std::chrono::milliseconds(milliseconds);
}

/// What the caller waits for; a failure of any kind is a reply too.
template <class Call>
tally_reply* waitFor(Call&& call) {
  return object([&] {
    auto reply = std::make_unique<tally_reply>();
    reply->status = status([&] {
      *reply = call();
      if (reply->status != TALLY_OK) setLastError(reply->error.c_str());
      return reply->status;
    });
    if (reply->status != TALLY_OK && reply->error.empty()) reply->error = tally_last_error();
    return reply.release();
  });
}

/// Passes answers on. A call that is refused is told so by its status instead.
template <class T>
TallyConnection::Completion<T> completion(tally_callback callback, void* context) {
  if (!callback) return {};
  return [callback, context](TallyReply<T> answer) {
    if (answer.kind == TallyError::Refused) return;
    std::optional<tally_reply> reply;
    status([&] {
      reply = replyFrom(std::move(answer));
      return tally_status{TALLY_OK};
    });
    status([&] {
      callback(reply ? &*reply : nullptr, context);
      return tally_status{TALLY_OK};
    });
  };
}

tally_status accepted(bool taken) {
  if (taken) return TALLY_OK;
  setLastError("too many calls are unfinished; no more are taken");
  return TALLY_ERROR_REFUSED;
}

std::function<void()> handlerFor(tally_handler handler, void* context) {
  if (!handler) return {};
  return [handler, context] { handler(context); };
}

}  // namespace

#define TALLY_STRINGIFIED(x) #x
#define TALLY_TEXT(x) TALLY_STRINGIFIED(x)

const char* tally_version(void) {
  return TALLY_TEXT(TALLY_VERSION_MAJOR) "." TALLY_TEXT(TALLY_VERSION_MINOR) "." TALLY_TEXT(
      TALLY_VERSION_PATCH);
}

tally_connection* tally_connect(const tally_options* options) {
  return object(
      [&] { return new tally_connection(options ? options->options : tallyd::TallyConnectionOptions()); });
}

void tally_disconnect(tally_connection* connection) { delete connection; }

tally_status tally_set_interruption_handler(tally_connection* connection, tally_handler handler,
                                            void* context) {
  return status([&] {
    connectionOf(connection).setInterruptionHandler(handlerFor(handler, context));
    return tally_status{TALLY_OK};
  });
}

tally_status tally_set_invalidation_handler(tally_connection* connection, tally_handler handler,
                                            void* context) {
  return status([&] {
    connectionOf(connection).setInvalidationHandler(handlerFor(handler, context));
    return tally_status{TALLY_OK};
  });
}

tally_status tally_set_reconnection_handler(tally_connection* connection, tally_handler handler,
                                            void* context) {
  return status([&] {
    connectionOf(connection).setReconnectionHandler(handlerFor(handler, context));
    return tally_status{TALLY_OK};
  });
}

tally_reply* tally_set_session_info(tally_connection* connection, const tally_value* session_info,
                                    const tally_value* user_info, const char* const* frameworks,
                                    size_t framework_count, int64_t timeout) {
  return waitFor([&] {
    return replyFrom(connectionOf(connection)
                         .setSessionInfoSync(dictionaryOf(session_info), dictionaryOf(user_info),
                                             stringsOf(frameworks, framework_count), timeoutOf(timeout)));
  });
}

tally_status tally_set_session_info_async(tally_connection* connection, const tally_value* session_info,
                                          const tally_value* user_info, const char* const* frameworks,
                                          size_t framework_count, int64_t timeout, tally_callback callback,
                                          void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .setSessionInfo(dictionaryOf(session_info), dictionaryOf(user_info),
                                        stringsOf(frameworks, framework_count),
                                        completion<std::string>(callback, context), timeoutOf(timeout)));
  });
}

tally_reply* tally_start_config(tally_connection* connection, int64_t timeout) {
  return waitFor([&] { return replyFrom(connectionOf(connection).startConfigSync(timeoutOf(timeout))); });
}

tally_status tally_start_config_async(tally_connection* connection, int64_t timeout, tally_callback callback,
                                      void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .startConfig(completion<std::optional<TallyConnection::Strings>>(callback, context),
                                     timeoutOf(timeout)));
  });
}

tally_reply* tally_fetch_states(tally_connection* connection, const tally_value* user_info, int64_t timeout) {
  return waitFor([&] {
    return replyFrom(connectionOf(connection).fetchStatesSync(dictionaryOf(user_info), timeoutOf(timeout)));
  });
}

tally_status tally_fetch_states_async(tally_connection* connection, const tally_value* user_info,
                                      int64_t timeout, tally_callback callback, void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .fetchStates(dictionaryOf(user_info),
                                     completion<std::optional<TallyConnection::Strings>>(callback, context),
                                     timeoutOf(timeout)));
  });
}

tally_reply* tally_fetch_display_url(tally_connection* connection, int64_t timeout) {
  return waitFor([&] { return replyFrom(connectionOf(connection).fetchDisplayURLSync(timeoutOf(timeout))); });
}

tally_status tally_fetch_display_url_async(tally_connection* connection, int64_t timeout,
                                           tally_callback callback, void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .fetchDisplayURL(completion<std::string>(callback, context), timeoutOf(timeout)));
  });
}

tally_reply* tally_send_message(tally_connection* connection, uint16_t category, uint16_t type,
                                const tally_value* payload, int64_t timeout) {
  return waitFor([&] {
    return replyFrom(
        connectionOf(connection).sendMessageSync(category, type, dictionaryOf(payload), timeoutOf(timeout)));
  });
}

tally_status tally_send_message_async(tally_connection* connection, uint16_t category, uint16_t type,
                                      const tally_value* payload, int64_t timeout, tally_callback callback,
                                      void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .sendMessage(category, type, dictionaryOf(payload),
                                     completion<std::optional<std::string>>(callback, context),
                                     timeoutOf(timeout)));
  });
}

tally_reply* tally_flush_messages(tally_connection* connection, int64_t timeout) {
  return waitFor([&] { return replyFrom(connectionOf(connection).flushMessagesSync(timeoutOf(timeout))); });
}

tally_status tally_flush_messages_async(tally_connection* connection, int64_t timeout,
                                        tally_callback callback, void* context) {
  return status([&] {
    return accepted(
        connectionOf(connection)
            .flushMessages(completion<std::optional<std::string>>(callback, context), timeoutOf(timeout)));
  });
}

tally_reply* tally_upload_file(tally_connection* connection, const char* path, int64_t timeout) {
  return waitFor([&] {
    return replyFrom(
        connectionOf(connection).uploadFileSync(&required(path, "the path"), timeoutOf(timeout)));
  });
}

tally_status tally_upload_file_async(tally_connection* connection, const char* path, int64_t timeout,
                                     tally_callback callback, void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .uploadFile(&required(path, "the path"), completion<bool>(callback, context),
                                    timeoutOf(timeout)));
  });
}

tally_reply* tally_upload_log_data(tally_connection* connection, const tally_value* log_data,
                                   int64_t timeout) {
  return waitFor([&] {
    return replyFrom(connectionOf(connection).uploadLogDataSync(arrayOf(log_data), timeoutOf(timeout)));
  });
}

tally_status tally_upload_log_data_async(tally_connection* connection, const tally_value* log_data,
                                         int64_t timeout, tally_callback callback, void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .uploadLogData(arrayOf(log_data),
                                       completion<TallyConnection::UploadLogDataResult>(callback, context),
                                       timeoutOf(timeout)));
  });
}

tally_reply* tally_send_message_with_session_info(tally_connection* connection,
                                                  const tally_value* session_info,
                                                  const tally_value* user_info, uint16_t category,
                                                  uint16_t type, const tally_value* payload,
                                                  int64_t timeout) {
  return waitFor([&] {
    return replyFrom(connectionOf(connection)
                         .sendMessageWithSessionInfoSync(dictionaryOf(session_info), dictionaryOf(user_info),
                                                         category, type, dictionaryOf(payload),
                                                         timeoutOf(timeout)));
  });
}

tally_status tally_send_message_with_session_info_async(tally_connection* connection,
                                                        const tally_value* session_info,
                                                        const tally_value* user_info, uint16_t category,
                                                        uint16_t type, const tally_value* payload,
                                                        int64_t timeout, tally_callback callback,
                                                        void* context) {
  return status([&] {
    return accepted(connectionOf(connection)
                        .sendMessageWithSessionInfo(dictionaryOf(session_info), dictionaryOf(user_info),
                                                    category, type, dictionaryOf(payload),
                                                    completion<std::string>(callback, context),
                                                    timeoutOf(timeout)));
  });
}
