// Whole files, read and replaced.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>
#include <string_view>

namespace tallyd::station {

/// The bytes of a file; throws std::system_error that names it.
[[nodiscard]] std::string readFile(const std::filesystem::path& path);

/// Replaces a file in one step: whoever reads it sees the old bytes or the new ones. Throws std::system_error
/// that names it.
void replaceFile(const std::filesystem::path& path, std::string_view bytes, mode_t mode);

/// Adds bytes at a file's end with one write; throws std::system_error that names it.
void appendToFile(const std::filesystem::path& path, std::string_view bytes);

}  // namespace tallyd::station
