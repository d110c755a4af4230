// Makes this process's files stop growing, as on a full disk.
#pragma once

#include <sys/resource.h>

#include <csignal>

namespace tallyd::test {

/// While it lives, no file of this process grows beyond a size: a write writes what has room, and the next
/// one fails with EFBIG. One at a time in a process.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(rlim_t bytes) : _handler(std::signal(SIGXFSZ, SIG_IGN)) {
    ::getrlimit(RLIMIT_FSIZE, &_before);
    const rlimit limit{bytes, _before.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &limit);
  }
  ~FileSizeLimit() {
    ::setrlimit(RLIMIT_FSIZE, &_before);
    std::signal(SIGXFSZ, _handler);
  }
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  rlimit _before{};
  void (*_handler)(int);
};

}  // namespace tallyd::test
