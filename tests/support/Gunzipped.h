// What a compressed body says.
#pragma once

#include <zlib.h>

#include <array>
#include <stdexcept>
#include <string>
#include <string_view>

namespace tallyd::test {

/// The text in the one gzip member that `compressed` is as a whole. Throws std::runtime_error when it is
/// anything else.
inline std::string gunzipped(std::string_view compressed) {
  constexpr int kGzip = 15 + 16;  // zlib.h: the largest window, with a gzip header.
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  if (inflateInit2(&stream, kGzip) != Z_OK) throw std::runtime_error("inflateInit2");
  std::string text;
  int status = Z_OK;
  while (status == Z_OK) {
    std::array<char, 4096> piece;
    stream.next_out = reinterpret_cast<Bytef*>(piece.data());
    stream.avail_out = static_cast<uInt>(piece.size());
    status = inflate(&stream, Z_NO_FLUSH);
    text.append(piece.data(), piece.size() - stream.avail_out);
  }
  inflateEnd(&stream);
  if (status != Z_STREAM_END || stream.avail_in > 0) throw std::runtime_error("not one gzip member");
  return text;
}

}  // namespace tallyd::test
