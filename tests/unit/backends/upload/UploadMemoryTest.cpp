// How much memory an upload takes, by counting all that is allocated with new.

#include <gtest/gtest.h>
#include <malloc.h>

#include <atomic>
#include <cstdlib>
#include <fstream>
#include <new>
#include <random>

#include "backends/upload/UploadBackend.h"
#include "fakes/FakePlatform.h"

namespace {

std::atomic<std::size_t> heldBytes;
std::atomic<std::size_t> peakBytes;

void* allocate(std::size_t size, const std::nothrow_t&) noexcept {
  void* block = std::malloc(size);
  if (!block) return nullptr;
  const std::size_t held = heldBytes += malloc_usable_size(block);
  std::size_t peak = peakBytes;
  while (held > peak && !peakBytes.compare_exchange_weak(peak, held)) {
  }
  return block;
}

void* allocate(std::size_t size) {
  void* block = allocate(size, std::nothrow);
  if (!block) throw std::bad_alloc();
  return block;
}

void release(void* block) {
  if (block) heldBytes -= malloc_usable_size(block);
  std::free(block);
}

}  // namespace

// Every form but those for types of a special alignment, which an upload does not use.
void* operator new(std::size_t size) { return allocate(size); }
void* operator new[](std::size_t size) { return allocate(size); }
void* operator new(std::size_t size, const std::nothrow_t& tag) noexcept { return allocate(size, tag); }
void* operator new[](std::size_t size, const std::nothrow_t& tag) noexcept { return allocate(size, tag); }
void operator delete(void* block) noexcept { release(block); }
void operator delete[](void* block) noexcept { release(block); }
void operator delete(void* block, std::size_t) noexcept { release(block); }
void operator delete[](void* block, std::size_t) noexcept { release(block); }

namespace tallyd {
namespace {

constexpr std::size_t kFileBytes = std::size_t{8} << 20;

/// Bytes that no compression makes fewer.
void writeNoise(const std::filesystem::path& path) {
  std::mt19937_64 random(1);
  std::ofstream file(path, std::ios::binary);
  for (std::size_t written = 0; written < kFileBytes; written += sizeof(std::uint64_t)) {
    const std::uint64_t word = random();
    file.write(reinterpret_cast<const char*>(&word), sizeof word);
  }
}

double timesTheFile(std::size_t bytes) { return static_cast<double>(bytes) / kFileBytes; }

TEST(UploadMemoryTest, HoldsTheFileTwiceAtMostAndOnceDuringTheRequest) {
  fakes::FakePlatform fake;
  const auto path = fake.folder.path() / "noise";
  writeNoise(path);
  const auto backend = UploadBackend::initWithName(
      fake.platform, "upload_server", platform::Dictionary{{"post_url", "http://upload.example/"}}, "Kasten");
  const std::size_t before = heldBytes;
  std::size_t duringRequest = 0;
  std::size_t bodyBytes = 0;
  fake.http.answer = [&](const platform::HTTPRequest& request) {
    duringRequest = heldBytes - before;
    bodyBytes = request.body.size();
    return fakes::FakeHTTPClient::ok("success");
  };
  peakBytes = before;
  ASSERT_TRUE(backend->uploadFileAtPath(path.string(), "token"));
  EXPECT_GE(bodyBytes, kFileBytes);
  EXPECT_GE(timesTheFile(peakBytes - before), 2.0);
  EXPECT_LT(timesTheFile(peakBytes - before), 2.1);
  EXPECT_GE(timesTheFile(duringRequest), 1.0);
  EXPECT_LT(timesTheFile(duringRequest), 1.1);
}

}  // namespace
}  // namespace tallyd
