#include "backends/dashboard/LocalLog.h"

#include <fmt/format.h>

#include <iterator>

#include "backends/TallyBackend.h"
#include "backends/dashboard/Datagram.h"
#include "platform/UTF8.h"

namespace tallyd {

std::string writeLocalLog(std::string_view datagram) {
  const auto textAt = [datagram](DatagramOffset offset, std::size_t length) {
    const std::string_view text = datagram.substr(offset, length);
    return text.substr(0, text.find('\0'));
  };
  std::string line;
  fmt::format_to(std::back_inserter(line), "{}.{:03} {} 127.0.0.1 {} {:5} {:5} {:5} {:5} {:5} {}",
                 datagramNumber32(datagram, DatagramSeconds),
                 datagramByte(datagram, DatagramSubsecond) * (kDatagramSubsecondMicroseconds / 1000),
                 textAt(DatagramDeviceID, kDatagramDeviceIDBytes),
                 codeForClientType(datagramByte(datagram, DatagramClientType)),
                 static_cast<std::uint16_t>(~datagramNumber16(datagram, DatagramClientVersion)),
                 ~datagramNumber32(datagram, DatagramSessionID), datagramNumber16(datagram, DatagramEventID),
                 datagramNumber16(datagram, DatagramMethod), datagramNumber16(datagram, DatagramRespCode),
                 textAt(DatagramText, std::string_view::npos));
  // Cut last: what stands in for a broken byte is longer than that.
  line = platform::withBrokenUTF8Replaced(line);
  line.resize(platform::wholeUTF8Characters(line, kMaximumLocalLogBytes).size());
  return line;
}

}  // namespace tallyd
