// Datagrams as the station reads them, and those that the daemon makes of a payload.

#include <string>

#include "FuzzTarget.h"
#include "backends/dashboard/Datagram.h"
#include "backends/dashboard/LocalLog.h"
#include "platform/JSON.h"
#include "platform/UTF8.h"
#include "station/ReadableText.h"
#include "station/ReceivedDatagram.h"

namespace tallyd::fuzz {
namespace {

using platform::Dictionary;
using namespace station;

/// Holds no control, neither of ASCII nor of ISO/IEC 6429 (U+0080 to U+009F).
bool isQuiet(std::string_view line) {
  for (std::size_t i = 0; i < line.size(); ++i) {
    const auto byte = static_cast<unsigned char>(line[i]);
    if (byte < 0x20 || byte == 0x7F) return false;
    if (byte == 0xC2 && i + 1 < line.size() && static_cast<unsigned char>(line[i + 1]) < 0xA0) return false;
  }
  return true;
}

void checkReceived(std::string_view bytes) {
  const DatagramResult result = decodeDatagram(bytes);
  FUZZ_CHECK(result.datagram.has_value() == result.problem.empty());
  if (!result.datagram) return;
  FUZZ_CHECK(bytes.size() == DatagramText + result.datagram->text.size());
  FUZZ_CHECK(result.datagram->device.size() <= kDatagramDeviceIDBytes);
  FUZZ_CHECK(bytes.starts_with(datagramHeader(bytes)));
  const auto acknowledgement = acknowledgementOf(bytes);
  FUZZ_CHECK(acknowledgedEventID(acknowledgement) == result.datagram->eventNumber);
  // Nothing that came from the network moves a terminal's cursor.
  FUZZ_CHECK(isQuiet(readableFields(fieldsOfText(result.datagram->text))));
  FUZZ_CHECK(isQuiet(readableText(result.datagram->device)));
  FUZZ_CHECK(isQuiet(senderNamed(result.datagram->clientType)));
}

void checkMade(const Dictionary& payload, std::string_view device) {
  DatagramFacts facts;
  facts.compType = 5;
  facts.timestamp = {1'763'712'000, 250'000};
  facts.sessionID = 77;
  facts.eventID = 0xA1B2;
  facts.udid = device;
  facts.reliableUDP = true;
  const Datagram datagram(facts, payload);
  const auto bytes = datagram.bytes();
  FUZZ_CHECK(bytes.size() >= DatagramText && bytes.size() < kDatagramBufferBytes);
  FUZZ_CHECK(acknowledgedEventID(bytes) == facts.eventID);
  const DatagramResult read = decodeDatagram(bytes);
  FUZZ_CHECK(read.datagram.has_value());
  FUZZ_CHECK(read.datagram->session == facts.sessionID && read.datagram->eventNumber == facts.eventID);
  const std::string line = writeLocalLog(bytes);
  FUZZ_CHECK(line.size() <= kMaximumLocalLogBytes);
  FUZZ_CHECK(platform::withBrokenUTF8Replaced(line) == line);
}

}  // namespace
}  // namespace tallyd::fuzz

/// A datagram; or a device ID, a line feed, and a payload as JSON.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  const auto bytes = Input(data, size).takeRest();
  checkReceived(bytes);
  if (bytes.size() >= tallyd::DatagramText) (void)tallyd::writeLocalLog(bytes);
  Input input(data, size);
  const auto device = input.takeLine();
  const auto payload = tallyd::platform::valueFromJSON(input.takeRest()).value;
  if (payload && payload->dictionary()) checkMade(*payload->dictionary(), device);
  return 0;
}
