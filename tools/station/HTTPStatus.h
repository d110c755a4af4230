// The HTTP status codes that the station answers with (RFC 9110, section 15).
#pragma once

namespace tallyd::station {

inline constexpr int kOK = 200;
inline constexpr int kBadRequest = 400;
inline constexpr int kNotFound = 404;
inline constexpr int kContentTooLarge = 413;
inline constexpr int kUnsupportedMediaType = 415;
inline constexpr int kServerError = 500;

}  // namespace tallyd::station
