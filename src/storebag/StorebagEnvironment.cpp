#include "storebag/StorebagEnvironment.h"

#include <array>

#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Settings.h"
#include "support/DeviceIdentity.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;
using platform::Platform;

namespace {

constexpr std::string_view kPreferencesSuite = "com.quillon.tally";
constexpr std::string_view kInternalBaseURL = "https://storebags.quillon.internal/storebags/sorrel";
constexpr std::string_view kPublicBaseURL = "https://storebags.quillon.example/bags/sorrel";

constexpr std::int32_t kFirstClientTypeWithStorebag = 5;
constexpr std::array<std::string_view, 7> kStorebagNames{"playhall",  "vitrine", "dialhouse", "lanternbox",
                                                         "broadwave", "hintery", "fennel"};
constexpr std::array<std::string_view, 4> kEnvironmentNames{"development", "quillon_internal", "seed",
                                                            "release"};

std::optional<std::string> stringPreference(const Platform& platform, std::string_view key) {
  const auto value = platform.preferences.value(kPreferencesSuite, key);
  if (!value || !value->string()) return std::nullopt;
  return std::string(*value->string());
}

std::uint32_t initialEnvironmentType(const Platform& platform) {
  const auto preference = platform.preferences.value(kPreferencesSuite, "environmentType");
  const auto preferred = preference ? preference->integerValue() : std::nullopt;
  if (!preferred) return isInternalBuild(platform) ? kEnvironmentTypeInternal : kEnvironmentTypeRelease;
  const auto type = static_cast<std::uint32_t>(*preferred);
  if (type <= kEnvironmentNames.size()) return type;
  asl_log(platform.log, LogLevel::Critical, "Invalid environment type {}", type);
  return kEnvironmentTypeInternal;
}

}  // namespace

std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType) {
  if (clientType < kFirstClientTypeWithStorebag) return std::nullopt;
  const auto index = static_cast<std::size_t>(clientType - kFirstClientTypeWithStorebag);
  if (index >= kStorebagNames.size()) return std::nullopt;
  return kStorebagNames[index];
}

std::optional<std::string_view> environmentNameForType(std::uint32_t environmentType) {
  if (environmentType == 0 || environmentType > kEnvironmentNames.size()) return std::nullopt;
  return kEnvironmentNames[environmentType - 1];
}

std::uint32_t currentEnvironmentType(const Platform& platform) {
  return platform.process.environmentType.get([&] {
    const std::uint32_t type = initialEnvironmentType(platform);
    asl_log(platform.log, LogLevel::Info, "Environment type {}", type);
    return type;
  });
}

std::string storebagBaseURL(const Platform& platform) {
  const auto& preferred = platform.process.storebagURLOverride.get(
      [&] { return stringPreference(platform, "tally_storebag_url"); });
  if (preferred) return *preferred;
  return std::string(isInternalBuild(platform) ? kInternalBaseURL : kPublicBaseURL);
}

std::optional<std::string> httpsPostURLFromPreferences(const Platform& platform) {
  return stringPreference(platform, "httpsPostURL");
}

}  // namespace tallyd
