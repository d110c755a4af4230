// What compressing and posting the same documents costs with zlib and libcurl alone.
#pragma once

#include <string>
#include <vector>

namespace tallyd::bench {

struct PostLoopTimes {
  double seconds = 0;
  double processorSeconds = 0;  ///< Of the thread that posts; what collects runs on another.
};

/// One thread that compresses each document as ZlibFloor.h does and posts it to a Collector over one kept
/// connection, one after the other. Throws std::runtime_error when a post fails.
///
/// @param headers  "NAME: VALUE" each: those of the daemon's posts, so that as many bytes go.
[[nodiscard]] PostLoopTimes postLoopTimes(const std::vector<std::string>& documents,
                                          const std::vector<std::string>& headers);

}  // namespace tallyd::bench
