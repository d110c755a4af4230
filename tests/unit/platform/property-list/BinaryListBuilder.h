// Binary property lists put together object by object, wrong ones too.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace tallyd::platform {

/// One-byte references and four-byte offsets, unless a test changes the trailer.
class BinaryListBuilder {
 public:
  /// Adds the bytes of one object and returns its number.
  std::size_t add(std::string object) {
    _objects.push_back(std::move(object));
    return _objects.size() - 1;
  }

  static std::string bigEndian(std::uint64_t number, std::size_t width) {
    std::string bytes;
    for (std::size_t i = width; i-- > 0;) bytes += static_cast<char>(number >> (8 * i) & 0xFF);
    return bytes;
  }

  /// A marker with its count, in the short form where that is possible.
  static std::string start(int kind, std::uint64_t count) {
    if (count < 15) return std::string(1, static_cast<char>(kind << 4 | static_cast<int>(count)));
    return std::string(1, static_cast<char>(kind << 4 | 0x0F)) + '\x13' + bigEndian(count, 8);
  }

  std::string container(int kind, std::uint64_t count, const std::vector<std::uint64_t>& references) const {
    std::string object = start(kind, count);
    for (const std::uint64_t reference : references) object += bigEndian(reference, referenceWidth);
    return object;
  }
  std::string array(const std::vector<std::uint64_t>& references) const {
    return container(0xA, references.size(), references);
  }

  [[nodiscard]] std::string list() const {
    std::string bytes = "bplist00";
    std::string table;
    for (const std::string& object : _objects) {
      table += bigEndian(bytes.size(), offsetWidth);
      bytes += object;
    }
    const std::uint64_t tableOffset = bytes.size();
    bytes +=
        table + std::string(6, '\0') + static_cast<char>(offsetWidth) + static_cast<char>(referenceWidth);
    return bytes + bigEndian(_objects.size(), 8) + bigEndian(root, 8) + bigEndian(tableOffset, 8);
  }

  std::size_t offsetWidth = 4;
  std::size_t referenceWidth = 4;
  std::uint64_t root = 0;

 private:
  std::vector<std::string> _objects;
};

/// The list of the one object `object`.
inline std::string listOf(std::string object) {
  BinaryListBuilder builder;
  builder.add(std::move(object));
  return builder.list();
}

}  // namespace tallyd::platform
