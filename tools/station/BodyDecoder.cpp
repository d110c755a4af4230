#include "station/BodyDecoder.h"

#include <fmt/format.h>
#include <zlib.h>

#include <algorithm>
#include <array>
#include <limits>
#include <new>
#include <utility>

#include "station/HTTPStatus.h"

namespace tallyd::station {

namespace {

/// zlib.h, inflateInit2: 15 is the largest window; 16 more takes gzip and nothing else.
constexpr int kGzipWindowBits = 15 + 16;
constexpr std::size_t kOutputBytes = 16'384;

char lowered(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

}  // namespace

struct BodyDecoder::Inflater {
  Inflater() {
    if (::inflateInit2(&stream, kGzipWindowBits) != Z_OK) throw std::bad_alloc();
  }
  ~Inflater() { ::inflateEnd(&stream); }
  Inflater(const Inflater&) = delete;
  Inflater& operator=(const Inflater&) = delete;

  z_stream stream{};
  bool isWhole = false;  ///< The last member has ended, and no other begun.
};

std::optional<BodyDecoder::Encoding> BodyDecoder::encodingNamed(std::string_view name) {
  std::string lower(name);
  std::transform(lower.begin(), lower.end(), lower.begin(), lowered);
  if (lower.empty() || lower == "identity") return Encoding::Identity;
  // RFC 9110, section 8.4.1.3: "x-gzip" is the same.
  if (lower == "gzip" || lower == "x-gzip") return Encoding::Gzip;
  return std::nullopt;
}

std::string_view BodyDecoder::nameOf(Encoding encoding) {
  return encoding == Encoding::Gzip ? "gzip" : "identity";
}

BodyDecoder::BodyDecoder(Encoding encoding, std::uint64_t limit, Sink sink)
    : _limit(limit),
      _sink(std::move(sink)),
      _inflater(encoding == Encoding::Gzip ? std::make_unique<Inflater>() : nullptr) {}

BodyDecoder::~BodyDecoder() = default;

void BodyDecoder::put(std::string_view bytes) {
  if (_inflater == nullptr) return hand(bytes);
  while (!bytes.empty()) {
    const std::string_view part = bytes.substr(0, std::numeric_limits<uInt>::max());
    inflate(part);
    bytes.remove_prefix(part.size());
  }
}

void BodyDecoder::finish() const {
  if (_inflater && !_inflater->isWhole)
    throw BodyError(kBadRequest, "the body can't be decoded (gzip): it is cut");
}

void BodyDecoder::hand(std::string_view decoded) {
  if (decoded.empty()) return;
  if (decoded.size() > _limit - _decodedBytes) {
    throw BodyError(kContentTooLarge, fmt::format("the body has more than {} bytes", _limit));
  }
  _decodedBytes += decoded.size();
  _sink(decoded);
}

void BodyDecoder::inflate(std::string_view bytes) {
  z_stream& stream = _inflater->stream;
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
  stream.avail_in = static_cast<uInt>(bytes.size());
  std::array<char, kOutputBytes> output;
  do {
    if (std::exchange(_inflater->isWhole, false)) ::inflateReset(&stream);
    stream.next_out = reinterpret_cast<Bytef*>(output.data());
    stream.avail_out = static_cast<uInt>(output.size());
    const int status = ::inflate(&stream, Z_NO_FLUSH);
    // Z_BUF_ERROR: all is read, and nothing was left to write.
    if (status != Z_OK && status != Z_STREAM_END && status != Z_BUF_ERROR) {
      throw BodyError(kBadRequest, fmt::format("the body can't be decoded (gzip): {}",
                                               stream.msg != nullptr ? stream.msg : "broken"));
    }
    hand({output.data(), output.size() - stream.avail_out});
    _inflater->isWhole = status == Z_STREAM_END;
  } while (stream.avail_in > 0 || (stream.avail_out == 0 && !_inflater->isWhole));
}

std::string decodedBody(BodyDecoder::Encoding encoding, std::uint64_t limit, std::string_view bytes) {
  std::string decoded;
  BodyDecoder decoder(encoding, limit, [&decoded](std::string_view part) { decoded += part; });
  decoder.put(bytes);
  decoder.finish();
  return decoded;
}

}  // namespace tallyd::station
