// Every key that the daemon reads in a storebag: the one table behind lint, the key list and the docs.
#pragma once

#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tallyd::storebagtool {

/// The dictionaries that a bag is made of.
enum class Place {
  Bag,      ///< The top.
  Section,  ///< An environment.
  Dashboard,
  UploadServer,
  HTTPSPost,
  PowerLog,
  Adaptor,
  Client,  ///< An element of HTTPSPost's "clients".
  Filter,  ///< An element of Client's "filters".
};

enum class KeyKind { Text, Integer, Real, TextList, Dictionary, DictionaryList };

enum class Presence {
  Required,  ///< Missing is an error.
  Expected,  ///< Missing is hardly meant.
  Optional,
};

struct KnownKey {
  Place place;
  std::string_view key;
  KeyKind kind;
  Presence presence;
  std::string_view whenMissing;  ///< What the daemon does then, also when the value is of another kind.
  std::string_view effect;
};

/// In the order in which the places stand above.
[[nodiscard]] std::span<const KnownKey> knownKeys();

/// Null for a key that nobody reads there.
[[nodiscard]] const KnownKey* knownKey(Place place, std::string_view key);
[[nodiscard]] std::vector<std::string_view> keysOf(Place place);

/// "client entry" and the like, for people.
[[nodiscard]] std::string_view nameOf(Place place);
/// "string", "array of strings" and the like.
[[nodiscard]] std::string_view nameOf(KeyKind kind);
[[nodiscard]] std::string_view nameOf(Presence presence);

/// The name among `names` that `text` is most likely a slip of; empty when none is near.
[[nodiscard]] std::string_view nearestName(std::string_view text, std::span<const std::string_view> names);

}  // namespace tallyd::storebagtool
