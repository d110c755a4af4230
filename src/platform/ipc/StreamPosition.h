// Where a stream of D-Bus messages stands: between two messages or within one.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace tallyd::platform {

/// Follows, from what waits in a socket before it is read, what the D-Bus library makes of it: the library
/// tells neither whether a connection ended within a message nor that it dropped one that is malformed.
///
/// The library reads one message at a time and nothing beyond it. Unless nextIsKnown(), take what waits in
/// the socket to willRead() before each of its turns; afterwards report what came of the turn.
class StreamPosition {
 public:
  /// The fixed part of a message's header (D-Bus Specification, "Message Format").
  static constexpr std::size_t kHeaderSize = 16;

  enum class Verdict { Fine, Malformed };

  /// What was read beyond the end of the authentication dialogue.
  void authenticated(std::string_view readAhead);

  /// At least one whole message has been seen to wait.
  [[nodiscard]] bool nextIsKnown() const { return _seen < _expected.size(); }
  /// Whether `start`, the first bytes that wait, reach to the end of the present or next message.
  [[nodiscard]] bool holdsWhole(std::string_view start) const;
  /// @param start      the first bytes that wait, at least kHeaderSize if there are as many.
  /// @param available  how many bytes wait; may be less unless `start` holds no whole message.
  void willRead(std::string_view start, std::size_t available);

  /// A message came; malformed when it is not the one that was to come.
  Verdict delivered(std::uint64_t serial);
  /// Something was read, all that had waited and perhaps more, and no message came of it; malformed when a
  /// whole one had waited.
  Verdict readWithoutDelivery();

  [[nodiscard]] bool withinMessage() const { return _within; }
  /// Messages that were read already and have not been delivered; they come without anything waiting in the
  /// socket.
  [[nodiscard]] std::size_t readAhead() const { return _readAhead; }

  struct Header {
    std::uint64_t size;  ///< Of the whole message.
    std::uint32_t serial;
  };
  /// Nothing when `start` is too short or of no known byte order.
  [[nodiscard]] static std::optional<Header> header(std::string_view start);

 private:
  bool _within = false;
  std::optional<std::uint64_t>
      _missing;  ///< Of the message that the stream is within; unknown when its header was cut.

  std::vector<std::uint32_t> _expected;  ///< Serials of the whole messages that were seen to wait.
  std::size_t _seen = 0;                 ///< So many of them have come.
  std::optional<std::uint64_t> _next;    ///< Size of the message that begins to wait behind them.
  std::size_t _available = 0;            ///< Bytes of it, or of the message that the stream is within.

  std::size_t _readAhead = 0;
  bool _withinAfterReadAhead = false;
  std::optional<std::uint64_t> _missingAfterReadAhead;
};

}  // namespace tallyd::platform
