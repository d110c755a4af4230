#include "backends/power-log/WattbookBackend.h"

#include <system_error>

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
  const auto drop = [&](DropReason reason) {
    _account->dropNew(reason, 1, {{method, eventID}});
    return std::nullopt;
  };
  if (method == 0) return drop(DropReason::NoMethod);
  if (!payload || payload->empty()) return drop(DropReason::NoPayload);
  Dictionary record = *payload;
  record.set("method", unsigned{method});
  record.set("respCode", unsigned{respCode});
  record.set("event", unsigned{eventID});
  try {
    _platform.powerLog.WBLogRegisteredEvent(kEventNumber, kEventName, record);
  } catch (const std::system_error&) {  // The power log has said why.
    return drop(DropReason::NotRecorded);
  }
  _account->send();
  _account->show("power", [&](TapLine& line) { line.add("name", kEventName).add("record", record); });
  return std::nullopt;
}

}  // namespace tallyd
