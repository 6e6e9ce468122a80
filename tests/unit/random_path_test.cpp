// Random path selection with scripted draws: which node each sequence of
// draws picks, and how many draws a pick takes.
#include <gtest/gtest.h>

#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "collections/random_path.hpp"
#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

// Hands out a fixed list of draws and notes any draw asked for beyond it.
struct Script {
    std::vector<int> draws;
    std::size_t used = 0;
    bool overrun = false;

    DrawSource source() {
        return DrawSource{[](void* context) noexcept {
                              auto* s = static_cast<Script*>(context);
                              if (s->used >= s->draws.size()) {
                                  s->overrun = true;
                                  return 0;
                              }
                              return s->draws[s->used++];
                          },
                          this};
    }
};

// The walk as first described: keep every direction in a vector, draw once
// more, follow k + 1 of them from the root again.
template <class Node>
const Node* naive_pick(const Node* root, Script& script) {
    if (root == nullptr) {
        return nullptr;
    }
    std::vector<int> directions;
    for (const Node* at = root; at != nullptr;) {
        const int r = script.source()() & 0x7FFF;
        directions.push_back(r % 2);
        at = directions.back() == 1 ? at->right : at->left;
    }
    const std::size_t n = directions.size();
    if (n == 1) {
        return root;
    }
    const std::size_t k = static_cast<std::size_t>(script.source()() & 0x7FFF) % (n - 1);
    const Node* at = root;
    for (std::size_t i = 0; i <= k; ++i) {
        at = directions[i] == 1 ? at->right : at->left;
    }
    return at;
}

template <class Node>
const Node* pick(const Node* root, Script& script) {
    return random_path_pick(root, script.source());
}

TEST(RandomPath, EmptyTreeDrawsNothing) {
    Script script{{1, 2, 3}};
    EXPECT_EQ(pick(static_cast<const IntegerNode*>(nullptr), script), nullptr);
    EXPECT_EQ(script.used, 0U);
}

struct PickCase {
    const char* name;
    std::vector<std::int32_t> adds;
    std::vector<int> draws;
    std::int32_t picked;
};

TEST(RandomPath, ScriptedDrawsPickTheExpectedNode) {
    const std::vector<PickCase> cases = {
        {"one node, even draw", {5}, {0}, 5},
        {"one node, odd draw", {5}, {1}, 5},
        {"one node, largest draw", {5}, {32767}, 5},
        {"2,1,3: odd first draw", {2, 1, 3}, {1, 0, 0}, 3},
        {"2,1,3: odd first draw, any later", {2, 1, 3}, {3, 32767, 32767}, 3},
        {"2,1,3: even first draw", {2, 1, 3}, {0, 0, 0}, 1},
        {"2,1,3: even first draw, any later", {2, 1, 3}, {32766, 1, 12345}, 1},
        {"chain 1,2,3: even first draw", {1, 2, 3}, {0}, 1},
        {"chain 1,2,3: odd then even", {1, 2, 3}, {1, 0, 0}, 2},
        {"chain 1,2,3: odd then even, odd pick", {1, 2, 3}, {1, 0, 1}, 2},
        {"chain 1,2,3: third draw ends the walk, even fourth", {1, 2, 3}, {1, 1, 0, 0}, 2},
        {"chain 1,2,3: third draw odd, even fourth", {1, 2, 3}, {1, 1, 1, 2}, 2},
        {"chain 1,2,3: third draw even, odd fourth", {1, 2, 3}, {1, 1, 0, 1}, 3},
        {"chain 1,2,3: odd fourth", {1, 2, 3}, {1, 1, 1, 32767}, 3},
        // Only the lowest 15 bits of a draw count.
        {"walk draw above 32767 is odd by its low bit", {2, 1, 3}, {0x8001, 0, 1}, 3},
        {"walk draw above 32767 is even by its low bit", {2, 1, 3}, {0x18000, 1, 1}, 1},
        {"pick draw 0x8000 counts as 0", {1, 2, 3, 4}, {1, 1, 1, 1, 0x8000}, 2},
        {"pick draw 0x10001 counts as 1", {1, 2, 3, 4}, {1, 1, 1, 1, 0x10001}, 3},
        {"pick draw 0x7FFF counts in full", {1, 2, 3, 4}, {1, 1, 1, 1, 0x7FFF}, 3},
        {"pick draw 0xFFFE counts as 32766", {1, 2, 3, 4}, {1, 1, 1, 1, 0xFFFE}, 2},
        // 50(30(20,40),70(60,80)): left, right from the root to 40.
        {"seven: walk to 40, pick depth 1", {50, 30, 70, 20, 40, 60, 80}, {0, 1, 0, 0}, 30},
        {"seven: walk to 40, pick depth 2", {50, 30, 70, 20, 40, 60, 80}, {0, 1, 1, 1}, 40},
        {"seven: walk to 60, pick depth 2", {50, 30, 70, 20, 40, 60, 80}, {1, 0, 0, 3}, 60},
    };
    for (const PickCase& c : cases) {
        SCOPED_TRACE(c.name);
        Ints h;
        for (const std::int32_t v : c.adds) {
            do_add(h, v);
        }
        Script script{c.draws};
        const IntegerNode* got = pick(static_cast<const IntegerNode*>(h.root), script);
        ASSERT_NE(got, nullptr);
        EXPECT_EQ(got->value, c.picked);
        EXPECT_EQ(script.used, c.draws.size()) << "every scripted draw is used, no more";
        EXPECT_FALSE(script.overrun);
    }
}

