// Chains as deep as the count: values added in order never balance, so every
// step that walks or frees a tree must work without stack use growing with
// depth. Each chain is built directly in the node layout (adding a million
// values one by one would take quadratic time) and then worked on from a
// thread with a 256 KiB stack.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

// The key for chain position i in each kind's own spelling.
template <class V>
auto chain_key(std::int32_t i, std::int32_t depth, bool leans_right) {
    if constexpr (std::is_same_v<V, char*>) {
        return chain_string(i, depth, leans_right);
    } else {
        return static_cast<V>(chain_int(i, depth, leans_right));
    }
}

// Length of the chain along the leaning side, or -1 when some node has a
// child on the other side.
template <class Node>
std::int64_t chain_length(const Node* root, bool leans_right) {
    std::int64_t length = 0;
    for (const Node* at = root; at != nullptr; at = leans_right ? at->right : at->left) {
        if ((leans_right ? at->left : at->right) != nullptr) {
            return -1;
        }
        ++length;
    }
    return length;
}

template <class V>
void work_on_a_deep_chain(bool leans_right, bool with_index) {
    const std::int32_t depth = kDeepChain;
    const std::size_t live_before = memory::live_allocations();
    const auto key = [&](std::int32_t i) { return chain_key<V>(i, depth, leans_right); };
    {
        Holder<V> h(with_index);
        build_chain(h, depth, leans_right);
        ASSERT_EQ(chain_length(h.root, leans_right), depth);

        struct Seen {
            bool deepest_found = false;
            bool beyond_found = true;
            bool removed_root = false, removed_middle = false, removed_deepest = false;
            bool middle_gone = true, neighbours_kept = false;
            std::int32_t count_after_removes = 0;
            std::int64_t chain_after_removes = 0;
            bool added_beyond = false;
            std::int64_t chain_after_add = 0;
            std::int32_t position_of_added = -2;
        } seen;

        run_on_small_stack([&] {
            seen.deepest_found = do_contains(h, key(depth - 1));
            seen.beyond_found = do_contains(h, key(depth));
            seen.removed_root = do_remove(h, key(0));
            seen.removed_middle = do_remove(h, key(depth / 2));
            seen.removed_deepest = do_remove(h, key(depth - 1));
            seen.middle_gone = !do_contains(h, key(depth / 2));
            seen.neighbours_kept = do_contains(h, key(depth / 2 - 1)) && do_contains(h, key(depth / 2 + 1)) &&
                                   do_contains(h, key(1)) && do_contains(h, key(depth - 2));
            seen.count_after_removes = h.count;
            seen.chain_after_removes = chain_length(h.root, leans_right);
            // One past the deepest end: a new leaf at the bottom.
            seen.added_beyond = do_add(h, key(depth));
            seen.chain_after_add = chain_length(h.root, leans_right);
            seen.position_of_added = do_position(h, key(depth));
        });

        EXPECT_TRUE(seen.deepest_found);
        EXPECT_FALSE(seen.beyond_found);
        EXPECT_TRUE(seen.removed_root);
        EXPECT_TRUE(seen.removed_middle);
        EXPECT_TRUE(seen.removed_deepest);
        EXPECT_TRUE(seen.middle_gone);
        EXPECT_TRUE(seen.neighbours_kept);
        EXPECT_EQ(seen.count_after_removes, depth - 3);
        EXPECT_EQ(seen.chain_after_removes, depth - 3);
        EXPECT_TRUE(seen.added_beyond);
        EXPECT_EQ(seen.chain_after_add, depth - 2);
        EXPECT_EQ(seen.position_of_added, with_index ? depth - 3 : -1);
        EXPECT_TRUE(collection_is_sound(h));
        if (with_index) {
            // The root's successor now leads the index, the new value ends it.
            EXPECT_EQ(h.index->at(0), h.root);
            EXPECT_EQ(reference_compare(h.index->at(h.index->size() - 1)->value, key(depth), false), 0);
        }

        // Clear through the view, still on the small stack.
        run_on_small_stack([&] { do_clear(h); });
        EXPECT_EQ(h.root, nullptr);
        EXPECT_EQ(h.count, 0);
    }
    EXPECT_EQ(memory::live_allocations(), live_before);
}

