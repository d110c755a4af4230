#include "platform/property-list/BinaryWalk.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <vector>

#include "platform/property-list/Limits.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {

namespace {

constexpr std::size_t kHeaderBytes = 8;    // "bplist00"
constexpr std::size_t kTrailerBytes = 32;  // Six unused bytes, the two widths, then three 8-byte numbers.

/// The high four bits of an object's first byte.
struct Kind {
  enum : std::uint8_t {
    Simple = 0x0,
    Integer = 0x1,
    Real = 0x2,
    Date = 0x3,
    Data = 0x4,
    ASCIIString = 0x5,
    UTF16String = 0x6,
    UID = 0x8,
    Array = 0xA,
    Set = 0xC,
    Dictionary = 0xD,
  };
};

/// One object, decoded as far as the walk needs.
struct Object {
  std::uint8_t kind = 0;
  std::uint64_t bytes = 0;       ///< Of a scalar's contents, or of all references of a container.
  std::uint64_t references = 0;  ///< Of a dictionary: keys first, then as many values.
  std::size_t start = 0;         ///< Where contents or references begin.
};

class BinaryWalk {
 public:
  explicit BinaryWalk(std::string_view bytes) : _bytes(bytes) {}

  std::string fault() {
    if (readTrailer()) walk();
    return _fault.empty() ? _fault : "binary property list: " + _fault;
  }

 private:
  enum class State : std::uint8_t { Unknown, Open, Done };

  /// What is known of an object, by its number.
  struct Node {
    std::uint64_t expandedBytes = 0;  ///< Everything below it included; saturating.
    State state = State::Unknown;
    std::uint8_t height = 0;  ///< Levels of containers from here down.
    bool isKey = false;       ///< A string that may be a key.
  };

  /// A container on the way from the root to where the walk is.
  struct Frame {
    std::size_t number = 0;
    Object object;
    std::uint64_t next = 0;
  };

  bool fail(std::string what) {
    _fault = std::move(what);
    return false;
  }

  [[nodiscard]] std::uint8_t byteAt(std::size_t position) const {
    return static_cast<std::uint8_t>(_bytes[position]);
  }

  /// A big-endian number; of more than 8 bytes the last 8 count.
  [[nodiscard]] std::uint64_t numberAt(std::size_t position, std::size_t width) const {
    std::uint64_t number = 0;
    for (std::size_t i = 0; i < width; ++i) number = number << 8 | byteAt(position + i);
    return number;
  }

  bool readTrailer() {
    if (_bytes.size() <= kHeaderBytes + kTrailerBytes) return fail("too short");
    if (!_bytes.starts_with("bplist00")) return fail("unknown version");
    const std::size_t end = _bytes.size() - kTrailerBytes;
    _offsetWidth = byteAt(end + 6);
    _referenceWidth = byteAt(end + 7);
    const std::uint64_t count = numberAt(end + 8, 8);
    const std::uint64_t root = numberAt(end + 16, 8);
    const std::uint64_t table = numberAt(end + 24, 8);
    const auto isWidth = [](std::size_t width) { return width >= 1 && width <= 8; };
    if (!isWidth(_offsetWidth) || !isWidth(_referenceWidth)) return fail("impossible widths in the trailer");
    if (table < kHeaderBytes || table >= end || count > (end - table) / _offsetWidth) {
      return fail("offset table outside the list");
    }
    if (root >= count) return fail("no root object");
    _table = static_cast<std::size_t>(table);
    _root = static_cast<std::size_t>(root);
    _nodes.resize(static_cast<std::size_t>(count));
    return true;
  }

  /// Decodes object `number`; false when it is broken or lies outside the list.
  bool decode(std::size_t number, Object& object) {
    const std::uint64_t offset = numberAt(_table + number * _offsetWidth, _offsetWidth);
    if (offset < kHeaderBytes || offset >= _table)
      return fail(fmt::format("object {} lies outside the list", number));
    const auto position = static_cast<std::size_t>(offset);
    const std::uint8_t low = byteAt(position) & 0x0F;
    object.kind = byteAt(position) >> 4;
    object.start = position + 1;
    if (!measure(object, low)) return false;
    if (object.bytes > _table - object.start) return fail(fmt::format("object {} is cut short", number));
    // Objects of an honest list lie side by side; overlapping ones could cost the square of the list's size.
    _contents += object.bytes;
    return _contents <= _bytes.size() || fail("objects overlap");
  }

  bool measure(Object& object, std::uint8_t low) {
    switch (object.kind) {
      case Kind::Simple:
        return low == 8 || low == 9 || fail("unknown kind of object");
      case Kind::Integer:
        object.bytes = std::uint64_t{1} << low;
        return low <= 4 || fail("integer of unknown width");
      case Kind::Real:
        object.bytes = std::uint64_t{1} << low;
        return low == 2 || low == 3 || fail("real of unknown width");
      case Kind::Date:
        object.bytes = 8;
        return low == 3 || fail("date of unknown width");
      case Kind::UID:
        object.bytes = low + 1U;
        return true;
      default:
        return readCount(object, low) && scaleCount(object);
    }
  }

