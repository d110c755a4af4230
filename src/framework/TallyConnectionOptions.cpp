#include "framework/TallyConnectionOptions.h"

#include <cstdlib>

#include "framework/ClientSessionInterface.h"
#include "platform/Root.h"

namespace tallyd {

std::filesystem::path tallyDefaultSocketPath() {
  const char* root = ::secure_getenv("TALLY_ROOT");
  return tallydSocketPath(platform::Root(root && *root ? root : "/"));
}

}  // namespace tallyd
