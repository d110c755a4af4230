// A service with the daemon's interface that answers as a test tells it and keeps what it was asked.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "fakes/FakeLog.h"
#include "framework/ClientSessionInterface.h"
#include "platform/IPC.h"
#include "platform/ipc/DBusListener.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd::tallyctl {

/// The script is set before the first client comes. Threading: calls arrive on the connections' queues.
class ScriptedDaemon final : public platform::ListenerDelegate {
 public:
  using Array = platform::Array;
  using Value = platform::Value;
  using Strings = std::vector<std::string>;

  struct Script {
    std::optional<Strings> states = Strings{"https_post", "dashboard"};
    std::optional<Strings> laterStates = Strings{"https_post"};  ///< What FetchStates answers.
    std::optional<std::string> flushResult;
    std::string onceReply = "finished";
    /// The result of a message of that type.
    std::function<std::optional<std::string>(std::uint16_t type)> sendResult;
    std::function<bool(std::uint16_t type)> rejects;  ///< Whether a message of that type gets an error.
    bool holdsMessages = false;                       ///< Until the states are fetched.
    bool repliesToOnce = true;
    bool refusesClients = false;
    std::string displayURL = "URL not available";
    std::function<bool()> upload;  ///< The answer to an upload, a file's or log data's; without one it is no.
    std::optional<std::string> uploadLogError;
    bool repliesToUploads = true;
  };

  struct Call {
    ClientSessionMethod method;
    std::vector<Value> arguments;
    bool operator==(const Call&) const = default;
  };

  explicit ScriptedDaemon(const std::filesystem::path& socket) : _listener(socket, _queues, _log) {
    _listener.setDelegate(*this);
    _listener.resume();
  }

  Script script;

  [[nodiscard]] std::vector<Call> calls() const {
    const std::lock_guard lock(_mutex);
    return _calls;
  }

  [[nodiscard]] std::vector<Call> callsOf(ClientSessionMethod method) const {
    auto calls = this->calls();
    std::erase_if(calls, [method](const Call& call) { return call.method != method; });
    return calls;
  }

  bool shouldAcceptNewConnection(const std::shared_ptr<platform::ServiceConnection>& connection) override {
    if (script.refusesClients) return false;
    connection->setExportedInterface(clientSessionInterface());
    connection->setExportedObject(std::make_shared<Object>(*this));
    connection->resume();
    return true;
  }

 private:
  using Held = std::vector<std::shared_ptr<platform::IncomingCall>>;  ///< Calls that wait for their answer.

  class Object final : public platform::ExportedObject {
   public:
    explicit Object(ScriptedDaemon& daemon) : _daemon(daemon) {}
    void handleCall(const std::shared_ptr<platform::IncomingCall>& call) override {
      _daemon.handle(call, _held);
    }

   private:
    ScriptedDaemon& _daemon;
    Held _held;
  };

  void handle(const std::shared_ptr<platform::IncomingCall>& call, Held& held) {
    const auto method = static_cast<ClientSessionMethod>(call->methodIndex());
    {
      const std::lock_guard lock(_mutex);
      _calls.push_back({method, call->arguments()});
    }
    switch (method) {
      case ClientSessionMethod::SetSessionInfo:
        return call->reply({"received"});
      case ClientSessionMethod::StartConfig:
        return call->reply({wrapped(script.states)});
      case ClientSessionMethod::FetchStates:
        for (const auto& message : std::exchange(held, {})) answerMessage(*message);
        return call->reply({wrapped(script.laterStates)});
      case ClientSessionMethod::SendMessageWithCategory:
        return script.holdsMessages ? held.push_back(call) : answerMessage(*call);
      case ClientSessionMethod::FlushMessages:
        return call->reply({wrapped(script.flushResult)});
      case ClientSessionMethod::SendMessageWithSessionInfo:
        if (script.repliesToOnce) call->reply({Value(script.onceReply)});
        return;
      case ClientSessionMethod::FetchDisplayURL:
        return call->reply({script.displayURL});
      case ClientSessionMethod::UploadFileAtPath:
        if (script.repliesToUploads) call->reply({script.upload && script.upload()});
        return;
      case ClientSessionMethod::UploadLogData:
        return call->reply({script.upload && script.upload(), wrapped(script.uploadLogError)});
    }
  }

  void answerMessage(platform::IncomingCall& call) {
    const auto type = static_cast<std::uint16_t>(call.arguments()[1].integerValue().value_or(0));
    if (script.rejects && script.rejects(type)) return call.rejectArguments("rejected");
    call.reply({wrapped(script.sendResult ? script.sendResult(type) : std::nullopt)});
  }

  static Value wrapped(const std::optional<std::string>& text) { return text ? Array{*text} : Array(); }
  static Value wrapped(const std::optional<Strings>& texts) {
    if (!texts) return Array();
    Array array;
    for (const auto& text : *texts) array.append(text);
    return Array{array};
  }

  fakes::FakeLog _log;
  mutable std::mutex _mutex;
  std::vector<Call> _calls;
  platform::AsioQueues _queues{2};
  platform::DBusListener _listener;
};

}  // namespace tallyd::tallyctl
