#include "station/ReceivedDatagram.h"

#include <fmt/format.h>

#include <array>
#include <vector>

namespace tallyd::station {

using platform::Dictionary;

namespace {

constexpr std::size_t kHeaderBytes = 64;
constexpr std::size_t kLongestTextBytes = 1023;
constexpr std::uint8_t kLayout = 1;
constexpr double kSecondsPerStep = 0.004;

constexpr std::uint16_t kReliableFlag = 1;
constexpr std::uint16_t kNoProfileFlag = 2;

constexpr std::array kSenders = {"KP", "WD", "YBF", "HJ", "ZU", "PH", "VT", "DH", "LB", "BW", "HT", "FN"};

/// Takes a header's fields one after the other, in the order in which they stand.
class HeaderReader {
 public:
  explicit HeaderReader(std::string_view bytes) : _rest(bytes) {}

  std::uint8_t byte() { return static_cast<std::uint8_t>(text(1)[0]); }
  std::uint16_t number16() {
    const unsigned high = byte();
    return static_cast<std::uint16_t>(high << 8 | byte());
  }
  std::uint32_t number32() {
    const std::uint32_t high = number16();
    return high << 16 | number16();
  }
  std::uint16_t inverted16() { return static_cast<std::uint16_t>(number16() ^ 0xFFFFU); }
  std::uint32_t inverted32() { return number32() ^ 0xFFFFFFFFU; }
  std::string_view text(std::size_t length) {
    const std::string_view taken = _rest.substr(0, length);
    _rest.remove_prefix(length);
    return taken;
  }

 private:
  std::string_view _rest;
};

DatagramResult problem(std::string text) { return {std::nullopt, std::move(text)}; }

std::string unescaped(std::string_view value) {
  std::string plain;
  for (std::size_t i = 0; i < value.size(); ++i) {
    const bool isEscape = value[i] == '\\' && i + 1 < value.size();
    if (isEscape) ++i;
    plain += value[i];
  }
  return plain;
}

struct Key {
  std::size_t start;
  std::size_t sign;  ///< Its equals sign.
};

/// Every equals sign that no backslash escapes, with the word in front of it.
std::vector<Key> keysIn(std::string_view text) {
  std::vector<Key> keys;
  std::size_t wordStart = 0;
  bool isInValue = false;  // Since the last blank there was an equals sign already.
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\') {
      ++i;
    } else if (text[i] == ' ') {
      wordStart = i + 1;
      isInValue = false;
    } else if (text[i] == '=' && !isInValue) {
      keys.push_back({wordStart, i});
      isInValue = true;
    }
  }
  return keys;
}

}  // namespace

DatagramResult decodeDatagram(std::string_view bytes) {
  if (bytes.size() < kHeaderBytes) return problem(fmt::format("it has {} bytes only", bytes.size()));
  HeaderReader reader(bytes);
  ReceivedDatagram datagram;
  datagram.selfVersion = reader.byte();
  datagram.clientType = reader.byte();
  const std::uint8_t layout = reader.byte();
  const std::uint8_t steps = reader.byte();
  datagram.sentTime = reader.number32() + steps * kSecondsPerStep;
  datagram.session = reader.inverted32();
  datagram.clientVersion = reader.inverted16();
  const std::uint16_t length = reader.inverted16();
  datagram.method = reader.number16();
  datagram.status = reader.number16();
  const std::string_view device = reader.text(40);
  datagram.device = device.substr(0, device.find('\0'));
  datagram.eventNumber = reader.number16();
  const std::uint16_t flags = reader.number16();
  datagram.isReliable = (flags & kReliableFlag) != 0;
  datagram.hasNoProfile = (flags & kNoProfileFlag) != 0;
  datagram.text = bytes.substr(kHeaderBytes);

  if (layout != kLayout) return problem(fmt::format("its layout is {}, not {}", layout, kLayout));
  if (length != bytes.size()) {
    return problem(fmt::format("it has {} bytes, and says that it has {}", bytes.size(), length));
  }
  return {std::move(datagram), {}};
}

std::string_view datagramHeader(std::string_view bytes) { return bytes.substr(0, kHeaderBytes); }

std::string_view acknowledgementOf(std::string_view bytes) { return datagramHeader(bytes); }

Dictionary fieldsOfText(std::string_view text) {
  const std::vector<Key> keys = keysIn(text);
  std::vector<Dictionary::Entry> fields;
  for (std::size_t i = 0; i < keys.size(); ++i) {
    const std::size_t valueStart = keys[i].sign + 1;
    const bool isLast = i + 1 == keys.size();
    // The blank in front of the next key belongs to neither.
    const std::size_t valueEnd = isLast ? text.size() : keys[i + 1].start - 1;
    fields.push_back({std::string(text.substr(keys[i].start, keys[i].sign - keys[i].start)),
                      unescaped(text.substr(valueStart, valueEnd - valueStart))});
  }
  return Dictionary(std::move(fields));
}

bool mayBeCut(std::string_view text) { return text.size() >= kLongestTextBytes; }

std::string senderNamed(std::uint8_t clientType) {
  return clientType < kSenders.size() ? kSenders[clientType] : std::to_string(clientType);
}

}  // namespace tallyd::station
