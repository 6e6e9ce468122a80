#include "collections/memory.hpp"

#include <cstdlib>

namespace sorvel::memory {
namespace {
// The host calls the library from one thread at a time, so plain counters do.
std::size_t live = 0;
std::uint64_t total = 0;
long fail_countdown = -1;
}  // namespace

void* allocate(std::size_t bytes) noexcept {
    if (fail_countdown >= 0 && fail_countdown-- == 0) {
        return nullptr;
    }
    void* block = std::malloc(bytes == 0 ? 1 : bytes);
    if (block != nullptr) {
        ++live;
        ++total;
    }
    return block;
}

void release(void* block) noexcept {
    if (block != nullptr) {
        --live;
        std::free(block);
    }
}

std::size_t live_allocations() noexcept { return live; }
std::uint64_t total_allocations() noexcept { return total; }
void fail_allocation_after(long n) noexcept { fail_countdown = n < 0 ? -1 : n; }

}  // namespace sorvel::memory
