#include "session/FileURL.h"

#include <strings.h>

#include <algorithm>
#include <charconv>

namespace tallyd {

namespace {

/// The byte that an escape at the start of `text` stands for; -1 when there is no whole escape.
int escapedByte(std::string_view text) {
  if (text.size() < 3 || text[0] != '%') return -1;
  unsigned byte = 0;
  const auto [end, error] = std::from_chars(text.data() + 1, text.data() + 3, byte, 16);
  // A zero byte would end the path for whoever opens it and not for whoever reports it.
  return error == std::errc() && end == text.data() + 3 && byte != 0 ? static_cast<int>(byte) : -1;
}

std::string unescaped(std::string_view text) {
  std::string plain;
  while (!text.empty()) {
    const int byte = escapedByte(text);
    plain += byte < 0 ? text[0] : static_cast<char>(byte);
    text.remove_prefix(byte < 0 ? 1 : 3);
  }
  return plain;
}

}  // namespace

std::string pathOfFileURL(std::string_view url) {
  constexpr std::string_view kScheme = "file:";
  if (url.size() < kScheme.size() || strncasecmp(url.data(), kScheme.data(), kScheme.size()) != 0) {
    return std::string(url);
  }
  url.remove_prefix(kScheme.size());
  if (url.starts_with("//")) {
    url.remove_prefix(2);
    url.remove_prefix(std::min(url.find('/'), url.size()));  // The host: empty, or this one.
  }
  return unescaped(url.substr(0, url.find_first_of("?#")));
}

}  // namespace tallyd
