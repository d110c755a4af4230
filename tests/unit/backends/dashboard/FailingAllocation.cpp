#include "FailingAllocation.h"

#include <cstdint>
#include <cstdlib>
#include <new>

// The program's allocation is replaced, as the language allows. It stands apart from every use, else the
// compiler sees a free() behind somebody's new.

namespace {

thread_local std::size_t smallestFailing = SIZE_MAX;

}  // namespace

void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
  return size < smallestFailing ? std::malloc(size == 0 ? 1 : size) : nullptr;
}

void* operator new(std::size_t size) {
  if (void* memory = operator new(size, std::nothrow)) return memory;
  throw std::bad_alloc();
}

void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }

namespace tallyd::test {

FailingAllocation::FailingAllocation(std::size_t smallestBytes) { smallestFailing = smallestBytes; }
FailingAllocation::~FailingAllocation() { smallestFailing = SIZE_MAX; }

}  // namespace tallyd::test
