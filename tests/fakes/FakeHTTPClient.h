// A network of scripted answers that keeps the requests it got.
#pragma once

#include <functional>
#include <mutex>

#include "platform/HTTPClient.h"

namespace tallyd::fakes {

class FakeHTTPClient : public platform::HTTPClient {
 public:
  using Answer = std::function<platform::HTTPResult(const platform::HTTPRequest&)>;

  /// What every request gets; an empty 200 until it is set.
  Answer answer = [](const platform::HTTPRequest&) { return ok(""); };

  static platform::HTTPResult ok(std::string body,
                                 std::vector<std::pair<std::string, std::string>> headers = {}) {
    return {std::nullopt, platform::HTTPResponse{200, std::move(headers)}, platform::Data(std::move(body))};
  }
  static platform::HTTPResult failure(std::string error) { return {std::move(error), std::nullopt, {}}; }

  platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& request) override {
    keep(_synchronous, request);
    return answer(request);
  }
  void sendAsynchronousRequest(platform::HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                               Completion completion) override {
    keep(_asynchronous, request);
    queue->async([result = answer(request), completion = std::move(completion)] { completion(result); });
  }

  [[nodiscard]] std::vector<platform::HTTPRequest> synchronousRequests() const { return copy(_synchronous); }
  [[nodiscard]] std::vector<platform::HTTPRequest> posts() const { return copy(_asynchronous); }

 private:
  using Requests = std::vector<platform::HTTPRequest>;
  void keep(Requests& list, const platform::HTTPRequest& request) {
    const std::lock_guard lock(_mutex);
    list.push_back(request);
  }
  Requests copy(const Requests& list) const {
    const std::lock_guard lock(_mutex);
    return list;
  }

  mutable std::mutex _mutex;
  Requests _synchronous;
  Requests _asynchronous;
};

}  // namespace tallyd::fakes
