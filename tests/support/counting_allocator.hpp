// The simulated host's counting, failing allocator: one for every target. A test
// program links counting_allocator.cpp (the sorvel_counting object), which
// stands behind the library's allocation seam (sorvel::memory) in place of
// the product's and, on Windows, reroutes a loaded DLL's C runtime allocator
// imports through the same counter. Either way the simulated host hands it out as
// Library::allocations(). The benchmarks fail allocations through it too;
// sorvel-host does without it.
#pragma once

#include <cstddef>
#include <cstdint>

namespace sorvel::test::counting {

std::size_t live();       // blocks allocated through the counter and not yet freed
std::uint64_t total();    // allocations (and moves by realloc) made so far
void fail_after(long n);  // the n-th allocation from now fails (0: the next); negative: none

}  // namespace sorvel::test::counting
