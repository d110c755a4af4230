#include "replay/Trace.h"

namespace tallyd::replay {

namespace {

bool isHexadecimal(char c) { return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f'); }

/// Cuts the digits of every "0x…".
void leaveOutAddresses(std::string& text) {
  for (auto found = text.find("0x"); found != std::string::npos; found = text.find("0x", found + 2)) {
    std::size_t end = found + 2;
    while (end < text.size() && isHexadecimal(text[end])) ++end;
    text.erase(found + 2, end - found - 2);
  }
}

void leaveOutAll(std::string& text, const std::string& part) {
  if (part.empty()) return;
  for (auto found = text.find(part); found != std::string::npos; found = text.find(part, found)) {
    text.erase(found, part.size());
  }
}

/// The file system stamps files with the real time.
void leaveOutFileDate(std::string& text) {
  const bool namesDate = text.find("Created new tallyd log file") != std::string::npos ||
                         text.find("Found existing tallyd log file") != std::string::npos;
  if (const auto date = text.rfind(" ("); namesDate && date != std::string::npos) text.erase(date);
}

void keepOnOneLine(std::string& text) {
  for (auto found = text.find('\n'); found != std::string::npos; found = text.find('\n', found)) {
    text.replace(found, 1, "\\n");
  }
}

}  // namespace

void Trace::write(std::string_view kind, std::string_view text) {
  std::string line(text);
  leaveOutAddresses(line);
  leaveOutAll(line, _root);
  leaveOutFileDate(line);
  keepOnOneLine(line);
  _text += fmt::format("{} {} {}\n", time(), kind, line);
  ++_lines;
}

std::string Trace::time() const {
  const auto now = _queues.now().count();
  return fmt::format("{:02}:{:02}:{:02}.{:03}", now / 3'600'000, now / 60'000 % 60, now / 1000 % 60,
                     now % 1000);
}

}  // namespace tallyd::replay
