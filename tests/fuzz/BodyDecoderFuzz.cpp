// Gzipped bodies: as they come, in whatever pieces, and the daemon's own.

#include <algorithm>
#include <optional>
#include <string>

#include "FuzzTarget.h"
#include "fakes/FakeLog.h"
#include "station/BodyDecoder.h"
#include "support/GzipCompression.h"

namespace tallyd::fuzz {
namespace {

using station::BodyDecoder;
using station::BodyError;

constexpr std::uint64_t kLimit = 1 << 16;

/// The decoded body, or nothing when it can't be taken.
std::optional<std::string> decoded(std::string_view body, std::uint32_t seed) {
  std::string bytes;
  BodyDecoder decoder(BodyDecoder::Encoding::Gzip, kLimit, [&](std::string_view part) { bytes += part; });
  try {
    for (Pieces pieces(body, seed); !pieces.areOver();) decoder.put(pieces.take());
    decoder.finish();
  } catch (const BodyError& error) {
    FUZZ_CHECK(error.status() == 400 || error.status() == 413);
    FUZZ_CHECK(bytes.size() <= kLimit);
    return std::nullopt;
  }
  FUZZ_CHECK(bytes.size() <= kLimit);
  return bytes;
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const std::uint8_t seed = input.takeByte();
  const auto body = input.takeRest();
  FUZZ_CHECK(decoded(body, 0) == decoded(body, seed + 1U));

  tallyd::fakes::FakeLog log;
  const auto compressed = tallyd::gzipDeflate(body, log);
  FUZZ_CHECK(compressed.has_value() == !body.empty());
  if (compressed) FUZZ_CHECK(decoded(*compressed, seed + 1U) == body);
  return 0;
}
