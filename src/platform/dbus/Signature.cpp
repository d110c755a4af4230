#include "platform/dbus/Signature.h"

namespace tallyd::platform::dbus {

namespace {

constexpr std::string_view kBasicTypes = "ybnqiuxtdsogh";

bool isBasic(char type) { return kBasicTypes.find(type) != std::string_view::npos; }

struct Depth {
  int arrays = 0;
  int structures = 0;
};

/// Moves `at` behind one complete type; false when there is none.
bool skipCompleteType(std::string_view signature, std::size_t& at, Depth depth);

bool skipDictionaryEntry(std::string_view signature, std::size_t& at, Depth depth) {
  if (at >= signature.size() || !isBasic(signature[at++])) return false;
  ++depth.structures;
  if (depth.structures > kMaximumSignatureDepth || !skipCompleteType(signature, at, depth)) return false;
  return at < signature.size() && signature[at++] == '}';
}

bool skipStructure(std::string_view signature, std::size_t& at, Depth depth) {
  ++depth.structures;
  if (depth.structures > kMaximumSignatureDepth || !skipCompleteType(signature, at, depth)) return false;
  while (at < signature.size() && signature[at] != ')') {
    if (!skipCompleteType(signature, at, depth)) return false;
  }
  return at < signature.size() && signature[at++] == ')';
}

bool skipCompleteType(std::string_view signature, std::size_t& at, Depth depth) {
  if (at >= signature.size()) return false;
  const char type = signature[at++];
  if (isBasic(type) || type == 'v') return true;
  if (type == '(') return skipStructure(signature, at, depth);
  if (type != 'a' || ++depth.arrays > kMaximumSignatureDepth) return false;
  if (at < signature.size() && signature[at] == '{') return skipDictionaryEntry(signature, ++at, depth);
  return skipCompleteType(signature, at, depth);
}

}  // namespace

std::size_t completeTypeLength(std::string_view signature) {
  std::size_t length = 0;
  while (length < signature.size() && signature[length] == 'a') ++length;
  int open = 0;
  while (length < signature.size()) {
    const char type = signature[length++];
    if (type == '(' || type == '{') ++open;
    if (type == ')' || type == '}') --open;
    if (open == 0) break;
  }
  return length;
}

bool isValidSignature(std::string_view signature) {
  if (signature.size() > kMaximumSignatureBytes) return false;
  std::size_t at = 0;
  while (at < signature.size()) {
    if (!skipCompleteType(signature, at, {})) return false;
  }
  return true;
}

bool isOneCompleteType(std::string_view signature) {
  if (signature.size() == 1) return isBasic(signature[0]) || signature[0] == 'v';
  std::size_t at = 0;
  return signature.size() <= kMaximumSignatureBytes && skipCompleteType(signature, at, {}) &&
         at == signature.size();
}

std::size_t alignmentOf(char type) {
  switch (type) {
    case 'n':
    case 'q':
      return 2;
    case 'b':
    case 'i':
    case 'u':
    case 'h':
    case 's':
    case 'o':
    case 'a':
      return 4;
    case 'x':
    case 't':
    case 'd':
    case '(':
    case '{':
      return 8;
    default:
      return 1;
  }
}

}  // namespace tallyd::platform::dbus