TEST(DeepChains, IntegersWorkAndClearOnASmallStack) {
    for (const bool leans_right : {true, false}) {
        SCOPED_TRACE(leans_right ? "right chain" : "left chain");
        work_on_a_deep_chain<std::int32_t>(leans_right, false);
    }
    work_on_a_deep_chain<std::int32_t>(true, true);
}

TEST(DeepChains, FloatsWorkAndClearOnASmallStack) {
    for (const bool leans_right : {true, false}) {
        SCOPED_TRACE(leans_right ? "right chain" : "left chain");
        work_on_a_deep_chain<float>(leans_right, false);
    }
    work_on_a_deep_chain<float>(false, true);
}

TEST(DeepChains, StringsWorkAndClearOnASmallStack) {
    for (const bool leans_right : {true, false}) {
        SCOPED_TRACE(leans_right ? "right chain" : "left chain");
        work_on_a_deep_chain<char*>(leans_right, false);
    }
    work_on_a_deep_chain<char*>(true, true);
}

// Tree freeing on its own: a chain handed straight to the free functions.
TEST(DeepChains, TreeFreeingOnASmallStack) {
    for (const bool leans_right : {true, false}) {
        SCOPED_TRACE(leans_right ? "right chain" : "left chain");
        const std::size_t live_before = memory::live_allocations();
        Ints ints;
        Floats floats;
        Strings strings;
        build_chain(ints, kDeepChain, leans_right);
        build_chain(floats, kDeepChain, leans_right);
        build_chain(strings, kDeepChain, leans_right);
        EXPECT_EQ(memory::live_allocations(), live_before + 3 * static_cast<std::size_t>(kDeepChain));
        IntegerNode* int_root = ints.root;
        FloatNode* float_root = floats.root;
        StringNode* string_root = strings.root;
        ints.root = nullptr;
        floats.root = nullptr;
        strings.root = nullptr;
        run_on_small_stack([&] {
            free_tree(int_root);
            free_tree(float_root);
            FreeStringTree(string_root);
        });
        EXPECT_EQ(memory::live_allocations(), live_before);
    }
}

// Deep on both sides and zigzagging below: freeing must not recurse into
// left subtrees either.
TEST(DeepChains, FreeingAZigzagOnASmallStack) {
    const std::size_t live_before = memory::live_allocations();
    IntegerNode* root = nullptr;
    IntegerNode* deepest = nullptr;
    for (std::int32_t i = 0; i < kDeepChain; ++i) {
        IntegerNode* node = make_node<std::int32_t>(i % 2 == 0 ? i / 2 : 2'000'000 - i / 2);
        if (deepest == nullptr) {
            root = node;
        } else if ((i - 1) % 2 == 0) {
            deepest->right = node;
        } else {
            deepest->left = node;
        }
        deepest = node;
    }
    run_on_small_stack([&] { free_tree(root); });
    EXPECT_EQ(memory::live_allocations(), live_before);
}

// Removing a root whose left subtree has a long right spine hangs the right
// subtree at the spine's end, as deep as the spine.
TEST(DeepChains, RemovalHangsTheRightSubtreeUnderALongSpine) {
    const std::int32_t spine = kDeepChain / 4;
    Ints h;
    // Root 0; its left subtree a right chain -spine..-1; right child 1.
    h.root = make_node<std::int32_t>(0);
    h.root->right = make_node<std::int32_t>(1);
    IntegerNode* at = nullptr;
    for (std::int32_t v = -spine; v < 0; ++v) {
        IntegerNode* node = make_node<std::int32_t>(v);
        if (at == nullptr) {
            h.root->left = node;
        } else {
            at->right = node;
        }
        at = node;
    }
    h.count = spine + 2;
    const IntegerNode* one = h.root->right;
    bool removed = false;
    run_on_small_stack([&] { removed = do_remove(h, 0); });
    EXPECT_TRUE(removed);
    ASSERT_NE(h.root, nullptr);
    EXPECT_EQ(h.root->value, -spine);
    EXPECT_EQ(at->right, one);
    EXPECT_EQ(chain_length(h.root, true), spine + 1);
    EXPECT_TRUE(collection_is_sound(h));
    run_on_small_stack([&] { do_clear(h); });
}

}  // namespace
}  // namespace sorvel::test
