#include "CurlFloor.h"

#include <curl/curl.h>

#include <memory>
#include <new>
#include <stdexcept>

#include "Collector.h"
#include "Measure.h"
#include "ZlibFloor.h"

namespace tallyd::bench {

namespace {

struct ListDeleter {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};
using HeaderList = std::unique_ptr<curl_slist, ListDeleter>;

void check(CURLcode code) {
  if (code != CURLE_OK) throw std::runtime_error(curl_easy_strerror(code));
}

void append(HeaderList& list, const std::string& line) {
  curl_slist* longer = curl_slist_append(list.get(), line.c_str());
  if (!longer) throw std::bad_alloc();
  static_cast<void>(list.release());
  list.reset(longer);
}

/// libcurl writes the host and the length itself.
HeaderList listOf(const std::vector<std::string>& headers) {
  HeaderList list;
  for (const std::string& header : headers) {
    if (!header.starts_with("Host:") && !header.starts_with("Content-Length:")) append(list, header);
  }
  append(list, "Expect:");  // Without a value it keeps libcurl from adding the header.
  return list;
}

/// One easy handle, whose connection stays.
class Poster {
 public:
  Poster(const std::string& url, const std::vector<std::string>& headers)
      : _handle(curl_easy_init(), curl_easy_cleanup), _headers(listOf(headers)) {
    if (!_handle) throw std::bad_alloc();
    check(curl_easy_setopt(_handle.get(), CURLOPT_URL, url.c_str()));
    check(curl_easy_setopt(_handle.get(), CURLOPT_POST, 1L));
    check(curl_easy_setopt(_handle.get(), CURLOPT_HTTPHEADER, _headers.get()));
    check(curl_easy_setopt(_handle.get(), CURLOPT_NOSIGNAL, 1L));
  }

  void post(const std::string& document) {
    constexpr long kOK = 200;
    const std::string_view body = _deflater.deflate(document);
    check(curl_easy_setopt(_handle.get(), CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body.size())));
    check(curl_easy_setopt(_handle.get(), CURLOPT_POSTFIELDS, body.data()));
    check(curl_easy_perform(_handle.get()));
    long status = 0;
    check(curl_easy_getinfo(_handle.get(), CURLINFO_RESPONSE_CODE, &status));
    if (status != kOK) throw std::runtime_error("the collector refuses a post");
  }

 private:
  std::unique_ptr<CURL, decltype(&curl_easy_cleanup)> _handle;
  HeaderList _headers;
  Deflater _deflater;
};

}  // namespace

PostLoopTimes postLoopTimes(const std::vector<std::string>& documents,
                            const std::vector<std::string>& headers) {
  Collector collector("");
  Poster poster(collector.url("/events"), headers);
  poster.post(documents.front());  // Connects.
  const double processorBefore = processorSecondsOfThisThread();
  const Stopwatch stopwatch;
  for (const std::string& document : documents) poster.post(document);
  return {stopwatch.seconds(), processorSecondsOfThisThread() - processorBefore};
}

}  // namespace tallyd::bench
