// What happens in a simulated day, written down before it begins.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/Fatal.h"
#include "platform/Value.h"
#include "replay/Weather.h"
#include "support/Consent.h"

namespace tallyd::replay {

using Milliseconds = std::chrono::milliseconds;
using OptionalDictionary = std::optional<platform::Dictionary>;

// What a client does on its connection.
struct Connect {
  bool operator==(const Connect&) const = default;
};
struct Configure {
  platform::Dictionary sessionInfo;
  OptionalDictionary userInfo;
  bool operator==(const Configure&) const = default;
};
struct Start {
  bool operator==(const Start&) const = default;
};
struct FetchStates {
  OptionalDictionary userInfo;
  bool operator==(const FetchStates&) const = default;
};
struct FetchDisplayURL {
  bool operator==(const FetchDisplayURL&) const = default;
};
struct Send {
  std::uint16_t category;
  std::uint16_t type;
  OptionalDictionary payload;
  bool operator==(const Send&) const = default;
};
struct SendOnce {
  OptionalDictionary sessionInfo;
  OptionalDictionary userInfo;
  Send message;
  bool operator==(const SendOnce&) const = default;
};
struct Flush {
  bool operator==(const Flush&) const = default;
};
struct UploadFile {
  std::string name;
  std::optional<std::size_t> bytes;  ///< Nothing: there is no such file.
  bool operator==(const UploadFile&) const = default;
};
struct UploadLogData {
  platform::Array data;
  bool operator==(const UploadLogData&) const = default;
};
enum class Ending { Clean, Broken };
struct Disconnect {
  Ending ending;
  bool operator==(const Disconnect&) const = default;
};

// What happens around the daemon.
struct SetPreference {
  std::string suite;
  std::string key;
  std::optional<platform::Value> value;
  bool operator==(const SetPreference&) const = default;
};
struct SetCountry {
  std::optional<std::string> country;
  bool operator==(const SetCountry&) const = default;
};
/// The servers give out other storebags from now on.
struct NewEdition {
  int edition;
  bool operator==(const NewEdition&) const = default;
};
struct ChangeWeather {
  Weather weather;
  bool operator==(const ChangeWeather&) const = default;
};
struct StepClock {
  Milliseconds step;
  bool operator==(const StepClock&) const = default;
};
enum class Loss { MessageLogFile, MessageLogFolder, UserDefaults };
struct Lose {
  Loss what;
  bool operator==(const Lose&) const = default;
};

using Happening = std::variant<Connect, Configure, Start, FetchStates, FetchDisplayURL, Send, SendOnce, Flush,
                               UploadFile, UploadLogData, Disconnect, SetPreference, SetCountry, NewEdition,
                               ChangeWeather, StepClock, Lose>;

struct Step {
  Milliseconds at;
  int client;  ///< Whose connection; no meaning for what happens around the daemon.
  Happening happening;
  bool wantsAnswer = true;
  bool operator==(const Step&) const = default;
};

/// What the daemon's operator has asked for; by default nothing.
struct OptIns {
  unsigned retryPosts = 0;  ///< Attempts beyond a post's first.
  ConsentChecks consentChecks = ConsentChecks::AtStart;
  platform::FatalFailures fatalFailures = platform::FatalFailures::EndProcess;
  std::optional<std::chrono::seconds>
      drain{};  ///< The daemon ends the day's last sessions, and waits so long.
  bool operator==(const OptIns&) const = default;
};

/// A drain's time in which everything comes to its end: a post's last further attempt begins up to 15 minutes
/// after its first, and is the slowest post.
inline constexpr std::chrono::minutes kLongDrain{20};

/// All that a day which nobody wrote by hand depends on.
struct Recipe {
  std::uint64_t seed = 1;
  std::chrono::hours length{24};
  std::optional<std::uint64_t> faults{};  ///< The seed of its faults; nothing: fine weather.
  bool operator==(const Recipe&) const = default;
};

/// A day.
struct Scenario {
  std::uint64_t seed;
  Milliseconds length;
  bool isInternalDevice;
  std::vector<Step> steps;  ///< In the order of their times.
  OptIns optIns{};
  std::optional<Recipe> recipe{};  ///< Nothing for a day that was written by hand.
  bool operator==(const Scenario&) const = default;
};

/// Messages have one of these categories; 0 is the daemon's own.
inline constexpr std::uint16_t kHighestCategory = 6;
/// The user's consent, among the preferences.
inline constexpr const char* kConsentKey = "DiagnosticLogSubmissionEnabled";
/// What identifies a message in its payload.
inline constexpr const char* kSerialKey = "n";

/// A day in fine weather. Its opt-ins, too, are those of the seed: any sixteen in a row have all
/// combinations.
[[nodiscard]] Scenario makeScenario(std::uint64_t seed, std::chrono::hours length);
/// The same day with storms, losses and jumps of the clock at random steps. `scenario` has none yet.
[[nodiscard]] Scenario withFaults(Scenario scenario, std::uint64_t seed);
/// The day that the recipe makes.
[[nodiscard]] Scenario scenarioOf(const Recipe& recipe);

/// Whether a post's further attempts may be stopped by consent that is withdrawn.
[[nodiscard]] bool mayStopFurtherAttempts(const OptIns& optIns);
/// "retries 3, consent re-read", or "none": one line for people.
[[nodiscard]] std::string description(const OptIns& optIns);

}  // namespace tallyd::replay
