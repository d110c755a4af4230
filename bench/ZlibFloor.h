// What compressing the same bytes with zlib alone costs.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

struct z_stream_s;

namespace tallyd::bench {

/// Level 6 in the gzip container (RFC 1952). The stream and the output buffer are made once and used for all
/// inputs: no compression with zlib is cheaper. Threading: one thread at a time.
class Deflater {
 public:
  Deflater();
  ~Deflater();
  Deflater(const Deflater&) = delete;
  Deflater& operator=(const Deflater&) = delete;

  /// The result; stays until the next call.
  std::string_view deflate(std::string_view input);

 private:
  const std::unique_ptr<z_stream_s> _stream;
  std::vector<unsigned char> _output;
};

/// Processor seconds for one thread that compresses every document.
[[nodiscard]] double zlibProcessorSeconds(const std::vector<std::string>& documents);
/// Seconds until the documents, shared out among as many threads as there are processors, are compressed.
[[nodiscard]] double zlibSecondsOnAllProcessors(const std::vector<std::string>& documents);

/// The document that a request body holds, compressed or not. Throws std::runtime_error.
[[nodiscard]] std::string documentInBody(std::string_view body);

}  // namespace tallyd::bench
