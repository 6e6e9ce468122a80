#include "host/file_read.hpp"

#if defined(_WIN32)
#include <windows.h>
#else
#include <unistd.h>
#endif

namespace sorvel {

std::uint32_t read_once(word handle, void* buffer, std::uint32_t size) noexcept {
#if defined(_WIN32)
    DWORD read = 0;  // ReadFile sets it to zero before anything else
    ReadFile(reinterpret_cast<HANDLE>(handle), buffer, size, &read, nullptr);
    return read;
#else
    const ssize_t read = ::read(static_cast<int>(handle), buffer, size);
    return read > 0 ? static_cast<std::uint32_t>(read) : 0;
#endif
}

}  // namespace sorvel
