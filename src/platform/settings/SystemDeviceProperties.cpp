#include "platform/settings/SystemDeviceProperties.h"

#include <fmt/format.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <sys/utsname.h>

#include <algorithm>

#include "platform/settings/PropertyListFile.h"

namespace tallyd::platform {

namespace {

using Digest = std::array<std::uint8_t, 32>;

/// HMAC-SHA256 of `message`; the machine ID as the key can't be found from it.
std::optional<Digest> keyedDigest(const MachineID& key, std::string_view message) {
  Digest digest{};
  unsigned length = 0;
  const auto* bytes = reinterpret_cast<const unsigned char*>(message.data());
  if (!HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()), bytes, message.size(), digest.data(),
            &length)) {
    return std::nullopt;
  }
  return digest;
}

std::optional<std::string> kernelRelease() {
  utsname names{};
  if (::uname(&names) != 0 || names.release[0] == '\0') return std::nullopt;
  return names.release;
}

}  // namespace

SystemDeviceProperties::SystemDeviceProperties(const Root& root, Log& log, std::filesystem::path systemRoot)
    : _machine(std::move(systemRoot)),
      _configured(std::make_unique<PropertyListFile>(root.under("/etc/tally/device.plist"), log)) {}

SystemDeviceProperties::~SystemDeviceProperties() = default;

std::optional<std::string> SystemDeviceProperties::GNCopyAnswer(std::string_view question) const {
  const Dictionary configured = _configured->contents();
  if (const auto answer = configured.string(question)) return std::string(*answer);
  return systemAnswer(question);
}

std::optional<std::string> SystemDeviceProperties::systemAnswer(std::string_view question) const {
  const auto either = [](std::optional<std::string> first, auto second) { return first ? first : second(); };
  if (question == "UniqueDeviceID") return uniqueDeviceID();
  if (question == "ProductVersion") return _machine.osRelease("VERSION_ID");
  if (question == "BuildVersion") return either(_machine.osRelease("BUILD_ID"), kernelRelease);
  if (question == "DeviceName") return _machine.chassis();
  if (question == "ProductType") {
    return either(_machine.dmi("product_name"), [this] { return _machine.deviceTree("compatible"); });
  }
  if (question == "HWModelStr") {
    return either(_machine.dmi("board_name"), [this] { return _machine.deviceTree("model"); });
  }
  if (question == "SerialNumber") {
    return either(_machine.dmi("product_serial"), [this] { return _machine.deviceTree("serial-number"); });
  }
  return std::nullopt;
}

std::optional<std::string> SystemDeviceProperties::uniqueDeviceID() const {
  constexpr std::size_t kBytes = 20;
  const auto id = _machine.machineID();
  const auto digest = id ? keyedDigest(*id, "com.quillon.tallyd UniqueDeviceID") : std::nullopt;
  if (!digest) return std::nullopt;
  std::string text;
  for (std::size_t i = 0; i < kBytes; ++i) fmt::format_to(std::back_inserter(text), "{:02x}", (*digest)[i]);
  return text;
}

std::optional<UUIDBytes> SystemDeviceProperties::machineIdentifier(std::string_view purpose) const {
  {
    const std::lock_guard lock(_identifiersMutex);
    const auto known = _identifiers.find(purpose);
    if (known != _identifiers.end()) return known->second;
  }
  const auto id = _machine.machineID();
  const auto digest = id ? keyedDigest(*id, purpose) : std::nullopt;
  if (!digest) return std::nullopt;
  UUIDBytes uuid{};
  std::copy_n(digest->begin(), uuid.size(), uuid.begin());
  uuid[6] = static_cast<std::uint8_t>((uuid[6] & 0x0F) | 0x40);
  uuid[8] = static_cast<std::uint8_t>((uuid[8] & 0x3F) | 0x80);
  const std::lock_guard lock(_identifiersMutex);
  return _identifiers.try_emplace(std::string(purpose), uuid).first->second;
}

}  // namespace tallyd::platform
