// One message of D-Bus: its header, and where its body lies (D-Bus Specification, "Message Format").
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/dbus/ByteWriter.h"

namespace tallyd::platform::dbus {

enum class MessageType : std::uint8_t { MethodCall = 1, MethodReturn = 2, Error = 3, Signal = 4 };

enum MessageFlag : std::uint8_t { NoReplyExpected = 1 };

/// The part of the header that every message has.
inline constexpr std::size_t kFixedHeaderBytes = 16;
/// Longest message, and longest array of header fields.
inline constexpr std::size_t kMaximumMessageBytes = std::size_t{1} << 27;
inline constexpr std::size_t kMaximumFieldsBytes = std::size_t{1} << 26;

/// What a header says; a field that is missing is empty.
struct MessageFields {
  MessageType type = MessageType::MethodCall;
  std::uint8_t flags = 0;
  std::uint32_t serial = 0;
  std::string_view path{};
  std::string_view interface {};
  std::string_view member{};
  std::string_view errorName{};
  std::optional<std::uint32_t> replySerial{};
  std::string_view signature{};  ///< Of the body.
  std::uint32_t descriptors = 0;

  [[nodiscard]] bool expectsReply() const {
    return type == MessageType::MethodCall && (flags & NoReplyExpected) == 0;
  }
};

/// A message as views of its bytes.
struct Message {
  MessageFields fields;
  std::string_view body;
  std::endian order = std::endian::native;
};

/// The length of the message that starts with these bytes; 0 while they are too few to tell. Throws Malformed
/// when they are no message's.
[[nodiscard]] std::size_t messageLength(std::string_view start);

/// Reads the header of a whole message. Throws Malformed: for a header that is not well-formed, lacks a field
/// that its type must have, or has one whose text breaks the rules for names. The body is not looked at. Of a
/// type that is unknown nothing is required.
[[nodiscard]] Message parseMessage(std::string_view bytes);

/// Appends a message: the header at construction, the body through body(), its length by finish().
class MessageBuilder {
 public:
  MessageBuilder(std::string& out, const MessageFields& fields);
  [[nodiscard]] ByteWriter& body() { return _body; }
  void finish();

 private:
  class Header;
  static std::string& withHeader(std::string& out, const MessageFields& fields);

  std::string& _out;
  const std::size_t _start;
  ByteWriter _body;
};

}  // namespace tallyd::platform::dbus
