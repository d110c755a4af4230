#include "replay/Scenario.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>

#include "framework/TallyKeys.h"
#include "replay/Draws.h"

namespace tallyd::replay {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using std::chrono::hours;
using std::chrono::minutes;
using std::chrono::seconds;

namespace {

constexpr int kSessionsPerHour = 9;
constexpr double kBurstShare = 0.12;
constexpr int kFirstClientType = 5;
constexpr int kLastClientType = 11;
/// No storebag has a name for them: each ends a daemon that is not resilient.
constexpr std::array kStrangeClientTypes{-3, 0, 4, 12, 1'000'000};
constexpr double kStrangerShare = 0.05;

const std::array<const char*, 4> kClientNames{"Studio", "STUDIO", "atelier", "Workshop"};
const std::array<const char*, 3> kServiceNames{"Calls", "calls", "Video"};
const std::array<const char*, 5> kTexts{"", "one", "two words", "caf\xC3\xA9 = \\ \n",
                                        "a longer text to be cut"};

/// Writes the steps of a day, one client after the other.
class DayWriter {
 public:
  DayWriter(std::uint64_t seed, Milliseconds length, const OptIns& optIns)
      : _draws(seed),
        _length(length),
        _hasStrangers(optIns.fatalFailures == platform::FatalFailures::FailRequest) {}

  std::vector<Step> write() {
    const auto sessions = std::chrono::duration_cast<hours>(_length).count() * kSessionsPerHour;
    for (std::int64_t i = 0; i < sessions; ++i) addSession();
    addSurroundings();
    std::stable_sort(_steps.begin(), _steps.end(),
                     [](const Step& one, const Step& other) { return one.at < other.at; });
    return std::move(_steps);
  }

 private:
  Milliseconds momentBetween(Milliseconds first, Milliseconds last) {
    return Milliseconds(_draws.between(first.count(), std::max(first, last).count()));
  }
  void add(Milliseconds at, Happening happening, double answerShare = 1) {
    _steps.push_back({at, _client, std::move(happening), answerShare >= 1 || _draws.chance(answerShare)});
  }

