// The interface through which the daemon shows its books, as it goes over a socket of its own.
#pragma once

#include <cstddef>
#include <filesystem>

#include "platform/IPC.h"
#include "platform/Root.h"

namespace tallyd {

/// The methods, in the order of the interface's table.
enum class InspectionMethod : std::size_t {
  Stats,  ///< The books, see TallyInspection::statsSync().
  Tap,    ///< From now on a line of JSON for everything that leaves the daemon, written to the descriptor.
};

/// "com.quillon.tallyd.InspectionInterface" at "/com/quillon/tallyd".
[[nodiscard]] const platform::Interface& inspectionInterface();

/// Where the inspection's socket lies below a root. Root and the daemon's own user may connect.
[[nodiscard]] std::filesystem::path inspectionSocketPath(const platform::Root& root);

}  // namespace tallyd
