// A request's body, read and decoded.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "station/BodyDecoder.h"

namespace httplib {
struct Request;
class ContentReader;
}  // namespace httplib

namespace tallyd::station {

struct BodyResult {
  std::string encoding;  ///< "gzip" or "identity"; as the request has it when it is another.
  int status = 0;        ///< An HTTP status code; 0 when the whole body was taken.
  std::string problem;   ///< Why it was not.
};

/// Reads a body to its end, also when it can't be taken, so that the connection is good for another request.
/// What the sink throws is a problem with status 500.
///
/// @param limit  Bytes, decoded.
[[nodiscard]] BodyResult readBody(const httplib::Request& request, const httplib::ContentReader& reader,
                                  std::uint64_t limit, BodyDecoder::Sink sink);

}  // namespace tallyd::station
