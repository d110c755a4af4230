// The bounds of the HTTP client, all in one place.
#pragma once

#include <chrono>
#include <cstddef>

namespace tallyd::platform {

struct HTTPLimits {
  /// Asynchronous requests that have not finished may hold this much: bodies, URLs, headers and bookkeeping.
  /// Hours of an unreachable collector must not eat the device's memory.
  std::size_t maximumPendingBytes = std::size_t{64} << 20;

  /// Headers and body of one request's responses together, redirects included. The documents that are fetched
  /// are a few kilobytes; the bound keeps a hostile server from filling the memory.
  std::size_t maximumResponseBytes = std::size_t{16} << 20;

  /// A request with no timeout of its own gives up after this long without progress: connecting, waiting for
  /// a connection, or neither sending nor receiving.
  std::chrono::seconds stallTime{60};

  /// A request ends with an error at the redirect after this many.
  int maximumRedirects = 10;

  /// Posts to a server without HTTP/2 share this many connections; more would only crowd the server.
  int maximumConnectionsPerHost = 8;

  /// Idle connections kept for later posts, of all hosts together: a handful of collectors at most.
  int maximumIdleConnections = 16;

  /// Posts handed to libcurl at one time; the others wait in the engine. A handle with its buffers takes tens
  /// of kilobytes, where a waiting post takes little more than its body. Above what one HTTP/2 connection
  /// usually carries.
  std::size_t maximumActiveTransfers = 128;

  /// Handles kept for reuse between bursts.
  std::size_t maximumIdleHandles = 8;
};

}  // namespace tallyd::platform
