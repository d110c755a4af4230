// Where C calls in: objects as C sees them, and what keeps exceptions inside.
#pragma once

#include <exception>
#include <stdexcept>
#include <string>
#include <utility>

#include "framework/c/values.h"
#include "platform/Value.h"

struct tally_value {
  tallyd::platform::Value value;
};

namespace tallyd::c {

/// What the caller did wrong.
struct ArgumentError : std::invalid_argument {
  using std::invalid_argument::invalid_argument;
};

/// Keeps `reason` for tally_last_error(), as far as there is memory.
void setLastError(const char* reason) noexcept;

/// Runs `work`, which returns a status; what it throws becomes one.
template <class Work>
tally_status status(Work&& work) noexcept {
  try {
    return std::forward<Work>(work)();
  } catch (const ArgumentError& error) {
    setLastError(error.what());
    return TALLY_ERROR_ARGUMENT;
  } catch (const std::exception& error) {
    setLastError(error.what());
  } catch (...) {
    setLastError("unknown failure");
  }
  return TALLY_ERROR_MEMORY;
}

/// Runs `work`, which returns a new object; what it throws becomes a null pointer.
template <class Work>
auto object(Work&& work) noexcept -> decltype(work()) {
  decltype(work()) made = nullptr;
  status([&] {
    made = std::forward<Work>(work)();
    return tally_status{TALLY_OK};
  });
  return made;
}

/// The thing that a pointer names. Throws ArgumentError for a null pointer.
template <class T>
T& required(T* pointer, const char* what) {
  if (!pointer) throw ArgumentError(std::string(what) + " is NULL");
  return *pointer;
}

}  // namespace tallyd::c
