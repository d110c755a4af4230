// A collector on the loopback interface that does as little as a collector can: it takes and answers.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::bench {

/// Plain HTTP/1.1 with kept-alive connections on a port that the system chooses. Posts are answered at once
/// and kept as they came; every GET gets one fixed document, the signed storebag.
///
/// One thread polls all connections. Threading: any thread.
class Collector {
 public:
  /// @param storebag  the body of the answer to each GET.
  explicit Collector(std::string storebag);
  ~Collector();
  Collector(const Collector&) = delete;
  Collector& operator=(const Collector&) = delete;

  [[nodiscard]] std::string url(const std::string& path) const;
  /// Returns when `count` posts have come since the last takePosts(). Throws std::runtime_error when no post
  /// has come for long.
  void waitForPosts(std::size_t count);
  /// The bodies of all posts since the last call.
  [[nodiscard]] std::vector<std::string> takePosts();

 private:
  struct Connection;

  void serve();
  bool serveConnection(Connection& connection);
  bool answerRequests(Connection& connection);
  void keepPost(std::string body);

  const std::string _storebagAnswer;
  platform::FileDescriptor _listener;
  platform::FileDescriptor _stop;
  std::uint16_t _port = 0;

  std::mutex _mutex;
  std::condition_variable _enough;
  std::vector<std::string> _posts;
  std::size_t _awaited = SIZE_MAX;

  std::thread _thread;
};

}  // namespace tallyd::bench
