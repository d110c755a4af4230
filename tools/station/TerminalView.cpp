#include "station/TerminalView.h"

#include <fmt/format.h>

#include <algorithm>
#include <string>

namespace tallyd::station {

void TerminalView::showRecord(std::string_view readable, std::string_view record) {
  if (_records == Records::JSON) writeLine(_output, record);
  if (_records != Records::Readable) return;
  for (std::size_t end = readable.find('\n'); end != std::string_view::npos; end = readable.find('\n')) {
    writeLine(_output, readable.substr(0, end));
    readable.remove_prefix(end + 1);
  }
  writeLine(_output, readable);
}

void TerminalView::showAside(std::string_view line) {
  if (_records == Records::Readable) writeLine(_output, line);
}

void TerminalView::showNotice(std::string_view line) {
  writeLine(_records == Records::JSON ? _problems : _output, line);
}

void TerminalView::showProblem(std::string_view line) {
  writeLine(_problems, fmt::format("tally-station: {}", line));
}

void TerminalView::writeLine(std::ostream& stream, std::string_view line) {
  std::string shown(line);
  std::replace_if(
      shown.begin(), shown.end(), [](unsigned char c) { return c < 0x20 || c == 0x7f; }, '?');
  const std::lock_guard lock(_mutex);
  stream << shown << '\n' << std::flush;
}

}  // namespace tallyd::station
