// The user's consent to send diagnostics.
#pragma once

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// When the user's consent is read.
enum class ConsentChecks {
  AtStart,        ///< When a backend is made.
  BeforeEachPost  ///< Also before each post, which a withdrawal stops.
};

/// Whether the user lets diagnostics leave the device, as the preferences stand now; no answer means no.
[[nodiscard]] bool DiagnosticLogSubmissionEnabled(const platform::Platform& platform);

}  // namespace tallyd
