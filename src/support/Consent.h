// The user's consent to send diagnostics.
#pragma once

namespace tallyd::platform {
struct Platform;
}

namespace tallyd {

/// Whether the user lets diagnostics leave the device, as the preferences stand now; no answer means no.
[[nodiscard]] bool DiagnosticLogSubmissionEnabled(const platform::Platform& platform);

}  // namespace tallyd
