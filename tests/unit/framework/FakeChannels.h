// Channels that do what the test says, and remember what they were told.
#pragma once

#include <deque>
#include <memory>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include "framework/ServiceChannel.h"

namespace tallyd {

struct FakeCall {
  ClientSessionMethod method;
  std::vector<platform::Value> arguments;
  std::chrono::milliseconds timeout;
  ServiceCompletion completion;
};

/// One channel. `room` says how many more calls it takes.
class FakeChannel final : public ServiceChannel {
 public:
  explicit FakeChannel(Events events) : _events(std::move(events)) {}

  [[nodiscard]] bool isReady() const override { return accepted && room > 0; }
  void call(ServiceRequest request, std::chrono::milliseconds timeout,
            ServiceCompletion completion) override {
    --room;
    calls.push_back({request.method, std::move(request.arguments), timeout, std::move(completion)});
  }
  void finish() override {
    finished = true;
    if (!lingers) end();
  }
  void abort() override { end(); }

  void accept() {
    accepted = true;
    _events.ready();
  }
  void makeRoom(int count) {
    room = count;
    _events.ready();
  }
  void answer(std::size_t index, ServiceReply reply = {}) {
    if (const auto completion = std::exchange(calls.at(index).completion, nullptr))
      completion(std::move(reply));
  }
  void end(bool withinMessage = false) {
    if (std::exchange(ended, true)) return;
    for (std::size_t i = 0; i < calls.size(); ++i) answer(i, {TallyError::Disconnected, "ended"});
    _events.ended(withinMessage);
  }
  [[nodiscard]] std::vector<ClientSessionMethod> methods() const {
    std::vector<ClientSessionMethod> methods;
    for (const auto& each : calls) methods.push_back(each.method);
    return methods;
  }

  bool accepted = false;
  bool finished = false;
  bool lingers = false;  ///< It does not end when it is finished.
  bool ended = false;
  int room = 1'000'000;
  std::vector<FakeCall> calls;

 private:
  Events _events;
};

/// Makes them; fails while `absent`.
struct FakeChannels {
  [[nodiscard]] ServiceConnector connector() {
    return [this](ServiceChannel::Events events) {
      ++attempts;
      if (absent) throw std::system_error(ENOENT, std::system_category(), "cannot connect to /the/socket");
      made.push_back(std::make_shared<FakeChannel>(std::move(events)));
      return made.back();
    };
  }
  FakeChannel& last() { return *made.back(); }

  bool absent = false;
  int attempts = 0;
  std::vector<std::shared_ptr<FakeChannel>> made;
};

}  // namespace tallyd
