#include "platform/sandbox/SystemCallProbes.h"

#include <linux/netlink.h>
#include <netinet/in.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {
namespace {

using Word = std::uintptr_t;
using Words = std::array<Word, 6>;

constexpr Word kNowhere = ~Word{0xFFF};  ///< An address at which no process has anything.
constexpr Word kNone = ~Word{0};   ///< As an ID, a descriptor, a size or flags: one that is never valid.
constexpr Word kNobody = INT_MAX;  ///< The ID of a process, above the kernel's upper limit.

Word address(const void* object) { return reinterpret_cast<Word>(object); }

/// How one call is tried: by itself with arguments, or by a function where that is not enough.
struct Probe {
  const char* act;
  const char* call;
  Words arguments{};
  std::optional<long> (*function)() = nullptr;  ///< The call's result; nothing where it can't be tried.
};

/// Starts a process when nothing keeps it from doing so.
std::optional<long> forks() {
#ifdef SYS_fork
  const long child = ::syscall(SYS_fork);
  while (child == 0) ::_exit(EXIT_SUCCESS);
  return child;
#else
  return std::nullopt;
#endif
}

std::optional<long> vforks() {
#ifdef SYS_vfork
  const pid_t child = ::vfork();  // NOLINT(clang-analyzer-security.insecureAPI.vfork): that is the question.
  while (child == 0) ::_exit(EXIT_SUCCESS);
  return child;
#else
  return std::nullopt;
#endif
}

/// Listens on a port of the loopback interface; where none can be had, only asks whether it might.
std::optional<long> listensOnTCP() {
  const FileDescriptor socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  const bool bound =
      socket && ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  // Not on a socket without an address: the kernel would choose a port on all interfaces.
  return ::listen(bound ? socket.get() : -1, 1);
}

/// Sets a limit to what it is.
std::optional<long> setsItsLimit() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return std::nullopt;
  return ::syscall(SYS_prlimit64, 0, RLIMIT_NOFILE, &limit, nullptr);
}

std::optional<long> setsItsLimitTheOldWay() {
#ifdef SYS_setrlimit
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return std::nullopt;
  return ::syscall(SYS_setrlimit, RLIMIT_NOFILE, &limit);
#else
  return std::nullopt;
#endif
}

/// Reads its own memory as a tracer reads another process's.
std::optional<long> readsMemoryAsATracer() {
  char from = 'x';
  char to = 0;
  const iovec source{&from, 1};
  const iovec target{&to, 1};
  return ::syscall(SYS_process_vm_readv, ::getpid(), &target, 1, &source, 1, 0);
}

