#include "station/RequestBody.h"

#include <fmt/format.h>
#include <httplib.h>

#include <exception>
#include <utility>

#include "station/HTTPStatus.h"

namespace tallyd::station {

namespace {

constexpr const char* kContentEncoding = "Content-Encoding";

/// Keeps the library from decoding: it takes a gzip body without its trailer for a whole one. Its reader asks
/// the request's headers when it is called, and the request is the library's own and no constant.
void takeBodyAsItIs(const httplib::Request& request) {
  const_cast<httplib::Request&>(request).headers.erase(kContentEncoding);
}

void fail(BodyResult& result, int status, std::string problem) {
  result.status = status;
  result.problem = std::move(problem);
}

}  // namespace

BodyResult readBody(const httplib::Request& request, const httplib::ContentReader& reader,
                    std::uint64_t limit, BodyDecoder::Sink sink) {
  BodyResult result;
  result.encoding = request.get_header_value(kContentEncoding);
  takeBodyAsItIs(request);
  const auto encoding = BodyDecoder::encodingNamed(result.encoding);
  if (encoding) {
    result.encoding = BodyDecoder::nameOf(*encoding);
  } else {
    fail(result, kUnsupportedMediaType,
         fmt::format("the body's encoding is not known ({})", result.encoding));
  }
  BodyDecoder decoder(encoding.value_or(BodyDecoder::Encoding::Identity), limit, std::move(sink));
  const auto attempt = [&result](auto&& step) {
    if (result.status != 0) return;
    try {
      step();
    } catch (const BodyError& error) {
      fail(result, error.status(), error.what());
    } catch (const std::exception& exception) {
      fail(result, kServerError, exception.what());
    }
  };
  const bool isRead = reader([&](const char* bytes, std::size_t size) {
    attempt([&] { decoder.put({bytes, size}); });
    return true;
  });
  if (!isRead && result.status == 0) fail(result, kBadRequest, "the body is not whole");
  attempt([&] { decoder.finish(); });
  return result;
}

}  // namespace tallyd::station
