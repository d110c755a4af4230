// Random draws and identifiers.
#pragma once

#include <array>
#include <cstdint>
#include <string>

namespace tallyd::platform {

using UUIDBytes = std::array<std::uint8_t, 16>;

/// Threading: any thread.
class Randomness {
 public:
  virtual ~Randomness() = default;

  /// The next value in [0, 1) of the generator of drand48(3) that nobody has seeded: the same sequence in
  /// every process.
  virtual double drand48() = 0;

  /// A new random UUID, version 4 (RFC 4122, section 4.4).
  virtual UUIDBytes uuid() = 0;
};

/// A draw from [0, 1) that nobody can foresee; drand48() and its sequence stay as they are.
[[nodiscard]] double uniformDraw(Randomness& randomness);

/// The canonical text of a UUID, upper case, 36 characters.
[[nodiscard]] std::string uuidText(const UUIDBytes& uuid);

}  // namespace tallyd::platform