TEST(RandomPath, RootOfTwoOrMoreIsNeverPickedWhenTheWalkGoesOn) {
    Ints h;
    for (const std::int32_t v : {2, 1, 3}) {
        do_add(h, v);
    }
    for (int first = 0; first < 64; ++first) {
        for (const int later : {0, 1, 2, 32767}) {
            Script script{{first, later, later}};
            const IntegerNode* got = pick(static_cast<const IntegerNode*>(h.root), script);
            ASSERT_NE(got, nullptr);
            EXPECT_NE(got->value, 2);
            EXPECT_EQ(got->value, first % 2 == 1 ? 3 : 1);
        }
    }
}

// Draws n when the walk visits one node, n + 1 otherwise, and agrees with
// the naive walk, on random trees of all three kinds.
template <class V, class Make>
void compare_with_naive(std::uint32_t seed, Make make) {
    std::mt19937 random(seed);
    for (int tree = 0; tree < 40; ++tree) {
        Holder<V> h;
        const int size = static_cast<int>(random() % 60);
        for (int i = 0; i < size; ++i) {
            do_add(h, make(random));
        }
        for (int trial = 0; trial < 40; ++trial) {
            std::vector<int> draws;
            for (int i = 0; i < 80; ++i) {
                // Mostly the runtime's range, sometimes wider.
                draws.push_back(static_cast<int>(random() % 8 == 0 ? random() % 0x40000 : random() % 0x8000));
            }
            Script library{draws};
            Script naive{draws};
            const auto* got = pick(static_cast<const TreeNode<V>*>(h.root), library);
            const auto* want = naive_pick(static_cast<const TreeNode<V>*>(h.root), naive);
            ASSERT_EQ(got, want) << "seed " << seed << " tree " << tree << " trial " << trial;
            ASSERT_EQ(library.used, naive.used);
            // The naive walk's own count: n when the walk stopped at once.
            std::size_t n = 0;
            for (const TreeNode<V>* at = h.root; at != nullptr; ++n) {
                at = (draws[n] & 1) != 0 ? at->right : at->left;
            }
            ASSERT_EQ(library.used, n == 0 ? 0 : n == 1 ? 1 : n + 1);
        }
    }
}

TEST(RandomPath, AgreesWithTheNaiveWalkOnRandomTrees) {
    compare_with_naive<std::int32_t>(11, [](std::mt19937& r) { return static_cast<std::int32_t>(r() % 100); });
    compare_with_naive<float>(12, [](std::mt19937& r) { return static_cast<float>(r() % 100) / 8.0F; });
    compare_with_naive<char*>(13, [](std::mt19937& r) { return std::string(1 + r() % 3, static_cast<char>('a' + r() % 5)); });
}

// Paths longer than the 32768 directions a pick can reach: k is at most
// 32767, so the pick lands at depth k + 1 whatever lies below.
struct DeepCase {
    const char* name;
    std::int32_t walked;  // nodes the walk visits
    int last;             // the pick draw
    std::int32_t depth;   // depth of the expected pick
};

