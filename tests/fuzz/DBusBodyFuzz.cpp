// Bodies of D-Bus messages, whatever their signature: read as values, written and read again.

#include <bit>
#include <optional>
#include <string>
#include <vector>

#include "FuzzTarget.h"
#include "ValueDepth.h"
#include "platform/Value.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/BodyWriter.h"
#include "platform/dbus/ByteWriter.h"
#include "platform/dbus/Signature.h"

namespace tallyd::fuzz {
namespace {

using platform::Value;
using namespace platform::dbus;

void checkSignature(std::string_view signature) {
  if (signature.empty() || !isValidSignature(signature)) return;
  std::string_view rest = signature;
  while (!rest.empty()) {
    const std::size_t length = completeTypeLength(rest);
    FUZZ_CHECK(length > 0 && length <= rest.size());
    FUZZ_CHECK(isOneCompleteType(rest.substr(0, length)));
    rest.remove_prefix(length);
  }
}

std::optional<std::string> written(std::string_view signature, const std::vector<Value>& values) {
  std::string bytes;
  ByteWriter writer(bytes);
  if (writeBody(writer, signature, values, 0)) return std::nullopt;
  return bytes;
}

void checkBody(std::string_view signature, std::string_view body, std::endian order) {
  const auto read = readBody(body, order, signature, {});
  if (read.problem) {
    FUZZ_CHECK(!read.problem->empty());
    return;
  }
  for (const Value& value : read.values) FUZZ_CHECK(depthOf(value) <= kMaximumContainerDepth);
  const auto once = written(signature, read.values);
  if (!once) return;
  const auto again = readBody(*once, std::endian::native, signature, {});
  FUZZ_CHECK(!again.problem);
  FUZZ_CHECK(written(signature, again.values) == once);
}

}  // namespace
}  // namespace tallyd::fuzz

/// A signature, a line feed, and a body.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const auto signature = input.takeLine();
  const auto body = input.takeRest();
  checkSignature(signature);
  if (!isValidSignature(signature)) return 0;
  checkBody(signature, body, std::endian::little);
  checkBody(signature, body, std::endian::big);
  return 0;
}
