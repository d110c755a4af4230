// Backends that do as the test says and keep what they were told.
#pragma once

#include <map>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "backends/TallyBackend.h"
#include "session/BackendSetup.h"

namespace tallyd {

class ScriptedBackend;

/// Makes the backends whose names it has a script for, and keeps a common trace of them all.
class ScriptedBackends {
 public:
  struct Script {
    TallyBackend::Result sent{};     ///< What a send returns.
    TallyBackend::Result flushed{};  ///< What a flush returns.
    bool uploadsFiles = false;
    bool uploadsLogData = false;
    std::int32_t state = ReportingStateOn;  ///< What updateState decides.
    std::int32_t hierarchy = 0;             ///< Taken when the state is updated.
    std::optional<std::string> displayURL{};
    std::string throwsAt{};  ///< The operation, as in the trace, that finds no memory.
  };
  /// One call of the factory.
  struct Request {
    std::string name;
    TallyBackend::Payload profile;
    std::optional<std::string> productFamily;
    std::int32_t clientType;
  };
  struct Message {
    std::string backend;
    TallyBackend::Payload payload;
    timeval timestamp;
    std::uint16_t method;
    std::uint16_t respCode;
    std::uint16_t eventID;
    std::optional<std::string> combinedSessionID;  ///< The backend's, when the message came.
  };

  std::map<std::string, Script> scripts;
  std::map<std::string, std::string> names;  ///< Storebag key to backend name, where they differ.
  std::function<void()> whenAsked = [] {};   ///< Runs before each call of the factory.

  std::vector<Request> requests;
  std::vector<Message> messages;
  std::vector<std::string> trace;  ///< "BACKEND: OPERATION".
  std::map<std::string, std::weak_ptr<ScriptedBackend>> latest;

  [[nodiscard]] inline BackendFactory factory();
  /// A storebag with an empty profile for every script.
  [[nodiscard]] platform::Dictionary storebag() const {
    platform::Dictionary all;
    for (const auto& [name, script] : scripts) all.set(name, platform::Dictionary());
    return all;
  }
};

class ScriptedBackend final : public TallyBackend {
 public:
  ScriptedBackend(ScriptedBackends& all, const platform::Platform& platform, std::string_view name,
                  const Payload& profile, const std::optional<std::string>& productFamily)
      : TallyBackend(platform, name, profile, productFamily), _all(all) {
    _displayURL = script().displayURL;
  }
  ~ScriptedBackend() override { note("end"); }

  using TallyBackend::sendMessage;
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode, std::uint16_t eventID) override {
    note("message " + std::to_string(method) + "/" + std::to_string(respCode));
    _all.messages.push_back(
        {name(), payload, timestamp, method, respCode, eventID, combinedSessionIDString()});
    return script().sent;
  }
  Result flushMessages() override {
    note("flush");
    return script().flushed;
  }
  bool uploadFileAtPath(std::string_view path, std::string_view extensionToken) override {
    note("file " + std::string(path) + " " + std::string(extensionToken));
    return script().uploadsFiles;
  }
  bool uploadLogData(const platform::Array& logData) override {
    note("log data " + platform::Value(logData).description());
    return script().uploadsLogData;
  }
  void updateState() override {
    note("update");
    setState(script().state);
    setHierarchy(script().hierarchy);
  }
  void cleanup() override { note("cleanup"); }
  void setCorrelatedSessionID(const std::string& correlatedSessionID) override {
    note("correlate " + correlatedSessionID);
    TallyBackend::setCorrelatedSessionID(correlatedSessionID);
  }

 private:
  [[nodiscard]] const ScriptedBackends::Script& script() const { return _all.scripts.at(name()); }
  void note(const std::string& operation) {
    _all.trace.push_back(name() + ": " + operation);
    if (operation == script().throwsAt) throw std::bad_alloc();
  }

  ScriptedBackends& _all;
};

inline BackendFactory ScriptedBackends::factory() {
  return [this](const platform::Platform& platform, std::string_view name,
                const TallyBackend::Payload& profile, const std::optional<std::string>& productFamily,
                std::int32_t clientType) -> std::shared_ptr<TallyBackend> {
    whenAsked();
    requests.push_back({std::string(name), profile, productFamily, clientType});
    const auto renamed = names.find(std::string(name));
    const std::string ownName = renamed == names.end() ? std::string(name) : renamed->second;
    if (!scripts.contains(ownName)) return nullptr;
    auto backend = std::make_shared<ScriptedBackend>(*this, platform, ownName, profile, productFamily);
    latest[ownName] = backend;
    return backend;
  };
}

}  // namespace tallyd
