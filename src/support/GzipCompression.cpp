#include "support/GzipCompression.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

constexpr std::string_view kSignature = "NSData *compressDataWithZlibOrGzip(BOOL, NSData *)";

// zlib.h, deflateInit2: 15 is the largest window; 16 more asks for the gzip container.
constexpr int kZlibWindowBits = 15;
constexpr int kGzipWindowBits = 15 + 16;
constexpr int kDefaultMemoryLevel = 8;

const char* messageOf(const z_stream& stream) { return stream.msg ? stream.msg : "(null)"; }

}  // namespace

std::string_view initialisationErrorText(int zlibCode) {
  switch (zlibCode) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_MEM_ERROR:
      return "Insufficient memory.";
    case Z_STREAM_ERROR:
      return "Invalid parameter passed in to function.";
    default:
      return "Unknown error code.";
  }
}

std::string_view compressionErrorText(int zlibCode) {
  switch (zlibCode) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_BUF_ERROR:
      return "Ran out of output buffer for writing compressed bytes.";
    case Z_MEM_ERROR:
      return "Memory could not be allocated for processing.";
    case Z_DATA_ERROR:
      return "The deflate data was invalid or incomplete.";
    case Z_STREAM_ERROR:
      return "The stream state was inconsistent (e.g., next_in or next_out was NULL).";
    case Z_ERRNO:
      return "Error occured while reading file.";
    default:
      return "Unknown error code.";
  }
}

std::optional<std::string> compressDataWithZlibOrGzip(CompressionContainer container, std::string_view data,
                                                      platform::Log& log, const DeflateFunctions& zlib) {
  if (data.empty()) {
    asl_log(log, LogLevel::Error, "[{}] Cannot compress empty NSData", kSignature);
    return std::nullopt;
  }
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  const int windowBits = container == CompressionContainer::Gzip ? kGzipWindowBits : kZlibWindowBits;
  const int initialised =
      zlib.initialise(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, windowBits, kDefaultMemoryLevel,
                      Z_DEFAULT_STRATEGY, ZLIB_VERSION, static_cast<int>(sizeof stream));
  if (initialised != Z_OK) {
    asl_log(log, LogLevel::Error, "{}: deflateInit2() Error: \"{}\" Message: \"{}\"", kSignature,
            initialisationErrorText(initialised), messageOf(stream));
    return std::nullopt;
  }

  std::string output(zlib.bound(&stream, data.size()), '\0');
  int status = Z_OK;
  while (status == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(output.data()) + stream.total_out;
    stream.avail_out = static_cast<uInt>(output.size()) - static_cast<uInt>(stream.total_out);
    status = zlib.deflate(&stream, Z_FINISH);
  }
  if (status != Z_STREAM_END) {
    asl_log(log, LogLevel::Error, "{}: zlib error while attempting compression: \"{}\" Message: \"{}\"",
            kSignature, compressionErrorText(status), messageOf(stream));
    zlib.end(&stream);
    return std::nullopt;
  }
  zlib.end(&stream);
  output.resize(stream.total_out);
  asl_log(log, LogLevel::Debug, "{}: Compressed file from {} to {}", kSignature, data.size(), output.size());
  return output;
}

std::optional<std::string> gzipDeflate(std::string_view data, platform::Log& log) {
  return compressDataWithZlibOrGzip(CompressionContainer::Gzip, data, log);
}

}  // namespace tallyd
