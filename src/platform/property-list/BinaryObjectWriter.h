// A binary property list ("bplist00"), written object by object.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tallyd::platform {

/// Numbers objects as they are reserved and writes them in whatever order they are put; each must be put
/// once.
///
/// The library's writer compares every object with a share of all others that grows with their number; this
/// one leaves that to its user and takes time in proportion to what is put. For at most 4 GiB.
class BinaryObjectWriter {
 public:
  using Ref = std::uint32_t;

  BinaryObjectWriter();

  /// The number of an object that is put later; the first is 0.
  [[nodiscard]] Ref reserve();

  void putBoolean(Ref at, bool value);
  void putInteger(Ref at, std::int64_t value);
  void putInteger(Ref at, std::uint64_t value);
  void putReal(Ref at, double value);
  /// UTF-8, with U+FFFD for what is none.
  void putString(Ref at, std::string_view text);
  void putData(Ref at, std::string_view bytes);
  /// What archives refer to each other's objects by.
  void putUID(Ref at, std::uint32_t number);
  void putArray(Ref at, const std::vector<Ref>& elements);
  /// Keys, which must be strings, and values.
  void putDictionary(Ref at, const std::vector<std::pair<Ref, Ref>>& entries);

  [[nodiscard]] std::size_t byteCount() const { return _bytes.size(); }
  /// The whole list, with `top` as its value. The writer is empty after that.
  [[nodiscard]] std::string finish(Ref top);

 private:
  void begin(Ref at);
  void appendCounted(std::uint8_t kind, std::size_t count);
  template <class Number>
  void append(Number number);

  std::string _bytes;
  std::vector<std::uint32_t> _offsets;  ///< Of each object, from the list's start.
};

}  // namespace tallyd::platform
