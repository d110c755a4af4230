// What every test of this folder starts from: a service in a folder of its own and clients of it.
#pragma once

#include <gtest/gtest.h>

#include <future>
#include <memory>
#include <string>
#include <vector>

#include "RawClient.h"
#include "TestService.h"
#include "fakes/FakeLog.h"
#include "fakes/TemporaryFolder.h"
#include "platform/ipc/DBusClientConnection.h"

namespace tallyd::platform {

class IPCTest : public testing::Test {
 protected:
  using Reply = DBusClientConnection::Reply;
  static constexpr std::chrono::milliseconds kTimeout{60'000};

  IPCTest() { _service.resume(); }
  ~IPCTest() override {
    for (const auto& client : _clients) client->close(std::chrono::seconds(5));
  }

  std::shared_ptr<DBusClientConnection> makeClient() {
    return _clients.emplace_back(DBusClientConnection::connect(_socketPath, testInterface(), _clientQueues));
  }

  /// Calls and waits for the answer.
  Reply call(DBusClientConnection& client, TestMethod method, std::vector<Value> arguments = {},
             std::vector<FileDescriptor> descriptors = {}, std::chrono::milliseconds timeout = kTimeout) {
    auto promise = std::make_shared<std::promise<Reply>>();
    client.call({method, std::move(arguments), std::move(descriptors)}, timeout,
                [promise](Reply reply) { promise->set_value(std::move(reply)); });
    return promise->get_future().get();
  }

  /// What came after the connection was accepted, but for calls and the description; waits for its end.
  std::vector<std::string> endEvents() {
    EXPECT_TRUE(_service.events.waitFor("dropped"));
    std::vector<std::string> ends;
    for (const auto& event : _service.events.all()) {
      if (event == "interrupted" || event == "invalidated" || event == "dropped") ends.push_back(event);
    }
    return ends;
  }

  const std::vector<std::string> kInterrupted{"interrupted", "invalidated", "dropped"};
  const std::vector<std::string> kInvalidatedOnly{"invalidated", "dropped"};

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _socketPath = _folder.path() / "run/service";
  fakes::FakeLog _log;
  TestService _service{_socketPath, _log};
  AsioQueues _clientQueues{1};
  std::vector<std::shared_ptr<DBusClientConnection>> _clients;
};

}  // namespace tallyd::platform
