// The property-list library's nodes as this folder owns and dates them.
#pragma once

#include <fmt/format.h>
#include <plist/plist.h>

#include <cstdint>
#include <memory>
#include <string_view>

namespace tallyd::platform {

struct NodeDeleter {
  void operator()(plist_t node) const { plist_free(node); }
};
/// Owns a node and all below it.
using Node = std::unique_ptr<void, NodeDeleter>;

/// From 1970-01-01 to the library's epoch, 2001-01-01.
inline constexpr std::int64_t kLibraryEpochSeconds = 978'307'200;

/// The node that the library makes of one XML element; null when it can't.
[[nodiscard]] Node nodeFromXML(std::string_view element);

/// A node of a number that is negative or that only an unsigned integer holds. Which of the two
/// plist_new_uint makes of 64 bits depends on the library's version; its XML reader tells them apart in all.
template <class Integer>
[[nodiscard]] Node integerNode(Integer number) {
  return nodeFromXML(fmt::format("<integer>{}</integer>", number));
}

}  // namespace tallyd::platform
