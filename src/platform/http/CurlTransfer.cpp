#include "platform/http/CurlTransfer.h"

#include <fmt/format.h>
#include <strings.h>

#include <algorithm>
#include <new>
#include <string_view>

namespace tallyd::platform {

namespace {

constexpr const char* kSchemes = "http,https";

struct URLDeleter {
  void operator()(CURLU* url) const { curl_url_cleanup(url); }
};
using ParsedURL = std::unique_ptr<CURLU, URLDeleter>;

/// The parsed URL, or null; a URL without a scheme is not guessed at.
ParsedURL parseURL(const std::string& text) {
  ParsedURL url(curl_url());
  if (!url) throw std::bad_alloc();
  const CURLUcode code = curl_url_set(url.get(), CURLUPART_URL, text.c_str(), CURLU_NON_SUPPORT_SCHEME);
  if (code == CURLUE_OUT_OF_MEMORY) throw std::bad_alloc();
  if (code != CURLUE_OK) url.reset();
  return url;
}

/// Asked again for the same URL, as of one post after the other, it remembers.
bool isURL(const std::string& text) {
  thread_local std::string known;
  if (text == known && !known.empty()) return true;
  if (!parseURL(text)) return false;
  known = text;
  return true;
}

std::string urlPart(CURLU* url, CURLUPart part) {
  char* text = nullptr;
  if (curl_url_get(url, part, &text, 0) != CURLUE_OK) return {};
  std::string result(text);
  curl_free(text);
  return result;
}

bool isHTTPS(const std::string& url) { return strncasecmp(url.c_str(), "https:", 6) == 0; }

/// RFC 9110, section 5.6.2.
bool isToken(std::string_view text) {
  constexpr std::string_view kOthers = "!#$%&'*+-.^_`|~";
  return !text.empty() && std::all_of(text.begin(), text.end(), [&](char c) {
    return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
           kOthers.find(c) != std::string_view::npos;
  });
}

bool sameName(std::string_view left, std::string_view right) {
  return left.size() == right.size() && strncasecmp(left.data(), right.data(), left.size()) == 0;
}

/// What no further attempt mends. Names that can't be looked up and certificates that do not hold are not
/// among them: networks and servers get into order.
bool isPermanent(CURLcode code) {
  switch (code) {
    case CURLE_UNSUPPORTED_PROTOCOL:
    case CURLE_URL_MALFORMAT:
    case CURLE_TOO_MANY_REDIRECTS:
      return true;
    default:
      return false;
  }
}

/// A header as libcurl's list takes it; there, an empty value is written with a semicolon.
std::string headerLine(const std::string& name, std::string value) {
  std::replace_if(
      value.begin(), value.end(), [](char c) { return c == '\r' || c == '\n' || c == '\0'; }, ' ');
  if (value.find_first_not_of(" \t") == std::string::npos) return name + ";";
  return name + ": " + value;
}

}  // namespace

std::string urlForMessages(const std::string& url) {
  const ParsedURL parsed = parseURL(url);
  if (!parsed) return url.empty() ? "no URL" : "a URL that can't be parsed";
  for (const CURLUPart secret :
       {CURLUPART_USER, CURLUPART_PASSWORD, CURLUPART_OPTIONS, CURLUPART_QUERY, CURLUPART_FRAGMENT}) {
    curl_url_set(parsed.get(), secret, nullptr, 0);
  }
  return urlPart(parsed.get(), CURLUPART_URL);
}

HTTPResult failedRequest(const HTTPRequest& request, const std::string& reason, HTTPFailure kind) {
  HTTPResult result;
  result.failure = kind;
  result.error = fmt::format("{} ({})", reason, urlForMessages(request.url));
  return result;
}

HTTPResult outOfMemory(const HTTPRequest& request) noexcept {
  constexpr const char* kReason = "out of memory";  // Short enough to lie within its string.
  try {
    return failedRequest(request, kReason);
  } catch (const std::bad_alloc&) {
    HTTPResult result;
    result.error = kReason;
    return result;
  }
}

/// Sets options and remembers the first that was refused.
class CurlTransfer::Options {
 public:
  explicit Options(CURL* handle) : _handle(handle) {}

  template <class T>
  void set(CURLoption option, T value) {
    if (_code == CURLE_OK) _code = curl_easy_setopt(_handle, option, value);
  }
  [[nodiscard]] CURLcode code() const { return _code; }

