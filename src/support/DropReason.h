// Why something that was taken never left the daemon.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tallyd {

enum class DropReason : std::uint8_t {
  // Posted events.
  StateOff,            ///< The backend does not report.
  MethodLimit,         ///< The batch holds its limit of events of this method.
  NotPostable,         ///< No document or property list can be made of it.
  NoClientIdentifier,  ///< The document left without events, as the client has no identifier.
  PostFailed,          ///< The post ended with an error instead of a response.
  MemoryBound,         ///< The post was refused, as unfinished posts hold all the memory that they may.
  ConsentWithdrawn,    ///< The user had consented when the session started, and does not any more.
  // Datagrams.
  QueueFull,    ///< The oldest of those that waited, when one more came.
  GivenUp,      ///< Not acknowledged after the last retransmission.
  OutOfMemory,  ///< No memory for the datagram, for the document that was to be posted, or for log data.
  // Whatever a backend still had when it went.
  CleanUp,
  // Uploads.
  NotUploadable,  ///< No server to upload to, or nothing that can be read, is small enough and is not empty.
  UploadFailed,   ///< The upload ended with an error instead of a response.
  // Adaptors and the power log.
  AdaptorUnavailable,  ///< There is no adaptor, or it does not take messages.
  AdaptorThrew,
  NoMethod,     ///< Method 0 is not recorded.
  NoPayload,    ///< Nothing to record.
  NotRecorded,  ///< The power log could not write it.
  // A session's own books.
  NoBackends,     ///< The session is not started, or its storebag makes no backend.
  NoStorebag,     ///< A one-shot message for which there is no storebag.
  NoSessionInfo,  ///< A one-shot message without the identifiers that it must have.
};

inline constexpr std::array<std::string_view, 21> kDropReasonNames{
    "state-off",      "method-limit",        "not-postable",      "no-client-identifier",
    "post-failed",    "memory-bound",        "consent-withdrawn", "queue-full",
    "given-up",       "out-of-memory",       "clean-up",          "not-uploadable",
    "upload-failed",  "adaptor-unavailable", "adaptor-threw",     "no-method",
    "no-payload",     "not-recorded",        "no-backends",       "no-storebag",
    "no-session-info"};
inline constexpr std::size_t kDropReasonCount = kDropReasonNames.size();
static_assert(static_cast<std::size_t>(DropReason::NoSessionInfo) + 1 == kDropReasonCount);

/// As inspections show it, such as "method-limit".
[[nodiscard]] constexpr std::string_view nameOf(DropReason reason) {
  return kDropReasonNames[static_cast<std::size_t>(reason)];
}

}  // namespace tallyd
