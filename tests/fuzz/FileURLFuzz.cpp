// What a client says about a file: its URL, the path in it, the upload's address, the extension token.

#include <algorithm>
#include <string>

#include "FuzzTarget.h"
#include "backends/upload/UploadURL.h"
#include "platform/sandbox/FileGrants.h"
#include "session/FileURL.h"

namespace tallyd::fuzz {
namespace {

using platform::FileGrants;
using platform::Sandbox;

bool isEscapedOnly(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) {
    return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
           std::string_view("-._~%").find(c) != std::string_view::npos;
  });
}

void checkURL(std::string_view url) {
  const std::string path = pathOfFileURL(url);
  FUZZ_CHECK(path.size() <= url.size());
  // A zero byte is in the path only where the client wrote one itself.
  FUZZ_CHECK(url.find('\0') != std::string_view::npos || path.find('\0') == std::string::npos);
  if (path.starts_with('/') && path.find('\0') == std::string::npos) {
    FUZZ_CHECK(pathOfFileURL("file:" + percentEscaped(path)) == path);
  }

  const auto name = lastPathComponent(path);
  FUZZ_CHECK(name.find('/') == std::string_view::npos || name == "/");
  FUZZ_CHECK(isEscapedOnly(percentEscaped(name)));
  constexpr std::string_view kEndpoint = "https://upload.test/in";
  const std::string address = uploadURLForFile(kEndpoint, "0123", 7, path);
  FUZZ_CHECK(address.starts_with(kEndpoint));
  FUZZ_CHECK(hasURLCharactersOnly(address));
  FUZZ_CHECK(std::count(address.begin(), address.end(), '&') == 4);
}

/// A token opens what it was offered with, and nothing else.
void checkToken(std::string_view offered, std::string_view asked, std::string_view path) {
  FileGrants grants;
  const auto grant = grants.offer(offered, {});
  const auto handle = grants.consume(asked);
  FUZZ_CHECK((handle != Sandbox::kNoExtension) == (offered == asked));
  FUZZ_CHECK(!grants.open(path));  // No descriptor came.
  grants.release(handle);
  FUZZ_CHECK(!grants.open(path));
}

}  // namespace
}  // namespace tallyd::fuzz

/// Lines: the file's URL, the token that is offered, the one that is asked for.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const auto url = input.takeLine();
  const auto offered = input.takeLine();
  const auto asked = input.takeLine();
  checkURL(url);
  checkToken(offered, asked, tallyd::pathOfFileURL(url));
  return 0;
}