 private:
  CURL* _handle;
  CURLcode _code = CURLE_OK;
};

CurlTransfer::CurlTransfer(CurlEasy handle, HTTPRequest request, ResponseBody responseBody,
                           const CurlEnvironment& environment)
    : _handle(std::move(handle)),
      _request(std::move(request)),
      _responseBody(responseBody),
      _environment(environment) {}

bool CurlTransfer::configure(CURL* handle, const CurlEnvironment& environment) {
  Options options(handle);
  options.set(CURLOPT_NOSIGNAL, 1L);
  options.set(CURLOPT_USERAGENT, "tallyd");
  options.set(CURLOPT_SHARE, environment.share.get());
  options.set(CURLOPT_TCP_KEEPALIVE, 1L);
  options.set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_2TLS));
  options.set(CURLOPT_PROTOCOLS_STR, kSchemes);
  options.set(CURLOPT_REDIR_PROTOCOLS_STR, kSchemes);
  options.set(CURLOPT_FOLLOWLOCATION, 1L);
  options.set(CURLOPT_MAXREDIRS, static_cast<long>(environment.limits.maximumRedirects));
  // The anchors come from the shared store; libcurl's own way would read the whole bundle for each
  // connection.
  options.set(CURLOPT_CAINFO, static_cast<char*>(nullptr));
  options.set(CURLOPT_CAPATH, static_cast<char*>(nullptr));
  options.set(CURLOPT_SSL_VERIFYPEER, 1L);
  options.set(CURLOPT_SSL_VERIFYHOST, 2L);
  options.set(CURLOPT_SSL_CTX_FUNCTION, &CurlTransfer::onTLSContext);
  options.set(CURLOPT_SSL_CTX_DATA, &environment.anchors);
  options.set(CURLOPT_WRITEFUNCTION, &CurlTransfer::onBody);
  options.set(CURLOPT_HEADERFUNCTION, &CurlTransfer::onHeader);
  options.set(CURLOPT_PREREQFUNCTION, &CurlTransfer::onStart);
  return options.code() == CURLE_OK;
}

std::optional<std::string> CurlTransfer::prepare() {
  if (!_handle) throw std::bad_alloc();
  if (!isURL(_request.url)) return "bad URL";
  if (!isToken(_request.method)) return "bad method";
  if (_request.method == "GET" && !_request.body.empty()) return "a GET request can't carry a body";
  if (auto problem = prepareHeaders()) return problem;

  Options options(_handle.get());
  options.set(CURLOPT_URL, _request.url.c_str());
  options.set(CURLOPT_ERRORBUFFER, _error.data());
  options.set(CURLOPT_HTTPHEADER, _headers.get());
  setMethod(options);
  // Waiting for a connection under way to turn out multiplexed beats opening one for each post of a burst.
  options.set(CURLOPT_PIPEWAIT, isHTTPS(_request.url) ? 1L : 0L);
  options.set(CURLOPT_FRESH_CONNECT, 0L);
  setTimes(options);
  setUser(options);
  if (options.code() == CURLE_OUT_OF_MEMORY) throw std::bad_alloc();
  if (options.code() != CURLE_OK) return curl_easy_strerror(options.code());
  return std::nullopt;
}

std::optional<std::string> CurlTransfer::prepareHeaders() {
  const auto append = [this](const std::string& line) {
    curl_slist* longer = curl_slist_append(_headers.get(), line.c_str());
    if (longer == nullptr) throw std::bad_alloc();
    static_cast<void>(_headers.release());
    _headers.reset(longer);
  };
  bool hasContentType = false;
  for (const auto& [name, value] : _request.headers) {
    if (!isToken(name)) return "bad header name";
    // libcurl writes the body's own length; one from this list would also go with the GET that follows a
    // redirect.
    if (sameName(name, "Content-Length")) continue;
    hasContentType = hasContentType || sameName(name, "Content-Type");
    append(headerLine(name, value));
  }
  if (_request.cachePolicy == CachePolicy::ReloadIgnoringCache) {
    append("Cache-Control: no-cache");
    append("Pragma: no-cache");
  }
  // A name without a value keeps libcurl from adding the header itself.
  append("Expect:");
  if (!hasContentType) append("Content-Type:");
  return std::nullopt;
}

void CurlTransfer::setMethod(Options& options) {
  const std::string& method = _request.method;
  // What the handle's last request was; setting the fields makes it a POST.
  options.set(CURLOPT_CUSTOMREQUEST, static_cast<char*>(nullptr));
  options.set(CURLOPT_POSTFIELDS, static_cast<char*>(nullptr));
  options.set(CURLOPT_HTTPGET, 1L);
  if (method == "GET") return;
  if (method == "HEAD") {
    options.set(CURLOPT_NOBODY, 1L);
    return;
  }
  if (method == "POST" || !_request.body.empty()) {
    const std::string_view body = _request.body.bytes();
    options.set(CURLOPT_POST, 1L);
    options.set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size()));
    options.set(CURLOPT_POSTFIELDS, body.empty() ? "" : body.data());
  }
  // Not for POST: a custom method would also be kept where a redirect asks for a GET.
  if (method != "POST") options.set(CURLOPT_CUSTOMREQUEST, method.c_str());
}

