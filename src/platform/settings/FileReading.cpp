#include "platform/settings/FileReading.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

namespace {

FileContents failed(FileContents contents, int number) {
  contents.bytes.reset();
  contents.errorNumber = number;
  contents.error = std::generic_category().message(number);
  return contents;
}

FileContents refused(FileContents contents, std::string reason) {
  contents.bytes.reset();
  contents.error = std::move(reason);
  return contents;
}

}  // namespace

FileContents readFile(const std::filesystem::path& path, std::size_t maximumBytes) {
  FileContents contents;
  // Not blocking, so that a pipe in a file's place is refused instead of waited for.
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) return failed(std::move(contents), errno);
  if (::fstat(file.get(), &contents.status) != 0) return failed(std::move(contents), errno);
  if (!S_ISREG(contents.status.st_mode)) return refused(std::move(contents), "not a regular file");
  const auto statedBytes = static_cast<std::size_t>(contents.status.st_size);
  if (statedBytes > maximumBytes) return refused(std::move(contents), "too large");
  std::string bytes;
  // Files of the kernel's own file systems state a size that means nothing: the end is where reading ends.
  constexpr std::size_t kStep = 4096;
  std::size_t filled = 0;
  for (;;) {
    bytes.resize(std::max(filled + kStep, statedBytes + 1));
    const ssize_t count = ::read(file.get(), bytes.data() + filled, bytes.size() - filled);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return failed(std::move(contents), errno);
    if (count == 0) break;
    filled += static_cast<std::size_t>(count);
    if (filled > maximumBytes) return refused(std::move(contents), "too large");
  }
  bytes.resize(filled);
  contents.bytes = std::move(bytes);
  return contents;
}

bool isPlainFileName(std::string_view name) {
  return !name.empty() && name != "." && name != ".." && name.find('/') == std::string_view::npos &&
         name.find('\0') == std::string_view::npos;
}

}  // namespace tallyd::platform
