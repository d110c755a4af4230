#include "tallyctl/MessageSender.h"

#include <utility>

namespace tallyd::tallyctl {

MessageSender::MessageSender(TallyConnection& connection, Handler handler)
    : _connection(connection), _handler(std::move(handler)) {}

MessageSender::~MessageSender() { drain(); }

void MessageSender::send(std::uint64_t number, Message message) {
  auto completion = begin(Kind::Message, number);
  _connection.sendMessage(message.category, message.type, std::move(message.payload), std::move(completion));
}

void MessageSender::flush(std::uint64_t number) { _connection.flushMessages(begin(Kind::Flush, number)); }

MessageSender::Totals MessageSender::totals() const {
  const std::lock_guard lock(_mutex);
  return _totals;
}

MessageSender::Totals MessageSender::drain() {
  std::unique_lock lock(_mutex);
  _changed.wait(lock, [this] { return _underWay == 0; });
  return _totals;
}

TallyConnection::Completion<std::optional<std::string>> MessageSender::begin(Kind kind,
                                                                             std::uint64_t number) {
  std::unique_lock lock(_mutex);
  _changed.wait(lock, [this] { return _underWay < kWindow; });
  ++_underWay;
  return [this, kind, number](TallyReply<std::optional<std::string>> reply) {
    finish({kind, number, std::move(reply)});
  };
}

void MessageSender::finish(const Answer& answer) {
  _handler(answer);
  const std::lock_guard lock(_mutex);
  const bool failed = answer.reply.error.has_value();
  if (answer.kind == Kind::Flush) {
    _totals.failedFlushes += failed ? 1 : 0;
  } else {
    ++(failed ? _totals.failed : _totals.sent);
  }
  --_underWay;
  _changed.notify_one();  // Under the lock: the waiting destructor may take the condition away after it.
}

}  // namespace tallyd::tallyctl
