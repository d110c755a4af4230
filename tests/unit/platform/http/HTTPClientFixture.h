// What the tests of the HTTP client have in common.
#pragma once

#include <gtest/gtest.h>

#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "fakes/FakeLog.h"
#include "fakes/TemporaryFolder.h"
#include "platform/http/CurlHTTPClient.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd::platform {

/// Results of asynchronous requests, in the order in which they arrive.
class Completions {
 public:
  HTTPClient::Completion next() {
    return [this](const HTTPResult& result) {
      const std::lock_guard lock(_mutex);
      _results.push_back(result);
      _arrived.notify_all();
    };
  }
  /// Waits for that many; fewer, after 30 s, fail the test.
  std::vector<HTTPResult> wait(std::size_t count) {
    std::unique_lock lock(_mutex);
    _arrived.wait_for(lock, std::chrono::seconds(30), [&] { return _results.size() >= count; });
    EXPECT_EQ(_results.size(), count);
    return _results;
  }

 private:
  std::mutex _mutex;
  std::condition_variable _arrived;
  std::vector<HTTPResult> _results;
};

class HTTPClientTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { ::setenv("no_proxy", "127.0.0.1,localhost", 1); }

  [[nodiscard]] std::unique_ptr<CurlHTTPClient> makeClient(const HTTPLimits& limits = {}) {
    return std::make_unique<CurlHTTPClient>(Root(folder.path()), queues, log, limits);
  }
  static HTTPRequest get(const std::string& url) {
    HTTPRequest request;
    request.url = url;
    return request;
  }
  static HTTPRequest post(const std::string& url, std::string body) {
    HTTPRequest request = get(url);
    request.method = "POST";
    request.headers = {{"Content-Type", "application/json"}};
    request.body = Data(std::move(body));
    return request;
  }
  static std::string textOf(const HTTPResult& result) { return std::string(result.data.bytes()); }
  static std::string errorOf(const HTTPResult& result) { return result.error.value_or("no error"); }
  static int statusOf(const HTTPResult& result) { return result.response ? result.response->status : 0; }

  fakes::TemporaryFolder folder;
  fakes::FakeLog log;
  Completions completions;  // Outlives the queues and the clients that a test makes.
  AsioQueues queues;
  std::shared_ptr<SerialQueue> queue = queues.makeSerialQueue("completions");
};

}  // namespace tallyd::platform
