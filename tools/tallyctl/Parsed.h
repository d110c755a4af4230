// The outcome of reading something that was written by hand.
#pragma once

#include <optional>
#include <string>

namespace tallyd::tallyctl {

/// What was read, or why it could not be.
template <class T>
struct Parsed {
  std::optional<T> value;
  std::string error;  ///< Empty when there is a value.
};

}  // namespace tallyd::tallyctl
