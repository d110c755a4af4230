#include "platform/sandbox/LandlockRuleset.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/sandbox/SandboxErrors.h"

// What the kernel headers of the oldest system that we build on lack; numbers from the kernel's landlock(7).
#ifndef LANDLOCK_ACCESS_FS_TRUNCATE
#define LANDLOCK_ACCESS_FS_TRUNCATE (1ULL << 14)
#endif
#ifndef LANDLOCK_ACCESS_FS_IOCTL_DEV
#define LANDLOCK_ACCESS_FS_IOCTL_DEV (1ULL << 15)
#endif
#ifndef LANDLOCK_ACCESS_NET_BIND_TCP
#define LANDLOCK_ACCESS_NET_BIND_TCP (1ULL << 0)
#endif
#ifndef LANDLOCK_RESTRICT_SELF_LOG_SAME_EXEC_OFF
#define LANDLOCK_RESTRICT_SELF_LOG_SAME_EXEC_OFF (1U << 0)
#endif
#ifndef LANDLOCK_SCOPE_ABSTRACT_UNIX_SOCKET
#define LANDLOCK_SCOPE_ABSTRACT_UNIX_SOCKET (1ULL << 0)
#endif
#ifndef LANDLOCK_SCOPE_SIGNAL
#define LANDLOCK_SCOPE_SIGNAL (1ULL << 1)
#endif

namespace tallyd::platform {
namespace {

/// landlock_ruleset_attr of version 6. Kernels take a longer structure than they know, as long as the rest is
/// zero.
struct RulesetAttributes {
  std::uint64_t handledFileAccess = 0;
  std::uint64_t handledNetworkAccess = 0;
  std::uint64_t scoped = 0;
};

constexpr std::uint64_t kRightsOfVersion1 =
    LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_WRITE_FILE | LANDLOCK_ACCESS_FS_READ_FILE |
    LANDLOCK_ACCESS_FS_READ_DIR | LANDLOCK_ACCESS_FS_REMOVE_DIR | LANDLOCK_ACCESS_FS_REMOVE_FILE |
    LANDLOCK_ACCESS_FS_MAKE_CHAR | LANDLOCK_ACCESS_FS_MAKE_DIR | LANDLOCK_ACCESS_FS_MAKE_REG |
    LANDLOCK_ACCESS_FS_MAKE_SOCK | LANDLOCK_ACCESS_FS_MAKE_FIFO | LANDLOCK_ACCESS_FS_MAKE_BLOCK |
    LANDLOCK_ACCESS_FS_MAKE_SYM;

/// The only rights that a rule on a single file may carry.
constexpr std::uint64_t kRightsOfFiles = LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_WRITE_FILE |
                                         LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_TRUNCATE |
                                         LANDLOCK_ACCESS_FS_IOCTL_DEV;

std::uint64_t rightsOfVersion(long version) {
  std::uint64_t rights = kRightsOfVersion1;
  if (version >= 2) rights |= LANDLOCK_ACCESS_FS_REFER;
  if (version >= 3) rights |= LANDLOCK_ACCESS_FS_TRUNCATE;
  if (version >= 5) rights |= LANDLOCK_ACCESS_FS_IOCTL_DEV;
  return rights;
}

std::uint64_t rightsFor(LandlockRuleset::Access access) {
  switch (access) {
    case LandlockRuleset::Access::Read:
      return LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
    case LandlockRuleset::Access::Write:
      return LANDLOCK_ACCESS_FS_WRITE_FILE | LANDLOCK_ACCESS_FS_TRUNCATE | LANDLOCK_ACCESS_FS_MAKE_REG |
             LANDLOCK_ACCESS_FS_MAKE_DIR | LANDLOCK_ACCESS_FS_REFER;
    case LandlockRuleset::Access::Remove:
      break;
  }
  return LANDLOCK_ACCESS_FS_REMOVE_FILE | LANDLOCK_ACCESS_FS_REMOVE_DIR;
}

[[noreturn]] void fail(std::string_view what) {
  throw EnforcementError(fmt::format("{}: {}", what, std::strerror(errno)));
}

}  // namespace

LandlockRuleset::LandlockRuleset() {
  _version = ::syscall(SYS_landlock_create_ruleset, nullptr, std::size_t{0}, LANDLOCK_CREATE_RULESET_VERSION);
  if (_version < 1) fail("the kernel can't restrict the file system (Landlock)");
  RulesetAttributes attributes;
  attributes.handledFileAccess = _handled = rightsOfVersion(_version);
  if (_version >= 4) attributes.handledNetworkAccess = LANDLOCK_ACCESS_NET_BIND_TCP;
  if (_version >= 6) attributes.scoped = LANDLOCK_SCOPE_ABSTRACT_UNIX_SOCKET | LANDLOCK_SCOPE_SIGNAL;
  _ruleset = FileDescriptor(static_cast<int>(
      ::syscall(SYS_landlock_create_ruleset, &attributes, sizeof attributes, std::uint32_t{0})));
  if (!_ruleset) fail("no Landlock ruleset could be made");
}

bool LandlockRuleset::allow(const std::filesystem::path& path, Access access) {
  const FileDescriptor place(::open(path.c_str(), O_PATH | O_CLOEXEC));
  struct stat status {};
  if (!place || ::fstat(place.get(), &status) != 0) return false;
  std::uint64_t rights = rightsFor(access) & _handled;
  if (!S_ISDIR(status.st_mode)) rights &= kRightsOfFiles;
  if (rights == 0) return true;  // A file is removed through its folder; a rule of its own says nothing.
  const landlock_path_beneath_attr rule{.allowed_access = rights, .parent_fd = place.get()};
  if (::syscall(SYS_landlock_add_rule, _ruleset.get(), LANDLOCK_RULE_PATH_BENEATH, &rule, std::uint32_t{0}) !=
      0) {
    fail(fmt::format("no Landlock rule could be made for {}", path.string()));
  }
  return true;
}

void LandlockRuleset::enforce(Refusals refusals) const {
  const std::uint32_t flags =
      refusals == Refusals::Quiet && _version >= 7 ? LANDLOCK_RESTRICT_SELF_LOG_SAME_EXEC_OFF : 0;
  if (::syscall(SYS_landlock_restrict_self, _ruleset.get(), flags) != 0) {
    fail("the file system could not be restricted (Landlock)");
  }
}

}  // namespace tallyd::platform
