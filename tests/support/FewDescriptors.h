// Descriptors that run out.
#pragma once

#include <fcntl.h>
#include <sys/resource.h>

#include "platform/FileDescriptor.h"

namespace tallyd::test {

/// Lets the process open only `spare` descriptors more for as long as it lives.
class FewDescriptors {
 public:
  explicit FewDescriptors(int spare) {
    ::getrlimit(RLIMIT_NOFILE, &_before);
    const platform::FileDescriptor next(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    auto limit = _before;
    limit.rlim_cur = static_cast<rlim_t>(next.get() + spare);
    ::setrlimit(RLIMIT_NOFILE, &limit);
  }
  ~FewDescriptors() { ::setrlimit(RLIMIT_NOFILE, &_before); }
  FewDescriptors(const FewDescriptors&) = delete;
  FewDescriptors& operator=(const FewDescriptors&) = delete;

 private:
  rlimit _before{};
};

}  // namespace tallyd::test
