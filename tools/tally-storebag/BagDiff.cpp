#include "tally-storebag/BagDiff.h"

#include <fmt/format.h>

#include <algorithm>
#include <optional>
#include <set>

#include "backends/TallyBackend.h"
#include "framework/TallyKeys.h"
#include "storebag/StorebagEnvironment.h"
#include "tally-storebag/ValueLint.h"

namespace tallyd::storebagtool {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::uint32_t kEnvironmentTypes = kEnvironmentTypeRelease;  ///< 1 to this one.

/// Whether the daemon makes a backend of the entry. Those that keep their reports on the device need no
/// profile.
bool makesBackend(std::string_view name, const Dictionary* profile) {
  if (name == kTallyBackendDashboard) return profile && profile->string("ip") && profile->integer("port");
  if (name == kTallyBackendUploadServer) return profile && profile->string("post_url");
  if (name == kTallyBackendHTTPPost || name == kTallyBackendHTTPPost2)
    return profile && profile->array("clients");
  return name == kTallyBackendWattbook || name == kTallyBackendPith;
}

/// The profile of the backend that is made under the name; nothing when none is.
std::optional<Dictionary> profileUnder(const Dictionary& section, std::string_view name) {
  const Value* value = section.find(name);
  if (!value || !makesBackend(name, value->dictionary())) return std::nullopt;
  return value->dictionary() ? *value->dictionary() : Dictionary();
}

void diffAsSetting(const Dictionary& before, const Dictionary& after, std::string_view key,
                   const std::string& path, Changes& changes) {
  const auto text = [key](const Dictionary& profile) {
    const Value* value = profile.find(key);
    return value ? value->description() : std::string("(none)");
  };
  if (text(before) == text(after)) return;
  changes.push_back({Exposure::Same, pathOf(path, key), fmt::format("{} -> {}", text(before), text(after))});
}

void diffDashboards(const Dictionary& before, const Dictionary& after, const std::string& path,
                    Changes& changes) {
  const auto server = [](const Dictionary& profile) {
    return fmt::format("{}:{}", profile.string("ip").value_or(""), profile.integer("port").value_or(0));
  };
  if (server(before) != server(after))
    changes.push_back(
        {Exposure::Grows, path, fmt::format("datagrams go to {}, not to {}", server(after), server(before))});
  diffDestination(before, after, "post_url", path, changes);
  diffAsSetting(before, after, "reliable", path, changes);
}

void diffProfiles(std::string_view name, const Dictionary& before, const Dictionary& after,
                  const std::string& path, Changes& changes) {
  if (name == kTallyBackendDashboard) diffDashboards(before, after, path, changes);
  if (name == kTallyBackendUploadServer) diffDestination(before, after, "post_url", path, changes);
  if (name == kTallyBackendHTTPPost || name == kTallyBackendHTTPPost2)
    diffClients(before, after, path, changes);
  diffAsSetting(before, after, "display_url", path, changes);
}

void diffBackend(std::string_view name, const Dictionary& before, const Dictionary& after,
                 const std::string& sectionName, Changes& changes) {
  const std::string path = pathOf(sectionName, name);
  const auto old = profileUnder(before, name);
  const auto now = profileUnder(after, name);
  if (!old && !now) return;
  if (!old) changes.push_back({Exposure::Grows, path, "the backend comes anew"});
  if (!now) return changes.push_back({Exposure::Shrinks, path, "the backend goes"});
  if (old) return diffProfiles(name, *old, *now, path, changes);
  // What a new HTTPS post backend lets go, entry by entry.
  if (now->array("clients")) diffClients(Dictionary(), *now, path, changes);
}

/// The section that the environment's devices get.
const Dictionary& sectionFor(const Dictionary& bag, std::string_view environment) {
  static const Dictionary kNone;
  const Dictionary* section = bag.dictionary(environment);
  if (!section && environment == environmentNameForType(kEnvironmentTypeSeed))
    section = bag.dictionary(*environmentNameForType(kEnvironmentTypeRelease));
  return section ? *section : kNone;
}

void diffEnvironment(const Dictionary& before, const Dictionary& after, std::string_view environment,
                     Changes& changes) {
  if (!before.dictionary(environment) && !after.dictionary(environment)) return;
  const Dictionary& old = sectionFor(before, environment);
  const Dictionary& now = sectionFor(after, environment);
  std::set<std::string_view> names;
  for (const auto& [name, value] : old) names.insert(name);
  for (const auto& [name, value] : now) names.insert(name);
  for (const auto name : names) diffBackend(name, old, now, std::string(environment), changes);
}

}  // namespace

Changes diffBags(const Dictionary& before, const Dictionary& after) {
  Changes changes;
  diffAsSetting(before, after, "version", "", changes);
  for (std::uint32_t type = 1; type <= kEnvironmentTypes; ++type)
    diffEnvironment(before, after, *environmentNameForType(type), changes);
  return changes;
}

bool exposureGrows(const Changes& changes) {
  return std::ranges::any_of(changes,
                             [](const Change& change) { return change.exposure == Exposure::Grows; });
}

void diffDestination(const Dictionary& before, const Dictionary& after, std::string_view key,
                     const std::string& path, Changes& changes) {
  const auto old = before.string(key);
  const auto now = after.string(key);
  if (old == now) return;
  const std::string place = pathOf(path, key);
  if (!old) {
    changes.push_back({Exposure::Grows, place, fmt::format("posts go to {}", *now)});
  } else if (!now) {
    changes.push_back({Exposure::Shrinks, place, fmt::format("posts go to {} no more", *old)});
  } else {
    changes.push_back({Exposure::Grows, place, fmt::format("posts go to {}, not to {}", *now, *old)});
  }
}

}  // namespace tallyd::storebagtool
