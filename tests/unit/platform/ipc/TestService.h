// A service with one method for each thing that a test wants to see.
#pragma once

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/IPC.h"
#include "platform/Log.h"
#include "platform/ipc/DBusListener.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd::platform {

enum TestMethod : std::size_t {
  kEcho,
  kLength,
  kSum,
  kMixed,
  kReadFiles,
  kNeverAnswered,
  kRejected,
  kLarge,
  kNothing,
};

inline const Interface& testInterface() {
  static const Interface kInterface{.objectPath = "/com/example/test",
                                    .name = "com.example.Test",
                                    .methods = {
                                        {"Echo", "v", {"value"}, "v", {"same"}},
                                        {"Length", "ay", {"bytes"}, "x", {"length"}},
                                        {"Sum", "ynqiuxt", {"a", "b", "c", "d", "e", "f", "g"}, "x", {"sum"}},
                                        {"Mixed",
                                         "qaa{sv}as",
                                         {"number", "dictionary", "strings"},
                                         "basaasdaa{sv}",
                                         {"a", "b", "c", "d", "e"}},
                                        {"ReadFiles", "sah", {"name", "files"}, "as", {"contents"}},
                                        {"NeverAnswered", "", {}, "s", {"answer"}},
                                        {"Rejected", "s", {"text"}, "s", {"answer"}},
                                        {"Large", "u", {"size"}, "s", {"text"}},
                                        {"Nothing", "", {}, "", {}},
                                    }};
  return kInterface;
}

/// Keeps what happened; waits end with what they wait for or, in a failing test, with the deadline.
class TestEvents {
 public:
  static constexpr std::chrono::seconds kDeadline{60};

  void add(std::string event) {
    const std::lock_guard lock(_mutex);
    _events.push_back(std::move(event));
    _changed.notify_all();
  }
  [[nodiscard]] std::size_t count(const std::string& event) const {
    const std::lock_guard lock(_mutex);
    return counted(event);
  }
  [[nodiscard]] std::vector<std::string> all() const {
    const std::lock_guard lock(_mutex);
    return _events;
  }
  [[nodiscard]] bool waitFor(const std::string& event, std::size_t times = 1) {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, kDeadline, [&] { return counted(event) >= times; });
  }

 private:
  [[nodiscard]] std::size_t counted(const std::string& event) const {
    return static_cast<std::size_t>(std::count(_events.begin(), _events.end(), event));
  }

  mutable std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::string> _events;
};

/// Answers the methods and notes each call's name.
class TestObject final : public ExportedObject {
 public:
  explicit TestObject(TestEvents& events) : _events(events) {}
  ~TestObject() override { _events.add("dropped"); }
  TestObject(const TestObject&) = delete;
  TestObject& operator=(const TestObject&) = delete;

  void handleCall(const std::shared_ptr<IncomingCall>& call) override {
    _events.add(testInterface().methods[call->methodIndex()].name +
                (call->expectsReply() ? "" : " no reply"));
    answer(call);
  }

 private:
  void answer(const std::shared_ptr<IncomingCall>& call) {
    const auto& arguments = call->arguments();
    switch (call->methodIndex()) {
      case kEcho:
        return call->reply({arguments[0]});
      case kLength:
        return call->reply({Value(static_cast<std::int64_t>(arguments[0].data()->size()))});
      case kSum: {
        std::int64_t sum = 0;
        for (const auto& each : arguments) sum += *each.integerValue();
        return call->reply({Value(sum)});
      }
      case kMixed:
        return call->reply(
            {Value(true), Value(Array()), Value(Array{*arguments[2].array()}), Value(2.5), arguments[1]});
      case kReadFiles: {
        std::vector<Value> contents;
        for (auto& file : call->descriptors()) {
          char bytes[64];
          const auto size = ::pread(file.get(), bytes, sizeof bytes, 0);
          contents.emplace_back(std::string(bytes, size > 0 ? static_cast<std::size_t>(size) : 0));
        }
        return call->reply({Value(Array(std::move(contents)))});
      }
      case kRejected:
        call->rejectArguments("not this text");
        return call->reply({Value("only the first answer counts")});
      case kLarge:
        return call->reply({Value(std::string(static_cast<std::size_t>(*arguments[0].integerValue()), 'x'))});
      case kNothing:
        return call->reply({});
      default:
        return;  // Never answered.
    }
  }

  TestEvents& _events;
};

/// The service on a socket; "accepted", "interrupted", "invalidated" and "dropped" are events too.
class TestService final : public ListenerDelegate {
 public:
  TestService(const std::filesystem::path& socketPath, Log& log) : _listener(socketPath, _queues, log) {
    _listener.setDelegate(*this);
  }
  void resume() { _listener.resume(); }

  bool shouldAcceptNewConnection(const std::shared_ptr<ServiceConnection>& connection) override {
    if (refuse) return false;
    {
      const std::lock_guard lock(_mutex);
      _connections.push_back(connection);
    }
    connection->setExportedInterface(testInterface());
    connection->setExportedObject(std::make_shared<TestObject>(events));
    connection->setInterruptionHandler([this] { events.add("interrupted"); });
    connection->setInvalidationHandler([this] { events.add("invalidated"); });
    const std::string description = connection->description();
    connection->resume();
    events.add("accepted");
    events.add(description);
    return true;
  }

  void finishAll() {
    const std::lock_guard lock(_mutex);
    for (const auto& each : _connections) {
      if (const auto connection = each.lock()) connection->finish();
    }
  }

  TestEvents events;
  bool refuse = false;

 private:
  std::mutex _mutex;
  std::vector<std::weak_ptr<ServiceConnection>> _connections;
  AsioQueues _queues{2};
  DBusListener _listener;
};

}  // namespace tallyd::platform
