// A daemon on a socket of the test's that keeps each call and answers what the test has set.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "fakes/FakeLog.h"
#include "framework/ClientSessionInterface.h"
#include "platform/ipc/DBusListener.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd {

struct ReceivedCall {
  ClientSessionMethod method;
  std::vector<platform::Value> arguments;
  std::vector<ino_t> files;
  bool expectsReply = false;
};

class ScriptedDaemon final : public platform::ListenerDelegate {
 public:
  /// What it answers at first: nothing, or "text" where a text must come, else nothing or no.
  enum class Answers { None, Fitting };

  explicit ScriptedDaemon(const std::filesystem::path& socketPath, Answers answers = Answers::None)
      : _answersFit(answers == Answers::Fitting), _listener(socketPath, _queues, _log) {
    _listener.setDelegate(*this);
    _listener.resume();
  }

  void answerWith(std::vector<platform::Value> results) {
    const std::lock_guard lock(_mutex);
    _answer = std::move(results);
  }
  void answerNothing() {
    const std::lock_guard lock(_mutex);
    _answer.reset();
    _answersFit = false;
  }
  /// The calls received, once there are `count` of them.
  std::vector<ReceivedCall> calls(std::size_t count) {
    std::unique_lock lock(_mutex);
    EXPECT_TRUE(_changed.wait_for(lock, std::chrono::seconds(30), [&] { return _calls.size() >= count; }));
    return _calls;
  }
  bool waitForInvalidation() {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::seconds(30), [&] { return _invalidated; });
  }

  bool shouldAcceptNewConnection(const std::shared_ptr<platform::ServiceConnection>& connection) override {
    connection->setExportedInterface(clientSessionInterface());
    connection->setExportedObject(std::make_shared<Session>(*this));
    connection->setInvalidationHandler([this] {
      const std::lock_guard lock(_mutex);
      _invalidated = true;
      _changed.notify_all();
    });
    connection->resume();
    return true;
  }

 private:
  class Session final : public platform::ExportedObject {
   public:
    explicit Session(ScriptedDaemon& daemon) : _daemon(daemon) {}
    void handleCall(const std::shared_ptr<platform::IncomingCall>& call) override { _daemon.receive(*call); }

   private:
    ScriptedDaemon& _daemon;
  };

  static std::vector<platform::Value> fittingAnswer(const std::string& signature) {
    if (signature == "s") return {"text"};
    if (signature == "b") return {false};
    if (signature == "bas") return {false, platform::Array()};
    return {platform::Array()};
  }

  void receive(platform::IncomingCall& call) {
    const std::lock_guard lock(_mutex);
    ReceivedCall received{
        static_cast<ClientSessionMethod>(call.methodIndex()), call.arguments(), {}, call.expectsReply()};
    for (const auto& file : call.descriptors()) {
      struct stat status {};
      EXPECT_EQ(::fstat(file.get(), &status), 0);
      received.files.push_back(status.st_ino);
    }
    _calls.push_back(std::move(received));
    _changed.notify_all();
    if (_answersFit) {
      call.reply(fittingAnswer(clientSessionInterface().methods[call.methodIndex()].out));
    } else if (_answer) {
      call.reply(*_answer);
    }
  }

  std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<ReceivedCall> _calls;
  std::optional<std::vector<platform::Value>> _answer;
  bool _answersFit;
  bool _invalidated = false;
  fakes::FakeLog _log;
  platform::AsioQueues _queues{2};
  platform::DBusListener _listener;
};

}  // namespace tallyd
