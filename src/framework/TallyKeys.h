// The names that clients and daemon agree on.
#pragma once

#include <string_view>

namespace tallyd {

// Keys of the session info dictionary.
inline constexpr std::string_view kTallySessionInfoSessionID = "SessionID";    ///< Number, unsigned 32-bit.
inline constexpr std::string_view kTallySessionInfoClientType = "ClientType";  ///< Number, signed 32-bit.
inline constexpr std::string_view kTallySessionInfoClientVersion =
    "ClientVersion";  ///< Number, low 16 bits used.
inline constexpr std::string_view kTallySessionInfoRequireUserInfo = "RequireUserInfo";  ///< Boolean.
inline constexpr std::string_view kTallySessionInfoBatchEvent = "BatchEvent";            ///< Boolean.

// Keys of the user info dictionary.
inline constexpr std::string_view kTallyUserInfoClientName = "ClientName";    ///< String.
inline constexpr std::string_view kTallyUserInfoServiceName = "ServiceName";  ///< String.

/// The storebag's second name for the HTTPS post backend.
inline constexpr std::string_view kTallyBackendHTTPPost2 = "https_post";

}  // namespace tallyd
