#include "platform/system/ProcessMemory.h"

#include <link.h>
#include <malloc.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>

namespace tallyd::platform {

namespace {

/// Freed memory at the end of a heap that stays with the process, in bytes.
constexpr int kKeptBytes = 2 * 1024 * 1024;
/// Allocations from this size on are mapped for themselves, in bytes.
constexpr int kMappedBytes = 1024 * 1024;

/// Only what is never written: a page that was relocated exists nowhere else.
int releaseSegments(dl_phdr_info* object, std::size_t /*size*/, void* /*data*/) {
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  for (std::size_t i = 0; i < object->dlpi_phnum; ++i) {
    const ElfW(Phdr)& segment = object->dlpi_phdr[i];
    if (segment.p_type != PT_LOAD || (segment.p_flags & PF_W) != 0) continue;
    const std::uintptr_t start = (object->dlpi_addr + segment.p_vaddr) / page * page;
    const std::uintptr_t end = object->dlpi_addr + segment.p_vaddr + segment.p_memsz;
    if (start != 0) ::madvise(reinterpret_cast<void*>(start), end - start, MADV_DONTNEED);
  }
  return 0;
}

}  // namespace

void keepFreedMemory() {
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  ::mallopt(M_MMAP_THRESHOLD, kMappedBytes);
}

void releaseStartPages() { ::dl_iterate_phdr(releaseSegments, nullptr); }

}  // namespace tallyd::platform
