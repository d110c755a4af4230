// What happens in a simulated day, written down before it begins.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "platform/Value.h"
#include "replay/Weather.h"

namespace tallyd::replay {

using Milliseconds = std::chrono::milliseconds;
using OptionalDictionary = std::optional<platform::Dictionary>;

// What a client does on its connection.
struct Connect {};
struct Configure {
  platform::Dictionary sessionInfo;
  OptionalDictionary userInfo;
};
struct Start {};
struct FetchStates {
  OptionalDictionary userInfo;
};
struct FetchDisplayURL {};
struct Send {
  std::uint16_t category;
  std::uint16_t type;
  OptionalDictionary payload;
};
struct SendOnce {
  OptionalDictionary sessionInfo;
  OptionalDictionary userInfo;
  Send message;
};
struct Flush {};
struct UploadFile {
  std::string name;
  std::optional<std::size_t> bytes;  ///< Nothing: there is no such file.
};
struct UploadLogData {
  platform::Array data;
};
enum class Ending { Clean, Broken };
struct Disconnect {
  Ending ending;
};

// What happens around the daemon.
struct SetPreference {
  std::string suite;
  std::string key;
  std::optional<platform::Value> value;
};
struct SetCountry {
  std::optional<std::string> country;
};
/// The servers give out other storebags from now on.
struct NewEdition {
  int edition;
};
struct ChangeWeather {
  Weather weather;
};
struct StepClock {
  Milliseconds step;
};
enum class Loss { MessageLogFile, MessageLogFolder, UserDefaults };
struct Lose {
  Loss what;
};

using Happening = std::variant<Connect, Configure, Start, FetchStates, FetchDisplayURL, Send, SendOnce, Flush,
                               UploadFile, UploadLogData, Disconnect, SetPreference, SetCountry, NewEdition,
                               ChangeWeather, StepClock, Lose>;

struct Step {
  Milliseconds at;
  int client;  ///< Whose connection; no meaning for what happens around the daemon.
  Happening happening;
  bool wantsAnswer = true;
};

/// A day that depends on its seed and length alone.
struct Scenario {
  std::uint64_t seed;
  Milliseconds length;
  bool isInternalDevice;
  std::vector<Step> steps;  ///< In the order of their times.
};

/// Messages have one of these categories; 0 is the daemon's own.
inline constexpr std::uint16_t kHighestCategory = 6;
/// What identifies a message in its payload.
inline constexpr const char* kSerialKey = "n";

/// A day in fine weather.
[[nodiscard]] Scenario makeScenario(std::uint64_t seed, std::chrono::hours length);
/// The same day with storms, losses and jumps of the clock at random steps.
[[nodiscard]] Scenario withFaults(Scenario scenario, std::uint64_t seed);

}  // namespace tallyd::replay
