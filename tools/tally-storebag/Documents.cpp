#include "tally-storebag/Documents.h"

#include <rapidjson/memorystream.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <zlib.h>

#include <algorithm>
#include <array>

namespace tallyd::storebagtool {

namespace {

/// Writes numbers in the letters in which they were read.
class LetterKeepingWriter : public rapidjson::PrettyWriter<rapidjson::StringBuffer> {
 public:
  using PrettyWriter::PrettyWriter;
  bool RawNumber(const char* text, rapidjson::SizeType length, bool /*copy*/) {
    return RawValue(text, length, rapidjson::kNumberType);
  }
};

}  // namespace

std::string indentedJSON(std::string_view json) {
  rapidjson::MemoryStream input(json.data(), json.size());
  rapidjson::StringBuffer output;
  LetterKeepingWriter writer(output);
  writer.SetIndent(' ', 2);
  rapidjson::Reader reader;
  const auto parsed =
      reader.Parse<rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseIterativeFlag>(input, writer);
  return parsed ? std::string(output.GetString(), output.GetSize()) : std::string(json);
}

std::optional<std::string> gunzipped(std::string_view bytes) {
  constexpr int kGzipWindowBits = 15 + 16;  // zlib.h, inflateInit2: 16 more expects a gzip header.
  z_stream stream{};
  if (inflateInit2(&stream, kGzipWindowBits) != Z_OK) return std::nullopt;
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
  stream.avail_in = static_cast<uInt>(bytes.size());
  std::string text;
  std::array<char, 16384> buffer;
  int code = Z_OK;
  while (code == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(buffer.data());
    stream.avail_out = static_cast<uInt>(buffer.size());
    code = inflate(&stream, Z_NO_FLUSH);
    text.append(buffer.data(), buffer.size() - stream.avail_out);
  }
  inflateEnd(&stream);
  return code == Z_STREAM_END ? std::optional(std::move(text)) : std::nullopt;
}

std::string documentOf(const platform::HTTPRequest& request) {
  const bool isGzip = std::ranges::any_of(request.headers, [](const auto& header) {
    return header.first == "Content-Encoding" && header.second == "gzip";
  });
  auto plain = isGzip ? gunzipped(request.body.bytes()) : std::nullopt;
  return plain ? std::move(*plain) : std::string(request.body.bytes());
}

}  // namespace tallyd::storebagtool
