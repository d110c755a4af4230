#include <gtest/gtest.h>

#include <array>
#include <cctype>
#include <map>
#include <random>

#include "backends/TallyBackend.h"
#include "backends/https-post/ReportingRules.h"
#include "framework/TallyKeys.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

constexpr std::uint64_t kSeed = 20'260'115;
constexpr int kCombinations = 100'000;

using Texts = std::vector<std::string>;

// What a storebag means, before it is written down

struct Entry {
  bool isDictionary = true;
  std::optional<Texts> clients;
  std::optional<Texts> services;
  std::optional<int> hierarchy;
  std::optional<int> override_dnu;
  std::optional<Texts> locales;
  std::optional<Texts> devices;
  std::optional<int> filterCount;
  std::optional<double> sampling;
  std::optional<int> eventThreshold;
  std::optional<int> extras;
  std::optional<std::string> url;
};

struct UserInfo {
  std::optional<std::string> client;
  std::optional<std::string> service;
};

struct Situation {
  bool requireUserInfo = true;
  std::optional<UserInfo> userInfo;
  std::optional<std::vector<Entry>> entries;
  bool consented = false;
  double factor = 0;
  std::optional<std::string> family;
  std::optional<std::string> country;
};

// Random situations

class Dice {
 public:
  explicit Dice(std::uint64_t seed) : _engine(seed) {}

  /// In [0, sides).
  int roll(int sides) { return static_cast<int>(_engine() % static_cast<std::uint64_t>(sides)); }
  bool once(int in) { return roll(in) == 0; }
  template <class Choices>
  auto pick(const Choices& choices) {
    return choices[static_cast<std::size_t>(roll(static_cast<int>(std::size(choices))))];
  }
  /// One of `choices`, or nothing once in `in`.
  template <class T, std::size_t kCount>
  std::optional<T> maybe(const std::array<T, kCount>& choices, int in) {
    if (once(in)) return std::nullopt;
    return pick(choices);
  }

 private:
  std::mt19937_64 _engine;
};

std::optional<Texts> someTexts(Dice& dice, const Texts& words, int absentIn, int shortest) {
  if (dice.once(absentIn)) return std::nullopt;
  Texts texts(static_cast<std::size_t>(shortest + dice.roll(4)));
  for (std::string& text : texts) text = dice.pick(words);
  return texts;
}

std::optional<std::string> someText(Dice& dice, const Texts& words, int absentIn) {
  if (dice.once(absentIn)) return std::nullopt;
  return dice.pick(words);
}

