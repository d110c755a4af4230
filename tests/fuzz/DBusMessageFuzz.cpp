// D-Bus messages: header and body read, written again and read again.

#include <optional>
#include <string>
#include <vector>

#include "FuzzTarget.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/BodyWriter.h"
#include "platform/dbus/ByteReader.h"
#include "platform/dbus/ByteWriter.h"
#include "platform/dbus/Message.h"
#include "platform/dbus/Signature.h"

namespace tallyd::fuzz {
namespace {

using platform::FileDescriptor;
using namespace platform::dbus;

bool hasSameFields(const MessageFields& a, const MessageFields& b) {
  return a.type == b.type && a.flags == b.flags && a.serial == b.serial && a.path == b.path &&
         a.interface == b.interface && a.member == b.member && a.errorName == b.errorName &&
         a.replySerial == b.replySerial && a.signature == b.signature && a.descriptors == b.descriptors;
}

std::string written(const MessageFields& fields, const std::vector<platform::Value>& values,
                    std::optional<std::string>& problem) {
  std::string bytes;
  MessageBuilder builder(bytes, fields);
  problem = writeBody(builder.body(), fields.signature, values, fields.descriptors);
  builder.finish();
  return bytes;
}

/// The length of a message is known from its fixed part on, and never another one.
std::size_t lengthOf(std::string_view bytes) {
  const std::size_t length = messageLength(bytes);
  FUZZ_CHECK((length == 0) == (bytes.size() < kFixedHeaderBytes));
  FUZZ_CHECK(length == 0 || (length >= kFixedHeaderBytes && length <= kMaximumMessageBytes));
  for (std::size_t part = 0; part < kFixedHeaderBytes && part < bytes.size(); ++part) {
    FUZZ_CHECK(messageLength(bytes.substr(0, part)) == 0);
  }
  if (length != 0) FUZZ_CHECK(messageLength(bytes.substr(0, kFixedHeaderBytes)) == length);
  return length;
}

void checkBody(const Message& message) {
  // Descriptors are not bytes: a body that refers to any is refused here, for none came.
  const auto read = readBody(message.body, message.order, message.fields.signature, {});
  if (read.problem) return;
  FUZZ_CHECK(read.descriptors.empty());
  std::optional<std::string> problem;
  const std::string once = written(message.fields, read.values, problem);
  if (problem) {
    // Typed arrays within variants become arrays of variants, which are twice as deep.
    FUZZ_CHECK(*problem == "nested too deeply");
    return;
  }
  FUZZ_CHECK(lengthOf(once) == once.size());
  const Message again = parseMessage(once);
  FUZZ_CHECK(hasSameFields(message.fields, again.fields));
  const auto reread = readBody(again.body, again.order, again.fields.signature, {});
  FUZZ_CHECK(!reread.problem);
  // Bytes are compared, as a real may be no number, which equals nothing.
  FUZZ_CHECK(written(again.fields, reread.values, problem) == once);
  FUZZ_CHECK(!problem);
}

void checkMessage(std::string_view bytes) {
  const Message message = parseMessage(bytes);
  FUZZ_CHECK(isValidSignature(message.fields.signature));
  FUZZ_CHECK(message.body.size() <= bytes.size() - kFixedHeaderBytes);
  FUZZ_CHECK(message.fields.type != MessageType::MethodCall ||
             (!message.fields.path.empty() && !message.fields.member.empty()));
  checkBody(message);
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  std::string_view bytes = Input(data, size).takeRest();
  try {
    while (!bytes.empty()) {
      const std::size_t length = lengthOf(bytes);
      if (length == 0 || length > bytes.size()) break;
      checkMessage(bytes.substr(0, length));
      bytes.remove_prefix(length);
    }
  } catch (const Malformed&) {
    // A connection ends here.
  }
  return 0;
}
