// Whole files, read and replaced.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>
#include <string_view>

namespace tallyd::station {

/// The bytes of a regular file; throws std::system_error that names it. Never waits for another process, as
/// opening a pipe would.
[[nodiscard]] std::string readFile(const std::filesystem::path& path);

/// Replaces a file in one step: whoever reads it sees the old bytes or the new ones. Throws std::system_error
/// that names it.
void replaceFile(const std::filesystem::path& path, std::string_view bytes, mode_t mode);

/// Adds bytes at a regular file's end; throws std::system_error that names it, and then leaves the file as it
/// was. One writer at a time.
void appendToFile(const std::filesystem::path& path, std::string_view bytes);

}  // namespace tallyd::station
