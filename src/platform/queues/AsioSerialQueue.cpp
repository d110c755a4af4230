#include "platform/queues/AsioSerialQueue.h"

#include <asio/dispatch.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>
#include <asio/steady_timer.hpp>
#include <asio/strand.hpp>
#include <utility>

namespace tallyd::platform {

EventLoop::EventLoop() : context(std::make_unique<asio::io_context>()) {}

EventLoop::~EventLoop() {
  stopping = true;
  std::unordered_set<std::shared_ptr<SourceState>> left;
  {
    const std::lock_guard lock(sourcesMutex);
    left.swap(sources);
  }
  for (const auto& source : left) source->drop();
  left.clear();
  context.reset();  // Drops the work that is queued; the table must still be there for what that work holds.
}

struct AsioSerialQueue::Strand {
  asio::strand<asio::io_context::executor_type> strand;
};

AsioSerialQueue::AsioSerialQueue(EventLoop& loop, std::string label)
    : _loop(loop),
      _label(std::move(label)),
      _strand(std::make_unique<Strand>(Strand{asio::make_strand(*loop.context)})) {}

AsioSerialQueue::~AsioSerialQueue() = default;

void AsioSerialQueue::async(Work work) {
  if (_loop.stopping) return;
  // An exception that leaves a piece of work is a bug and ends the process.
  asio::post(_strand->strand, [self = shared_from_this(), work = std::move(work)]() noexcept { work(); });
}

void AsioSerialQueue::dispatch(Work work) {
  if (_loop.stopping) return;
  asio::dispatch(_strand->strand, [self = shared_from_this(), work = std::move(work)]() noexcept { work(); });
}

void AsioSerialQueue::asyncAfter(std::chrono::milliseconds delay, Work work) {
  if (_loop.stopping) return;
  auto timer = std::make_unique<asio::steady_timer>(*_loop.context, delay);
  auto& waiting = *timer;
  waiting.async_wait([self = shared_from_this(), timer = std::move(timer),
                      work = std::move(work)](const asio::error_code& error) mutable noexcept {
    if (!error) self->dispatch(std::move(work));
  });
}

std::unique_ptr<Source> AsioSerialQueue::makeTimer(std::chrono::milliseconds first,
                                                   std::chrono::milliseconds period, Work handler,
                                                   Work cancelHandler) {
  return makeTimerSource(shared_from_this(), first, period, std::move(handler), std::move(cancelHandler));
}

std::unique_ptr<Source> AsioSerialQueue::makeReadSource(int descriptor, Work handler, Work cancelHandler) {
  return makeDescriptorSource(shared_from_this(), descriptor, DescriptorTable::Direction::Read,
                              std::move(handler), std::move(cancelHandler));
}

std::unique_ptr<Source> AsioSerialQueue::makeWriteSource(int descriptor, Work handler, Work cancelHandler) {
  return makeDescriptorSource(shared_from_this(), descriptor, DescriptorTable::Direction::Write,
                              std::move(handler), std::move(cancelHandler));
}

}  // namespace tallyd::platform
