// The one place that knows about calling conventions, export visibility and
// the width of a host word.
#pragma once

#include <cstdint>

// Every export, handler and host routine uses the standard calling convention
// on 32-bit x86 (the product), and the platform's only convention elsewhere.
#if defined(__i386__)
#define SORVEL_CALL __attribute__((stdcall))
#else
#define SORVEL_CALL
#endif

// On Windows the .def file decides what is exported; elsewhere the shared
// object is built with hidden visibility and only these names are visible.
#if defined(_WIN32)
#define SORVEL_EXPORT extern "C"
#else
#define SORVEL_EXPORT extern "C" __attribute__((visibility("default")))
#endif

namespace sorvel {

// A host word: 32 bits on the product, pointer-sized on 64-bit builds.
// Integers and handles are sign-extended into it, float bits zero-extended.
using word = std::intptr_t;

constexpr std::int32_t low32(word w) noexcept {
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(static_cast<std::uintptr_t>(w)));
}

constexpr word from_bits(std::uint32_t bits) noexcept {
    return static_cast<word>(static_cast<std::uintptr_t>(bits));
}

}  // namespace sorvel
