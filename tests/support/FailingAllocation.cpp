#include "support/FailingAllocation.h"

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <new>

// The program's allocation is replaced, as the language allows. It stands apart from every use, else the
// compiler sees a free() behind somebody's new.

namespace {

std::atomic<std::thread::id> failingThread;
std::atomic<int> allocationsLeft{0};  ///< Up to and with the one that fails.
thread_local std::size_t smallestFailing = SIZE_MAX;

bool isToFail(std::size_t size) {
  if (size >= smallestFailing) return true;
  return allocationsLeft.load() > 0 && failingThread.load() == std::this_thread::get_id() &&
         allocationsLeft.fetch_sub(1) == 1;
}

}  // namespace

void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
  return isToFail(size) ? nullptr : std::malloc(size == 0 ? 1 : size);
}

void* operator new(std::size_t size) {
  if (void* memory = operator new(size, std::nothrow)) return memory;
  throw std::bad_alloc();
}

void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }

namespace tallyd::test {

OneFailingAllocation::OneFailingAllocation(std::thread::id thread, int number) {
  failingThread = thread;
  allocationsLeft = number;
}

OneFailingAllocation::~OneFailingAllocation() { allocationsLeft = 0; }

bool OneFailingAllocation::hasFailed() const { return allocationsLeft.load() <= 0; }

FailingLargeAllocations::FailingLargeAllocations(std::size_t smallestBytes) {
  smallestFailing = smallestBytes;
}

FailingLargeAllocations::~FailingLargeAllocations() { smallestFailing = SIZE_MAX; }

}  // namespace tallyd::test
