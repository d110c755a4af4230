// What a request that waits costs in memory.
#pragma once

#include <cstddef>

#include "platform/HTTPClient.h"

namespace tallyd::platform {

/// Its texts, and the records that hold it with what the allocator adds.
[[nodiscard]] inline std::size_t heldBytesOf(const HTTPRequest& request) {
  constexpr std::size_t kBookkeepingBytes = 512;
  std::size_t bytes = kBookkeepingBytes + request.body.size() + request.url.size();
  for (const auto& [name, value] : request.headers) bytes += name.size() + value.size();
  return bytes;
}

}  // namespace tallyd::platform
