// Every allocation the library makes goes through here: one seam, so that
// tests can stand their own counting allocator behind it (at link time, or
// through a loaded DLL's imports of the C runtime's allocator).
#pragma once

#include <cstddef>

namespace sorvel::memory {

// Null when the allocation fails.
void* allocate(std::size_t bytes) noexcept;
void release(void* block) noexcept;

}  // namespace sorvel::memory
