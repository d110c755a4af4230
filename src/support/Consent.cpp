#include "support/Consent.h"

#include "platform/Platform.h"
#include "platform/Settings.h"

namespace tallyd {

bool DiagnosticLogSubmissionEnabled(const platform::Platform& platform) {
  const auto enabled =
      platform.preferences.value("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled");
  return enabled && enabled->booleanValue();
}

bool ConsentWatch::isWithdrawn() {
  if (!_isWithdrawn && !DiagnosticLogSubmissionEnabled(_platform)) _isWithdrawn = true;
  return _isWithdrawn;
}

}  // namespace tallyd
