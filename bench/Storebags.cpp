#include "Storebags.h"

#include "fakes/SignedStorebag.h"

namespace tallyd::bench {

using platform::Array;
using platform::Dictionary;
using platform::Value;

Dictionary httpsPostSettings() {
  const Dictionary filter{{"key", kHashedField}, {"action", "sha256"}};
  const Dictionary client{{"override_dnu", 1},
                          {"locale_whitelist", Array{Value("US")}},
                          {"filters", Array{Value(filter)}},
                          {"sampling_threshold", 1},
                          {"event_threshold", static_cast<std::int64_t>(kLargestBatch - 1)}};
  return {{"clients", Array{Value(client)}}};
}

Dictionary dashboardSettings(std::uint16_t port) {
  return {{"ip", "127.0.0.1"}, {"port", static_cast<std::int64_t>(port)}};
}

std::size_t postersIn(const Dictionary& backends) {
  return std::size_t{backends.contains(kFirstPoster)} + std::size_t{backends.contains(kSecondPoster)};
}

std::string signedStorebag(const Dictionary& backends) {
  return fakes::StorebagSigner::server().envelope(Dictionary{{"version", "1.0"}, {"release", backends}});
}

}  // namespace tallyd::bench
