// What the benchmarks share: random values and the heap in use.
#pragma once

#include <benchmark/benchmark.h>

#include <cstdint>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#if defined(__GLIBC__)
#include <malloc.h>
#endif

#include "collections/collections.hpp"
#include "holder.hpp"

namespace sorvel::bench {

// Random 32-bit values (repeats possible), the same for the same seed.
inline std::vector<std::int32_t> random_ints(std::size_t n, std::uint32_t seed = 11) {
    std::mt19937 random(seed);
    std::vector<std::int32_t> v(n);
    for (auto& x : v) {
        x = static_cast<std::int32_t>(random());
    }
    return v;
}

// Alphabets of random strings.
inline constexpr std::string_view kPrintable =
    "!\"#$%&'()*+,-./0123456789:;<=>?@ABCDEFGHIJKLMNOPQRSTUVWXYZ[\\]^_`abcdefghijklmnopqrstuvwxyz{|}~";
inline constexpr std::string_view kLetters = "abcdefghijklmnopqrstuvwxyz";
// Letters of both cases, digits and "_[]": case folding matters for them.
inline constexpr std::string_view kMixedCase = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_[]";

// Random strings of 8 to 24 bytes of the alphabet (repeats possible), the
// same for the same seed.
inline std::vector<std::string> random_strings(std::size_t n, std::uint32_t seed, std::string_view alphabet) {
    std::mt19937 random(seed);
    std::vector<std::string> v(n);
    for (auto& s : v) {
        s.resize(8 + random() % 17);
        for (char& c : s) {
            c = alphabet[random() % alphabet.size()];
        }
    }
    return v;
}

// Heap bytes in use, from the C library's allocator statistics, so that its
// per-block overhead counts for every contender alike.
inline std::size_t heap_in_use() {
#if defined(__GLIBC__)
    const struct mallinfo2 info = mallinfo2();
    return info.uordblks + info.hblkhd;  // large blocks are mapped apart from the heap
#else
    return 0;
#endif
}

// Times Contains of every probe, and counts per probe.
inline void time_contains(benchmark::State& state, IntegerCollection c, const std::vector<std::int32_t>& probes) {
    for (auto _ : state) {
        std::size_t found = 0;
        for (const std::int32_t v : probes) {
            found += contains(c, v) ? 1 : 0;
        }
        benchmark::DoNotOptimize(found);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * probes.size()));
}

}  // namespace sorvel::bench
