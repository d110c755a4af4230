// The test service as a program of its own, on a socket that it was passed the way a service manager passes
// one.
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "TestService.h"
#include "fakes/FakeLog.h"

namespace {

/// Usage: PASSED-SOCKET OWN-PATH. Says "ready" and serves until its standard input ends.
int serve(const char* passedPath, const char* ownPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, passedPath, sizeof address.sun_path - 1);
  const int made = ::socket(AF_UNIX, SOCK_STREAM, 0);
  if (::bind(made, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(made, 8) != 0) {
    return 1;
  }
  constexpr int kFirstPassed = 3;
  if (made != kFirstPassed && ::dup2(made, kFirstPassed) < 0) return 1;
  ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  ::setenv("LISTEN_FDS", "1", 1);

  tallyd::fakes::FakeLog log;
  tallyd::platform::TestService service(ownPath, log);
  service.resume();
  std::puts("ready");
  std::fflush(stdout);
  return std::getchar() == EOF ? 0 : 1;
}

}  // namespace

int main(int count, char** arguments) { return count == 3 ? serve(arguments[1], arguments[2]) : 2; }
