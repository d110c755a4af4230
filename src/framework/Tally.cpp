#include "framework/Tally.h"

#include "platform/Platform.h"
#include "platform/Settings.h"

namespace tallyd {

std::optional<std::string> Tally::bundleVersion() const {
  const auto version = _platform.frameworkBundle.infoValue("CFBundleVersion");
  if (!version || !version->string()) return std::nullopt;
  return std::string(*version->string());
}

std::optional<std::string> Tally::getPersistentIdentifierForDNU(bool consented) const {
  const auto identifier = _platform.device.machineIdentifier(consented ? "com.quillon.tally.client.consented"
                                                                       : "com.quillon.tally.client.override");
  if (!identifier) return std::nullopt;
  return platform::uuidText(*identifier);
}

}  // namespace tallyd
