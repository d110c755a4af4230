// The adaptor of the simulated device's code bundles.
#pragma once

#include "framework/PithAdaptor.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// Takes messages, and throws as the weather has it. One at a time: an adaptor's C functions can't be told
/// whose they are.
class SimulatedAdaptor {
 public:
  explicit SimulatedAdaptor(Surroundings& world);
  ~SimulatedAdaptor();
  SimulatedAdaptor(const SimulatedAdaptor&) = delete;
  SimulatedAdaptor& operator=(const SimulatedAdaptor&) = delete;

  [[nodiscard]] const PithAdaptorClass* adaptorClass() const;
};

}  // namespace tallyd::replay
