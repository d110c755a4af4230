// The time of day as the kernel keeps it.
#pragma once

#include "platform/Clock.h"

namespace tallyd::platform {

class SystemClock final : public Clock {
 public:
  [[nodiscard]] TimePoint now() const override;
};

}  // namespace tallyd::platform
