// The daemon's own services below a folder that goes with the object, and a network that answers from memory.
#pragma once

#include <memory>

#include "platform/Platform.h"
#include "platform/Value.h"

namespace tallyd::bench {

/// A device whose user consents. Files, clock, queues and random numbers are the real ones; a request for a
/// storebag gets the one that is served, and a post an empty answer. Warnings and worse throw, as NoLog says.
class Device {
 public:
  Device();
  ~Device();

  [[nodiscard]] const platform::Platform& platform() const;
  /// Has this bag served from now on, as an XML list for a day, signed with a key of 2,048 bits that the
  /// device trusts.
  void serve(const platform::Dictionary& bag);

 private:
  struct Services;
  std::unique_ptr<Services> _services;
};

}  // namespace tallyd::bench
