// The side structure and the index beyond what the fuzzer reaches: memory
// running out while they are built, grow or shrink, and positions across
// shrink cycles of 10^5 values.
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <vector>

#include "counting_allocator.hpp"
#include "support.hpp"

namespace {

using namespace sorvel;
using Ints = test::Holder<std::int32_t>;

// Adds, some removals among them, then most values removed: the side
// structure is built, grows, is rebuilt to fit and dropped; the index grows
// and shrinks.
std::vector<std::pair<std::int32_t, bool>> grow_then_shrink(Ints& h) {
    std::mt19937 random(5);
    std::vector<std::pair<std::int32_t, bool>> done;  // value (negative: removed), and whether it took
    for (std::int32_t i = 0; i < 400; ++i) {
        const std::int32_t v = i % 5 == 4 ? static_cast<std::int32_t>(random() % 400) : i;
        done.emplace_back(i % 7 == 6 ? -1 - v : v, i % 7 == 6 ? remove(h.view(), v) : add(h.view(), v));
    }
    std::vector<std::int32_t> order(400);
    for (std::int32_t i = 0; i < 400; ++i) {
        order[static_cast<std::size_t>(i)] = i;
    }
    std::shuffle(order.begin(), order.end(), random);
    for (std::size_t i = 0; i < 380; ++i) {
        done.emplace_back(-1 - order[i], remove(h.view(), order[i]));
    }
    return done;
}

// Every allocation in turn fails once: the collection loses at most the one
// value whose own node could not be made, and stays equal to plain descents.
TEST(SideStructure, AllocationFailuresCostNoData) {
    std::uint64_t allocations = test::counting::total();
    {
        Ints side(true, true);
        grow_then_shrink(side);
    }
    allocations = test::counting::total() - allocations;
    for (long fail = 0; fail < static_cast<long>(allocations); ++fail) {
        SCOPED_TRACE(fail);
        const std::size_t live = test::counting::live();
        {
            Ints side(true, true), plain(true, false);
            test::counting::fail_after(fail);
            const auto done = grow_then_shrink(side);
            test::counting::fail_after(-1);
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
        EXPECT_EQ(test::counting::live(), live);
    }
}

// Grow to 10^5, thin out to a few hundred, grow again: positions and IndexOf
// agree with a list of the Adds, and what is held follows the count.
TEST(SideStructure, PositionsAcrossShrinkCycles) {
    constexpr std::int32_t kPeak = 100'000;
    for (const bool sorted : {true, false}) {
        SCOPED_TRACE(sorted);
        std::mt19937 random(9);
        Ints h(true, true);
        std::vector<std::int32_t> added;  // in the order of the Adds; removed ones leave the list
        for (int cycle = 0; cycle < 3; ++cycle) {
            while (h.count < kPeak) {
                const auto v = sorted ? static_cast<std::int32_t>(added.size()) + cycle * kPeak
                                      : static_cast<std::int32_t>(random() >> 1);
                if (add(h.view(), v)) {
                    added.push_back(v);
                }
            }
            // Remove all but every 300th, in random order, reading positions
            // around the removed ones now and then.
            std::vector<std::size_t> doomed;
            for (std::size_t i = 0; i < added.size(); ++i) {
                if (i % 300 != 7) {
                    doomed.push_back(i);
                }
            }
            std::shuffle(doomed.begin(), doomed.end(), random);
            std::vector<bool> gone(added.size());
            for (std::size_t k = 0; k < doomed.size(); ++k) {
                ASSERT_TRUE(remove(h.view(), added[doomed[k]]));
                gone[doomed[k]] = true;
                if (k % 997 == 0) {
                    const std::size_t next = (doomed[k] + 1) % added.size();
                    const std::int32_t p = position_of(h.view(), added[next]);
                    ASSERT_EQ(p >= 0, !gone[next]);
                    const IntegerNode* at = node_at(h.view(), p);
                    ASSERT_TRUE(p < 0 || (at != nullptr && at->value == added[next]));
                }
            }
            std::vector<std::int32_t> kept;
            for (std::size_t i = 0; i < added.size(); ++i) {
                if (!gone[i]) {
                    kept.push_back(added[i]);
                }
            }
            added = kept;
            ASSERT_EQ(h.positions(), added);
            for (std::size_t p = 0; p < added.size(); ++p) {
                ASSERT_EQ(position_of(h.view(), added[p]), static_cast<std::int32_t>(p));
            }
            EXPECT_LE(h.index->capacity(), 4 * added.size() + 8);
            EXPECT_LE(h.side.capacity(), 4 * added.size() + 64);
        }
    }
}

}  // namespace
