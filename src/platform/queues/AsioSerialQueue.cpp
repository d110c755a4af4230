#include "platform/queues/AsioSerialQueue.h"

#include <asio/dispatch.hpp>
#include <asio/io_context.hpp>
#include <asio/post.hpp>
#include <asio/steady_timer.hpp>
#include <asio/strand.hpp>
#include <cstdlib>
#include <exception>
#include <utility>

#include "platform/Fatal.h"
#include "platform/Log.h"

namespace tallyd::platform {

EventLoop::EventLoop(Log* toBorrow) : log(toBorrow), context(std::make_unique<asio::io_context>()) {}

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
  asio::post(_strand->strand,
             [self = shared_from_this(), work = std::move(work)]() noexcept { self->run(work); });
}

void AsioSerialQueue::dispatch(Work work) {
  if (_loop.stopping) return;
  asio::dispatch(_strand->strand,
                 [self = shared_from_this(), work = std::move(work)]() noexcept { self->run(work); });
}

void AsioSerialQueue::asyncAfter(std::chrono::milliseconds delay, Work work) {
  if (_loop.stopping) return;
  auto timer = std::make_unique<asio::steady_timer>(*_loop.context, delay);
  auto& waiting = *timer;
  waiting.async_wait([self = shared_from_this(), timer = std::move(timer),
                      work = std::move(work)](const asio::error_code& error) mutable noexcept {
    if (!error) self->mustHaveMemory([&] { self->dispatch(std::move(work)); });
  });
}

void AsioSerialQueue::run(const Work& work) const noexcept {
  if (!_loop.log) return work();
  try {
    work();
  } catch (const std::exception& exception) {
    asl_log(*_loop.log, LogLevel::Critical, "Gave up work on queue {}: {}", _label, exception.what());
  } catch (...) {
    asl_log(*_loop.log, LogLevel::Critical, "Gave up work on queue {}", _label);
  }
}

void AsioSerialQueue::endWithoutMemory() const noexcept {
  if (_loop.log)
    fatalFailure(*_loop.log, FatalFailures::EndProcess, "No memory for the events of queue {}", _label);
  std::abort();
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
