// libcurl's handles with owners: easy handles, their pool, and what they share.
#pragma once

#include <curl/curl.h>

#include <array>
#include <cstddef>
#include <functional>
#include <memory>
#include <mutex>
#include <vector>

namespace tallyd::platform {

struct CurlEasyDeleter {
  void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
};
using CurlEasy = std::unique_ptr<CURL, CurlEasyDeleter>;

struct CurlMultiDeleter {
  void operator()(CURLM* handle) const { curl_multi_cleanup(handle); }
};
using CurlMulti = std::unique_ptr<CURLM, CurlMultiDeleter>;

struct CurlListDeleter {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};
using CurlList = std::unique_ptr<curl_slist, CurlListDeleter>;

/// Prepares libcurl once in the process; starts no thread.
void initialiseCurl();

/// Looked-up names and TLS sessions, shared by all handles that are given it; it outlives them.
///
/// Threading: any thread; libcurl takes the locks.
class CurlShare {
 public:
  CurlShare();
  ~CurlShare();
  CurlShare(const CurlShare&) = delete;
  CurlShare& operator=(const CurlShare&) = delete;

  [[nodiscard]] CURLSH* get() const { return _share; }

 private:
  static void lock(CURL* handle, curl_lock_data data, curl_lock_access access, void* self);
  static void unlock(CURL* handle, curl_lock_data data, void* self);

  CURLSH* _share;
  std::array<std::mutex, CURL_LOCK_DATA_LAST> _mutexes;
};

/// Easy handles between two uses. A handle keeps the connections that it made itself, and its options:
/// putting them back takes memory, and a handle that lacked it would spoil the request after the next.
///
/// Threading: any thread; one handle belongs to one user at a time.
class CurlHandlePool {
 public:
  /// @param configure  sets what all users of the handles want, once for each handle; false when that fails.
  CurlHandlePool(std::size_t maximumIdle, std::function<bool(CURL*)> configure);

  /// A configured handle, whose other options are those of its last user; null when memory runs out.
  [[nodiscard]] CurlEasy take();
  void giveBack(CurlEasy handle);  ///< Takes no memory.

 private:
  const std::size_t _maximumIdle;
  const std::function<bool(CURL*)> _configure;
  std::mutex _mutex;
  std::vector<CurlEasy> _idle;
};

}  // namespace tallyd::platform
