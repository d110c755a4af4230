#include "backends/upload/UploadURL.h"

#include <fmt/format.h>

namespace tallyd {

namespace {

constexpr std::string_view kDescription = "Parlor QPRC log";

bool isHexadecimal(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}

bool isUnreserved(char c) {
  return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '-' || c == '.' ||
         c == '_' || c == '~';
}

bool isReserved(char c) {
  constexpr std::string_view kReserved = ":/?#[]@!$&'()*+,;=";
  return kReserved.find(c) != std::string_view::npos;
}

}  // namespace

std::string uploadURLForFile(std::string_view endpoint, std::string_view deviceID, std::uint32_t sessionID,
                             std::string_view path) {
  const std::string fileName = std::string(lastPathComponent(path)) + ".gz";
  return fmt::format("{}?uuid={}&sequence={}&description={}%20(Uploaded%20by%20PHS)&filename={}&raw=true",
                     endpoint, deviceID, sessionID, percentEscaped(kDescription), percentEscaped(fileName));
}

std::string percentEscaped(std::string_view text) {
  std::string escaped;
  escaped.reserve(text.size());
  for (const char c : text) {
    if (isUnreserved(c)) {
      escaped += c;
    } else {
      escaped += fmt::format("%{:02X}", static_cast<unsigned char>(c));
    }
  }
  return escaped;
}

bool hasURLCharactersOnly(std::string_view text) {
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%') {
      if (text.size() - i < 3 || !isHexadecimal(text[i + 1]) || !isHexadecimal(text[i + 2])) return false;
    } else if (!isUnreserved(text[i]) && !isReserved(text[i])) {
      return false;
    }
  }
  return true;
}

std::string_view lastPathComponent(std::string_view path) {
  const auto end = path.find_last_not_of('/');
  if (end == std::string_view::npos) return path.substr(0, 1);
  path = path.substr(0, end + 1);
  return path.substr(path.rfind('/') + 1);  // Without a slash: the whole.
}

}  // namespace tallyd
