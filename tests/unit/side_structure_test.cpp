// The side structure of links when memory runs out while it is built or
// grows: shapes, answers and positions still match a plain-descent view.
// Everything else about it is the fuzzer's, which runs past a bound of 2.
#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "collections/memory.hpp"
#include "support.hpp"

namespace {

using namespace sorvel;
using Ints = test::Holder<std::int32_t>;

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
