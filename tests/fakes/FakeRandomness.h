// Random draws that the test chooses.
#pragma once

#include <deque>

#include "platform/Randomness.h"

namespace tallyd::fakes {

/// Gives the queued draws, then 0.5; UUIDs count upwards.
class FakeRandomness : public platform::Randomness {
 public:
  double drand48() override {
    if (draws.empty()) return 0.5;
    const double draw = draws.front();
    draws.pop_front();
    return draw;
  }
  platform::UUIDBytes uuid() override {
    platform::UUIDBytes bytes{};
    bytes[6] = 0x40;
    bytes[8] = 0x80;
    bytes[15] = ++_uuids;
    return bytes;
  }

  std::deque<double> draws;

 private:
  std::uint8_t _uuids = 0;
};

}  // namespace tallyd::fakes