void CurlTransfer::setTimes(Options& options) {
  const bool hasTimeout = _request.timeout.count() > 0;
  const std::chrono::milliseconds stall = _environment.limits.stallTime;
  options.set(CURLOPT_TIMEOUT_MS, static_cast<long>(hasTimeout ? _request.timeout.count() : 0));
  options.set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>((hasTimeout ? _request.timeout : stall).count()));
  options.set(CURLOPT_LOW_SPEED_LIMIT, hasTimeout ? 0L : 1L);
  options.set(CURLOPT_LOW_SPEED_TIME,
              hasTimeout ? 0L : static_cast<long>(_environment.limits.stallTime.count()));
}

void CurlTransfer::setUser(Options& options) {
  options.set(CURLOPT_PRIVATE, static_cast<void*>(this));
  options.set(CURLOPT_WRITEDATA, static_cast<void*>(this));
  options.set(CURLOPT_HEADERDATA, static_cast<void*>(this));
  options.set(CURLOPT_PREREQDATA, static_cast<void*>(this));
}

/// libcurl itself runs a request again when it finds the connection dead before it sends or while it
/// receives, and not when it finds that while it sends a body.
bool CurlTransfer::prepareSecondAttempt(CURLcode code) {
  long newConnections = 0;
  long status = 0;
  curl_easy_getinfo(_handle.get(), CURLINFO_NUM_CONNECTS, &newConnections);
  curl_easy_getinfo(_handle.get(), CURLINFO_RESPONSE_CODE, &status);
  if (code != CURLE_SEND_ERROR || newConnections != 0 || status != 0 || _secondAttempt) return false;
  _secondAttempt = true;
  _error.front() = '\0';
  return curl_easy_setopt(_handle.get(), CURLOPT_FRESH_CONNECT, 1L) == CURLE_OK;
}

CurlEasy CurlTransfer::releaseHandle() {
  if (_handle) {
    for (const CURLoption pointer :
         {CURLOPT_ERRORBUFFER, CURLOPT_HTTPHEADER, CURLOPT_POSTFIELDS, CURLOPT_PRIVATE, CURLOPT_WRITEDATA,
          CURLOPT_HEADERDATA, CURLOPT_PREREQDATA})
      curl_easy_setopt(_handle.get(), pointer, static_cast<void*>(nullptr));
  }
  return std::move(_handle);
}

HTTPResult CurlTransfer::result(CURLcode code) {
  if (_tooLarge || code != CURLE_OK) return failure(code);
  HTTPResult result;
  result.response = response();
  result.data = Data(std::move(_body));
  return result;
}

HTTPResult CurlTransfer::failure(CURLcode code) const {
  if (_tooLarge) {
    return failedRequest(
        _request, fmt::format("response of more than {} bytes", _environment.limits.maximumResponseBytes),
        HTTPFailure::Permanent);
  }
  if (_outOfMemory) return outOfMemory(_request);
  return failedRequest(_request,
                       _error.front() != '\0' ? std::string(_error.data()) : curl_easy_strerror(code),
                       isPermanent(code) ? HTTPFailure::Permanent : HTTPFailure::Transfer);
}

HTTPResponse CurlTransfer::response() const {
  HTTPResponse response;
  long status = 0;
  curl_easy_getinfo(_handle.get(), CURLINFO_RESPONSE_CODE, &status);
  response.status = static_cast<int>(status);
  constexpr int kLastResponse = -1;
  curl_header* header = nullptr;
  while ((header = curl_easy_nextheader(_handle.get(), CURLH_HEADER, kLastResponse, header)) != nullptr) {
    response.headers.emplace_back(header->name, header->value);
  }
  return response;
}

bool CurlTransfer::received(const char* bytes, std::size_t size, ResponseBody use) {
  _tooLarge = _tooLarge || size > _environment.limits.maximumResponseBytes - _receivedBytes;
  if (_tooLarge) return false;
  _receivedBytes += size;
  if (use == ResponseBody::Keep) _body.append(bytes, size);
  return true;
}

std::size_t CurlTransfer::onBody(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  try {
    return transfer.received(bytes, size * count, transfer._responseBody) ? size * count : 0;
  } catch (const std::bad_alloc&) {
    transfer._outOfMemory = true;
    return 0;  // Ends the transfer; an exception may not pass through libcurl.
  }
}

std::size_t CurlTransfer::onHeader(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  return transfer.received(bytes, size * count, ResponseBody::Drop) ? size * count : 0;
}

int CurlTransfer::onStart(void* self, char*, char*, int, int) {
  ++static_cast<CurlTransfer*>(self)->_starts;
  return CURL_PREREQFUNC_OK;
}

CURLcode CurlTransfer::onTLSContext(CURL*, void* context, void* anchors) {
  try {
    const bool applied = static_cast<TrustAnchors*>(anchors)->applyTo(static_cast<ssl_ctx_st*>(context));
    return applied ? CURLE_OK : CURLE_OUT_OF_MEMORY;
  } catch (const std::bad_alloc&) {
    return CURLE_OUT_OF_MEMORY;
  }
}

}  // namespace tallyd::platform
