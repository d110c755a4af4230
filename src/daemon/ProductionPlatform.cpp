#include "daemon/ProductionPlatform.h"

#include <optional>

#include "platform/code-bundles/DlopenCodeBundles.h"
#include "platform/http/CurlHTTPClient.h"
#include "platform/http/RetryingHTTPClient.h"
#include "platform/power-log/FilePowerLog.h"
#include "platform/queues/AsioQueues.h"
#include "platform/settings/FileBundle.h"
#include "platform/settings/FilePreferences.h"
#include "platform/settings/FileUserDefaults.h"
#include "platform/settings/SystemDeviceProperties.h"
#include "platform/system/SystemLocale.h"
#include "platform/system/SystemRandomness.h"

namespace tallyd {

namespace {

constexpr std::string_view kFrameworkBundle = "/usr/share/tally/Tally.framework";

}  // namespace

struct ProductionPlatform::Services {
  Services(const platform::Root& root, platform::Log& log, const platform::Clock& clock,
           platform::Sandbox& sandbox, unsigned retryPosts)
      : queues(platform::AsioQueues::defaultThreadCount(), &log),
        curl(root, queues, log),
        http(withRetries(retryPosts, clock, log)),
        preferences(root, log),
        defaults(root, log),
        device(root, log),
        frameworkBundle(root.under(kFrameworkBundle), log),
        powerLog(root, clock, log),
        codeBundles(log),
        platform{root,     log,    clock,           randomness, locale,   queues,      http,   preferences,
                 defaults, device, frameworkBundle, sandbox,    powerLog, codeBundles, process} {}

  /// The client that everybody uses; without retries it is libcurl's own.
  platform::HTTPClient& withRetries(unsigned attempts, const platform::Clock& clock, platform::Log& log) {
    if (attempts == 0) return curl;
    return retrying.emplace(curl, clock, randomness, log, platform::RetryLimits{.attempts = attempts});
  }

  platform::SystemRandomness randomness;
  platform::SystemLocale locale;
  platform::AsioQueues queues;
  platform::CurlHTTPClient curl;
  std::optional<platform::RetryingHTTPClient> retrying;
  platform::HTTPClient& http;
  platform::FilePreferences preferences;
  platform::FileUserDefaults defaults;
  platform::SystemDeviceProperties device;
  platform::FileBundle frameworkBundle;
  platform::FilePowerLog powerLog;
  platform::DlopenCodeBundles codeBundles;
  platform::ProcessValues process;
  platform::Platform platform;
};

ProductionPlatform::ProductionPlatform(const platform::Root& root, platform::Log& log,
                                       const platform::Clock& clock, platform::Sandbox& sandbox,
                                       unsigned retryPosts)
    : _services(std::make_unique<Services>(root, log, clock, sandbox, retryPosts)) {}

ProductionPlatform::~ProductionPlatform() = default;

const platform::Platform& ProductionPlatform::platform() const { return _services->platform; }

}  // namespace tallyd
