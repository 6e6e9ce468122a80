// Random path selection: walk down from the root drawing one number per node
// (its lowest bit picks left or right) until a null link, then draw once more
// to pick one of the nodes below the root on that path.
#pragma once

#include <cstdint>

namespace sorvel {

// Draws are 15-bit values, 0 to 32767, whatever the runtime's rand gives.
inline constexpr int kDrawMask = 0x7FFF;

// Gives the chosen node, or null for an empty tree (then nothing is drawn).
// `draw` is called once per visited node, and once more when the walk
// visited more than one node.
template <class Node, class Draw>
const Node* random_path_pick(const Node* root, Draw&& draw) noexcept {
    if (root == nullptr) {
        return nullptr;
    }
    // The pick is k + 1 steps down with k = draw mod (n - 1) <= 32767, so
    // only the first 32768 directions can ever be followed again.
    constexpr std::uint32_t kKept = 32768;
    std::uint32_t directions[kKept / 32];
    std::uint64_t visited = 0;
    for (const Node* at = root; at != nullptr; ++visited) {
        const auto right = static_cast<std::uint32_t>(draw() & 1);
        if (visited < kKept) {
            const auto slot = static_cast<std::uint32_t>(visited / 32);
            const auto shift = static_cast<std::uint32_t>(visited % 32);
            directions[slot] = (shift == 0 ? 0U : directions[slot]) | (right << shift);
        }
        at = right != 0 ? at->right : at->left;
    }
    if (visited == 1) {
        return root;
    }
    const auto pick = static_cast<std::uint64_t>(draw() & kDrawMask) % (visited - 1);
    const Node* at = root;
    for (std::uint64_t step = 0; step <= pick; ++step) {
        const bool right = ((directions[step / 32] >> (step % 32)) & 1U) != 0;
        at = right ? at->right : at->left;
    }
    return at;
}

// A source of draws that a caller can script: unit tests pass their own.
struct DrawSource {
    int (*next)(void* context) noexcept;
    void* context;
    int operator()() const noexcept { return next(context); }
};

// The library's only source of draws: the C runtime's generator, never
// seeded here, cut to its low 15 bits where the runtime's range is wider.
int draw_from_runtime() noexcept;
DrawSource runtime_draws() noexcept;

}  // namespace sorvel
