// Values as keyed archives: object graphs within a binary property list.
#pragma once

#include <optional>
#include <string>

#include "platform/Value.h"

namespace tallyd::platform {

/// The keyed archive of `root`, in the layout of version 100000 of "NSKeyedArchiver": a list of objects that
/// refer to each other by their place in it.
///
/// Strings, numbers, booleans and data stand in the list as they are, equal ones once; dates, arrays and
/// dictionaries name their class, and containers that share their storage stand there once. Null is the
/// list's first object, "$null"; a string of just this text is written as a mutable one, so that no reader
/// takes it for null. In strings, what is no UTF-8 becomes U+FFFD.
///
/// Never throws; takes time in proportion to the value, but for a logarithm. Nothing for nesting deeper than
/// kMaximumValueDepth or for more than a gigabyte.
[[nodiscard]] std::optional<std::string> archivedDataWithRootObject(const Value& root);

}  // namespace tallyd::platform
