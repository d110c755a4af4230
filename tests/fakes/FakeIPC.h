// A client's connection without a socket: the test makes the calls and reads the answers.
#pragma once

#include <algorithm>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "platform/IPC.h"

namespace tallyd::fakes {

/// One call and what was answered to it.
class FakeIncomingCall : public platform::IncomingCall {
 public:
  enum class Answer { Wanted, NotWanted };

  FakeIncomingCall(std::size_t methodIndex, std::vector<platform::Value> arguments,
                   Answer answer = Answer::Wanted, std::vector<platform::FileDescriptor> descriptors = {})
      : _methodIndex(methodIndex),
        _arguments(std::move(arguments)),
        _answer(answer),
        _descriptors(std::move(descriptors)) {}

  [[nodiscard]] std::size_t methodIndex() const override { return _methodIndex; }
  [[nodiscard]] const std::vector<platform::Value>& arguments() const override { return _arguments; }
  [[nodiscard]] std::vector<platform::FileDescriptor>& descriptors() override { return _descriptors; }
  [[nodiscard]] bool expectsReply() const override { return _answer == Answer::Wanted; }
  void reply(std::vector<platform::Value> results) override {
    if (expectsReply()) {
      replies.push_back(std::move(results));
    } else {
      ++unwantedReplies;
    }
  }
  void rejectArguments(std::string_view reason) override {
    if (expectsReply()) rejections.emplace_back(reason);
  }

  /// Every answer, so that a test sees one too many.
  std::vector<std::vector<platform::Value>> replies;
  std::vector<std::string> rejections;
  int unwantedReplies = 0;  ///< To a call that wants none: a real one drops them.

 private:
  std::size_t _methodIndex;
  std::vector<platform::Value> _arguments;
  Answer _answer;
  std::vector<platform::FileDescriptor> _descriptors;
};

/// Threading: as a real connection, one call or event at a time; different connections on any threads.
class FakeServiceConnection : public platform::ServiceConnection {
 public:
  using Answer = FakeIncomingCall::Answer;

  explicit FakeServiceConnection(std::string description = "client 1 of user 0")
      : _description(std::move(description)) {}

  [[nodiscard]] std::string description() const override { return _description; }
  [[nodiscard]] std::optional<uid_t> peerUser() const override { return peer; }
  void setExportedInterface(const platform::Interface& exported) override { _interface = &exported; }
  void setExportedObject(std::shared_ptr<platform::ExportedObject> object) override {
    _object = std::move(object);
  }
  void setInterruptionHandler(std::function<void()> handler) override { _interrupted = std::move(handler); }
  void setInvalidationHandler(std::function<void()> handler) override { _invalidated = std::move(handler); }
  void resume() override {
    if (hasNoMemory) throw std::bad_alloc();
    _resumed = true;
  }
  void finish() override {
    ++finished;
    invalidate();
  }

  std::optional<uid_t> peer = 0;  ///< The user who connected.
  int finished = 0;               ///< How often the service ended it.
  bool hasNoMemory = false;       ///< It can't be resumed.

  [[nodiscard]] const platform::Interface* exportedInterface() const { return _interface; }
  [[nodiscard]] bool resumed() const { return _resumed; }

  /// The client calls a method of the exported interface; the call comes back with its answers.
  std::shared_ptr<FakeIncomingCall> call(std::string_view method, std::vector<platform::Value> arguments = {},
                                         Answer answer = Answer::Wanted,
                                         std::vector<platform::FileDescriptor> descriptors = {}) {
    if (!_resumed || !_interface || !_object) throw std::logic_error("a call before the connection runs");
    const auto& methods = _interface->methods;
    const auto found = std::find_if(methods.begin(), methods.end(),
                                    [&](const auto& candidate) { return candidate.name == method; });
    if (found == methods.end()) throw std::logic_error("no such method: " + std::string(method));
    const auto made =
        std::make_shared<FakeIncomingCall>(static_cast<std::size_t>(found - methods.begin()),
                                           std::move(arguments), answer, std::move(descriptors));
    _object->handleCall(made);
    return made;
  }

  /// The client breaks off within a message; a real connection is invalidated next.
  void interrupt() const {
    if (_interrupted) _interrupted();
  }
  /// The client is gone: the handler runs once, then object and handlers are dropped.
  void invalidate() {
    if (const auto handler = std::exchange(_invalidated, nullptr)) handler();
    _interrupted = nullptr;
    _object = nullptr;
  }

 private:
  std::string _description;
  const platform::Interface* _interface = nullptr;
  std::shared_ptr<platform::ExportedObject> _object;
  std::function<void()> _interrupted;
  std::function<void()> _invalidated;
  bool _resumed = false;
};

}  // namespace tallyd::fakes
