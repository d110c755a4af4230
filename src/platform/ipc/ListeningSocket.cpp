#include "platform/ipc/ListeningSocket.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <string>
#include <system_error>

namespace tallyd::platform {

namespace {

constexpr int kBacklog = 4096;       ///< Linux's default upper limit (net.core.somaxconn).
constexpr mode_t kEverybody = 0666;  ///< Every local program may report.
constexpr mode_t kOwnersOnly = 0600;

[[noreturn]] void fail(const std::string& what, const std::filesystem::path& path) {
  throw std::system_error(errno, std::system_category(), what + " " + path.string());
}

FileDescriptor lockFor(const std::filesystem::path& socketPath) {
  const std::filesystem::path lockPath = socketPath.string() + ".lock";
  FileDescriptor lock(::open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock) fail("cannot open", lockPath);
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno != EWOULDBLOCK) fail("cannot lock", lockPath);
    throw std::runtime_error("another tallyd is running on this root: " + socketPath.string());
  }
  return lock;
}

FileDescriptor socketOfServiceManager() {
  const int count = sd_listen_fds(1);
  for (int descriptor = SD_LISTEN_FDS_START; descriptor < SD_LISTEN_FDS_START + count; ++descriptor) {
    if (sd_is_socket_unix(descriptor, SOCK_STREAM, 1, nullptr, 0) <= 0) continue;
    ::fcntl(descriptor, F_SETFL, ::fcntl(descriptor, F_GETFL) | O_NONBLOCK);
    return FileDescriptor(descriptor);
  }
  return {};
}

FileDescriptor newSocket(const std::filesystem::path& path, mode_t mode) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string name = path.string();
  if (name.size() >= sizeof address.sun_path) {
    errno = ENAMETOOLONG;
    fail("cannot listen on", path);
  }
  std::memcpy(address.sun_path, name.c_str(), name.size() + 1);

  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket) fail("cannot make a socket for", path);
  if (::unlink(address.sun_path) != 0 && errno != ENOENT) fail("cannot replace", path);
  if (::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::chmod(address.sun_path, mode) != 0 || ::listen(socket.get(), kBacklog) != 0) {
    fail("cannot listen on", path);
  }
  return socket;
}

}  // namespace

ListeningSocket::ListeningSocket(const std::filesystem::path& path, SocketAccess access) : _path(path) {
  std::filesystem::create_directories(path.parent_path());
  _lock = lockFor(path);
  if (access == SocketAccess::Everybody) _socket = socketOfServiceManager();
  if (_socket) return;
  _socket = newSocket(path, access == SocketAccess::Everybody ? kEverybody : kOwnersOnly);
  _ownsFile = true;
}

ListeningSocket::~ListeningSocket() {
  if (_ownsFile) ::unlink(_path.c_str());
}

}  // namespace tallyd::platform
