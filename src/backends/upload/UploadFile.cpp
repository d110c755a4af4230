#include "backends/upload/UploadFile.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/Sandbox.h"

namespace tallyd {

UploadFile UploadFile::open(platform::Sandbox& sandbox, const std::string& path) {
  UploadFile file;
  // A system call would stop at the zero byte and take another file.
  if (path.find('\0') != std::string::npos) return file;
  struct stat status {};
  const bool isVisible = ::lstat(path.c_str(), &status) == 0;
  if (isVisible && !S_ISREG(status.st_mode)) return file;
  file.isRegular = isVisible;
  file.descriptor = sandbox.openForReading(path);
  if (!file.descriptor) return file;
  file.isRegular = ::fstat(file.descriptor.get(), &status) == 0 && S_ISREG(status.st_mode);
  if (file.isRegular) file.bytes = static_cast<std::uint64_t>(status.st_size);
  return file;
}

std::string UploadFile::contents() const {
  std::string contents(bytes, '\0');
  std::size_t filled = 0;
  while (filled < contents.size()) {
    const ssize_t count = ::read(descriptor.get(), contents.data() + filled, contents.size() - filled);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return {};
    if (count == 0) break;  // Cut short meanwhile.
    filled += static_cast<std::size_t>(count);
  }
  contents.resize(filled);
  return contents;
}

}  // namespace tallyd
