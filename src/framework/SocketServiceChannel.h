// The channel over a Unix socket.
#pragma once

#include <chrono>
#include <filesystem>

#include "framework/ServiceChannel.h"

namespace tallyd {

/// Channels to the socket at `path`, made without waiting: where the daemon is too busy to take a connection,
/// making one fails.
[[nodiscard]] ServiceConnector socketConnector(std::filesystem::path path,
                                               std::shared_ptr<platform::SerialQueue> queue);

/// One channel over a socket that is connected already; making another one fails.
[[nodiscard]] ServiceConnector oneTimeConnector(platform::FileDescriptor socket,
                                                std::shared_ptr<platform::SerialQueue> queue);

/// The socket for it. Waits up to `patience` while the daemon is too busy to take it. Throws
/// std::system_error that names the path.
[[nodiscard]] platform::FileDescriptor connectedSocket(const std::filesystem::path& path,
                                                       std::chrono::milliseconds patience);

}  // namespace tallyd
