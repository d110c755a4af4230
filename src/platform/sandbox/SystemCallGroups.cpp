#include "platform/sandbox/SystemCallGroups.h"

#include <linux/netlink.h>
#include <linux/sockios.h>
#include <netinet/in.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <initializer_list>

namespace tallyd::platform {
namespace {

using Rules = std::vector<SystemCallRule>;

// The kernel looks only at the lower half of an argument that is an int; the upper half may hold anything.
constexpr std::uint64_t kInt = 0xFFFF'FFFF;
constexpr std::uint64_t kWhole = ~std::uint64_t{0};
constexpr std::uint64_t kSocketType =
    0xF;  // The bits beside SOCK_NONBLOCK and SOCK_CLOEXEC, as the kernel has it.

constexpr ArgumentCondition equals(unsigned argument, std::uint64_t value) {
  return {argument, kInt, value & kInt};
}

Rules calls(std::initializer_list<const char*> names) {
  Rules rules;
  for (const char* name : names) rules.push_back({name, {}});
  return rules;
}

Rules basicIO() {
  Rules rules = calls({"read",        "write",        "readv",    "writev",        "pread64",   "pwrite64",
                       "preadv",      "pwritev",      "preadv2",  "pwritev2",      "close",     "close_range",
                       "dup",         "dup2",         "dup3",     "fcntl",         "lseek",     "poll",
                       "ppoll",       "select",       "pselect6", "epoll_create1", "epoll_ctl", "epoll_wait",
                       "epoll_pwait", "epoll_pwait2", "eventfd",  "eventfd2",      "pipe",      "pipe2"});
  // Only requests that ask; others would type into a terminal or set up devices.
  for (const int request : {FIONREAD, FIONBIO, FIOCLEX, TCGETS, TIOCGWINSZ, SIOCGIFINDEX, SIOCGIFNAME}) {
    rules.push_back({"ioctl", {equals(1, static_cast<unsigned>(request))}});
  }
  return rules;
}

Rules files() {
  return calls({"open",     "openat",     "stat",    "lstat",     "fstat",      "newfstatat",
                "statx",    "statfs",     "fstatfs", "access",    "faccessat",  "faccessat2",
                "getdents", "getdents64", "getcwd",  "readlink",  "readlinkat", "mkdir",
                "mkdirat",  "rmdir",      "rename",  "renameat",  "renameat2",  "unlink",
                "unlinkat", "ftruncate",  "fsync",   "fdatasync", "fadvise64",  "flock"});
}

Rules network() {
  Rules rules =
      calls({"bind", "connect", "accept", "accept4", "getsockname", "getpeername", "getsockopt", "setsockopt",
             "shutdown", "sendto", "sendmsg", "sendmmsg", "recvfrom", "recvmsg", "recvmmsg"});
  // No raw packets and no rare protocol families, which is where the kernel's own faults are found.
  const auto allow = [&rules](unsigned family, unsigned type, std::initializer_list<unsigned> protocols) {
    for (const unsigned protocol : protocols) {
      rules.push_back({"socket", {equals(0, family), {1, kSocketType, type}, equals(2, protocol)}});
    }
  };
  for (const unsigned family : std::initializer_list<unsigned>{AF_INET, AF_INET6}) {
    allow(family, SOCK_STREAM, {0, IPPROTO_TCP});
    allow(family, SOCK_DGRAM, {0, IPPROTO_UDP});
  }
  allow(AF_UNIX, SOCK_STREAM, {0});
  allow(AF_UNIX, SOCK_DGRAM, {0});
  // The C library asks the kernel which addresses it has before it sorts the answers of the name service.
  rules.push_back({"socket", {equals(0, AF_NETLINK), equals(2, NETLINK_ROUTE)}});
  rules.push_back({"socketpair", {equals(0, AF_UNIX)}});
  return rules;
}

Rules threads() {
  Rules rules = calls({"futex", "set_robust_list", "rseq", "set_tid_address", "gettid", "getcpu",
                       "sched_yield", "sched_getaffinity", "sched_getparam", "sched_getscheduler"});
  // New threads, but no new processes. clone3 hides its flags from the filter; see SystemCallFilter.cpp.
  rules.push_back({"clone", {{0, CLONE_THREAD, CLONE_THREAD}}});
  return rules;
}

Rules time() {
  return calls({"clock_gettime", "clock_getres", "clock_nanosleep", "nanosleep", "gettimeofday", "time",
                "times", "timerfd_create", "timerfd_settime", "timerfd_gettime"});
}

Rules memory() {
  return calls(
      {"mmap", "munmap", "mremap", "mprotect", "madvise", "mincore", "msync", "brk", "memfd_create"});
}

Rules signals() {
  Rules rules = calls({"rt_sigaction", "rt_sigprocmask", "rt_sigreturn", "rt_sigpending", "rt_sigtimedwait",
                       "rt_sigsuspend", "sigaltstack", "pause", "restart_syscall"});
  // Signals to itself only: that is how abort(3) ends the process.
  rules.push_back({"tgkill", {equals(0, static_cast<unsigned>(::getpid()))}});
  return rules;
}

Rules process() {
  Rules rules =
      calls({"exit", "exit_group", "getpid", "getppid", "getuid", "geteuid", "getgid", "getegid", "getresuid",
             "getresgid", "getgroups", "getrlimit", "getrusage", "uname", "sysinfo", "getrandom"});
  rules.push_back({"prlimit64", {equals(0, 0), {2, kWhole, 0}}});  // Asks, and sets nothing.
  for (const int operation : {PR_SET_NAME, PR_GET_NAME, PR_GET_DUMPABLE}) {
    rules.push_back({"prctl", {equals(0, static_cast<unsigned>(operation))}});
  }
  return rules;
}

}  // namespace

std::vector<SystemCallGroup> systemCallGroups() {
  return {
      {"@basic-io", "reading, writing and waiting on open descriptors, epoll and event descriptors",
       basicIO()},
      {"@files", "opening, making, moving and removing files, within what the file rules leave open",
       files()},
      {"@network",
       "TCP, UDP and Unix sockets, accepting on those that listen already, the look-up of the machine's own "
       "addresses",
       network()},
      {"@threads", "starting threads and waiting for each other", threads()},
      {"@time", "clocks, sleeping and timer descriptors", time()},
      {"@memory", "memory, and the mapping of libraries and adaptor bundles", memory()},
      {"@signals", "handling signals and ending by abort", signals()},
      {"@process", "ending, naming itself, asking for its own identity and limits, random numbers",
       process()},
  };
}

}  // namespace tallyd::platform
