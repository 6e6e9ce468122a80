// Runs a function on a thread with a small stack, to prove that a piece of
// work does not recurse along deep trees.
#pragma once

#include <cstddef>
#include <functional>

namespace sorvel::testing {

inline constexpr std::size_t kSmallStack = 256 * 1024;

// Runs `work` to completion on a new thread whose stack is `stack_bytes`.
void run_on_small_stack(const std::function<void()>& work, std::size_t stack_bytes = kSmallStack);

}  // namespace sorvel::testing
