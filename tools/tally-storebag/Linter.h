// What a writer of storebags should know before a bag is signed.
#pragma once

#include <string>

#include "platform/Value.h"
#include "tally-storebag/Finding.h"

namespace tallyd::storebagtool {

/// Everything in the bag that the daemon ignores, misreads or takes as a reason not to report. In the order
/// of the bag. Pure.
[[nodiscard]] Findings lintBag(const platform::Dictionary& bag);

/// The same of one HTTPS post backend's client list.
void lintClients(const platform::Array& clients, const std::string& profilePath, Findings& findings);

/// The same of one client entry's filter rules.
void lintFilters(const platform::Array& filters, const std::string& entryPath, Findings& findings);

}  // namespace tallyd::storebagtool
