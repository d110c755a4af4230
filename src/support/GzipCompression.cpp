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

namespace {

/// Outputs up to this size are written into a buffer that the thread keeps.
constexpr std::size_t kKeptOutputBytes = 256 * 1024;

bool isEmpty(std::string_view data, platform::Log& log) {
  if (data.empty()) asl_log(log, LogLevel::Error, "[{}] Cannot compress empty NSData", kSignature);
  return data.empty();
}

void logSetUpFailure(int code, const z_stream& stream, platform::Log& log) {
  asl_log(log, LogLevel::Error, "{}: deflateInit2() Error: \"{}\" Message: \"{}\"", kSignature,
          initialisationErrorText(code), messageOf(stream));
}

int setUp(z_stream& stream, CompressionContainer container, const DeflateFunctions& zlib) {
  const int windowBits = container == CompressionContainer::Gzip ? kGzipWindowBits : kZlibWindowBits;
  return zlib.initialise(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, windowBits, kDefaultMemoryLevel,
                         Z_DEFAULT_STRATEGY, ZLIB_VERSION, static_cast<int>(sizeof stream));
}

/// The output's length within `output`, with a stream that is set up; nothing, after an error line, when zlib
/// fails.
std::optional<std::size_t> deflateInto(std::string& output, std::string_view data, z_stream& stream,
                                       platform::Log& log, const DeflateFunctions& zlib) {
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  int status = Z_OK;
  while (status == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(output.data()) + stream.total_out;
    stream.avail_out = static_cast<uInt>(output.size()) - static_cast<uInt>(stream.total_out);
    status = zlib.deflate(&stream, Z_FINISH);
  }
  if (status != Z_STREAM_END) {
    asl_log(log, LogLevel::Error, "{}: zlib error while attempting compression: \"{}\" Message: \"{}\"",
            kSignature, compressionErrorText(status), messageOf(stream));
    return std::nullopt;
  }
  asl_log(log, LogLevel::Debug, "{}: Compressed file from {} to {}", kSignature, data.size(),
          stream.total_out);
  return stream.total_out;
}

/// A thread's gzip stream and output: to set them up costs more than to compress a small document.
class KeptStream {
 public:
  KeptStream() = default;
  ~KeptStream() {
    if (_isSetUp) deflateEnd(&_stream);
  }
  KeptStream(const KeptStream&) = delete;
  KeptStream& operator=(const KeptStream&) = delete;

  std::optional<std::string> compress(std::string_view data, platform::Log& log) {
    const int code = _isSetUp ? deflateReset(&_stream) : setUp(_stream, CompressionContainer::Gzip, {});
    if (code != Z_OK) {
      logSetUpFailure(code, _stream, log);
      return std::nullopt;
    }
    _isSetUp = true;
    const std::size_t bound = deflateBound(&_stream, data.size());
    if (bound > kKeptOutputBytes) {
      std::string output(bound, '\0');
      const auto length = deflateInto(output, data, _stream, log, {});
      if (!length) return std::nullopt;
      output.resize(*length);
      return output;
    }
    if (_output.size() < bound) _output.resize(bound);
    const auto length = deflateInto(_output, data, _stream, log, {});
    return length ? std::optional(_output.substr(0, *length)) : std::nullopt;
  }

 private:
  z_stream _stream{};
  bool _isSetUp = false;
  std::string _output;
};

}  // namespace

std::optional<std::string> compressDataWithZlibOrGzip(CompressionContainer container, std::string_view data,
                                                      platform::Log& log, const DeflateFunctions& zlib) {
  if (isEmpty(data, log)) return std::nullopt;
  z_stream stream{};
  if (const int code = setUp(stream, container, zlib); code != Z_OK) {
    logSetUpFailure(code, stream, log);
    return std::nullopt;
  }
  std::string output(zlib.bound(&stream, data.size()), '\0');
  const auto length = deflateInto(output, data, stream, log, zlib);
  zlib.end(&stream);
  if (!length) return std::nullopt;
  output.resize(*length);
  return output;
}

std::optional<std::string> gzipDeflate(std::string_view data, platform::Log& log) {
  if (isEmpty(data, log)) return std::nullopt;
  thread_local KeptStream stream;
  return stream.compress(data, log);
}

}  // namespace tallyd
