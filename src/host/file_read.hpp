// Reading an opened file whole. On Windows the host's handle is a file
// handle read with ReadFile; elsewhere it is a file descriptor read once.
#pragma once

#include <cstdint>

#include "host/platform.hpp"

namespace sorvel {

// One read of up to `size` bytes; gives the count read, 0 when the read fails.
std::uint32_t read_once(word handle, void* buffer, std::uint32_t size) noexcept;

}  // namespace sorvel