  Dictionary userInfo() {
    Dictionary info{{"visit", _draws.between(1, 99)}};
    if (!_draws.chance(0.05)) info.set(kTallyUserInfoClientName, _draws.pick(kClientNames));
    if (!_draws.chance(0.05)) info.set(kTallyUserInfoServiceName, _draws.pick(kServiceNames));
    return info;
  }
  std::int64_t clientType() {
    if (_hasStrangers && _draws.chance(kStrangerShare)) return _draws.pick(kStrangeClientTypes);
    return _draws.between(kFirstClientType, kLastClientType);
  }
  Dictionary sessionInfo(bool requiresUserInfo) {
    return {{kTallySessionInfoSessionID.data(), _draws.between(1, 4'000'000'000)},
            {kTallySessionInfoClientType.data(), clientType()},
            {kTallySessionInfoClientVersion.data(), _draws.between(0, 70'000)},
            {kTallySessionInfoRequireUserInfo.data(), requiresUserInfo},
            {kTallySessionInfoBatchEvent.data(), _draws.chance(0.5)}};
  }
  OptionalDictionary payload() {
    if (_draws.chance(0.04)) return std::nullopt;
    Dictionary payload{{kSerialKey, ++_serial}, {"text", _draws.pick(kTexts)}, {"caller", "ada@example.org"}};
    if (_draws.chance(0.2)) payload.set("share", _draws.unit());
    if (_draws.chance(0.1)) payload.set("list", Array{1, "two"});
    if (_draws.chance(0.1)) payload.set("when", platform::Date{_draws.unit() * 1e9});
    if (_draws.chance(0.03)) payload.set("long", std::string(2000, 'x'));
    return payload;
  }
  Send message() {
    const auto category = static_cast<std::uint16_t>(_draws.between(0, kHighestCategory));
    return {category, static_cast<std::uint16_t>(_draws.between(0, 3)), payload()};
  }

  void addSession() {
    ++_client;
    const Milliseconds opened = momentBetween(Milliseconds(0), _length);
    add(opened, Connect{});
    if (_draws.chance(0.12)) return addOneShot(opened);
    // From seconds to hours, each order of magnitude as often as the next.
    const auto life = seconds(_draws.between(2, 20)) * (std::int64_t{1} << _draws.between(0, 9));
    const Milliseconds closed = std::min<Milliseconds>(opened + life, _length);
    const bool requiresUserInfo = _draws.chance(0.6);
    const bool comesLate = requiresUserInfo && _draws.chance(0.3);
    const bool hasUserInfo = requiresUserInfo || _draws.chance(0.1);
    add(opened, Configure{sessionInfo(requiresUserInfo),
                          hasUserInfo && !comesLate ? OptionalDictionary(userInfo()) : std::nullopt});
    if (!_draws.chance(0.03)) add(momentBetween(opened, opened + seconds(1)), Start{}, 0.8);
    if (comesLate) add(momentBetween(opened + seconds(1), closed), FetchStates{userInfo()}, 0.8);
    addMessages(opened + seconds(1), closed);
    addErrands(opened + seconds(1), closed);
    if (_draws.chance(0.06)) addImpatience(opened, closed);
    if (_draws.chance(0.05)) return;  // Stays until the day ends.
    add(closed + seconds(1), Disconnect{_draws.chance(0.9) ? Ending::Clean : Ending::Broken});
  }

  /// A client that starts over and over, as one does that gets no backends.
  void addImpatience(Milliseconds first, Milliseconds last) {
    for (auto at = first; at < last; at += momentBetween(seconds(20), seconds(120))) add(at, Start{}, 0.8);
  }

  void addOneShot(Milliseconds opened) {
    const bool requiresUserInfo = _draws.chance(0.5);
    OptionalDictionary info = sessionInfo(requiresUserInfo);
    if (_draws.chance(0.1)) info->remove(kTallySessionInfoSessionID);
    const OptionalDictionary user = requiresUserInfo ? OptionalDictionary(userInfo()) : std::nullopt;
    for (auto i = _draws.between(1, 3); i > 0; --i) add(opened, SendOnce{info, user, message()}, 0.7);
    add(opened + seconds(2), Disconnect{Ending::Clean});
  }

  void addMessages(Milliseconds first, Milliseconds last) {
    if (_draws.chance(kBurstShare)) {
      const Milliseconds burst = momentBetween(first, last);
      const auto category = static_cast<std::uint16_t>(_draws.between(1, kHighestCategory));
      for (auto i = _draws.between(40, 120); i > 0; --i) add(burst, Send{category, 0, payload()}, 0.2);
    }
    for (auto i = _draws.between(0, 25); i > 0; --i) add(momentBetween(first, last), message(), 0.6);
  }

  void addErrands(Milliseconds first, Milliseconds last) {
    const auto sometimes = [&](double share, auto make) {
      if (_draws.chance(share)) add(momentBetween(first, last), make(), 0.9);
    };
    sometimes(0.5, [] { return Flush{}; });
    sometimes(0.3, [] { return Flush{}; });
    sometimes(0.3, [this] { return FetchStates{userInfo()}; });
    sometimes(0.1, [] { return FetchStates{std::nullopt}; });
    sometimes(0.2, [] { return FetchDisplayURL{}; });
    sometimes(0.2, [this] { return uploadedFile(); });
    sometimes(0.15, [this] {
      return UploadLogData{Array{Dictionary{{"phase", _draws.between(1, 9)}}, "end"}};
    });
    sometimes(0.06, [] { return Start{}; });
  }

  UploadFile uploadedFile() {
    const std::string name = "session-" + std::to_string(_client) + ".log";
    if (_draws.chance(0.1)) return {name, std::nullopt};
    return {name, _draws.chance(0.1) ? 0 : static_cast<std::size_t>(_draws.between(1, 20'000))};
  }

  void addSurroundings() {
    const auto around = [&](Milliseconds meanGap, auto make) {
      for (Milliseconds at = momentBetween(Milliseconds(0), 2 * meanGap); at < _length;
           at += momentBetween(Milliseconds(1), 2 * meanGap)) {
        add(at, make());
      }
    };
    add(Milliseconds(0), SetPreference{"com.quillon.diagnostics", kConsentKey, true});
    around(hours(3), [this] {
      return SetPreference{"com.quillon.diagnostics", kConsentKey, _draws.chance(0.6)};
    });
    around(hours(3), [this] {
      const bool isSet = _draws.chance(0.7);
      return SetPreference{
          "com.quillon.tally", "httpsPostURL",
          isSet ? std::optional<Value>("https://collector.example/preferred") : std::nullopt};
    });
    around(hours(6), [this] {
      return SetPreference{"com.quillon.timed", "TMAutomaticTimeZoneEnabled", _draws.chance(0.5)};
    });
    around(hours(5), [this] {
      const std::array<std::optional<std::string>, 3> countries{"DE", "AQ", std::nullopt};
      return SetCountry{_draws.pick(countries)};
    });
    around(hours(4), [this] { return NewEdition{static_cast<int>(_draws.between(1, 9))}; });
  }

  Draws _draws;
  const Milliseconds _length;
  const bool _hasStrangers;
  std::vector<Step> _steps;
  int _client = 0;
  std::int64_t _serial = 0;
};

Weather storm(Draws& draws) {
  const auto bad = [&draws] { return draws.chance(0.4) ? draws.unit() : 0.0; };
  const auto slow = [&draws](Milliseconds most) { return Milliseconds(draws.between(1, most.count())); };
  return {.postFails = bad(),
          .postIsRefused = bad(),
          .postFindsNoRoom = bad() / 2,
          .fetchFails = draws.chance(0.6) ? draws.unit() : 0,
          .uploadFails = bad(),
          .uploadIsRefused = bad(),
          .datagramIsNotTaken = bad(),
          .datagramIsLost = bad(),
          .acknowledgementIsLost = bad(),
          .acknowledgementComesTwice = bad(),
          .noiseComes = bad(),
          .socketFails = bad() / 2,
          .adaptorThrows = bad(),
          .hasNoMachineID = bad() / 2,
          .longestPost = slow(minutes(2)),
          .longestFetch = slow(seconds(15)),
          .longestUpload = slow(minutes(2)),
          .longestRoundTrip = slow(seconds(40))};
}

Happening fault(Draws& draws) {
  const double kind = draws.unit();
  if (kind < 0.5) return ChangeWeather{storm(draws)};
  if (kind < 0.85) return ChangeWeather{};
  if (kind < 0.96) return StepClock{seconds(draws.between(-7200, 7200))};
  const std::array kLosses{Loss::MessageLogFile, Loss::MessageLogFolder, Loss::UserDefaults};
  return Lose{draws.pick(kLosses)};
}

/// Any sixteen seeds in a row have all combinations.
OptIns optInsOf(std::uint64_t seed) {
  Draws draws(seed);
  OptIns optIns;
  if ((seed & 1U) != 0) optIns.retryPosts = static_cast<unsigned>(draws.between(1, 8));
  if ((seed & 2U) != 0) optIns.consentChecks = ConsentChecks::BeforeEachPost;
  if ((seed & 4U) != 0) optIns.fatalFailures = platform::FatalFailures::FailRequest;
  // From what hardly suffices to what always does.
  if ((seed & 8U) != 0) optIns.drain = draws.chance(0.5) ? seconds(draws.between(1, 20)) : kLongDrain;
  return optIns;
}

}  // namespace

Scenario makeScenario(std::uint64_t seed, hours length) {
  const OptIns optIns = optInsOf(seed);
  return {.seed = seed,
          .length = length,
          .isInternalDevice = Draws(~seed).chance(0.3),
          .steps = DayWriter(seed, length, optIns).write(),
          .optIns = optIns,
          .recipe = Recipe{.seed = seed, .length = length}};
}

Scenario withFaults(Scenario scenario, std::uint64_t seed) {
  constexpr std::size_t kStepsPerFault = 40;
  Draws draws(seed);
  std::vector<Step> faulty;
  faulty.reserve(scenario.steps.size() + scenario.steps.size() / kStepsPerFault);
  for (Step& step : scenario.steps) {
    if (draws.chance(1.0 / kStepsPerFault)) faulty.push_back({step.at, 0, fault(draws)});
    faulty.push_back(std::move(step));
  }
  scenario.steps = std::move(faulty);
  if (scenario.recipe) scenario.recipe->faults = seed;
  return scenario;
}

Scenario scenarioOf(const Recipe& recipe) {
  Scenario fine = makeScenario(recipe.seed, recipe.length);
  return recipe.faults ? withFaults(std::move(fine), *recipe.faults) : fine;
}

bool mayStopFurtherAttempts(const OptIns& optIns) {
  return optIns.retryPosts > 0 && optIns.consentChecks == ConsentChecks::BeforeEachPost;
}

std::string description(const OptIns& optIns) {
  std::vector<std::string> parts;
  if (optIns.retryPosts > 0) parts.push_back(fmt::format("retries {}", optIns.retryPosts));
  if (optIns.consentChecks == ConsentChecks::BeforeEachPost) parts.emplace_back("consent re-read");
  if (optIns.fatalFailures == platform::FatalFailures::FailRequest) parts.emplace_back("resilient");
  if (optIns.drain) parts.push_back(fmt::format("drain {} s", optIns.drain->count()));
  return parts.empty() ? "none" : fmt::format("{}", fmt::join(parts, ", "));
}

}  // namespace tallyd::replay
