// Runs a function on a thread with a small stack, to prove that a piece of
// work does not recurse along deep trees.
#pragma once

#include <cstddef>
#include <functional>

namespace sorvel::test {

inline constexpr std::size_t kSmallStack = 256 * 1024;

// Runs `work` on a new thread whose stack is `stack_bytes` and gives whether
// it ran to its end: under wine an overflow can end just the thread, quietly.
// wine also gives a thread at least about 1 MiB whatever is asked for.
[[nodiscard]] bool run_on_small_stack(const std::function<void()>& work, std::size_t stack_bytes = kSmallStack);

}  // namespace sorvel::test
