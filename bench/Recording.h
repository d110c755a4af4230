// What a client program sends, recorded once and replayed as fast as a socket takes it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::bench {

enum class Posting {
  Batched,    ///< The session asks for batches.
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
  std::string flushAndAnswer;   ///< The same call; wants an answer.
};

/// Has the client library talk to a socket of this function's own. The session requires user info and gives
/// some, so that the storebag's rules and filters count.
[[nodiscard]] Recording recordClient(Posting posting);

/// A connection that replays a recording, so that load costs next to nothing on the client's side.
///
/// Calls block. Throws std::system_error when the connection breaks. Threading: one thread at a time.
class ReplayingClient {
 public:
  /// For sendEvents().
  static constexpr std::size_t kNoFlush = 0;

  /// Connects and authenticates. Borrows the recording.
  ReplayingClient(const std::filesystem::path& socketPath, const Recording& recording);
  /// The same for many at once: they are all connected before the first is waited for.
  [[nodiscard]] static std::vector<ReplayingClient> crowd(std::size_t size,
                                                          const std::filesystem::path& socketPath,
                                                          const Recording& recording);

  /// Sends a message that wants an answer, waits for it and returns its bytes behind the fixed header; an
  /// error is thrown as std::runtime_error.
  std::string call(std::string_view message);
  /// Sends a message that wants none.
  void send(std::string_view message);
  /// Sends the events `first` to `first` + `count` - 1 in chunks of kBatchSize, of which `count` is a
  /// multiple, and a flush after every `flushEvery` of them.
  void sendEvents(std::size_t first, std::size_t count, std::size_t flushEvery);

 private:
  explicit ReplayingClient(const Recording& recording);

  void connect(const std::filesystem::path& socketPath);
  void awaitAcceptance() const;
  void append(std::string& chunk, std::string_view message);
  void write(std::string_view bytes) const;
  void read(char* bytes, std::size_t length) const;

  const Recording& _recording;
  platform::FileDescriptor _socket;
  std::uint32_t _serial = 0;
};

}  // namespace tallyd::bench
