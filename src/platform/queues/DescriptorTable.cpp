#include "platform/queues/DescriptorTable.h"

#include <asio/posix/stream_descriptor.hpp>
#include <utility>

namespace tallyd::platform {

struct DescriptorTable::Registration {
  Registration(asio::io_context& loop, int descriptor) : number(descriptor), stream(loop, descriptor) {}

  const int number;
  std::size_t shares = 0;  ///< Guarded by the table's mutex.
  std::mutex mutex;        ///< Guards the stream.
  asio::posix::stream_descriptor stream;
};

DescriptorTable::DescriptorTable() = default;
DescriptorTable::~DescriptorTable() = default;

DescriptorTable::Share DescriptorTable::share(asio::io_context& loop, int descriptor) {
  const std::lock_guard lock(_mutex);
  auto& registration = _registrations[descriptor];
  if (!registration) {
    try {
      registration = std::make_unique<Registration>(loop, descriptor);
    } catch (...) {
      _registrations.erase(descriptor);
      throw;
    }
  }
  ++registration->shares;
  return {*this, *registration};
}

void DescriptorTable::giveBack(Registration& registration) {
  const std::lock_guard lock(_mutex);
  if (--registration.shares > 0) {
    const std::lock_guard streamLock(registration.mutex);
    registration.stream.cancel();  // Ends every wait; the other sources ask anew.
    return;
  }
  {
    const std::lock_guard streamLock(registration.mutex);
    registration.stream.release();
  }
  _registrations.erase(registration.number);
}

DescriptorTable::Share::Share(Share&& other) noexcept
    : _table(other._table), _registration(std::exchange(other._registration, nullptr)) {}

DescriptorTable::Share& DescriptorTable::Share::operator=(Share&& other) noexcept {
  if (this != &other) {
    if (_registration) _table->giveBack(*_registration);
    _table = other._table;
    _registration = std::exchange(other._registration, nullptr);
  }
  return *this;
}

DescriptorTable::Share::~Share() {
  if (_registration) _table->giveBack(*_registration);
}

void DescriptorTable::Share::wait(Direction direction, std::function<void(Outcome)> done) {
  using asio::posix::descriptor_base;
  const std::lock_guard lock(_registration->mutex);
  _registration->stream.async_wait(
      direction == Direction::Read ? descriptor_base::wait_read : descriptor_base::wait_write,
      [done = std::move(done)](const asio::error_code& error) noexcept {
        done(error == asio::error::operation_aborted ? Outcome::Again : Outcome::Ready);
      });
}

}  // namespace tallyd::platform
