#include "support/GzipCompression.h"

#include <gtest/gtest.h>

#include "fakes/FakeLog.h"

namespace tallyd {
namespace {

using fakes::FakeLog;
using platform::LogLevel;

constexpr const char* kSignature = "NSData *compressDataWithZlibOrGzip(BOOL, NSData *)";

/// The input again, by zlib's own automatic detection of the container.
std::string inflated(std::string_view compressed, std::size_t expectedBytes) {
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  EXPECT_EQ(inflateInit2(&stream, 15 + 32), Z_OK);
  std::string output(expectedBytes + 1, '\0');
  stream.next_out = reinterpret_cast<Bytef*>(output.data());
  stream.avail_out = static_cast<uInt>(output.size());
  EXPECT_EQ(inflate(&stream, Z_FINISH), Z_STREAM_END);
  EXPECT_EQ(stream.avail_in, 0U);
  output.resize(stream.total_out);
  inflateEnd(&stream);
  return output;
}

std::string sampleText() {
  std::string text;
  for (int i = 0; i < 2000; ++i) text += "line " + std::to_string(i * 7919 % 1000) + "\n";
  return text;
}

TEST(GzipCompressionTest, RefusesAnEmptyInputWithoutCallingZlib) {
  FakeLog log;
  DeflateFunctions untouched{nullptr, nullptr, nullptr, nullptr};
  EXPECT_EQ(compressDataWithZlibOrGzip(CompressionContainer::Gzip, "", log, untouched), std::nullopt);
  EXPECT_EQ(log.lines(),
            (std::vector<FakeLog::Line>{
                {LogLevel::Error, fmt::format("[{}] Cannot compress empty NSData", kSignature)}}));
}

TEST(GzipCompressionTest, WritesAGzipContainerThatInflatesToTheInput) {
  FakeLog log;
  const std::string text = sampleText();
  const auto compressed = gzipDeflate(text, log);
  ASSERT_TRUE(compressed);
  EXPECT_EQ(compressed->substr(0, 2), "\x1F\x8B");
  EXPECT_LT(compressed->size(), text.size());
  EXPECT_EQ(inflated(*compressed, text.size()), text);
  EXPECT_EQ(log.lines(), (std::vector<FakeLog::Line>{
                             {LogLevel::Debug, fmt::format("{}: Compressed file from {} to {}", kSignature,
                                                           text.size(), compressed->size())}}));
}

TEST(GzipCompressionTest, WritesAZlibContainerWhenAskedFor) {
  FakeLog log;
  const std::string text = sampleText();
  const auto compressed = compressDataWithZlibOrGzip(CompressionContainer::Zlib, text, log);
  ASSERT_TRUE(compressed);
  EXPECT_EQ(compressed->substr(0, 2), "\x78\x9C");
  EXPECT_EQ(inflated(*compressed, text.size()), text);
}

TEST(GzipCompressionTest, CompressesOneByteIntoMore) {
  FakeLog log;
  const auto compressed = gzipDeflate("x", log);
  ASSERT_TRUE(compressed);
  EXPECT_GT(compressed->size(), 1U);
  EXPECT_TRUE(log.has(LogLevel::Debug,
                      fmt::format("{}: Compressed file from 1 to {}", kSignature, compressed->size())));
}

TEST(GzipCompressionTest, CutsTheOutputToWhatZlibWrote) {
  FakeLog log;
  const std::string zeros(100'000, '\0');
  const auto compressed = gzipDeflate(zeros, log);
  ASSERT_TRUE(compressed);
  EXPECT_LT(compressed->size(), compressBound(zeros.size()));
  EXPECT_EQ(inflated(*compressed, zeros.size()), zeros);
}

TEST(GzipCompressionTest, LogsAFailedSetUpWithItsText) {
  FakeLog log;
  DeflateFunctions zlib;
  zlib.initialise = [](z_streamp, int, int, int, int, int, const char*, int) -> int { return Z_MEM_ERROR; };
  zlib.end = nullptr;  // Not called on this path.
  EXPECT_EQ(compressDataWithZlibOrGzip(CompressionContainer::Gzip, "abc", log, zlib), std::nullopt);
  EXPECT_EQ(log.lines(),
            (std::vector<FakeLog::Line>{
                {LogLevel::Error,
                 fmt::format("{}: deflateInit2() Error: \"Insufficient memory.\" Message: \"(null)\"",
                             kSignature)}}));
}

int endCalls = 0;

TEST(GzipCompressionTest, LogsAFailedCompressionWithItsTextAndEndsTheStream) {
  FakeLog log;
  endCalls = 0;
  DeflateFunctions zlib;
  zlib.deflate = [](z_streamp stream, int) -> int {
    stream->msg = const_cast<char*>("went wrong");
    return Z_MEM_ERROR;
  };
  zlib.end = [](z_streamp stream) -> int {
    ++endCalls;
    return deflateEnd(stream);
  };
  EXPECT_EQ(compressDataWithZlibOrGzip(CompressionContainer::Gzip, "abc", log, zlib), std::nullopt);
  EXPECT_EQ(endCalls, 1);
  EXPECT_EQ(log.lines(),
            (std::vector<FakeLog::Line>{
                {LogLevel::Error,
                 fmt::format("{}: zlib error while attempting compression: \"Memory could not be allocated "
                             "for processing.\" Message: \"went wrong\"",
                             kSignature)}}));
}

int deflateCalls = 0;

TEST(GzipCompressionTest, GoesOnWhileZlibAsksForMoreCalls) {
  FakeLog log;
  deflateCalls = 0;
  DeflateFunctions zlib;
  zlib.deflate = [](z_streamp stream, int flush) -> int {
    return ++deflateCalls < 3 ? Z_OK : ::deflate(stream, flush);
  };
  const auto compressed = compressDataWithZlibOrGzip(CompressionContainer::Gzip, "abc", log, zlib);
  ASSERT_TRUE(compressed);
  EXPECT_EQ(deflateCalls, 3);
  EXPECT_EQ(inflated(*compressed, 3), "abc");
}

TEST(GzipCompressionTest, NamesEachSetUpFailure) {
  EXPECT_EQ(initialisationErrorText(Z_VERSION_ERROR),
            "The version of zlib.h and the version of the library linked do not match.");
  EXPECT_EQ(initialisationErrorText(Z_MEM_ERROR), "Insufficient memory.");
  EXPECT_EQ(initialisationErrorText(Z_STREAM_ERROR), "Invalid parameter passed in to function.");
  for (const int code : {Z_BUF_ERROR, Z_DATA_ERROR, Z_ERRNO, 1, 2, 77, -7, -100}) {
    EXPECT_EQ(initialisationErrorText(code), "Unknown error code.") << code;
  }
}

TEST(GzipCompressionTest, NamesEachCompressionFailureInItsOwnWords) {
  EXPECT_EQ(compressionErrorText(Z_VERSION_ERROR),
            "The version of zlib.h and the version of the library linked do not match.");
  EXPECT_EQ(compressionErrorText(Z_BUF_ERROR), "Ran out of output buffer for writing compressed bytes.");
  EXPECT_EQ(compressionErrorText(Z_MEM_ERROR), "Memory could not be allocated for processing.");
  EXPECT_EQ(compressionErrorText(Z_DATA_ERROR), "The deflate data was invalid or incomplete.");
  EXPECT_EQ(compressionErrorText(Z_STREAM_ERROR),
            "The stream state was inconsistent (e.g., next_in or next_out was NULL).");
  EXPECT_EQ(compressionErrorText(Z_ERRNO), "Error occured while reading file.");
  for (const int code : {Z_NEED_DICT, 3, 77, -7, -100}) {
    EXPECT_EQ(compressionErrorText(code), "Unknown error code.") << code;
  }
}

}  // namespace
}  // namespace tallyd
