// Records, filter rules and storebags like those that the daemon meets.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "Events.h"
#include "backends/https-post/EventRecord.h"
#include "platform/Log.h"
#include "platform/Value.h"

namespace tallyd::bench {

/// A log that nothing may come to: a line throws std::runtime_error with its text. Takes warnings and worse.
class NoLog final : public platform::Log {
 public:
  NoLog() : Log(platform::LogLevel::Warning) {}
  void open(std::string_view /*identity*/, std::string_view /*facility*/) override {}
  void close() override {}
  void write(platform::LogLevel level, std::string_view message) override;
};

/// What the record of payload(number) says beside it. The texts are constants.
[[nodiscard]] EventFacts eventFacts(std::size_t number);

/// The client that the last entry of storebag() is for.
[[nodiscard]] platform::Dictionary userInfo();

inline constexpr std::size_t kDecoratedFields = 28;
/// Records of the payloads from 0 on. No payload is shared with anything else.
[[nodiscard]] std::vector<EventRecord> eventRecords(std::size_t count);

/// The fields of a batch of records with the user info set over them, as they come to the filters.
class FreshFields {
 public:
  FreshFields() { renew(); }
  void renew();  ///< As if nobody had touched them.

  [[nodiscard]] std::vector<EventFields>& events() { return _fields; }

 private:
  const platform::Dictionary _userInfo = userInfo();
  const std::vector<EventRecord> _records = eventRecords(kBatchSize);
  std::vector<EventFields> _fields = std::vector<EventFields>(kBatchSize);
};

/// The body of a post of so many records with the user info.
[[nodiscard]] std::string documentOf(std::size_t events);
/// The body of a post with these events; a constant beside them.
[[nodiscard]] std::string documentAround(std::string_view eventArray);

enum class Hashing { No, Yes };

inline constexpr std::size_t kFewestFittingRules = 15;
inline constexpr std::size_t kRemovedFields = 2;  ///< By rules that hash nothing.
/// Rules of a storebag. From kFewestFittingRules on, five of them fit fields of a decorated event: two remove
/// theirs (with Hashing::Yes: hash it), three leave it as it is. Ten more name the same five fields for other
/// methods or statuses, and come first. All others, and all of a shorter list, name fields that no event has.
///
/// @param count  up to 1,000.
[[nodiscard]] platform::Array filterRules(std::size_t count, Hashing hashing = Hashing::No);

inline constexpr int kLastEventThreshold = 47;  ///< The last entry's; all others have 49.
/// The profile of a post backend: `entries` client entries of ten filter rules each, for three client names
/// and two parts of a service name. Only the last is for userInfo(); one in five before it has its client
/// name, and not its service.
///
/// @param country  the last of ten in each list of locales.
[[nodiscard]] platform::Dictionary postProfile(std::size_t entries, std::string_view country = "US");

/// A whole bag with this profile in its release section.
[[nodiscard]] platform::Dictionary storebag(const platform::Dictionary& profile);

}  // namespace tallyd::bench
