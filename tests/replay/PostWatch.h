// The daemon's posts, from when it hands them over to when it hears what became of them.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string_view>

#include "platform/HTTPClient.h"
#include "platform/http/RetryPolicy.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// The limits of the client that tries posts again for the daemon; nothing when there is none.
[[nodiscard]] std::optional<platform::RetryLimits> retryLimitsOf(const OptIns& optIns);

/// Counts what is handed over and what is heard of it, and watches over the attempts in between: that each
/// post is tried as often as it must and may be, at times at which it may be, and that the daemon hears what
/// the last attempt came to.
///
/// Each post carries its number through whatever is in between, in a header of its own.
class PostWatch {
 public:
  explicit PostWatch(Surroundings& surroundings);

  /// The daemon hands a post over; it is given its number.
  void begin(platform::HTTPRequest& request);
  /// An attempt reaches the network, and has come to something there.
  void attempt(const platform::HTTPRequest& request);
  void attempted(const platform::HTTPRequest& request, const platform::HTTPResult& result,
                 std::chrono::seconds retryAfter);
  /// The daemon hears of the post with this number.
  void end(std::uint64_t number, const platform::HTTPResult& result);

  [[nodiscard]] static std::uint64_t numberOf(const platform::HTTPRequest& request);

 private:
  struct Post {
    Milliseconds begun;
    std::size_t events;
    platform::Data body;
    unsigned attempts = 0;
    bool isUnderWay = false;
    platform::HTTPResult last{};         ///< What the last attempt came to,
    Milliseconds ended{0};               ///< when,
    std::chrono::milliseconds asked{0};  ///< and how long the server wants to be left alone.
  };

  [[nodiscard]] std::size_t takeDocument(const platform::HTTPRequest& request);
  [[nodiscard]] Post* find(const platform::HTTPRequest& request);
  void checkFurtherAttempt(const Post& post, const platform::HTTPRequest& request);
  void checkEnd(const Post& post, const platform::HTTPResult& result);
  [[nodiscard]] bool mustBeTriedAgain(const Post& post) const;
  void count(const Post& post, const platform::HTTPResult& result);

  Surroundings& _world;
  const std::optional<platform::RetryLimits> _retries;
  const bool _asksForConsent;  ///< Before each further attempt, where there was consent at first.
  std::uint64_t _lastNumber = 0;
  std::map<std::uint64_t, Post> _posts;
};

/// The daemon's side: hands everything on to another client.
class WatchedHTTP : public platform::HTTPClient {
 public:
  WatchedHTTP(platform::HTTPClient& client, PostWatch& posts) : _client(client), _posts(posts) {}

  platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& request) override {
    return _client.sendSynchronousRequest(request);
  }
  void sendAsynchronousRequest(platform::HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                               Completion completion) override;

 private:
  platform::HTTPClient& _client;
  PostWatch& _posts;
};

/// The value of a header; empty when it is missing.
[[nodiscard]] std::string header(const platform::HTTPRequest& request, std::string_view name);

}  // namespace tallyd::replay
