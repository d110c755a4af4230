// Why a process could not be confined.
#pragma once

#include <stdexcept>

namespace tallyd::platform {

/// The profile itself is wrong: never gone without.
class ProfileError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

/// This system can't do what the profile says: an optional profile goes without it.
class EnforcementError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

}  // namespace tallyd::platform
