// What a client program sends, recorded once and replayed as fast as a socket takes it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"

namespace tallyd::bench {

enum class Posting {
  Batched,    ///< The session asks for batches; kBatchSize messages, then a flush.
  Unbatched,  ///< Each message is posted by itself.
};

/// A client's bytes, as the client library writes them; a message each but for the first.
struct Recording {
  std::string authentication;
  std::string setSessionInfo;   ///< Wants an answer.
  std::string startConfig;      ///< Wants an answer.
  std::string fetchDisplayURL;  ///< Wants an answer.
  std::string sendMessage;      ///< Event 0; wants none.
  std::string flushMessages;    ///< Wants none.
};

/// Has the client library talk to a socket of this function's own.
[[nodiscard]] Recording recordClient(Posting posting);

/// A connection that replays a recording, so that load costs next to nothing on the client's side.
///
/// Calls block. Throws std::system_error when the connection breaks. Threading: one thread at a time.
class ReplayingClient {
 public:
  /// Connects and authenticates. Borrows the recording.
  ReplayingClient(const std::filesystem::path& socketPath, const Recording& recording);

  /// Sends a message that wants an answer, and waits for it; an error is thrown as std::runtime_error.
  void call(std::string_view message);
  /// Sends the events `first` to `first` + `count` - 1; `count` is a multiple of kBatchSize.
  void sendEvents(std::size_t first, std::size_t count, Posting posting);

 private:
  void append(std::string& chunk, const std::string& message);
  void write(std::string_view bytes) const;
  void read(char* bytes, std::size_t length) const;

  const Recording& _recording;
  platform::FileDescriptor _socket;
  std::uint32_t _serial = 0;
};

}  // namespace tallyd::bench