  /// Reads how many elements the object has into `bytes`.
  bool readCount(Object& object, std::uint8_t low) {
    object.bytes = low;
    if (low != 0x0F) return true;
    const std::uint8_t marker = object.start < _table ? byteAt(object.start) : 0;
    const std::size_t width = std::size_t{1} << (marker & 3);
    if (marker >> 4 != Kind::Integer || (marker & 0x0F) > 3 || _table - object.start <= width)
      return fail("broken count");
    object.bytes = numberAt(object.start + 1, width);
    object.start += 1 + width;
    return object.bytes <= _bytes.size() || fail("impossible count");
  }

  bool scaleCount(Object& object) {
    switch (object.kind) {
      case Kind::Data:
      case Kind::ASCIIString:
        return true;
      case Kind::UTF16String:
        object.bytes *= 2;
        return true;
      case Kind::Array:
      case Kind::Set:
        object.references = object.bytes;
        break;
      case Kind::Dictionary:
        object.references = object.bytes * 2;
        break;
      default:
        return fail("unknown kind of object");
    }
    object.bytes = object.references * _referenceWidth;
    return true;
  }

  void walk() {
    if (!enter(_root)) return;
    while (!_path.empty()) {
      Frame& frame = _path.back();
      if (frame.next == frame.object.references) {
        _nodes[frame.number].state = State::Done;
        _path.pop_back();
        continue;
      }
      const auto place = frame.object.start + static_cast<std::size_t>(frame.next) * _referenceWidth;
      const std::uint64_t number = numberAt(place, _referenceWidth);
      if (number >= _nodes.size()) return void(fail("reference to an object that does not exist"));
      const auto child = static_cast<std::size_t>(number);
      const bool isKey = frame.object.kind == Kind::Dictionary && frame.next < frame.object.references / 2;
      if (_nodes[child].state == State::Open) return void(fail("object that contains itself"));
      if (_nodes[child].state == State::Unknown) {
        if (!enter(child)) return;
        if (_nodes[child].state == State::Open) continue;
      }
      if (isKey && !_nodes[child].isKey) return void(fail("key that is no string or holds a NUL"));
      ++frame.next;
      if (!addChild(_nodes[frame.number], _nodes[child])) return;
    }
  }

  /// The library ends the process at a key with a NUL.
  [[nodiscard]] bool canBeKey(const Object& object) const {
    const std::string_view contents = _bytes.substr(object.start, static_cast<std::size_t>(object.bytes));
    if (object.kind == Kind::ASCIIString) return contents.find('\0') == std::string_view::npos;
    if (object.kind != Kind::UTF16String) return false;
    for (std::size_t i = 0; i < contents.size(); i += 2) {
      if (contents[i] == '\0' && contents[i + 1] == '\0') return false;
    }
    return true;
  }

  /// Meets an object for the first time. A container stays open; its parent meets it again when it is done.
  bool enter(std::size_t number) {
    Object object;
    if (!decode(number, object)) return false;
    Node& node = _nodes[number];
    node.expandedBytes = kBytesPerReference + object.bytes;
    node.isKey = canBeKey(object);
    if (object.kind < Kind::Array) {
      node.state = State::Done;
      return true;
    }
    node.state = State::Open;
    node.height = 1;
    if (_path.size() >= kMaximumPropertyListDepth) return fail("nested too deep");
    _path.push_back({number, object, 0});
    return true;
  }

  bool addChild(Node& parent, const Node& child) {
    parent.expandedBytes += child.expandedBytes;
    parent.height = std::max<std::uint8_t>(parent.height, static_cast<std::uint8_t>(child.height + 1));
    if (parent.height > kMaximumPropertyListDepth) return fail("nested too deep");
    // Checked at each step, so the sum can't overflow.
    return parent.expandedBytes <= kMaximumExpansion * _bytes.size() + kExpansionAllowanceBytes ||
           fail("shared objects that take up far more than the list");
  }

  std::string_view _bytes;
  std::size_t _table = 0;
  std::size_t _root = 0;
  std::size_t _offsetWidth = 0;
  std::size_t _referenceWidth = 0;
  std::uint64_t _contents = 0;
  std::vector<Node> _nodes;
  std::vector<Frame> _path;
  std::string _fault;
};

static_assert(kMaximumPropertyListDepth < std::numeric_limits<std::uint8_t>::max());

}  // namespace

std::string binaryPropertyListFault(std::string_view bytes) { return BinaryWalk(bytes).fault(); }

}  // namespace tallyd::platform
