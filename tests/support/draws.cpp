// The runtime generator as the library sees it.
//
// ELF targets: this file defines rand itself. The program is linked with
// -rdynamic, so the library's calls to rand, whether it is linked in or
// loaded with dlopen, resolve to this definition as soon as this object is
// part of the program, which any use of the draws functions ensures. Every
// call is counted; scripted values come first, then a generator seeded by
// reseed. Its values span 0 to 2^31 - 1 like glibc's, so the library's own
// cut to 15 bits is exercised.
//
// Windows: the program and the library, linked in or a DLL, share msvcrt's
// rand and its state, which the program does not replace. reseed seeds it,
// learns the sequence that follows (far more values than asked for) and
// seeds it again, so the library draws exactly the learnt values from the
// first on. made() then
// draws a few values itself, finds where they stand in the learnt sequence
// (that position is the number of draws the library made) and seeds again
// and draws up to that position, which leaves the generator as it found it.
#include "draws.hpp"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <vector>

namespace sorvel::test::draws {
namespace {
constexpr int kMask = 0x7FFF;
}  // namespace
}  // namespace sorvel::test::draws

#if !defined(_WIN32)

namespace sorvel::test::draws {
namespace {

constexpr std::uint64_t state_for(unsigned seed) {
    return 0x9E3779B97F4A7C15ULL ^ (static_cast<std::uint64_t>(seed) << 1U);
}

// Draws come from the script first, then from the generator. The script
// keeps its storage from one call to the next: no draw allocates.
std::vector<int> g_script;
std::size_t g_scripted = 0;  // values of the script already drawn
std::uint64_t g_state = state_for(1);
std::size_t g_made = 0;

// A 64-bit linear congruential step; its top 31 bits are the value.
int generate(std::uint64_t& state) {
    state = state * 6364136223846793005ULL + 1442695040888963407ULL;
    return static_cast<int>(state >> 33U);
}

}  // namespace

std::vector<int> reseed(unsigned seed, std::size_t n) {
    g_script.clear();
    g_scripted = 0;
    g_state = state_for(seed);
    g_made = 0;
    std::vector<int> values(n);
    std::uint64_t ahead = g_state;
    for (int& v : values) {
        v = generate(ahead) & kMask;
    }
    return values;
}

bool scriptable() {
    return true;
}

void script(std::vector<int> values) {
    g_script.assign(values.begin(), values.end());
    g_scripted = 0;
    g_made = 0;
}

std::size_t made() {
    return g_made;
}

int next_value() {
    ++g_made;
    if (g_scripted < g_script.size()) {
        return g_script[g_scripted++];
    }
    return generate(g_state);
}

}  // namespace sorvel::test::draws

extern "C" int rand() noexcept {
    return sorvel::test::draws::next_value();
}

#else

namespace sorvel::test::draws {
namespace {

constexpr std::size_t kMargin = 4096;  // draws the library may make beyond those asked for
constexpr std::size_t kProbe = 8;      // values drawn to find the position

unsigned g_seed = 0;
std::vector<int> g_learnt;

}  // namespace

std::vector<int> reseed(unsigned seed, std::size_t n) {
    g_seed = seed;
    std::srand(seed);
    g_learnt.assign(n + kMargin + kProbe, 0);
    for (int& v : g_learnt) {
        v = std::rand();
    }
    std::srand(seed);
    std::vector<int> values(g_learnt.begin(), g_learnt.begin() + static_cast<std::ptrdiff_t>(n));
    for (int& v : values) {
        v &= kMask;
    }
    return values;
}

bool scriptable() {
    return false;
}

void script(std::vector<int>) {
    throw std::logic_error("the Windows runtime generator cannot be scripted");
}

std::size_t made() {
    if (g_learnt.empty()) {
        throw std::logic_error("draws::made() before draws::reseed()");
    }
    int probe[kProbe];
    for (int& v : probe) {
        v = std::rand();
    }
    for (std::size_t at = 0; at + kProbe <= g_learnt.size(); ++at) {
        bool match = true;
        for (std::size_t i = 0; i < kProbe && match; ++i) {
            match = g_learnt[at + i] == probe[i];
        }
        if (match) {
            std::srand(g_seed);
            for (std::size_t i = 0; i < at; ++i) {
                (void)std::rand();
            }
            return at;
        }
    }
    throw std::runtime_error("more than " + std::to_string(g_learnt.size() - kProbe) +
                             " draws since reseed, or the generator was seeded elsewhere");
}

}  // namespace sorvel::test::draws

#endif
