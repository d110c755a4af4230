// Draws of the C library's 48-bit generator, and UUIDs from the kernel's random numbers.
#pragma once

#include <cstdlib>
#include <mutex>

#include "platform/Randomness.h"

namespace tallyd::platform {

/// Each object has a generator of its own, which nobody else in the process can seed or advance; its draws
/// are those that drand48(3) gives from the start of a process.
class SystemRandomness final : public Randomness {
 public:
  double drand48() override;
  /// Throws std::system_error when the kernel refuses random bytes, which no kernel does to a started system.
  UUIDBytes uuid() override;

 private:
  std::mutex _mutex;
  drand48_data _generator{};  ///< All zero is the state before any seeding. Guarded by `_mutex`.
};

}  // namespace tallyd::platform
