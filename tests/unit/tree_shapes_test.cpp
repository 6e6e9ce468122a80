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

#include "literal_tree.hpp"
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

TEST(IntegerRemoves, ShapesFollowRemovalByReinsertion) {
    const std::vector<RemoveCase> cases = {
        {"root with two children", kSeven, {50}, "30(20,40(-,70(60,80)))", {"30", "70", "20", "40", "60", "80"}},
        {"inner node with two children", kSeven, {30}, "50(20(-,40),70(60,80))",
         {"50", "70", "20", "40", "60", "80"}},
        {"right inner node", kSeven, {70}, "50(30(20,40),60(-,80))", {"50", "30", "20", "40", "60", "80"}},
        {"leftmost leaf", kSeven, {20}, "50(30(-,40),70(60,80))", {"50", "30", "70", "40", "60", "80"}},
        {"rightmost leaf", kSeven, {80}, "50(30(20,40),70(60,-))", {"50", "30", "70", "20", "40", "60"}},
        {"inner leaf", kSeven, {40}, "50(30(20,-),70(60,80))", {"50", "30", "70", "20", "60", "80"}},
        {"right subtree hangs under the largest of the left", {50, 30, 70, 20, 40, 35, 45, 60}, {50},
         "30(20,40(35,45(-,70(60,-))))", {"30", "70", "20", "40", "35", "45", "60"}},
        {"inner node, right subtree under a deeper largest", {100, 50, 30, 70, 40, 45, 80}, {50},
         "100(30(-,40(-,45(-,70(-,80)))),-)", {"100", "30", "70", "40", "45", "80"}},
        {"root without left child", {10, 20, 15, 30}, {10}, "20(15,30)", {"20", "15", "30"}},
        {"root without right child", {10, 5, 3, 7}, {10}, "5(3,7)", {"5", "3", "7"}},
        {"inner node with only a left child", {10, 5, 3, 2}, {5}, "10(3(2,-),-)", {"10", "3", "2"}},
        {"inner node with only a right child", {10, 5, 7, 8}, {5}, "10(7(-,8),-)", {"10", "7", "8"}},
        {"only node", {10}, {10}, ".", {}},
        {"absent value", kSeven, {55}, "50(30(20,40),70(60,80))", {"50", "30", "70", "20", "40", "60", "80"}},
        {"absent below a leaf", kSeven, {19, 81, 65}, "50(30(20,40),70(60,80))",
         {"50", "30", "70", "20", "40", "60", "80"}},
        {"empty collection", {}, {1}, ".", {}},
        {"same value twice", {10, 20, 30}, {20, 20}, "10(-,30)", {"10", "30"}},
        {"index keeps the order of the rest", {10, 20, 30}, {20}, "10(-,30)", {"10", "30"}},
        {"root with left leaf and right chain", {10, 20, 30, 5}, {10}, "5(-,20(-,30))", {"20", "30", "5"}},
        {"everything, root first", kSeven, {50, 30, 20, 40, 70, 60, 80}, ".", {}},
        {"smallest integer", {0, kMin, kMax}, {kMin}, "0(-,2147483647)", {"0", "2147483647"}},
    };
    for (const bool with_index : {false, true}) {
        for (const RemoveCase& c : cases) {
            SCOPED_TRACE(std::string(c.name) + (with_index ? ", index on" : ", index off"));
            Ints h(with_index);
            for (const std::int32_t v : c.adds) {
                do_add(h, v);
            }
            for (const std::int32_t v : c.removes) {
                do_remove(h, v);
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

// Random adds and removes applied to the library and to the literal tree
// must leave identical shapes, counts and index orders after every step.
template <class V, class Make>
void compare_with_literal(std::uint32_t seed, bool with_index, bool case_sensitive, int steps, Make make) {
    using Value = decltype(make(std::declval<std::mt19937&>()));
    Holder<V> h(with_index, case_sensitive);
    LiteralTree<Value> literal(case_sensitive);
    std::mt19937 random(seed);
    std::vector<Value> held;
    for (int step = 0; step < steps; ++step) {
        const unsigned roll = random() % 100;
        Value v = make(random);
        std::string what;
        if (roll < 10) {
            // A sorted run of adds grows a long chain somewhere in the tree.
            std::vector<Value> run;
            for (int i = 0; i < 6; ++i) {
                run.push_back(make(random));
            }
            const bool up = (random() & 1) != 0;
            std::sort(run.begin(), run.end(), [&](const Value& a, const Value& b) {
                const int c = reference_compare(a, b, case_sensitive);
                return up ? c < 0 : c > 0;
            });
            for (const Value& r : run) {
                do_add(h, r);
                literal.add(r);
                held.push_back(r);
            }
            what = up ? "ascending run" : "descending run";
        } else if (roll < 55) {
            do_add(h, v);
            literal.add(v);
            held.push_back(v);
            what = "add " + show(v);
        } else if (roll < 85 && !held.empty()) {
            v = held[random() % held.size()];
            do_remove(h, v);
            literal.remove(v);
            what = "remove held " + show(v);
        } else {
            do_remove(h, v);
            literal.remove(v);
            what = "remove " + show(v);
        }
        ASSERT_EQ(render(h), render(literal.root())) << "seed " << seed << " step " << step << ": " << what;
        ASSERT_EQ(h.count, literal.count()) << "seed " << seed << " step " << step;
        if (with_index) {
            ASSERT_EQ(index_values(h), literal.index_values()) << "seed " << seed << " step " << step;
        }
        if (step % 16 == 0) {
            ASSERT_TRUE(collection_is_sound(h)) << "seed " << seed << " step " << step;
        }
    }
    ASSERT_TRUE(collection_is_sound(h)) << "seed " << seed;
}

TEST(RemovalMatchesLiteralSteps, Integers) {
    for (const std::uint32_t seed : {1U, 2U, 3U}) {
        for (const bool with_index : {false, true}) {
            compare_with_literal<std::int32_t>(seed, with_index, false, 1000, [](std::mt19937& r) {
                return static_cast<std::int32_t>(r() % 160) - 80;
            });
        }
    }
}

TEST(RemovalMatchesLiteralSteps, IntegersAtTheExtremes) {
    const std::vector<std::int32_t> pool = {kMin, kMin + 1, -2, -1, 0, 1, 2, kMax - 1, kMax};
    compare_with_literal<std::int32_t>(9, true, false, 600, [&](std::mt19937& r) { return pool[r() % pool.size()]; });
}

TEST(RemovalMatchesLiteralSteps, Floats) {
    const float inf = std::numeric_limits<float>::infinity();
    const std::vector<float> specials = {0.0F, -0.0F, inf, -inf, 0.5F, -0.5F};
    for (const std::uint32_t seed : {5U, 6U}) {
        for (const bool with_index : {false, true}) {
            compare_with_literal<float>(seed, with_index, false, 1000, [&](std::mt19937& r) {
                if (r() % 8 == 0) {
                    return specials[r() % specials.size()];
                }
                return static_cast<float>(static_cast<int>(r() % 200) - 100) / 4.0F;
            });
        }
    }
}

TEST(RemovalMatchesLiteralSteps, Strings) {
    // Mixed case, '_' between the cases, a byte above 127 and the empty
    // string: the two comparisons order these differently.
    const std::string alphabet = "aAbB_mMzZ\xE9";
    for (const std::uint32_t seed : {7U, 8U}) {
        for (const bool with_index : {false, true}) {
            for (const bool case_sensitive : {false, true}) {
                SCOPED_TRACE(case_sensitive ? "case-sensitive" : "case-insensitive");
                compare_with_literal<char*>(seed, with_index, case_sensitive, 800, [&](std::mt19937& r) {
                    std::string s;
                    const unsigned length = r() % 4;
                    for (unsigned i = 0; i < length; ++i) {
                        s += alphabet[r() % alphabet.size()];
                    }
                    return s;
                });
            }
        }
    }
}

}  // namespace
}  // namespace sorvel::test
