// A collector on the loopback interface that does as little as a collector can: it takes and answers.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::bench {

/// What becomes of posts once they have been taken.
enum class PostAnswers { AtOnce, Never };

/// Plain HTTP/1.1 with kept-alive connections on a port that the system chooses. Posts are kept as they came;
/// every GET gets one fixed document, the signed storebag, at once.
///
/// One thread polls all connections. Threading: any thread.
class Collector {
 public:
  /// @param storebag  the body of the answer to each GET.
  explicit Collector(const std::string& storebag, PostAnswers answers = PostAnswers::AtOnce);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  [[nodiscard]] std::string url(const std::string& path) const;
  /// Returns when `count` posts have come since the last takePosts(). Throws std::runtime_error when no post
  /// has come for long.
  void waitForPosts(std::size_t count);
  /// The bodies of all posts since the last call.
  [[nodiscard]] std::vector<std::string> takePosts();
  /// The header fields of the last post, a "NAME: VALUE" each.
  [[nodiscard]] std::vector<std::string> headersOfLastPost();

 private:
  struct Connection;

  void serve();
  bool serveConnection(Connection& connection);
  bool answerRequests(Connection& connection);
  void keepPost(std::string_view head, std::string body);

  const PostAnswers _answers;
  const std::string _storebagAnswer;
  platform::FileDescriptor _listener;
  platform::FileDescriptor _stop;
  std::uint16_t _port = 0;

  std::mutex _mutex;
  std::condition_variable _enough;
  std::vector<std::string> _posts;
  std::string _lastHead;
  std::size_t _awaited = SIZE_MAX;

  std::thread _thread;
};

}  // namespace tallyd::bench
