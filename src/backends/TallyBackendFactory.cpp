#include "backends/TallyBackend.h"
#include "backends/adaptor/PithBackend.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/https-post/HTTPSPostBackend.h"
#include "backends/power-log/WattbookBackend.h"
#include "backends/upload/UploadBackend.h"
#include "framework/TallyKeys.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "support/DeviceIdentity.h"

namespace tallyd {

namespace {

constexpr std::string_view kDeviceWithoutAdaptors = "Deskframe";  // A product type.

}  // namespace

std::shared_ptr<TallyBackend> TallyBackend::newBackendWithName(
    const platform::Platform& platform, std::string_view name, const Payload& profile,
    const std::optional<std::string>& productFamily, std::int32_t clientType) {
  if (name == kTallyBackendDashboard) {
    return DashboardBackend::initWithName(platform, name, profile, productFamily);
  }
  if (name == kTallyBackendUploadServer) {
    return UploadBackend::initWithName(platform, name, profile, productFamily);
  }
  if (name == kTallyBackendHTTPPost || name == kTallyBackendHTTPPost2) {
    return HTTPSPostBackend::initWithName(platform, name, profile, productFamily);
  }
  if (name == kTallyBackendWattbook) {
    return WattbookBackend::initWithName(platform, name, profile, productFamily);
  }
  if (name == kTallyBackendPith && deviceProductType(platform) != kDeviceWithoutAdaptors) {
    return PithBackend::initWithName(platform, name, profile, productFamily, clientType);
  }
  asl_log(platform.log, platform::LogLevel::Error, "TallyBackend(newBackendWithName): {}", name);
  return nullptr;
}

}  // namespace tallyd
