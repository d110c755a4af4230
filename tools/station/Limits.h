// Everything that bounds what the station holds and takes.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace tallyd::station {

/// Of one post of events, decoded; it holds at most some hundreds of events.
inline constexpr std::uint64_t kMaximumPostBytes = std::uint64_t{64} << 20;
/// Of one archive of log data, decoded; it is held in memory several times over.
inline constexpr std::uint64_t kMaximumLogDataBytes = std::uint64_t{64} << 20;
/// Of one uploaded file, decoded, and of any request: more than the daemon uploads.
inline constexpr std::uint64_t kMaximumUploadBytes = std::uint64_t{4} << 30;
/// Of the name under which an uploaded file is kept, what the station adds left aside: file systems allow
/// 255.
inline constexpr std::size_t kMaximumFileNameBytes = 180;

/// What an archive may come to with every shared object written out, each value counted as kBytesPerValue
/// and its text. More than any client's log data, and it keeps a small archive from becoming a huge record.
inline constexpr std::uint64_t kMaximumExpandedArchiveBytes = std::uint64_t{64} << 20;
inline constexpr std::uint64_t kBytesPerValue = 16;
/// How much of log data the terminal shows; the file has all of it.
inline constexpr std::size_t kShownElements = 50;
inline constexpr std::size_t kShownElementBytes = 400;

/// Datagrams whose copies are recognised: as many as one session has event numbers.
inline constexpr std::size_t kRememberedDatagrams = 65'536;
/// Datagrams, or acknowledgements, that are held back at a time; more are lost.
inline constexpr std::size_t kMaximumHeldPackets = 16'384;
/// How long a reordered datagram waits for another one to overtake it.
inline constexpr std::chrono::milliseconds kReorderPatience{250};

/// The latest records of each kind that watchers can still get: more than a burst brings before they have
/// read the first.
inline constexpr std::size_t kFeedCapacityPerKind = 10'000;
/// The latest records of each kind that a web page gets when it opens.
inline constexpr std::size_t kPageRecordsPerKind = 1000;

/// Web pages that are kept up to date at a time, by all servers together; each holds a thread of its
/// server's.
inline constexpr std::size_t kMostLivePages = 8;
/// Requests that are answered at a time, in each server; what reports come in never waits for pages.
inline constexpr std::size_t kServerThreads = 32 + kMostLivePages;
/// How long an idle connection is kept, and so how long stopping may take.
inline constexpr std::chrono::seconds kKeepAlive{1};

}  // namespace tallyd::station
