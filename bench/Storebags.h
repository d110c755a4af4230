// The signed storebags that the daemon is measured with.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/Value.h"

namespace tallyd::bench {

/// The highest number of events that a batch may hold.
inline constexpr std::size_t kLargestBatch = 5000;

/// The field of the payload that the storebag has hashed.
inline constexpr const char* kHashedField = "requestID";

/// An HTTPS post backend's settings: everybody in the United States reports, without consent being asked for,
/// and kHashedField is hashed.
[[nodiscard]] platform::Dictionary httpsPostSettings();
/// A dashboard's, on the loopback interface, without acknowledgements.
[[nodiscard]] platform::Dictionary dashboardSettings(std::uint16_t port);

/// The two names of HTTPS post backends: a bag can have one of each.
inline constexpr const char* kFirstPoster = "splunk";
inline constexpr const char* kSecondPoster = "https_post";
/// How many HTTPS post backends the bag has.
[[nodiscard]] std::size_t postersIn(const platform::Dictionary& backends);

/// The body of a storebag server's answer: a signed bag with these backends, settings by name.
[[nodiscard]] std::string signedStorebag(const platform::Dictionary& backends);

}  // namespace tallyd::bench
