// The documents that get compressed, posted and written to the message log.
#pragma once

#include <string>

#include "Samples.h"
#include "backends/https-post/PostBody.h"

namespace tallyd::bench {

/// The body of a post of so many decorated events.
[[nodiscard]] inline std::string documentOf(std::size_t events) {
  return *postBody({1'760'000'200, 125'000}, "6f1cbb53-52a8-5f0c-9d0a-0d1a4c6b7e21", decoratedEvents(events));
}

}  // namespace tallyd::bench
