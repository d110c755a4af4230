// Checks of single values: numbers, URLs, addresses, lists of texts.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"
#include "tally-storebag/Finding.h"
#include "tally-storebag/KnownKeys.h"

namespace tallyd::storebagtool {

/// Unknown keys, missing ones and values of another kind, by the table.
void lintKeys(const platform::Dictionary& dictionary, Place place, const std::string& path,
              Findings& findings);

/// A URL that something is posted to, or that people open.
void lintURL(const platform::Dictionary& dictionary, std::string_view key, const std::string& path,
             Findings& findings);

/// A server's IPv4 address.
void lintAddress(std::string_view address, const std::string& path, Findings& findings);

/// Blanks around texts that are matched as they stand, and empty ones, which match nothing. `whole` says that
/// a text must match as a whole.
enum class Matching { Whole, Part };
void lintTexts(const std::vector<std::string>& texts, Matching matching, const std::string& path,
               Findings& findings);

/// The texts of a list as the daemon takes them: what is no string is empty.
[[nodiscard]] std::vector<std::string> textsOf(const platform::Array& list);
/// The parts between commas; one part without a comma.
[[nodiscard]] std::vector<std::string> partsOf(std::string_view text);

[[nodiscard]] bool hasBlanksAround(std::string_view text);
[[nodiscard]] std::string pathOf(const std::string& parent, std::string_view key);
[[nodiscard]] std::string pathOf(const std::string& parent, std::string_view key, std::size_t index);

}  // namespace tallyd::storebagtool
