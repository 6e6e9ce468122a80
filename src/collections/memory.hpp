// Every allocation the library makes goes through here, so that tests can
// count what is live and make any chosen allocation fail.
#pragma once

#include <cstddef>
#include <cstdint>

namespace sorvel::memory {

// Null when the allocation fails (really, or because a test asked for it).
void* allocate(std::size_t bytes) noexcept;
void release(void* block) noexcept;

std::size_t live_allocations() noexcept;
std::uint64_t total_allocations() noexcept;

// The n-th allocation from now fails (0: the next one); a negative n
// disables the failure.
void fail_allocation_after(long n) noexcept;

}  // namespace sorvel::memory
