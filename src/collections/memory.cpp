#include "collections/memory.hpp"

#include <cstdlib>

namespace sorvel::memory {

void* allocate(std::size_t bytes) noexcept {
    return std::malloc(bytes == 0 ? 1 : bytes);
}

void release(void* block) noexcept {
    std::free(block);
}

}  // namespace sorvel::memory
