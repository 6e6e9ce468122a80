// Tree shapes after adds and removes: the shape is the behaviour, since it
// decides every later path, the random element and the chances it gives.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <map>
#include <random>
#include <string>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

constexpr std::int32_t kMax = std::numeric_limits<std::int32_t>::max();
constexpr std::int32_t kMin = std::numeric_limits<std::int32_t>::min();

struct AddCase {
    const char* name;
    std::vector<std::int32_t> adds;
    const char* shape;
    std::vector<std::string> index;  // insertion order of the values kept
};

TEST(IntegerAdds, ShapesFollowTheAddOrder) {
    const std::vector<AddCase> cases = {
        {"duplicate is one node", {5, 5}, "5", {"5"}},
        {"duplicate deep down", {50, 30, 70, 40, 40, 30}, "50(30(-,40),70)", {"50", "30", "70", "40"}},
        {"negative goes left of positive", {1, -1}, "1(-1,-)", {"1", "-1"}},
        {"smallest goes left of largest", {kMax, kMin}, "2147483647(-2147483648,-)", {"2147483647", "-2147483648"}},
        {"signed order around zero", {0, kMin, -1, kMax, 1}, "0(-2147483648(-,-1),2147483647(1,-))",
         {"0", "-2147483648", "-1", "2147483647", "1"}},
        {"ascending is a right chain", {1, 2, 3, 4}, "1(-,2(-,3(-,4)))", {"1", "2", "3", "4"}},
        {"descending is a left chain", {4, 3, 2, 1}, "4(3(2(1,-),-),-)", {"4", "3", "2", "1"}},
        {"zigzag", {10, 1, 9, 2, 8}, "10(1(-,9(2(-,8),-)),-)", {"10", "1", "9", "2", "8"}},
        {"balanced seven", {50, 30, 70, 20, 40, 60, 80}, "50(30(20,40),70(60,80))",
         {"50", "30", "70", "20", "40", "60", "80"}},
    };
    for (const bool with_index : {false, true}) {
        for (const AddCase& c : cases) {
            SCOPED_TRACE(std::string(c.name) + (with_index ? ", index on" : ", index off"));
            Ints h(with_index);
            for (const std::int32_t v : c.adds) {
                do_add(h, v);
            }
            EXPECT_EQ(render(h), c.shape);
            EXPECT_EQ(h.count, static_cast<std::int32_t>(c.index.size()));
            EXPECT_TRUE(collection_is_sound(h));
            if (with_index) {
                EXPECT_EQ(index_values(h), c.index);
            }
        }
    }
}

TEST(IntegerAdds, ReportWhetherTheValueWasNew) {
    Ints h(true);
    EXPECT_TRUE(do_add(h, 7));
    EXPECT_FALSE(do_add(h, 7));
    EXPECT_TRUE(do_add(h, -7));
    EXPECT_FALSE(do_add(h, -7));
    EXPECT_EQ(h.count, 2);
    EXPECT_EQ(h.index->size(), 2U);
}

TEST(IntegerAdds, ExistingNodesNeverMove) {
    Ints h;
    do_add(h, 50);
    const IntegerNode* root = h.root;
    do_add(h, 30);
    const IntegerNode* thirty = h.root->left;
    for (const std::int32_t v : {70, 20, 40, 30, 50, 10}) {
        do_add(h, v);
    }
    EXPECT_EQ(h.root, root);
    EXPECT_EQ(h.root->left, thirty);
    EXPECT_EQ(render(h), "50(30(20(10,-),40),70)");
}

struct RemoveCase {
    const char* name;
    std::vector<std::int32_t> adds;
    std::vector<std::int32_t> removes;
    const char* shape;
    std::vector<std::string> index;
};

const std::vector<std::int32_t> kSeven = {50, 30, 70, 20, 40, 60, 80};

TEST(IntegerRemoves, RemovedValueComesBackAsALeaf) {
    Ints h(true);
    for (const std::int32_t v : {10, 20, 30, 5}) {
        do_add(h, v);
    }
    do_remove(h, 10);
    do_add(h, 10);
    EXPECT_EQ(render(h), "5(-,20(10,30))");
    EXPECT_EQ(h.count, 4);
    EXPECT_EQ(index_values(h), (std::vector<std::string>{"20", "30", "5", "10"}));
}

TEST(IntegerRemoves, ReportWhetherAValueWentAway) {
    Ints h;
    EXPECT_FALSE(do_remove(h, 1));
    do_add(h, 1);
    EXPECT_FALSE(do_remove(h, 2));
    EXPECT_TRUE(do_remove(h, 1));
    EXPECT_FALSE(do_remove(h, 1));
    EXPECT_EQ(h.count, 0);
    EXPECT_EQ(h.root, nullptr);
}

// Removal relinks subtrees: every other node keeps its address, so the
// index's pointers stay valid.
TEST(IntegerRemoves, OtherNodesKeepTheirAddresses) {
    for (const std::int32_t gone : kSeven) {
        SCOPED_TRACE(gone);
        Ints h(true);
        for (const std::int32_t v : kSeven) {
            do_add(h, v);
        }
        std::map<std::int32_t, const IntegerNode*> before;
        walk_in_order(h.root, [&](const IntegerNode* n) { before[n->value] = n; });
        do_remove(h, gone);
        std::map<std::int32_t, const IntegerNode*> after;
        walk_in_order(h.root, [&](const IntegerNode* n) { after[n->value] = n; });
        before.erase(gone);
        EXPECT_EQ(after, before);
    }
}

}  // namespace
}  // namespace sorvel::test
