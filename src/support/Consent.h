// The user's consent to send diagnostics.
#pragma once

#include <atomic>

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

/// Consent that was there when a session began, and is read anew whenever something is to leave.
///
/// Threading: any thread.
class ConsentWatch {
 public:
  /// Borrows the platform.
  explicit ConsentWatch(const platform::Platform& platform) : _platform(platform) {}

  /// Whether consent is withdrawn now, or was at an earlier call.
  [[nodiscard]] bool isWithdrawn();

 private:
  const platform::Platform& _platform;
  std::atomic<bool> _isWithdrawn{false};
};

}  // namespace tallyd
