#include "storebag/StorebagCache.h"

#include "platform/Platform.h"
#include "storebag/StorebagEnvironment.h"

namespace tallyd {

using platform::asl_log;
using platform::Dictionary;
using platform::FatalFailures;
using platform::LogLevel;

StorebagDecision decideStorebag(const CachedStorebag* entry, platform::TimePoint now) {
  if (!entry) return StorebagDecision::Fetch;
  const auto age = std::chrono::abs(now - entry->fetchTime);
  if (entry->fetchState == CachedStorebag::FetchState::Successful) {
    const bool fresh = age < std::chrono::seconds(entry->maxAgeSeconds);
    return fresh ? StorebagDecision::UseCached : StorebagDecision::Fetch;
  }
  const bool waiting = age < StorebagCache::kMinimumWaitAfterFailure;
  return waiting ? StorebagDecision::WaitAfterFailure : StorebagDecision::Fetch;
}

std::optional<Dictionary> StorebagCache::storebag(std::uint32_t sessionID, std::int32_t clientType) {
  asl_log(_platform.log, LogLevel::Debug, "Retrieving storebag for session {} with client type {}", sessionID,
          clientType);
  const auto name = storebagNameForClientType(clientType);
  auto cached = entry(name);
  switch (decideStorebag(cached ? &*cached : nullptr, _platform.clock.now())) {
    case StorebagDecision::UseCached:
      asl_log(_platform.log, LogLevel::Debug, "Cached storebag found for client type {}", clientType);
      return cached->storebag;
    case StorebagDecision::WaitAfterFailure:
      asl_log(_platform.log, LogLevel::Info,
              "Not fetching storebag for client type {} - must wait {} seconds between attempts", clientType,
              kMinimumWaitAfterFailure.count());
      return cached->storebag;
    case StorebagDecision::Fetch:
      break;
  }
  fetchAndCacheStorebag(clientType);
  cached = entry(name);
  return cached ? cached->storebag : std::nullopt;
}

std::optional<std::string> StorebagCache::version(std::int32_t clientType) const {
  const auto cached = entry(storebagNameForClientType(clientType));
  return cached ? cached->version : std::nullopt;
}

void StorebagCache::fetchAndCacheStorebag(std::int32_t clientType) {
  asl_log(_platform.log, LogLevel::Debug, "Fetching storebag for client type {}", clientType);
  const auto name = storebagNameForClientType(clientType);
  // Nothing would be remembered of the attempt: in a process that goes on, a client could have the server
  // asked as often as it likes.
  const bool mayAsk = name || _fatalFailures == FatalFailures::EndProcess;
  StorebagFetch fetch =
      mayAsk ? fetchStorebagForClientType(_platform, clientType, _fatalFailures) : StorebagFetch();
  asl_log(_platform.log, LogLevel::Debug, "Storebag max age: {} seconds", fetch.maxAgeSeconds);
  if (!name) {
    platform::fatalFailure(_platform.log, _fatalFailures,
                           "Client type {} has no storebag name to keep its storebag under", clientType);
  }
  if (!fetch.storebag) {
    asl_log(_platform.log, LogLevel::Critical, "Unable to fetch storebag for client type {}", clientType);
  }
  if (name) store(*name, std::move(fetch));
}

std::optional<CachedStorebag> StorebagCache::entry(std::optional<std::string_view> name) const {
  if (!name) return std::nullopt;
  const std::lock_guard lock(_mutex);
  const auto found = _entries.find(*name);
  return found == _entries.end() ? std::nullopt : std::optional(found->second);
}

void StorebagCache::store(std::string_view name, StorebagFetch fetch) {
  const auto now = _platform.clock.now();
  const std::lock_guard lock(_mutex);
  CachedStorebag& cached = _entries[std::string(name)];
  cached.fetchState =
      fetch.storebag ? CachedStorebag::FetchState::Successful : CachedStorebag::FetchState::Failure;
  if (fetch.storebag) cached.storebag = std::move(fetch.storebag);
  cached.fetchTime = now;
  cached.maxAgeSeconds = fetch.maxAgeSeconds;
  cached.version = std::move(fetch.version);
}

}  // namespace tallyd
