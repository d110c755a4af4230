// One HTTP request on one libcurl handle.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <utility>

#include "platform/HTTPClient.h"
#include "platform/http/CurlHandles.h"
#include "platform/http/HTTPLimits.h"
#include "platform/http/TrustAnchors.h"

namespace tallyd::platform {

/// What all transfers have in common; borrowed.
struct CurlEnvironment {
  const CurlShare& share;
  TrustAnchors& anchors;
  const HTTPLimits& limits;
};

/// The URL without user, password, query and fragment, as messages may show it; a general phrase when it
/// can't be parsed.
[[nodiscard]] std::string urlForMessages(const std::string& url);

/// An error about `request` that no transfer came to.
[[nodiscard]] HTTPResult failedRequest(const HTTPRequest& request, const std::string& reason,
                                       HTTPFailure kind = HTTPFailure::Transfer);

/// The error of a request for which memory ran out; of the next attempt nothing is known. Takes no memory
/// where there is none, and then lacks the URL.
[[nodiscard]] HTTPResult outOfMemory(const HTTPRequest& request) noexcept;

/// Sets a handle up for a request, receives the response, and says what became of it.
///
/// Life cycle: prepare(), then the handle is run by curl_easy_perform or a multi handle, once more when
/// prepareSecondAttempt() says so, then result(). It stays where it is from prepare() on: the handle points
/// to it.
///
/// Threading: one thread at a time.
class CurlTransfer {
 public:
  enum class ResponseBody { Keep, Drop };

  CurlTransfer(CurlEasy handle, HTTPRequest request, ResponseBody responseBody,
               const CurlEnvironment& environment);
  CurlTransfer(const CurlTransfer&) = delete;
  CurlTransfer& operator=(const CurlTransfer&) = delete;

  /// Sets the options that are the same for all requests; false when libcurl refuses one.
  [[nodiscard]] static bool configure(CURL* handle, const CurlEnvironment& environment);

  /// Sets every option that differs from request to request, on a handle that is configured; what is wrong
  /// with this one, or nothing. Throws std::bad_alloc.
  [[nodiscard]] std::optional<std::string> prepare();

  [[nodiscard]] CURL* handle() const { return _handle.get(); }
  [[nodiscard]] const HTTPRequest& request() const { return _request; }
  /// Whether a connection was found and the request is on its way.
  [[nodiscard]] bool hasStarted() const { return _starts > 0; }
  /// Whether the handle may be used again: libcurl counts how often requests of a handle had to be run again,
  /// for as long as there is the handle, and after five times lets the next one fail.
  [[nodiscard]] bool mayReuseHandle() const { return _starts <= 1; }

  /// After the handle has been run: whether the request is to be run once more, on a connection of its own,
  /// because the one that it had waited idle and was closed by the server as the request came. Such a request
  /// has not been served (RFC 9112, section 9.3.1).
  [[nodiscard]] bool prepareSecondAttempt(CURLcode code);
  [[nodiscard]] HTTPResult result(CURLcode code);
  /// The handle back, for another use; last. It points to nothing of this object any more.
  [[nodiscard]] CurlEasy releaseHandle();

 private:
  class Options;

  [[nodiscard]] std::optional<std::string> prepareHeaders();
  void setMethod(Options& options);
  void setTimes(Options& options);
  void setUser(Options& options);
  [[nodiscard]] HTTPResult failure(CURLcode code) const;
  [[nodiscard]] HTTPResponse response() const;
  [[nodiscard]] bool received(const char* bytes, std::size_t size, ResponseBody use);

  static std::size_t onBody(char* bytes, std::size_t size, std::size_t count, void* self);
  static std::size_t onHeader(char* bytes, std::size_t size, std::size_t count, void* self);
  static int onStart(void* self, char* primary, char* local, int primaryPort, int localPort);
  static CURLcode onTLSContext(CURL* handle, void* context, void* anchors);

  CurlEasy _handle;
  const HTTPRequest _request;
  const ResponseBody _responseBody;
  const CurlEnvironment& _environment;
  CurlList _headers;
  std::array<char, CURL_ERROR_SIZE> _error{};
  std::string _body;
  std::size_t _receivedBytes = 0;
  bool _tooLarge = false;
  bool _outOfMemory = false;
  int _starts = 0;  ///< How often it was on its way; more than once also after a redirect.
  bool _secondAttempt = false;
};

}  // namespace tallyd::platform
