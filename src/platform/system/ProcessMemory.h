// What memory this process keeps.
#pragma once

namespace tallyd::platform {

/// Makes the allocator keep what it will need again at once, a bounded amount, instead of giving it back to
/// the kernel after every batch. Call before there are other threads.
void keepFreedMemory();

/// Gives back the pages of programs and libraries that only the dynamic linker and the start have read. Those
/// that are needed again come back from the page cache by themselves.
void releaseStartPages();

}  // namespace tallyd::platform
