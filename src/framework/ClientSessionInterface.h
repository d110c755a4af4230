// The interface that a session offers to its client, as it goes over the socket.
#pragma once

#include <cstddef>
#include <filesystem>

#include "platform/IPC.h"
#include "platform/Root.h"

namespace tallyd {

/// The methods, in the order of the interface's table.
enum class ClientSessionMethod : std::size_t {
  SetSessionInfo,
  StartConfig,
  FetchStates,
  FetchDisplayURL,
  SendMessageWithCategory,
  FlushMessages,
  UploadFileAtPath,
  UploadLogData,
  SendMessageWithSessionInfo,
};

/// "com.quillon.tallyd.ClientSessionInterface" at "/com/quillon/tallyd". A dictionary, array or string that
/// may be missing travels in an array: empty for nothing, else with the value as its only element.
[[nodiscard]] const platform::Interface& clientSessionInterface();

/// Where the service's socket lies below a root.
[[nodiscard]] std::filesystem::path tallydSocketPath(const platform::Root& root);

}  // namespace tallyd
