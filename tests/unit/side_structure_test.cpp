// Deep trees with the side structure of links: the shapes, answers and
// positions match a plain-descent view, also when memory runs out while the
// structure is built or grows, and after the index packs its empty slots.
// Shallow and mixed cases are the fuzzer's.
#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "collections/memory.hpp"
#include "support.hpp"

namespace {

using namespace sorvel;
using Ints = test::Holder<std::int32_t>;

struct Case {
    const char* name;
    std::int32_t (*value)(std::int32_t i, std::int32_t n);
    int removal;  // 0: oldest half, 1: every third value, 2: all, newest first
};

TEST(SideStructure, DeepShapesMatchPlainDescents) {
    constexpr std::int32_t kN = 3000;
    const Case cases[] = {
        {"sorted", [](std::int32_t i, std::int32_t) { return i; }, 0},
        {"reversed", [](std::int32_t i, std::int32_t n) { return n - i; }, 1},
        {"zigzag", [](std::int32_t i, std::int32_t n) { return i % 2 == 0 ? i / 2 : n - i / 2; }, 2},
    };
    for (const Case& k : cases) {
        SCOPED_TRACE(k.name);
        Ints side(true), plain(true, false);
        std::vector<std::int32_t> values;
        for (std::int32_t i = 0; i < kN; ++i) {
            values.push_back(k.value(i, kN));
            ASSERT_EQ(add(side.view(), values.back()), add(plain.view(), values.back()));
        }
        ASSERT_TRUE(side.links.built());
        for (std::size_t i = 0; i < values.size(); ++i) {
            const bool go = k.removal == 2 || (k.removal == 0 ? i < values.size() / 2 : i % 3 == 0);
            const std::int32_t v = k.removal == 2 ? values[values.size() - 1 - i] : values[i];
            if (go) {
                ASSERT_EQ(remove(side.view(), v), remove(plain.view(), v));
            }
            ASSERT_EQ(contains(side.view(), v), contains(plain.view(), v));
            ASSERT_EQ(position_of(side.view(), v + 1), position_of(plain.view(), v + 1));
        }
        EXPECT_EQ(test::shape(side.root), test::shape(plain.root));
        EXPECT_EQ(side.positions(), plain.positions());
    }
}

// A chain of 100,000 would take a plain descent minutes; with the side
// structure it finishes, and the chain stays a chain.
TEST(SideStructure, LongChainsFinish) {
    constexpr std::int32_t kN = 100000;
    Ints side(true);
    for (std::int32_t i = 0; i < kN; ++i) {
        ASSERT_TRUE(add(side.view(), i));
    }
    for (std::int32_t i = 0; i < kN; i += 2) {
        ASSERT_TRUE(remove(side.view(), i));
        ASSERT_EQ(position_of(side.view(), i + 1), i / 2);
    }
    std::int32_t expect = 1;
    for (const IntegerNode* n = side.root; n != nullptr; n = n->right, expect += 2) {
        ASSERT_TRUE(n->left == nullptr && n->value == expect);
    }
    EXPECT_EQ(expect, kN + 1);
    EXPECT_EQ(node_at(side.view(), kN / 2 - 1)->value, kN - 1);
}

// Every allocation in turn fails once: the collection loses at most the one
// value whose own node could not be made, and stays equal to plain descents.
TEST(SideStructure, AllocationFailuresCostNoData) {
    std::mt19937 random(5);
    for (long fail = 0; fail < 60; ++fail) {
        SCOPED_TRACE(fail);
        const std::size_t live = memory::live_allocations();
        {
            Ints side(true), plain(true, false);
            std::vector<std::pair<std::int32_t, bool>> done;  // value (negative: removed), and whether it took
            memory::fail_allocation_after(fail);
            for (std::int32_t i = 0; i < 400; ++i) {
                const std::int32_t v = i % 5 == 4 ? static_cast<std::int32_t>(random() % 400) : i;
                done.emplace_back(i % 7 == 6 ? -1 - v : v, i % 7 == 6 ? remove(side.view(), v) : add(side.view(), v));
            }
            memory::fail_allocation_after(-1);
            int lost = 0;
            for (const auto& [v, took] : done) {
                if (v < 0) {
                    ASSERT_EQ(remove(plain.view(), -1 - v), took);
                } else if (took) {
                    ASSERT_TRUE(add(plain.view(), v));
                } else {
                    lost += contains(plain.view(), v) ? 0 : 1;
                }
            }
            EXPECT_LE(lost, 1);
            EXPECT_EQ(test::shape(side.root), test::shape(plain.root));
            EXPECT_EQ(side.positions(), plain.positions());
        }
        EXPECT_EQ(memory::live_allocations(), live);
    }
}

}  // namespace
