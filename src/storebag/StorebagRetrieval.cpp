#include "storebag/StorebagRetrieval.h"

#include <algorithm>
#include <chrono>
#include <limits>

#include "framework/Tally.h"
#include "platform/Base64.h"
#include "platform/HTTPClient.h"
#include "platform/Platform.h"
#include "platform/Settings.h"
#include "platform/property-list/PropertyList.h"
#include "storebag/StorebagEnvironment.h"
#include "storebag/StorebagSignature.h"

namespace tallyd {

using platform::asl_log;
using platform::Dictionary;
using platform::FatalFailures;
using platform::LogLevel;
using platform::Platform;
using platform::Value;

namespace {

constexpr std::chrono::seconds kRequestTimeout{15};
constexpr std::int32_t kDefaultMaxAgeSeconds = 86'400;
constexpr std::string_view kNoText = "(null)";

std::int32_t clampedTo32Bits(std::int64_t number) {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(std::clamp<std::int64_t>(number, Limits::min(), Limits::max()));
}

std::string storebagURL(const Platform& platform, std::optional<std::string_view> storebagName) {
  const std::string frameworkVersion =
      Tally(platform).bundleVersion().value_or(std::string(kDefaultReportingVersion));
  return fmt::format("{}/{}?version={}", storebagBaseURL(platform), storebagName.value_or(kNoText),
                     frameworkVersion);
}

/// Says that what came is hardly a storebag; it is read all the same.
void warnOfStatus(const Platform& platform, const std::string& url, int status) {
  constexpr int kLeastSuccess = 200;
  constexpr int kMostSuccess = 299;  // RFC 9110, section 15.3.
  if (status >= kLeastSuccess && status <= kMostSuccess) return;
  asl_log(platform.log, LogLevel::Warning, "Storebag server answers status {} for {}", status, url);
}

platform::HTTPResult requestStorebag(const Platform& platform, const std::string& url) {
  asl_log(platform.log, LogLevel::Debug, "Storebag Server URL: {}", url);
  platform::HTTPRequest request;
  request.url = url;
  request.cachePolicy = platform::CachePolicy::ReloadIgnoringCache;
  request.timeout = kRequestTimeout;
  platform::HTTPResult result = platform.http.sendSynchronousRequest(request);
  if (result.error) {
    asl_log(platform.log, LogLevel::Critical, "Error resolving with lookup server {}", url);
    asl_log(platform.log, LogLevel::Critical, "sendSynchronousRequest error {}", *result.error);
  } else if (result.response) {
    warnOfStatus(platform, url, result.response->status);
  }
  return result;
}

/// Nothing for a header that ends in "max-age".
std::optional<std::int32_t> maxAgeOf(const Platform& platform,
                                     const std::optional<platform::HTTPResponse>& response,
                                     FatalFailures fatalFailures) {
  const auto cacheControl = response ? response->header("Cache-Control") : std::nullopt;
  const CacheAge age = cacheAgeFromHeader(cacheControl);
  if (!age.endsInMaxAge) return age.maxAgeSeconds;
  platform::fatalFailure(platform.log, fatalFailures,
                         "Cache-Control \"{}\" of the storebag server ends in max-age without a number",
                         *cacheControl);
  return std::nullopt;
}

Dictionary parsedEnvelope(const Platform& platform, std::string_view body) {
  const auto parsed = platform::propertyListWithData(body);
  if (!parsed.value) asl_log(platform.log, LogLevel::Critical, "propertyListWithData error {}", parsed.error);
  const Dictionary* envelope = parsed.value ? parsed.value->dictionary() : nullptr;
  return envelope ? *envelope : Dictionary();
}

/// The decoded text under `key`; nothing when there is none or it is not base64.
std::optional<std::string> decodedText(const Dictionary& envelope, std::string_view key) {
  const auto text = envelope.string(key);
  return text ? platform::base64DecodedIgnoringUnknown(*text) : std::nullopt;
}

/// The bytes of the bag when the envelope's signature over them holds.
std::optional<std::string> verifiedBag(const Platform& platform, const Dictionary& envelope) {
  if (!envelope.contains("signature")) {
    asl_log(platform.log, LogLevel::Critical, "Signature is missing");
    return std::nullopt;
  }
  const auto der = platform.frameworkBundle.resource("publicKey", "der");
  const auto key = der ? StorebagPublicKey::fromDER(der->bytes()) : std::nullopt;
  if (!key) return std::nullopt;
  const auto signature = decodedText(envelope, "signature");
  if (!signature) return std::nullopt;
  auto bag = decodedText(envelope, "bag");
  if (!bag) return std::nullopt;
  if (!verifyStorebagSignature(*key, *bag, *signature)) {
    asl_log(platform.log, LogLevel::Critical, "Signature can not be verified, {}", fmt::ptr(key->get()));
    return std::nullopt;
  }
  return bag;
}

/// The section of the current environment; the name last looked up stays in `sectionName`.
const Dictionary* currentSection(const Platform& platform, const Dictionary& bag,
                                 std::optional<std::string_view>& sectionName) {
  const std::uint32_t environment = currentEnvironmentType(platform);
  sectionName = environmentNameForType(environment);
  if (!sectionName) return nullptr;
  const Dictionary* section = bag.dictionary(*sectionName);
  if (section || environment != kEnvironmentTypeSeed) return section;
  asl_log(platform.log, LogLevel::Warning, "Seed section is missing in the storebag.");
  sectionName = environmentNameForType(kEnvironmentTypeRelease);
  return bag.dictionary(*sectionName);
}

std::optional<std::string> versionOf(const Platform& platform, const Dictionary& bag, std::int32_t clientType,
                                     FatalFailures fatalFailures) {
  const Value* version = bag.find("version");
  if (!version) {
    platform::fatalFailure(platform.log, fatalFailures, "Storebag for client type {} has no version",
                           clientType);
    return std::nullopt;
  }
  if (const auto text = version->string()) return std::string(*text);
  asl_log(platform.log, LogLevel::Warning, "Storebag version for client type {} is not a string", clientType);
  return version->description();
}

}  // namespace

CacheAge cacheAgeFromHeader(std::optional<std::string_view> cacheControl) {
  if (!cacheControl) return {};
  std::string_view rest = *cacheControl;
  while (true) {
    const auto separator = rest.find_first_of("= ");
    const bool found = rest.substr(0, separator) == "max-age";
    if (separator == std::string_view::npos)
      return {.endsInMaxAge = found, .maxAgeSeconds = kDefaultMaxAgeSeconds};
    rest.remove_prefix(separator + 1);
    if (!found) continue;
    const auto number = rest.substr(0, rest.find_first_of("= "));
    return {.maxAgeSeconds = clampedTo32Bits(platform::leadingInteger(number))};
  }
}

std::optional<Dictionary> fetchSignedStorebag(const Platform& platform,
                                              std::optional<std::string_view> storebagName,
                                              std::int32_t& maxAgeSeconds, FatalFailures fatalFailures) {
  const auto result = requestStorebag(platform, storebagURL(platform, storebagName));
  if (result.error) return std::nullopt;
  const Dictionary envelope = parsedEnvelope(platform, result.data.bytes());
  const auto maxAge = maxAgeOf(platform, result.response, fatalFailures);
  if (!maxAge) return std::nullopt;
  maxAgeSeconds = *maxAge;
  const auto bag = verifiedBag(platform, envelope);
  if (!bag) return std::nullopt;
  const auto parsed = platform::propertyListWithData(*bag);
  if (!parsed.value) return std::nullopt;
  if (!parsed.value->dictionary()) {
    asl_log(platform.log, LogLevel::Critical, "Storebag {} is not a dictionary",
            storebagName.value_or(kNoText));
    return std::nullopt;
  }
  return *parsed.value->dictionary();
}

StorebagFetch fetchStorebagForClientType(const Platform& platform, std::int32_t clientType,
                                         FatalFailures fatalFailures) {
  StorebagFetch fetch;
  if (clientType == 0) {
    asl_log(platform.log, LogLevel::Critical, "Could not find storebag name for client type {}", clientType);
    return fetch;
  }
  const auto bag = fetchSignedStorebag(platform, storebagNameForClientType(clientType), fetch.maxAgeSeconds,
                                       fatalFailures);
  if (!bag) {
    asl_log(platform.log, LogLevel::Critical, "Could not fetch storebag for client type {}", clientType);
    return fetch;
  }
  std::optional<std::string_view> sectionName;
  const Dictionary* section = currentSection(platform, *bag, sectionName);
  if (!section) {
    asl_log(platform.log, LogLevel::Critical,
            "Could not find storebag for client type {} with {} environment", clientType,
            sectionName.value_or(kNoText));
    return fetch;
  }
  fetch.version = versionOf(platform, *bag, clientType, fatalFailures);
  if (fetch.version) fetch.storebag = *section;
  return fetch;
}

}  // namespace tallyd
