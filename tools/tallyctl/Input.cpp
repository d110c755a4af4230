#include "tallyctl/Input.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <string_view>
#include <system_error>

namespace tallyd::tallyctl {

namespace {

constexpr std::string_view kStandardInput = "-";

[[noreturn]] void fail(int error, const std::string& name) {
  throw std::system_error(error, std::generic_category(), name);
}

platform::FileDescriptor openFile(const std::string& path) {
  if (path == kStandardInput) return {};
  platform::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) fail(errno, path);
  return file;
}

}  // namespace

Input::Input(const std::string& path, int standardInput)
    : _name(path == kStandardInput ? "standard input" : path),
      _file(openFile(path)),
      _standardInput(standardInput) {
  struct stat status {};
  if (::fstat(descriptor(), &status) != 0) fail(errno, _name);
  if (S_ISDIR(status.st_mode)) fail(EISDIR, _name);
  if (S_ISREG(status.st_mode)) _lengthBytes = static_cast<std::uint64_t>(status.st_size);
}

std::string Input::readWhole(std::size_t maximumBytes) const {
  std::string bytes;
  std::array<char, 16384> buffer;
  while (true) {
    const ssize_t count = ::read(descriptor(), buffer.data(), buffer.size());
    if (count == 0) return bytes;
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail(errno, _name);
    if (static_cast<std::size_t>(count) > maximumBytes - bytes.size()) fail(EFBIG, _name);
    bytes.append(buffer.data(), static_cast<std::size_t>(count));
  }
}

}  // namespace tallyd::tallyctl
