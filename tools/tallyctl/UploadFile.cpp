#include "tallyctl/UploadFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>
#include <system_error>

#include "platform/FileDescriptor.h"
#include "tallyctl/Session.h"

namespace tallyd::tallyctl {

namespace {

[[noreturn]] void failToOpen(const std::string& name) {
  throw std::system_error(errno, std::generic_category(), name);
}

std::string_view kindOf(mode_t mode) {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return "a directory";
    case S_IFLNK:
      return "a symbolic link";
    case S_IFCHR:
    case S_IFBLK:
      return "a device";
    case S_IFIFO:
      return "a pipe";
    case S_IFSOCK:
      return "a socket";
    default:
      return "no regular file";
  }
}

/// The file's folder may be named by links and dots; its own name stays.
std::filesystem::path absolutePath(const std::filesystem::path& name) {
  if (name.is_absolute()) return name;
  return std::filesystem::canonical(std::filesystem::absolute(name).parent_path()) / name.filename();
}

}  // namespace

UploadFile UploadFile::find(const std::string& name) {
  struct stat status {};
  if (::lstat(name.c_str(), &status) != 0) failToOpen(name);
  if (!S_ISREG(status.st_mode)) {
    throw Failure(fmt::format("{}: is {}; only regular files are uploaded", name, kindOf(status.st_mode)));
  }
  if (status.st_size == 0) throw Failure(fmt::format("{}: is empty; there is nothing to upload", name));
  const platform::FileDescriptor file(::open(name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!file) failToOpen(name);
  return {absolutePath(name), static_cast<std::uint64_t>(status.st_size)};
}

}  // namespace tallyd::tallyctl
