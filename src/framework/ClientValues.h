// How the operations' arguments and results look as values of the interface.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

namespace tallyd::client {

using Results = std::vector<platform::Value>;
using Strings = std::vector<std::string>;

/// "Nothing" is an empty array, a value its only element.
[[nodiscard]] platform::Value wrapped(std::optional<platform::Dictionary> value);
[[nodiscard]] platform::Value arrayOf(Strings strings);

// How each kind of result is read; the types of the answer must have been checked.
[[nodiscard]] std::string readText(const Results& results);
[[nodiscard]] std::optional<std::string> readOptionalText(const Results& results);
[[nodiscard]] std::optional<Strings> readOptionalTexts(const Results& results);
[[nodiscard]] bool readTruth(const Results& results);

/// "file://" and the absolute path, escaped by the rules for a URL's path (RFC 3986, section 3.3).
[[nodiscard]] std::string fileURL(const std::string& absolutePath);

/// The file and its folder, or nothing when either cannot be opened.
[[nodiscard]] std::vector<platform::FileDescriptor> grantFor(const std::filesystem::path& file);

}  // namespace tallyd::client
