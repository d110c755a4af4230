// Who reports: the rules that a storebag's client entries make, without a backend.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace tallyd {

/// On what terms the user's consent is asked for.
enum DNUType : std::int32_t {
  DNUTypeConsent = 0,            ///< No override: reporting needs consent.
  DNUTypeOverrideNoConsent = 1,  ///< Override, and the user has not consented.
  DNUTypeOverrideConsent = 2,    ///< Override, and the user has consented.
};

/// What the rules look at.
struct ReportingCircumstances {
  platform::Dictionary profile;
  bool requireUserInfo = false;
  std::optional<platform::Dictionary> userInfo;
  bool consented = false;
  double samplingFactor = 0;  ///< In [0, 1).
  std::optional<std::string> productFamily;
  std::optional<std::string> countryCode;
};

enum class ReportingReason {
  UserInfoNotRequired,  ///< On, without a look at the profile.
  NoUserInfo,
  NoClientList,
  NoMatchingClient,
  NoConsent,
  LocaleNotListed,
  DeviceNotListed,
  NoFilters,
  NotSampled,
  Sampled,  ///< On.
};

/// What the rules say. A member that is nothing was not reached, or is not given by the entry: whoever
/// applies the decision leaves what it has.
struct ReportingDecision {
  std::int32_t state = 0;  ///< A ReportingState.
  ReportingReason reason = ReportingReason::NoUserInfo;
  std::optional<platform::Dictionary> entry;  ///< The chosen client entry.
  std::optional<std::int32_t> hierarchy;
  std::optional<DNUType> dnuType;
  std::int32_t override_dnu = 0;
  std::optional<platform::Array> filters;
  bool reachedSampling = false;
  std::optional<platform::Value>
      samplingThreshold;  ///< Nothing is a value of its own once sampling was reached.
  std::optional<std::int32_t> eventThreshold;
  std::optional<std::int32_t> extrasOnInternal;
  std::optional<std::string> postURL;
};

/// The rules in the order in which they are asked.
enum class ReportingRule {
  UserInfoNotRequired,  ///< Passed by a session that requires none; that ends the rules.
  UserInfo,
  ClientList,
  ClientEntry,  ///< Once for each entry, up to the one that is chosen.
  Consent,
  Locale,
  Device,
  Filters,
  Sampling,
};

/// One answer of the rules on their way to a decision.
struct ReportingStep {
  ReportingRule rule = ReportingRule::UserInfo;
  bool passed = false;
  std::optional<std::size_t> entryIndex{};  ///< Of the client entry, from that rule on.
  bool operator==(const ReportingStep&) const = default;
};
using ReportingTrace = std::vector<ReportingStep>;

/// Evaluates the rules from the beginning. Pure; any thread.
///
/// @param trace  Takes the steps, behind what it holds; null when nobody asks.
[[nodiscard]] ReportingDecision decideReporting(const ReportingCircumstances& circumstances,
                                                ReportingTrace* trace = nullptr);

/// Strings to match against; nothing where the storebag gives no list.
using MatchList = std::optional<std::vector<std::string_view>>;

/// Whether an element equals `wholeString`, or occurs in it, without regard to case. `whitelist` is the
/// answer for an empty or missing list; its opposite the answer for a missing string. An empty element
/// matches nothing.
[[nodiscard]] bool matchExactStringWithList(const MatchList& list,
                                            std::optional<std::string_view> wholeString, bool whitelist);
[[nodiscard]] bool matchStringWithList(const MatchList& list, std::optional<std::string_view> wholeString,
                                       bool whitelist);

}  // namespace tallyd
