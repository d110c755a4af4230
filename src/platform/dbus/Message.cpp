#include "platform/dbus/Message.h"

#include <algorithm>
#include <array>

#include "platform/dbus/ByteReader.h"
#include "platform/dbus/Signature.h"

namespace tallyd::platform::dbus {

namespace {

constexpr std::uint8_t kProtocolVersion = 1;
constexpr std::size_t kBodyLengthOffset = 4;
constexpr std::size_t kMaximumNameBytes = 255;

/// D-Bus Specification, "Header Fields".
enum HeaderField : std::uint8_t {
  FieldPath = 1,
  FieldInterface = 2,
  FieldMember = 3,
  FieldErrorName = 4,
  FieldReplySerial = 5,
  FieldDestination = 6,
  FieldSender = 7,
  FieldSignature = 8,
  FieldDescriptors = 9,
};

std::endian byteOrderOf(char mark) {
  if (mark == 'l') return std::endian::little;
  if (mark == 'B') return std::endian::big;
  throwMalformed("an unknown byte order");
}

constexpr bool isNameStart(char c) { return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '_'; }

/// By byte: whether it may stand in a name, though perhaps not at its start.
constexpr auto kNameParts = [] {
  std::array<bool, 256> parts{};
  for (unsigned byte = 0; byte < parts.size(); ++byte) {
    const auto c = static_cast<char>(byte);
    parts[byte] = isNameStart(c) || (c >= '0' && c <= '9');
  }
  return parts;
}();

bool isNamePart(char c) { return kNameParts[static_cast<unsigned char>(c)]; }

bool isMember(std::string_view name) {
  return !name.empty() && name.size() <= kMaximumNameBytes && isNameStart(name[0]) &&
         std::all_of(name.begin(), name.end(), isNamePart);
}

/// Two or more members with points between.
bool isInterface(std::string_view name) {
  if (name.size() > kMaximumNameBytes || name.find('.') == std::string_view::npos) return false;
  for (std::size_t start = 0; start <= name.size();) {
    const std::size_t end = std::min(name.find('.', start), name.size());
    if (!isMember(name.substr(start, end - start))) return false;
    start = end + 1;
  }
  return true;
}

bool isPath(std::string_view path) {
  if (path == "/") return true;
  if (path.empty() || path[0] != '/' || path.back() == '/') return false;
  for (std::size_t i = 1; i < path.size(); ++i) {
    if (path[i] == '/' ? path[i - 1] == '/' : !isNamePart(path[i])) return false;
  }
  return true;
}

void require(bool condition, const char* reason) {
  if (!condition) throwMalformed(reason);
}

void readField(ByteReader& bytes, std::uint8_t code, MessageFields& fields) {
  const std::string_view type = bytes.signature();
  const auto text = [&](std::string_view wanted) {
    require(type == wanted, "a header field of a wrong type");
    return bytes.text();
  };
  const auto number = [&] {
    require(type == "u", "a header field of a wrong type");
    return bytes.number<std::uint32_t>();
  };
  switch (code) {
    case FieldPath:
      fields.path = text("o");
      return require(isPath(fields.path), "a path that is none");
    case FieldInterface:
      fields.interface = text("s");
      return require(isInterface(fields.interface), "an interface's name that is none");
    case FieldMember:
      fields.member = text("s");
      return require(isMember(fields.member), "a member's name that is none");
    case FieldErrorName:
      fields.errorName = text("s");
      return require(isInterface(fields.errorName), "an error's name that is none");
    case FieldReplySerial:
      fields.replySerial = number();
      return require(*fields.replySerial != 0, "an answer to no call");
    case FieldDestination:
    case FieldSender:
      (void)text("s");  // Means nothing without a bus.
      return;
    case FieldSignature:
      require(type == "g", "a header field of a wrong type");
      fields.signature = bytes.signature();
      return require(isValidSignature(fields.signature), "a signature that is none");
    case FieldDescriptors:
      fields.descriptors = number();
      return;
    default:
      // Fields that are new since may be of any of these.
      if (type == "u") return (void)number();
      if (type == "g") return (void)bytes.signature();
      require(type == "s" || type == "o", "an unknown header field of an unknown type");
      (void)bytes.text();
  }
}

void requireFields(const MessageFields& fields) {
  switch (fields.type) {
    case MessageType::MethodCall:
      return require(!fields.path.empty() && !fields.member.empty(), "a call without its path or member");
    case MessageType::Signal:
      return require(!fields.path.empty() && !fields.member.empty() && !fields.interface.empty(),
                     "a signal without its path, interface or member");
    case MessageType::MethodReturn:
      return require(fields.replySerial.has_value(), "an answer without its call");
    case MessageType::Error:
      return require(fields.replySerial && !fields.errorName.empty(), "an error without its call or name");
  }
}

}  // namespace

std::size_t messageLength(std::string_view start) {
  if (start.empty()) return 0;
  const std::endian order = byteOrderOf(start[0]);
  if (start.size() < kFixedHeaderBytes) return 0;
  ByteReader bytes(start.substr(0, kFixedHeaderBytes), order);
  (void)bytes.bytes(1);
  require(bytes.number<std::uint8_t>() != 0, "a message of no type");
  (void)bytes.number<std::uint8_t>();
  require(bytes.number<std::uint8_t>() == kProtocolVersion, "an unknown protocol version");
  const std::size_t body = bytes.number<std::uint32_t>();
  require(bytes.number<std::uint32_t>() != 0, "a message without a serial number");
  const std::size_t fields = bytes.number<std::uint32_t>();
  require(fields <= kMaximumFieldsBytes, "a header that is too long");
  const std::size_t length = kFixedHeaderBytes + (fields + 7) / 8 * 8 + body;
  require(length <= kMaximumMessageBytes, "a message that is too long");
  return length;
}

Message parseMessage(std::string_view message) {
  Message result;
  result.order = byteOrderOf(message[0]);
  ByteReader bytes(message, result.order);
  (void)bytes.bytes(1);
  result.fields.type = static_cast<MessageType>(bytes.number<std::uint8_t>());
  result.fields.flags = bytes.number<std::uint8_t>();
  (void)bytes.number<std::uint8_t>();
  const std::size_t bodyLength = bytes.number<std::uint32_t>();
  result.fields.serial = bytes.number<std::uint32_t>();
  const std::size_t end = bytes.number<std::uint32_t>() + bytes.position();
  while (bytes.position() < end) {
    bytes.align(8);
    readField(bytes, bytes.number<std::uint8_t>(), result.fields);
  }
  require(bytes.position() == end, "a header field that reaches beyond the header");
  bytes.align(8);
  result.body = bytes.bytes(bodyLength);
  requireFields(result.fields);
  return result;
}

/// The fields' part of a header.
class MessageBuilder::Header {
 public:
  explicit Header(ByteWriter& out) : _out(out), _length(out.reserveNumber()), _start(out.position()) {}