Entry someEntry(Dice& dice) {
  static const Texts kClients{"alpha", "BETA", "Beta", "gamma", "alpha ", " beta", "", "Alphabet"};
  static const Texts kServices{"call", "VIDEO", "ser", "", " call", "fax", "VideoCallService"};
  static const Texts kLocales{"DE", "de", "D", "US", "", "DEU"};
  static const Texts kDevices{"Kasten", "KAST", "tafel", "", "Kasten3"};
  Entry entry;
  entry.isDictionary = !dice.once(12);
  entry.clients = someTexts(dice, kClients, 4, 1);  // A text that is split has one part at least.
  entry.services = someTexts(dice, kServices, 3, 1);
  entry.hierarchy = dice.maybe(std::array{0, 1, 7, -4, 2'147'483'647}, 4);
  entry.override_dnu = dice.maybe(std::array{0, 1, 1, 2, -1}, 2);
  entry.locales = someTexts(dice, kLocales, 8, 0);
  entry.devices = someTexts(dice, kDevices, 2, 0);
  if (!dice.once(6)) entry.filterCount = dice.roll(4);
  entry.sampling = dice.maybe(std::array{0.0, 0.25, 0.5, 0.75, 1.0, 3.0, -0.5}, 5);
  entry.eventThreshold = dice.maybe(std::array{-1, 0, 10, 49, 1000}, 3);
  entry.extras = dice.maybe(std::array{0, 1, -1}, 2);
  entry.url = dice.maybe(std::array<std::string, 3>{"https://a.example/", "https://b.example/", ""}, 3);
  return entry;
}

Situation someSituation(Dice& dice) {
  static const Texts kNames{"Alpha", "beta", "BETA", "delta", "alpha ", "", "alphabet"};
  static const Texts kServices{"VideoCallService", "fax", "CALL", "", "other"};
  Situation situation;
  situation.requireUserInfo = !dice.once(10);
  if (!dice.once(10)) situation.userInfo = UserInfo{someText(dice, kNames, 8), someText(dice, kServices, 8)};
  if (!dice.once(15)) {
    situation.entries.emplace();
    for (int i = dice.roll(5); i > 0; --i) situation.entries->push_back(someEntry(dice));
  }
  situation.consented = !dice.once(3);
  situation.factor = dice.pick(std::array{0.0, 0.1, 0.25, 0.5, 0.6, 0.75, 0.999});
  situation.family = someText(dice, {"Kasten", "KASTEN3,1", "Tafel"}, 10);
  situation.country = someText(dice, {"DE", "us", "FR"}, 10);
  return situation;
}

// The same written down as a storebag and user info, in one of the many ways

class Writer {
 public:
  explicit Writer(Dice& dice) : _dice(dice) {}

  ReportingCircumstances written(const Situation& situation) {
    Dictionary profile;
    if (situation.entries) {
      std::vector<Value> clients;
      for (std::size_t i = 0; i < situation.entries->size(); ++i) {
        clients.push_back(entryValue((*situation.entries)[i], i));
      }
      profile.set("clients", Array(std::move(clients)));
    } else if (_dice.once(2)) {
      profile.set("clients", noList());
    }
    return {.profile = profile,
            .requireUserInfo = situation.requireUserInfo,
            .userInfo = userInfo(situation),
            .consented = situation.consented,
            .samplingFactor = situation.factor,
            .productFamily = situation.family,
            .countryCode = situation.country};
  }

 private:
  std::optional<Dictionary> userInfo(const Situation& situation) {
    if (!situation.userInfo) return std::nullopt;
    Dictionary info{{"another", 1}};
    setText(info, kTallyUserInfoClientName, situation.userInfo->client);
    setText(info, kTallyUserInfoServiceName, situation.userInfo->service);
    return info;
  }

  Value entryValue(const Entry& entry, std::size_t index) {
    if (!entry.isDictionary) return _dice.pick(std::array<Value, 4>{Value(), "alpha", 5, Array{"alpha"}});
    Dictionary written{{"index", static_cast<std::int64_t>(index)}};
    setText(written, "client", joined(entry.clients));
    setText(written, "service", joined(entry.services));
    setInteger(written, "hierarchy", entry.hierarchy);
    setInteger(written, "override_dnu", entry.override_dnu);
    setList(written, "locale_whitelist", entry.locales);
    setList(written, "device_whitelist", entry.devices);
    if (entry.filterCount) {
      Array filters;
      for (int i = 0; i < *entry.filterCount; ++i) filters.append(Dictionary{{"key", "k"}});
      written.set("filters", filters);
    } else if (_dice.once(2)) {
      written.set("filters", noList());
    }
    setReal(written, "sampling_threshold", entry.sampling);
    setInteger(written, "event_threshold", entry.eventThreshold);
    setInteger(written, "extras_on_internal", entry.extras);
    setText(written, "post_url", entry.url);
    return written;
  }

  static std::optional<std::string> joined(const std::optional<Texts>& parts) {
    if (!parts) return std::nullopt;
    std::string text;
    for (const std::string& part : *parts) text += (&part == &parts->front() ? "" : ",") + part;
    return text;
  }

  Value noList() { return _dice.pick(std::array<Value, 4>{Value(), "DE", 1, Dictionary{{"0", "DE"}}}); }
  Value noNumber() { return _dice.pick(std::array<Value, 3>{Value(), Array{1}, platform::Data("1")}); }

  void setText(Dictionary& to, std::string_view key, const std::optional<std::string>& text) {
    if (text) {
      to.set(key, *text);
    } else if (_dice.once(3)) {
      to.set(key, _dice.pick(std::array<Value, 4>{Value(), 5, true, Array{"alpha"}}));
    }
  }
  void setInteger(Dictionary& to, std::string_view key, std::optional<int> number) {
    if (number) {
      const double beyond = *number < 0 ? *number - 0.5 : *number + 0.5;
      to.set(key, _dice.pick(std::array<Value, 4>{*number, beyond, std::to_string(*number),
                                                  " " + std::to_string(*number) + " of"}));
    } else if (_dice.once(3)) {
      to.set(key, noNumber());
    }
  }
  void setReal(Dictionary& to, std::string_view key, std::optional<double> number) {
    if (number) {
      to.set(key, _dice.once(3) ? Value(std::to_string(*number)) : Value(*number));
    } else if (_dice.once(3)) {
      to.set(key, noNumber());
    }
  }
  void setList(Dictionary& to, std::string_view key, const std::optional<Texts>& texts) {
    if (texts) {
      Array list;
      for (const std::string& text : *texts) {
        if (_dice.once(6)) list.append(noNumber());  // An element that is no text matches nothing.
        list.append(text);
      }
      to.set(key, list);
    } else if (_dice.once(3)) {
      to.set(key, noList());
    }
  }

  Dice& _dice;
};

// The rules again, as a table

std::string lower(std::string text) {
  for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return text;
}

bool listed(const std::optional<Texts>& list, const std::optional<std::string>& text, bool exact,
            bool whenEmpty) {
  if (!list || list->empty()) return whenEmpty;
  if (!text) return !whenEmpty;
  for (const std::string& element : *list) {
    if (element.empty()) continue;
    if (exact ? lower(element) == lower(*text) : lower(*text).find(lower(element)) != std::string::npos)
      return true;
  }
  return false;
}

std::optional<std::size_t> chosenIndex(const Situation& s) {
  for (std::size_t i = 0; i < s.entries->size(); ++i) {
    const Entry& e = (*s.entries)[i];
    if (e.isDictionary && listed(e.clients, s.userInfo->client, true, true) &&
        listed(e.services, s.userInfo->service, false, true)) {
      return i;
    }
  }
  return std::nullopt;
}

const Entry& chosen(const Situation& s) { return (*s.entries)[*chosenIndex(s)]; }

/// A row: the evaluation ends here when `ends`, with this state and reason.
struct Row {
  bool (*ends)(const Situation& s);
  int state;
  ReportingReason reason;
};

constexpr std::array<Row, 10> kTable{{
    {[](const Situation& s) { return !s.requireUserInfo; }, 2, ReportingReason::UserInfoNotRequired},
    {[](const Situation& s) { return !s.userInfo; }, 0, ReportingReason::NoUserInfo},
    {[](const Situation& s) { return !s.entries; }, 1, ReportingReason::NoClientList},
    {[](const Situation& s) { return !chosenIndex(s); }, 0, ReportingReason::NoMatchingClient},
    {[](const Situation& s) { return !s.consented && chosen(s).override_dnu != 1; }, 1,
     ReportingReason::NoConsent},
    {[](const Situation& s) { return !listed(chosen(s).locales, s.country, false, false); }, 1,
     ReportingReason::LocaleNotListed},
    {[](const Situation& s) { return !listed(chosen(s).devices, s.family, false, true); }, 1,
     ReportingReason::DeviceNotListed},
    {[](const Situation& s) { return !chosen(s).filterCount; }, 1, ReportingReason::NoFilters},
    {[](const Situation& s) { return !chosen(s).sampling || s.factor > *chosen(s).sampling; }, 1,
     ReportingReason::NotSampled},
    {[](const Situation&) { return true; }, 2, ReportingReason::Sampled},
}};
constexpr std::size_t kFirstRowWithEntry = 4;
constexpr std::size_t kFirstRowWithEverything = 8;

std::size_t rowThatEnds(const Situation& s) {
  std::size_t row = 0;
  while (!kTable[row].ends(s)) ++row;
  return row;
}

int expectedDNUType(const Situation& s) {
  if (chosen(s).override_dnu != 1) return 0;
  return s.consented ? 2 : 1;
}

/// The first member in which the decision is not what the table says; empty when there is none.
std::string firstDifference(const Situation& s, const ReportingDecision& decision) {
  const std::size_t row = rowThatEnds(s);
  if (decision.state != kTable[row].state) return "state";
  if (decision.reason != kTable[row].reason) return "reason";

  const Entry* entry = row >= kFirstRowWithEntry ? &chosen(s) : nullptr;
  if (decision.entry.has_value() != (entry != nullptr)) return "entry";
  if (entry && decision.entry->integer("index") != static_cast<std::int64_t>(*chosenIndex(s)))
    return "entry's index";
  if (decision.hierarchy != (entry ? std::optional(entry->hierarchy.value_or(0)) : std::nullopt))
    return "hierarchy";
  if (decision.dnuType.has_value() != (entry != nullptr)) return "dnuType reached";
  if (entry && *decision.dnuType != expectedDNUType(s)) return "dnuType";
  if (decision.override_dnu != (entry ? entry->override_dnu.value_or(0) : 0)) return "override_dnu";

  const Entry* all = row >= kFirstRowWithEverything ? entry : nullptr;
  if (decision.reachedSampling != (all != nullptr)) return "reachedSampling";
  if (decision.filters.has_value() != (all != nullptr)) return "filters reached";
  if (all && decision.filters->size() != static_cast<std::size_t>(*all->filterCount)) return "filters";
  const auto threshold = all ? all->sampling : std::nullopt;
  if (decision.samplingThreshold.has_value() != threshold.has_value()) return "samplingThreshold reached";
  if (threshold && decision.samplingThreshold->realValue() != threshold) return "samplingThreshold";
  if (decision.eventThreshold != (all ? all->eventThreshold : std::nullopt)) return "eventThreshold";
  if (decision.extrasOnInternal != (all ? all->extras : std::nullopt)) return "extrasOnInternal";
  if (decision.postURL != (all ? all->url : std::nullopt)) return "postURL";
  return {};
}

std::string describe(const ReportingCircumstances& given) {
  const auto text = [](const std::optional<std::string>& fact) { return fact.value_or("(null)"); };
  return "profile " + Value(given.profile).description() + "\nuser info " +
         (given.userInfo ? Value(*given.userInfo).description() : "(null)") +
         "\nrequired: " + std::to_string(given.requireUserInfo) +
         ", consented: " + std::to_string(given.consented) +
         ", factor: " + std::to_string(given.samplingFactor) + ", family: " + text(given.productFamily) +
         ", country: " + text(given.countryCode);
}

TEST(ReportingRulesPropertyTest, DecidesARandomHundredThousandAsTheTableDoes) {
  Dice dice(kSeed);
  std::map<std::size_t, int> endsByRow;
  for (int i = 0; i < kCombinations; ++i) {
    const Situation situation = someSituation(dice);
    const ReportingCircumstances given = Writer(dice).written(situation);
    const std::string difference = firstDifference(situation, decideReporting(given));
    ASSERT_EQ(difference, "") << "seed " << kSeed << ", combination " << i << "\n" << describe(given);
    ++endsByRow[rowThatEnds(situation)];
  }
  for (std::size_t row = 0; row < kTable.size(); ++row) {
    EXPECT_GT(endsByRow[row], kCombinations / 200) << "too few combinations end in row " << row;
  }
}

}  // namespace
}  // namespace tallyd
