// What sd-bus and the system's calls return, as exceptions.
#pragma once

#include <cerrno>
#include <system_error>

namespace tallyd::bench {

/// The result of a function that returns negative error numbers. Throws std::system_error.
inline int check(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), what);
  return result;
}

/// The same for one that sets errno.
inline int checkErrno(int result, const char* what) { return check(result < 0 ? -errno : result, what); }

}  // namespace tallyd::bench
