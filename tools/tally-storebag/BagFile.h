// Storebags as they lie in files, bare or in their signed envelope.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>

#include "platform/Value.h"

namespace tallyd::storebagtool {

struct BagFile {
  platform::Dictionary bag;
  bool inEnvelope = false;  ///< It was taken out of an envelope, whose signature nobody has looked at.
};

/// The bag in `bytes`, any form of property list. Throws std::runtime_error that begins with `name`.
[[nodiscard]] BagFile bagFromBytes(std::string_view bytes, const std::string& name);

/// The bag in a file; throws std::exception that names the file.
[[nodiscard]] BagFile readBagFile(const std::filesystem::path& path);

}  // namespace tallyd::storebagtool
