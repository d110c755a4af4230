// What starts or stops leaving devices when one bag takes another's place.
#pragma once

#include <string>
#include <vector>

#include "platform/Value.h"

namespace tallyd::storebagtool {

enum class Exposure {
  Same,     ///< Something else changes.
  Shrinks,  ///< Less leaves than before, or from fewer.
  Grows,    ///< More leaves, from more, to somewhere else, or less veiled.
};

struct Change {
  Exposure exposure = Exposure::Same;
  std::string
      path;  ///< Of what it is about: "release/splunk", with the clients and services that it concerns.
  std::string text;
  bool operator==(const Change&) const = default;
};
using Changes = std::vector<Change>;

/// Every environment of either bag, as devices see it: without "seed", seed builds have "release".
///
/// Client entries are not compared by their places but by what they do: the daemon's own rules choose an
/// entry for each client and service that either bag names, and for one that neither does; the chosen entries
/// are compared. Pure.
[[nodiscard]] Changes diffBags(const platform::Dictionary& before, const platform::Dictionary& after);

[[nodiscard]] bool exposureGrows(const Changes& changes);

/// The changes between the chosen entries for the same clients, of which null means that none is chosen.
void diffEntries(const platform::Dictionary* before, const platform::Dictionary* after,
                 const std::string& path, Changes& changes);

/// The changes between two lists of filters.
void diffFilters(const platform::Array& before, const platform::Array& after, const std::string& path,
                 Changes& changes);

/// The changes between the client lists of two HTTPS post backends.
void diffClients(const platform::Dictionary& before, const platform::Dictionary& after,
                 const std::string& path, Changes& changes);

/// A place that something is sent to; none is an empty optional.
void diffDestination(const platform::Dictionary& before, const platform::Dictionary& after,
                     std::string_view key, const std::string& path, Changes& changes);

}  // namespace tallyd::storebagtool
