#include "ZlibFloor.h"

#include <zlib.h>

#include <atomic>
#include <stdexcept>
#include <thread>

#include "Measure.h"

namespace tallyd::bench {

namespace {

// zlib.h, deflateInit2: 15 is the largest window; 16 more asks for the gzip container.
constexpr int kGzipWindowBits = 15 + 16;
constexpr int kDefaultMemoryLevel = 8;
constexpr int kLevel = 6;

void check(int status, int expected) {
  if (status != expected) throw std::runtime_error("zlib fails");
}

Bytef* inputOf(std::string_view bytes) { return reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data())); }

}  // namespace

Deflater::Deflater() : _stream(std::make_unique<z_stream>()) {
  check(deflateInit2(_stream.get(), kLevel, Z_DEFLATED, kGzipWindowBits, kDefaultMemoryLevel,
                     Z_DEFAULT_STRATEGY),
        Z_OK);
}

Deflater::~Deflater() { deflateEnd(_stream.get()); }

std::string_view Deflater::deflate(std::string_view input) {
  check(deflateReset(_stream.get()), Z_OK);
  const auto bound = static_cast<std::size_t>(deflateBound(_stream.get(), input.size()));
  if (_output.size() < bound) _output.resize(bound);
  _stream->next_in = inputOf(input);
  _stream->avail_in = static_cast<uInt>(input.size());
  _stream->next_out = _output.data();
  _stream->avail_out = static_cast<uInt>(_output.size());
  check(::deflate(_stream.get(), Z_FINISH), Z_STREAM_END);
  return {reinterpret_cast<const char*>(_output.data()), _stream->total_out};
}

double zlibProcessorSeconds(const std::vector<std::string>& documents) {
  Deflater deflater;
  const double start = processorSecondsOfThisThread();
  for (const std::string& document : documents) keep(deflater.deflate(document));
  return processorSecondsOfThisThread() - start;
}

double zlibSecondsOnAllProcessors(const std::vector<std::string>& documents) {
  std::atomic<std::size_t> next = 0;
  const Stopwatch stopwatch;
  std::vector<std::jthread> threads;
  for (unsigned i = 0; i < std::thread::hardware_concurrency(); ++i) {
    threads.emplace_back([&] {
      Deflater deflater;
      for (std::size_t index = next++; index < documents.size(); index = next++) {
        keep(deflater.deflate(documents[index]));
      }
    });
  }
  threads.clear();
  return stopwatch.seconds();
}

std::string documentInBody(std::string_view body) {
  constexpr std::string_view kGzipMagic = "\x1f\x8b";
  if (!body.starts_with(kGzipMagic)) return std::string(body);
  constexpr std::size_t kChunk = 65'536;
  z_stream stream{};
  check(inflateInit2(&stream, kGzipWindowBits), Z_OK);
  const std::unique_ptr<z_stream, decltype(&inflateEnd)> ending(&stream, inflateEnd);
  stream.next_in = inputOf(body);
  stream.avail_in = static_cast<uInt>(body.size());
  std::string document;
  int status = Z_OK;
  while (status == Z_OK) {
    document.resize(stream.total_out + kChunk);
    stream.next_out = reinterpret_cast<Bytef*>(document.data()) + stream.total_out;
    stream.avail_out = kChunk;
    status = inflate(&stream, Z_NO_FLUSH);
  }
  check(status, Z_STREAM_END);
  document.resize(stream.total_out);
  return document;
}

}  // namespace tallyd::bench
