#include "platform/sandbox/FileGrants.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>

namespace tallyd::platform {
namespace {

bool isReadableFile(int descriptor) {
  const int flags = ::fcntl(descriptor, F_GETFL);
  if (flags < 0 || (flags & O_PATH) != 0 || (flags & O_ACCMODE) == O_WRONLY) return false;
  struct stat status {};
  return ::fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode);
}

FileDescriptor readerOf(int descriptor) {
  FileDescriptor reader(
      ::open(fmt::format("/proc/self/fd/{}", descriptor).c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY));
  if (reader) return reader;
  reader = FileDescriptor(::fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
  if (reader && ::lseek(reader.get(), 0, SEEK_SET) != 0) reader.reset();
  return reader;
}

}  // namespace

class FileGrants::Offer final : public Sandbox::Grant {
 public:
  Offer(FileGrants& grants, Handle handle) : _grants(grants), _handle(handle) {}
  ~Offer() override { _grants.withdraw(_handle); }

 private:
  FileGrants& _grants;
  const Handle _handle;
};

std::unique_ptr<Sandbox::Grant> FileGrants::offer(std::string_view token,
                                                  std::vector<FileDescriptor> descriptors) {
  Entry entry{std::string(token), std::this_thread::get_id(),
              std::make_shared<const Descriptors>(std::move(descriptors))};
  const std::lock_guard lock(_mutex);
  const Handle handle = _nextHandle++;
  _offered.emplace(handle, std::move(entry));
  return std::make_unique<Offer>(*this, handle);
}

void FileGrants::withdraw(Handle offer) {
  const std::lock_guard lock(_mutex);
  _offered.erase(offer);
}

FileGrants::Handle FileGrants::consume(std::string_view token) {
  const std::lock_guard lock(_mutex);
  const auto offered = find(_offered, token);
  if (offered == _offered.end()) return Sandbox::kNoExtension;
  const Handle handle = _nextHandle++;
  _consumed.emplace(handle,
                    Entry{offered->second.token, std::this_thread::get_id(), offered->second.descriptors});
  return handle;
}

void FileGrants::release(Handle handle) {
  const std::lock_guard lock(_mutex);
  _consumed.erase(handle);
}

FileDescriptor FileGrants::open(std::string_view path) {
  std::shared_ptr<const Descriptors> descriptors;
  {
    const std::lock_guard lock(_mutex);
    const auto consumed = find(_consumed, fmt::format("{}{}", kFileTokenPrefix, path));
    if (consumed != _consumed.end()) descriptors = consumed->second.descriptors;
  }
  if (!descriptors || descriptors->empty()) {
    errno = ENOENT;
    return {};
  }
  const int file = descriptors->front().get();
  if (!isReadableFile(file)) {
    errno = EACCES;
    return {};
  }
  return readerOf(file);
}

FileGrants::Entries::const_iterator FileGrants::find(const Entries& entries, std::string_view token) {
  auto latest = entries.end();
  auto own = entries.end();
  for (auto entry = entries.begin(); entry != entries.end();
       ++entry) {  // Handles rise: the last is the latest.
    if (entry->second.token != token) continue;
    latest = entry;
    if (entry->second.thread == std::this_thread::get_id()) own = entry;
  }
  return own != entries.end() ? own : latest;
}

}  // namespace tallyd::platform
