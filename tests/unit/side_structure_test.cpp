// Deep trees with the side structure of links: the shapes, answers and
// positions match a plain-descent view, also when memory runs out while the
// structure is built or grows, and after the index packs its empty slots.
// Shallow and mixed cases are the fuzzer's.
#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

// The same values in two collections: one with a side structure, one without.
struct Twin {
    Ints side{true};
    Ints plain{true};
    LinkIndex<IntegerNode> links;
    IntegerCollection with_links() { return {side.root, side.count, side.index, &links}; }
};

// Iterative, so chains of any depth compare.
::testing::AssertionResult same_shape(const IntegerNode* a, const IntegerNode* b) {
    std::vector<std::pair<const IntegerNode*, const IntegerNode*>> todo{{a, b}};
    while (!todo.empty()) {
        const auto [x, y] = todo.back();
        todo.pop_back();
        if ((x == nullptr) != (y == nullptr) || (x != nullptr && x->value != y->value)) {
            return ::testing::AssertionFailure() << "shapes differ at " << (x ? show(x->value) : "null");
        }
        if (x != nullptr) {
            todo.push_back({x->left, y->left});
            todo.push_back({x->right, y->right});
        }
    }
    return ::testing::AssertionSuccess();
}

struct Case {
    const char* name;
    std::int32_t n;
    std::int32_t (*value)(std::int32_t i, std::int32_t n);
    int removal;  // 0: oldest half, 1: every third value, 2: all, newest first
};

const Case kCases[] = {
    {"sorted", 3000, [](std::int32_t i, std::int32_t) { return i; }, 0},
    {"reversed", 3000, [](std::int32_t i, std::int32_t n) { return n - i; }, 1},
    {"zigzag", 3000, [](std::int32_t i, std::int32_t n) { return i % 2 == 0 ? i / 2 : n - i / 2; }, 2},
};

TEST(SideStructure, DeepShapesMatchPlainDescents) {
    for (const Case& k : kCases) {
        SCOPED_TRACE(k.name);
        Twin t;
        IntegerCollection s = t.with_links();
        IntegerCollection p = t.plain.view();
        std::vector<std::int32_t> values;
        for (std::int32_t i = 0; i < k.n; ++i) {
            values.push_back(k.value(i, k.n));
            ASSERT_EQ(add(s, values.back()), add(p, values.back()));
        }
        ASSERT_TRUE(t.links.built());
        for (std::size_t i = 0; i < values.size(); ++i) {
            const bool go = k.removal == 2 || (k.removal == 0 ? i < values.size() / 2 : i % 3 == 0);
            const std::int32_t v = k.removal == 2 ? values[values.size() - 1 - i] : values[i];
            if (go) {
                ASSERT_EQ(remove(s, v), remove(p, v));
            }
            ASSERT_EQ(contains(s, v), contains(p, v));
            ASSERT_EQ(position_of(s, v + 1), position_of(p, v + 1));
        }
        EXPECT_TRUE(same_shape(t.side.root, t.plain.root));
        EXPECT_EQ(index_values(t.side), index_values(t.plain));
    }
}

// A chain of 100,000 would take a plain descent minutes; with the side
// structure it finishes, and the chain stays a chain.
TEST(SideStructure, LongChainsFinish) {
    constexpr std::int32_t kN = 100000;
    Twin t;
    IntegerCollection s = t.with_links();
    for (std::int32_t i = 0; i < kN; ++i) {
        ASSERT_TRUE(add(s, i));
    }
    for (std::int32_t i = 0; i < kN; i += 2) {
        ASSERT_TRUE(remove(s, i));
        ASSERT_EQ(position_of(s, i + 1), i / 2);
    }
    std::int32_t expect = 1;
    for (const IntegerNode* n = t.side.root; n != nullptr; n = n->right, expect += 2) {
        ASSERT_TRUE(n->left == nullptr && n->value == expect);
    }
    EXPECT_EQ(expect, kN + 1);
    EXPECT_EQ(node_at(s, kN / 2 - 1)->value, kN - 1);
}

// Every allocation in turn fails once: the collection loses at most the one
// value whose own node could not be made, and stays equal to plain descents.
TEST(SideStructure, AllocationFailuresCostNoData) {
    std::mt19937 random(5);
    for (long fail = 0; fail < 60; ++fail) {
        SCOPED_TRACE(fail);
        const std::size_t live = memory::live_allocations();
        {
            Twin t;
            IntegerCollection s = t.with_links();
            std::vector<std::pair<std::int32_t, bool>> added;  // value, and whether the add took it
            memory::fail_allocation_after(fail);
            for (std::int32_t i = 0; i < 400; ++i) {
                const std::int32_t v = i % 5 == 4 ? static_cast<std::int32_t>(random() % 400) : i;
                added.emplace_back(i % 7 == 6 ? -1 - v : v, i % 7 == 6 ? remove(s, v) : add(s, v));
            }
            memory::fail_allocation_after(-1);
            IntegerCollection p = t.plain.view();
            int lost = 0;
            for (const auto& [v, took] : added) {
                if (v < 0) {
                    ASSERT_EQ(remove(p, -1 - v), took);
                } else if (took) {
                    ASSERT_TRUE(add(p, v));
                } else {
                    lost += contains(p, v) ? 0 : 1;
                }
            }
            EXPECT_LE(lost, 1);
            EXPECT_TRUE(same_shape(t.side.root, t.plain.root));
            EXPECT_EQ(index_values(t.side), index_values(t.plain));
        }
        EXPECT_EQ(memory::live_allocations(), live);
    }
}

}  // namespace
}  // namespace sorvel::test