/// Calls of one act stand together. The comments say what ends a call that gets through.
std::span<const Probe> probes() {
  static const Probe kProbes[] = {
      // A program that exists and may be executed, with arguments at no address: EFAULT, or Landlock's
      // EACCES.
      {"execute a program", "execve", {address("/proc/self/exe"), kNowhere, 0}},
      {"execute a program", "execveat", {kNone, address("/proc/self/exe"), kNowhere, 0, 0}},

      {"start a process", "fork", {}, forks},
      {"start a process", "vfork", {}, vforks},
      {"start a process", "clone", {CLONE_SIGHAND}},  // Without CLONE_VM: EINVAL.
      {"start a process", "clone3", {kNowhere, 0}},   // The size is too small: EINVAL.

      {"trace a process", "ptrace", {PTRACE_ATTACH, kNobody}},
      {"trace a process", "process_vm_readv", {}, readsMemoryAsATracer},
      {"trace a process", "process_vm_writev", {kNobody}},
      {"trace a process", "pidfd_getfd", {kNone, 0, 0}},
      {"trace a process", "perf_event_open", {kNowhere, 0, 0, kNone, kNone}},

      {"signal other processes", "kill", {kNobody, 0}},
      {"signal other processes", "tkill", {kNobody, 0}},
      {"signal other processes", "tgkill", {kNobody, kNobody, 0}},
      {"signal other processes", "pidfd_send_signal", {kNone, 0, 0, 0}},

      {"open a raw or packet socket", "socket", {AF_INET, SOCK_RAW | SOCK_CLOEXEC, IPPROTO_ICMP}},
      // No such protocol: EINVAL, where a real one is refused for want of privilege.
      {"open a raw or packet socket", "socket", {AF_INET, SOCK_RAW | SOCK_CLOEXEC, kNone}},
      {"open a raw or packet socket", "socket", {AF_INET6, SOCK_RAW | SOCK_CLOEXEC, kNone}},
      {"open a raw or packet socket", "socket", {AF_PACKET, SOCK_RAW | SOCK_CLOEXEC, 0}},
      {"open a raw or packet socket", "socket", {AF_PACKET, SOCK_DGRAM | SOCK_CLOEXEC, 0}},
      {"open a socket of a rare protocol", "socket", {AF_INET, SOCK_STREAM | SOCK_CLOEXEC, IPPROTO_SCTP}},
      {"open a socket of a rare protocol", "socket", {AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, IPPROTO_ICMP}},
      {"open a socket of a rare protocol",
       "socket",
       {AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_KOBJECT_UEVENT}},
      {"listen on the network", "listen", {}, listensOnTCP},

      {"change its limits", "prlimit64", {}, setsItsLimit},
      {"change its limits", "setrlimit", {}, setsItsLimitTheOldWay},
      {"change its limits", "setpriority", {kNone}},
      {"change its limits", "sched_setscheduler", {0, kNone}},

      // An ID of -1 means "as it is", or is none.
      {"change its identity", "setuid", {kNone}},
      {"change its identity", "setgid", {kNone}},
      {"change its identity", "setreuid", {kNone, kNone}},
      {"change its identity", "setregid", {kNone, kNone}},
      {"change its identity", "setresuid", {kNone, kNone, kNone}},
      {"change its identity", "setresgid", {kNone, kNone, kNone}},
      {"change its identity", "setfsuid", {kNone}},
      {"change its identity", "setfsgid", {kNone}},
      {"change its identity", "setgroups", {kNone, kNowhere}},
      {"change its identity", "capset", {kNowhere, kNowhere}},
      {"change its identity", "personality", {0xFFFF'FFFF}},  // Only asks.
      {"change its identity", "prctl", {PR_SET_DUMPABLE, kNone}},

      {"change file systems", "mount", {kNowhere, kNowhere, kNowhere, 0, 0}},
      {"change file systems", "umount2", {kNowhere, kNone}},
      {"change file systems", "pivot_root", {kNowhere, kNowhere}},
      {"change file systems", "chroot", {kNowhere}},
      {"change file systems", "open_tree", {kNone, kNowhere, kNone}},
      {"change file systems", "move_mount", {kNone, kNowhere, kNone, kNowhere, kNone}},
      {"change file systems", "fsopen", {kNowhere, kNone}},
      {"change file systems", "swapon", {kNowhere, kNone}},
      {"change file systems", "open_by_handle_at", {kNone, kNowhere, 0}},
      {"change file systems", "mknod", {kNowhere}},
      {"change file systems", "mknodat", {kNone, kNowhere}},
      {"change file systems", "chown", {kNowhere, kNone, kNone}},
      {"change file systems", "fchownat", {kNone, kNowhere, kNone, kNone, kNone}},

      {"load code into the kernel", "init_module", {0, 0, kNowhere}},
      {"load code into the kernel", "finit_module", {kNone, kNowhere, kNone}},
      {"load code into the kernel", "delete_module", {kNowhere, 0}},
      {"load code into the kernel", "bpf", {kNone, kNowhere, kNone}},
      {"load code into the kernel", "kexec_load", {0, kNone, kNowhere, kNone}},
      {"load code into the kernel", "kexec_file_load", {kNone, kNone, 0, 0, kNone}},

      {"reach into the kernel", "keyctl", {kNone}},
      {"reach into the kernel", "add_key", {kNowhere, kNowhere, kNowhere, kNone, 0}},
      {"reach into the kernel", "request_key", {kNowhere, kNowhere, 0, 0}},
      {"reach into the kernel", "unshare", {1}},  // No flag of it: EINVAL.
      {"reach into the kernel", "setns", {kNone, 0}},
      {"reach into the kernel", "userfaultfd", {kNone}},
      {"reach into the kernel", "io_uring_setup", {0, kNowhere}},
      {"reach into the kernel", "ioctl", {kNone, TIOCSTI, kNowhere}},
      {"reach into the kernel", "syslog", {kNone}},
      {"reach into the kernel", "iopl", {kNone}},
      {"reach into the kernel", "reboot", {0, 0, 0, 0}},  // Without its two magic numbers: EINVAL.
      {"reach into the kernel", "settimeofday", {kNowhere, kNowhere}},
      {"reach into the kernel", "sethostname", {kNowhere, kNone}},
      {"reach into the kernel", "acct", {kNowhere}},
  };
  return kProbes;
}

bool isLetThrough(const Probe& probe) {
  std::optional<long> result;
  if (probe.function) {
    result = probe.function();
  } else if (const int number = ::seccomp_syscall_resolve_name(probe.call); number >= 0) {
    const Words& words = probe.arguments;
    result = ::syscall(number, words[0], words[1], words[2], words[3], words[4], words[5]);
  }
  if (!result) return false;  // This architecture has no such call.
  return *result >= 0 || (errno != EPERM && errno != ENOSYS);
}

template <class Condition>
std::vector<ForbiddenAct> actsOf(const Condition& condition) {
  std::vector<ForbiddenAct> acts;
  for (const Probe& probe : probes()) {
    if (!condition(probe)) continue;
    if (acts.empty() || acts.back().name != probe.act) acts.push_back({probe.act, {}});
    auto& calls = acts.back().calls;
    if (calls.empty() || calls.back() != probe.call) calls.emplace_back(probe.call);
  }
  return acts;
}

}  // namespace

std::vector<ForbiddenAct> systemCallsLetThrough() { return actsOf(isLetThrough); }

std::vector<ForbiddenAct> forbiddenActs() {
  return actsOf([](const Probe&) { return true; });
}

}  // namespace tallyd::platform