TEST(RandomPath, DeepPathsPickAtDepthKPlusOne) {
    constexpr std::int32_t kDepth = 40'000;
    const std::vector<DeepCase> cases = {
        {"whole chain, largest draw", kDepth, 32767, 32768},
        {"whole chain, smallest draw", kDepth, 0, 1},
        {"whole chain, masked draw", kDepth, 0x8000 + 5, 6},
        {"walk of 32769 nodes, largest draw", 32769, 32767, 32768},
        {"walk of 32768 nodes, largest draw wraps", 32768, 32767, 1},
        {"walk of 32768 nodes, draw 32766", 32768, 32766, 32767},
        {"walk of 35001 nodes", 35001, 32767, 32768},
        {"walk of 1000 nodes", 1000, 32767, 32767 % 999 + 1},
    };
    for (const bool leans_right : {true, false}) {
        Ints h;
        build_chain(h, kDepth, leans_right);
        for (const DeepCase& c : cases) {
            SCOPED_TRACE(std::string(c.name) + (leans_right ? ", right chain" : ", left chain"));
            // Follow the chain for walked - 1 steps, then turn off it.
            std::vector<int> draws(static_cast<std::size_t>(c.walked - 1), leans_right ? 1 : 0);
            draws.push_back(leans_right ? 0 : 1);
            draws.push_back(c.last);
            Script library{draws};
            Script naive{draws};
            const IntegerNode* got = pick(static_cast<const IntegerNode*>(h.root), library);
            ASSERT_NE(got, nullptr);
            EXPECT_EQ(got->value, chain_int(c.depth, kDepth, leans_right));
            EXPECT_EQ(got, naive_pick(static_cast<const IntegerNode*>(h.root), naive));
            EXPECT_EQ(library.used, draws.size());
            EXPECT_FALSE(library.overrun);
        }
    }
}

// A zigzag chain (each node's only child alternating right, left, right...)
// makes the remembered directions differ from step to step.
TEST(RandomPath, DeepZigzagFollowsEachRememberedDirection) {
    constexpr std::int32_t kDepth = 40'000;
    Ints h;
    IntegerNode* deepest = nullptr;
    for (std::int32_t i = 0; i < kDepth; ++i) {
        IntegerNode* node = make_node<std::int32_t>(i % 2 == 0 ? i / 2 : 1'000'000 - i / 2);
        if (deepest == nullptr) {
            h.root = node;
        } else if ((i - 1) % 2 == 0) {
            deepest->right = node;
        } else {
            deepest->left = node;
        }
        deepest = node;
        ++h.count;
    }
    ASSERT_TRUE(collection_is_sound(h));
    std::vector<int> walk;
    for (std::int32_t i = 0; i < kDepth; ++i) {
        walk.push_back(i % 2 == 0 ? 1 : 0);
    }
    for (const int last : {0, 1, 2, 3, 12345, 32766, 32767}) {
        SCOPED_TRACE(last);
        std::vector<int> draws = walk;
        draws.push_back(last);
        Script library{draws};
        Script naive{draws};
        const IntegerNode* got = pick(static_cast<const IntegerNode*>(h.root), library);
        ASSERT_NE(got, nullptr);
        const std::int32_t depth = last % (kDepth - 1) + 1;
        EXPECT_EQ(got->value, depth % 2 == 0 ? depth / 2 : 1'000'000 - depth / 2);
        EXPECT_EQ(got, naive_pick(static_cast<const IntegerNode*>(h.root), naive));
        EXPECT_EQ(library.used, draws.size());
    }
}

TEST(RandomPath, MillionNodeWalk) {
    if (kDeepChain < 1'000'000) {
        GTEST_SKIP() << "only on native builds";
    }
    Ints h;
    build_chain(h, kDeepChain, true);
    std::vector<int> draws(static_cast<std::size_t>(kDeepChain), 1);
    draws.push_back(32767);
    Script script{draws};
    const IntegerNode* got = pick(static_cast<const IntegerNode*>(h.root), script);
    ASSERT_NE(got, nullptr);
    EXPECT_EQ(got->value, chain_int(32768, kDeepChain, true));
    EXPECT_EQ(script.used, draws.size());
}

}  // namespace
}  // namespace sorvel::test
