#include "station/IncomingFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <system_error>
#include <utility>

#include "station/Limits.h"

namespace tallyd::station {

namespace {

[[noreturn]] void fail(const std::string& path) {
  throw std::system_error(errno, std::generic_category(), path);
}

bool isSafe(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
         std::string_view("-_+@.").find(c) != std::string_view::npos;
}

}  // namespace

IncomingFile::IncomingFile(std::filesystem::path folder)
    : _folder(std::move(folder)), _temporaryPath((_folder / ".incoming-XXXXXX").string()) {
  std::filesystem::create_directories(_folder);
  _file = platform::FileDescriptor(::mkostemp(_temporaryPath.data(), O_CLOEXEC));
  if (!_file) fail(_temporaryPath);
}

IncomingFile::~IncomingFile() { ::unlink(_temporaryPath.c_str()); }

void IncomingFile::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(_file.get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(_temporaryPath);
    _bytes += static_cast<std::uint64_t>(count);
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

std::string IncomingFile::keepAs(const std::string& name) {
  if (::fchmod(_file.get(), 0644) != 0) fail(_temporaryPath);
  std::string kept = name;
  for (unsigned copy = 2; ::link(_temporaryPath.c_str(), (_folder / kept).c_str()) != 0; ++copy) {
    if (errno != EEXIST) fail((_folder / kept).string());
    kept = fmt::format("{}.{}", name, copy);
  }
  return kept;
}

std::string safeFileName(std::string_view wanted) {
  while (!wanted.empty() && wanted.back() == '/') wanted.remove_suffix(1);
  std::string name(wanted.substr(wanted.rfind('/') + 1));  // Without a slash: the whole.
  name.resize(std::min(name.size(), kMaximumFileNameBytes));
  std::replace_if(
      name.begin(), name.end(), [](char c) { return !isSafe(c); }, '_');
  if (!name.empty() && name.front() == '.') name.front() = '_';
  return name.empty() ? "file" : name;
}

}  // namespace tallyd::station
