#include "tally-storebag/Files.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "platform/FileDescriptor.h"

namespace tallyd::storebagtool {

using platform::FileDescriptor;

namespace {

[[noreturn]] void fail(const std::filesystem::path& path) {
  throw std::system_error(errno, std::generic_category(), path.string());
}

void writeAll(int descriptor, std::string_view bytes, const std::filesystem::path& path) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(descriptor, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(path);
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
}

std::string readAll(int descriptor, const std::filesystem::path& path) {
  std::string bytes;
  std::array<char, 16384> buffer;
  while (true) {
    const ssize_t count = ::read(descriptor, buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(path);
    if (count == 0) return bytes;
    bytes.append(buffer.data(), static_cast<std::size_t>(count));
  }
}

}  // namespace

std::string readFile(const std::filesystem::path& path) {
  if (path == kStandardStream) return readAll(STDIN_FILENO, "standard input");
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) fail(path);
  return readAll(file.get(), path);
}

void writeFile(const std::filesystem::path& path, std::string_view bytes, mode_t mode, Existing existing) {
  std::string temporary = path.string() + ".XXXXXX";
  const FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
  if (!file) fail(path);
  try {
    if (::fchmod(file.get(), mode) != 0) fail(path);
    writeAll(file.get(), bytes, path);
    // link(2) refuses a name that is taken, rename(2) takes it over.
    if (existing == Existing::Replace && ::rename(temporary.c_str(), path.c_str()) != 0) fail(path);
    if (existing == Existing::Keep && ::link(temporary.c_str(), path.c_str()) != 0) fail(path);
  } catch (...) {
    ::unlink(temporary.c_str());
    throw;
  }
  if (existing == Existing::Keep) ::unlink(temporary.c_str());
}

TemporaryFolder::TemporaryFolder() {
  std::string name = (std::filesystem::temp_directory_path() / "tally-storebag-XXXXXX").string();
  if (!::mkdtemp(name.data())) fail(name);
  _path = name;
}

TemporaryFolder::~TemporaryFolder() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

}  // namespace tallyd::storebagtool