  void text(std::uint8_t code, std::string_view type, std::string_view text) {
    if (text.empty()) return;
    begin(code, type);
    _out.text(text);
  }
  void signature(std::string_view signature) {
    if (signature.empty()) return;
    begin(FieldSignature, "g");
    _out.signature(signature);
  }
  void number(std::uint8_t code, std::uint32_t number) {
    begin(code, "u");
    _out.number(number);
  }
  void finish() {
    _out.fillIn(_length, _out.position() - _start);
    _out.align(8);
  }

 private:
  void begin(std::uint8_t code, std::string_view type) {
    _out.align(8);
    _out.number(code);
    _out.signature(type);
  }

  ByteWriter& _out;
  const std::size_t _length;
  const std::size_t _start;
};

std::string& MessageBuilder::withHeader(std::string& out, const MessageFields& fields) {
  ByteWriter bytes(out);
  bytes.number(std::endian::native == std::endian::little ? 'l' : 'B');
  bytes.number(static_cast<std::uint8_t>(fields.type));
  bytes.number(fields.flags);
  bytes.number(kProtocolVersion);
  bytes.number(std::uint32_t{0});  // The body's length, until finish().
  bytes.number(fields.serial);
  Header header(bytes);
  header.text(FieldPath, "o", fields.path);
  header.text(FieldInterface, "s", fields.interface);
  header.text(FieldMember, "s", fields.member);
  header.text(FieldErrorName, "s", fields.errorName);
  if (fields.replySerial) header.number(FieldReplySerial, *fields.replySerial);
  header.signature(fields.signature);
  if (fields.descriptors > 0) header.number(FieldDescriptors, fields.descriptors);
  header.finish();
  return out;
}

MessageBuilder::MessageBuilder(std::string& out, const MessageFields& fields)
    : _out(out), _start(out.size()), _body(withHeader(out, fields)) {}

void MessageBuilder::finish() {
  const auto length = static_cast<std::uint32_t>(_body.position());
  std::memcpy(_out.data() + _start + kBodyLengthOffset, &length, sizeof length);
}

}  // namespace tallyd::platform::dbus
