// Sends many messages without waiting for each answer.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>

#include "framework/TallyConnection.h"
#include "tallyctl/Message.h"

namespace tallyd::tallyctl {

/// Keeps up to a window of calls under way, so that a long input is neither held in memory nor slowed down by
/// the way to the daemon and back.
///
/// Threading: one thread sends; the handler runs on the connection's thread, one call at a time, in the order
/// of the calls, and must not send. The destructor waits for the answers, at most for the connection's
/// timeout.
class MessageSender {
 public:
  /// Below what the connection queues before it stops reading.
  static constexpr std::size_t kWindow = 128;

  enum class Kind { Message, Flush };
  struct Answer {
    Kind kind = Kind::Message;
    std::uint64_t number = 0;  ///< As given with the call.
    TallyReply<std::optional<std::string>> reply;
  };
  using Handler = std::function<void(const Answer& answer)>;

  struct Totals {
    std::uint64_t sent = 0;    ///< Messages that the daemon took.
    std::uint64_t failed = 0;  ///< Messages that got no answer.
    std::uint64_t failedFlushes = 0;
    [[nodiscard]] bool anyFailed() const { return failed > 0 || failedFlushes > 0; }
  };

  /// Borrows the connection.
  MessageSender(TallyConnection& connection, Handler handler);
  ~MessageSender();
  MessageSender(const MessageSender&) = delete;
  MessageSender& operator=(const MessageSender&) = delete;

  /// Both wait while the window is full.
  void send(std::uint64_t number, Message message);
  void flush(std::uint64_t number);

  [[nodiscard]] Totals totals() const;  ///< Of the answers up to now.
  Totals drain();                       ///< The same once every answer is there.

 private:
  TallyConnection::Completion<std::optional<std::string>> begin(Kind kind, std::uint64_t number);
  void finish(const Answer& answer);

  TallyConnection& _connection;
  const Handler _handler;
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  std::size_t _underWay = 0;
  Totals _totals;
};

}  // namespace tallyd::tallyctl
