#include "platform/http/CurlHandles.h"

#include <utility>

namespace tallyd::platform {

void initialiseCurl() {
  // Never undone: other parts of the process may use libcurl or OpenSSL until it ends.
  static const CURLcode initialised = curl_global_init(CURL_GLOBAL_DEFAULT);
  static_cast<void>(initialised);
}

CurlShare::CurlShare() : _share(curl_share_init()) {
  if (_share == nullptr) return;
  curl_share_setopt(_share, CURLSHOPT_USERDATA, this);
  curl_share_setopt(_share, CURLSHOPT_LOCKFUNC, &CurlShare::lock);
  curl_share_setopt(_share, CURLSHOPT_UNLOCKFUNC, &CurlShare::unlock);
  curl_share_setopt(_share, CURLSHOPT_SHARE, CURL_LOCK_DATA_DNS);
  curl_share_setopt(_share, CURLSHOPT_SHARE, CURL_LOCK_DATA_SSL_SESSION);
}

CurlShare::~CurlShare() { curl_share_cleanup(_share); }

void CurlShare::lock(CURL*, curl_lock_data data, curl_lock_access, void* self) {
  static_cast<CurlShare*>(self)->_mutexes[static_cast<std::size_t>(data)].lock();
}

void CurlShare::unlock(CURL*, curl_lock_data data, void* self) {
  static_cast<CurlShare*>(self)->_mutexes[static_cast<std::size_t>(data)].unlock();
}

CurlHandlePool::CurlHandlePool(std::size_t maximumIdle, std::function<bool(CURL*)> configure)
    : _maximumIdle(maximumIdle), _configure(std::move(configure)) {
  _idle.reserve(maximumIdle);
}

CurlEasy CurlHandlePool::take() {
  {
    const std::lock_guard lock(_mutex);
    if (!_idle.empty()) {
      CurlEasy handle = std::move(_idle.back());
      _idle.pop_back();
      return handle;
    }
  }
  CurlEasy handle(curl_easy_init());
  if (handle && !_configure(handle.get())) handle.reset();
  return handle;
}

void CurlHandlePool::giveBack(CurlEasy handle) {
  if (!handle) return;
  const std::lock_guard lock(_mutex);
  if (_idle.size() < _maximumIdle) _idle.push_back(std::move(handle));
}

}  // namespace tallyd::platform
