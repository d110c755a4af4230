#include "platform/sandbox/FileProbes.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {
namespace {

// The first ones are open to every user of every machine, so that a refusal is the sandbox's work.
constexpr const char* kMayNotRead[] = {"/",     "/tmp",  "/var/tmp", "/dev",          "/proc",     "/dev/shm",
                                       "/home", "/root", "/boot",    "/proc/version", "/proc/kmsg"};
constexpr const char* kMayNotWrite[] = {"/proc/self/mem", "/proc/self/oom_score_adj",
                                        "/proc/sys/kernel/core_pattern", "/dev/kmsg", "/dev/full"};
constexpr const char* kMayNotMakeFilesIn[] = {"/tmp", "/var/tmp", "/dev/shm", "/",
                                              "/etc", "/usr",     "/usr/lib", "/usr/share",
                                              "/var", "/home",    "/root",    "/boot"};
constexpr const char* kMayNotRemove[] = {"/usr", "/usr/lib"};  ///< Folders that are never empty.

bool opens(const char* path, int flags) {
  return static_cast<bool>(FileDescriptor(::open(path, flags | O_CLOEXEC | O_NOCTTY | O_NONBLOCK, 0600)));
}

bool makesFileIn(const char* folder) {
  if (opens(folder, O_TMPFILE | O_WRONLY)) return true;
  if (errno != EOPNOTSUPP && errno != EISDIR) return false;
  // This file system has no files without names.
  const std::string path = std::string(folder) + "/.tallyd-sandbox-probe";
  if (!opens(path.c_str(), O_CREAT | O_WRONLY | O_NOFOLLOW)) return false;
  ::unlink(path.c_str());
  return true;
}

bool mightRemove(const char* folder) {
  return ::rmdir(folder) == 0 || errno == ENOTEMPTY || errno == EEXIST || errno == EBUSY;
}

}  // namespace

std::vector<std::string> reachableFiles() {
  std::vector<std::string> reached;
  const auto note = [&](bool succeeded, const char* act, const char* path) {
    if (succeeded) reached.push_back(std::string(act) + " " + path);
  };
  for (const char* path : kMayNotRead) note(opens(path, O_RDONLY), "read", path);
  for (const char* path : kMayNotWrite) note(opens(path, O_WRONLY), "write to", path);
  for (const char* path : kMayNotMakeFilesIn) note(makesFileIn(path), "make files in", path);
  for (const char* path : kMayNotRemove) note(mightRemove(path), "remove", path);
  return reached;
}

}  // namespace tallyd::platform
