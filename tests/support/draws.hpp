// Scripted draws: the runtime generator the library draws from. On ELF
// targets the program defines rand itself (draws.cpp), so every draw is
// scripted and counted; on Windows the shared C runtime generator is seeded
// and its sequence learnt in advance.
#pragma once

#include <cstddef>
#include <vector>

namespace sorvel::test::draws {

// Reseeds and gives the next n values (low 15 bits) the library will draw.
std::vector<int> reseed(unsigned seed, std::size_t n);
// ELF only: the exact values the next draws give (then the seeded sequence).
bool scriptable();
void script(std::vector<int> values);
// Draws made since the last reseed or script. On Windows it is found by
// matching the generator's next values against the learnt sequence, after
// which the generator is put back where it was.
std::size_t made();

}  // namespace sorvel::test::draws
