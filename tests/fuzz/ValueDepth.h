// How deep a value is.
#pragma once

#include <algorithm>

#include "platform/Value.h"

namespace tallyd::fuzz {

/// Levels of containers, an empty one included.
inline int depthOf(const platform::Value& value) {
  int deepest = 0;
  if (const auto* array = value.array()) {
    for (const platform::Value& element : *array) deepest = std::max(deepest, depthOf(element));
    return deepest + 1;
  }
  if (const auto* dictionary = value.dictionary()) {
    for (const auto& entry : *dictionary) deepest = std::max(deepest, depthOf(entry.value));
    return deepest + 1;
  }
  return 0;
}

}  // namespace tallyd::fuzz
