// Turns a storebag into live backends.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/TallyBackend.h"
#include "platform/Value.h"

namespace tallyd {

class SessionBook;

/// Makes the backend that a storebag's entry asks for, or none: TallyBackend::newBackendWithName, unless a
/// test brings backends of its own.
using BackendFactory = std::function<std::shared_ptr<TallyBackend>(
    const platform::Platform& platform, std::string_view name, const TallyBackend::Payload& profile,
    const std::optional<std::string>& productFamily, std::int32_t clientType)>;

/// By storebag key, in the order of the keys.
using BackendSet = std::map<std::string, std::shared_ptr<TallyBackend>, std::less<>>;

/// One backend for every entry of the storebag that makes one, stamped with the session's, the client's and
/// the device's identity. Nothing, after a line in the log, without a storebag or session info.
///
/// The backends borrow the platform and keep the pointer `deviceID`, a terminated text: both must outlive
/// them. Each backend gets an account of its own in `book`, if there is one.
[[nodiscard]] std::optional<BackendSet> createBackendsFromStorebag(
    const platform::Platform& platform, const std::optional<platform::Dictionary>& storebag,
    const std::optional<platform::Dictionary>& sessionInfo,
    const std::optional<platform::Dictionary>& userInfo, const char* deviceID,
    const BackendFactory& newBackend = TallyBackend::newBackendWithName, SessionBook* book = nullptr);

}  // namespace tallyd
