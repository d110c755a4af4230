// How well the world treats the daemon.
#pragma once

#include <chrono>

namespace tallyd::replay {

/// Probabilities, and the longest that things take. As it stands: everything works.
struct Weather {
  double postFails = 0;
  double postIsRefused = 0;    ///< Answered with an error status.
  double postFindsNoRoom = 0;  ///< Refused by the HTTP client itself.
  double fetchFails = 0;
  double uploadFails = 0;
  double uploadIsRefused = 0;
  double datagramIsNotTaken = 0;  ///< By the network: sending fails.
  double datagramIsLost = 0;
  double acknowledgementIsLost = 0;
  double acknowledgementComesTwice = 0;
  double noiseComes = 0;  ///< Beside an acknowledgement: bytes that are none.
  double socketFails = 0;
  double adaptorThrows = 0;
  double hasNoMachineID = 0;
  std::chrono::milliseconds longestPost{300};
  std::chrono::milliseconds longestFetch{400};
  std::chrono::milliseconds longestUpload{900};
  std::chrono::milliseconds longestRoundTrip{200};
  bool operator==(const Weather&) const = default;
};

}  // namespace tallyd::replay
