// One-pass compression of whole buffers with zlib.
#pragma once

#include <zlib.h>

#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"

namespace tallyd {

enum class CompressionContainer {
  Zlib,  ///< RFC 1950.
  Gzip,  ///< RFC 1952.
};

/// The four operations of zlib that a compression takes.
struct DeflateFunctions {
  int (*initialise)(z_streamp stream, int level, int method, int windowBits, int memLevel, int strategy,
                    const char* version, int streamSize) = deflateInit2_;
  uLong (*bound)(z_streamp stream, uLong inputBytes) = deflateBound;
  int (*deflate)(z_streamp stream, int flush) = ::deflate;
  int (*end)(z_streamp stream) = deflateEnd;
};

/// The whole of `data`, compressed at zlib's default level; nothing, after one error line, when it is empty
/// or zlib fails.
///
/// Holds the input and one output buffer of zlib's upper bound at a time. Inputs of 4 GiB and more are not
/// supported. Threading: any thread.
[[nodiscard]] std::optional<std::string> compressDataWithZlibOrGzip(CompressionContainer container,
                                                                    std::string_view data, platform::Log& log,
                                                                    const DeflateFunctions& zlib = {});

/// The same in the gzip container. Each thread that comes here keeps a stream, and an output buffer of at
/// most 256 KiB, for the next time.
[[nodiscard]] std::optional<std::string> gzipDeflate(std::string_view data, platform::Log& log);

/// What the log says of a zlib code that ended the set-up, and of one that ended the compression.
[[nodiscard]] std::string_view initialisationErrorText(int zlibCode);
[[nodiscard]] std::string_view compressionErrorText(int zlibCode);

}  // namespace tallyd
