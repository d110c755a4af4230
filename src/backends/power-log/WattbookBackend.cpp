#include "backends/power-log/WattbookBackend.h"

#include "platform/Platform.h"
#include "platform/PowerLog.h"

namespace tallyd {

std::shared_ptr<WattbookBackend> WattbookBackend::initWithName(
    const platform::Platform& platform, std::string_view name, const Payload& profile,
    const std::optional<std::string>& productFamily) {
  return std::shared_ptr<WattbookBackend>(new WattbookBackend(platform, name, profile, productFamily));
}

TallyBackend::Result WattbookBackend::sendMessage(const Payload& payload, const timeval& /*timestamp*/,
                                                  std::uint16_t method, std::uint16_t respCode,
                                                  std::uint16_t eventID) {
  if (method == 0 || !payload || payload->empty()) {
    _account->dropNew(method == 0 ? DropReason::NoMethod : DropReason::NoPayload, 1, {{method, eventID}});
    return std::nullopt;
  }
  Dictionary record = *payload;
  record.set("method", unsigned{method});
  record.set("respCode", unsigned{respCode});
  record.set("event", unsigned{eventID});
  _platform.powerLog.WBLogRegisteredEvent(kEventNumber, kEventName, record);
  _account->send();
  _account->show("power", [&](TapLine& line) { line.add("name", kEventName).add("record", record); });
  return std::nullopt;
}

}  // namespace tallyd
