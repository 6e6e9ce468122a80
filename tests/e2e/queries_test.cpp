// The twelve expressions end to end: sizes, positions, values at positions,
// random elements with the draws they make, result flags and string results.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include "test_host.hpp"

namespace {

namespace draws = sorvel::testhost::draws;
using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::Param;
using sorvel::testhost::word;

constexpr std::uint16_t kFloatFlag = 0x4000;
constexpr std::uint16_t kStringFlag = 0x8000;

class Queries : public ::testing::Test {
protected:
    void TearDown() override { EXPECT_EQ(Library::stack_errors(), 0U); }

    std::int32_t integer(Instance& i, const char* name, std::vector<Param> params = {}) {
        return static_cast<std::int32_t>(host.event(i, name, std::move(params)));
    }
    float floating(Instance& i, const char* name, std::vector<Param> params = {}) {
        i.set_result_flags(0);
        const word result = host.event(i, name, std::move(params));
        EXPECT_EQ(i.result_flags(), kFloatFlag) << name;
        return Host::float_bits(result);
    }
    std::string text(Instance& i, const char* name, std::vector<Param> params = {}) {
        i.set_result_flags(0);
        const word result = host.event(i, name, std::move(params));
        EXPECT_EQ(i.result_flags(), kStringFlag) << name;
        return Host::text_at(result);
    }

    Host host{Library::built()};
};

TEST_F(Queries, SizesCountWithOrWithoutIndex) {
    for (int use_indices : {0, 1, 2}) {
        Instance& i = host.create(0, use_indices);
        for (int v : {1, 2, 3, 2}) {
            host.event(i, "Add Integer: %0", {Param::of(v)});
        }
        host.event(i, "Add Float: %0", {Param::of(0.5F)});
        host.event(i, "Add String: %0", {Param::of("a")});
        host.event(i, "Add String: %0", {Param::of("b")});
        i.set_result_flags(0);
        EXPECT_EQ(integer(i, "IntegersSize("), 3);
        EXPECT_EQ(integer(i, "FloatsSize("), 1);
        EXPECT_EQ(integer(i, "StringsSize("), 2);
        EXPECT_EQ(i.result_flags(), 0) << "integer results leave the flags alone";
        host.event(i, "Clear Strings");
        EXPECT_EQ(integer(i, "StringsSize("), 0);
        host.destroy(i);
    }
}

TEST_F(Queries, PositionsFollowInsertionOrder) {
    Instance& i = host.create(0, 1);
    for (int v : {30, 10, 20}) {
        host.event(i, "Add Integer: %0", {Param::of(v)});
    }
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(0)}), 30);
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(1)}), 10);
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(2)}), 20);
    EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(20)}), 2);
    host.event(i, "Remove Integer: %0", {Param::of(10)});
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(1)}), 20);
    EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(20)}), 1);
    EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(10)}), -1);
    host.event(i, "Clear Integers");
    EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(30)}), -1);
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(0)}), 0);
}

TEST_F(Queries, FloatPositionsUseIeeeEquality) {
    Instance& i = host.create(0, 1);
    host.event(i, "Add Float: %0", {Param::of(1.5F)});
    host.event(i, "Add Float: %0", {Param::of(0.0F)});
    EXPECT_EQ(integer(i, "IndexOfFloatElement(", {Param::of(-0.0F)}), 1);
    EXPECT_EQ(integer(i, "IndexOfFloatElement(", {Param::of(std::numeric_limits<float>::quiet_NaN())}), -1);
    EXPECT_EQ(floating(i, "FloatElementAt(", {Param::of(0)}), 1.5F);
    // Out of range gives the float 0.0, flagged as a float.
    const float zero = floating(i, "FloatElementAt(", {Param::of(2)});
    EXPECT_EQ(zero, 0.0F);
    EXPECT_FALSE(std::signbit(zero));
}

TEST_F(Queries, StringPositionsFollowTheComparison) {
    Instance& folded = host.create(0, 1);
    Instance& exact = host.create(1, 1);
    for (Instance* i : {&folded, &exact}) {
        for (const char* s : {"Pear", "apple", "Fig"}) {
            host.event(*i, "Add String: %0", {Param::of(s)});
        }
    }
    EXPECT_EQ(integer(folded, "IndexOfStringElement(", {Param::of("APPLE")}), 1);
    EXPECT_EQ(text(folded, "StringElementAt$(", {Param::of(1)}), "apple");
    EXPECT_EQ(integer(exact, "IndexOfStringElement(", {Param::of("APPLE")}), -1);
    host.event(folded, "Remove String: %0", {Param::of("Pear")});
    EXPECT_EQ(text(folded, "StringElementAt$(", {Param::of(0)}), "apple");
    EXPECT_EQ(integer(folded, "IndexOfStringElement(", {Param::of("Fig")}), 1);
    host.event(exact, "Add String: %0", {Param::of("")});
    EXPECT_EQ(integer(exact, "IndexOfStringElement(", {Param::of("")}), 3);
    EXPECT_EQ(text(exact, "StringElementAt$(", {Param::of(3)}), "");
}

// Every 32-bit position outside the index gives the fixed result, whatever
// the option says.
TEST_F(Queries, OutOfRangePositionsGiveFixedResults) {
    const std::int32_t positions[] = {-1, 3, 4, std::numeric_limits<std::int32_t>::min(),
                                      std::numeric_limits<std::int32_t>::max(), -65536, 65536};
    for (int use_indices : {0, 1, -1}) {
        Instance& i = host.create(0, use_indices);
        for (int v : {7, 8, 9}) {
            host.event(i, "Add Integer: %0", {Param::of(v)});
            host.event(i, "Add Float: %0", {Param::of(static_cast<float>(v))});
            host.event(i, "Add String: %0", {Param::of(std::to_string(v))});
        }
        for (std::int32_t p : positions) {
            SCOPED_TRACE(std::to_string(use_indices) + " at " + std::to_string(p));
            EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(p)}), 0);
            EXPECT_EQ(floating(i, "FloatElementAt(", {Param::of(p)}), 0.0F);
            EXPECT_EQ(text(i, "StringElementAt$(", {Param::of(p)}), "");
        }
        if (use_indices != 1) {
            EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(0)}), 0);
            EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(7)}), -1);
            EXPECT_EQ(integer(i, "IndexOfFloatElement(", {Param::of(7.0F)}), -1);
            EXPECT_EQ(integer(i, "IndexOfStringElement(", {Param::of("7")}), -1);
            EXPECT_EQ(text(i, "StringElementAt$(", {Param::of(0)}), "");
        } else {
            EXPECT_EQ(text(i, "StringElementAt$(", {Param::of(2)}), "9");
        }
        host.destroy(i);
    }
}

TEST_F(Queries, EmptyCollectionsGiveFixedResultsWithoutDrawing) {
    Instance& i = host.create(0, 1);
    draws::reseed(11, 8);
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 0);
    EXPECT_EQ(floating(i, "FloatsRandomElement("), 0.0F);
    EXPECT_EQ(text(i, "StringsRandomElement$("), "");
    EXPECT_EQ(draws::made(), 0U);
    EXPECT_EQ(integer(i, "IndexOfIntegerElement(", {Param::of(0)}), -1);
    EXPECT_EQ(integer(i, "IndexOfStringElement(", {Param::of("")}), -1);
    EXPECT_EQ(integer(i, "IntegerElementAt(", {Param::of(0)}), 0);
}

// The walk the library must make on a known shape, from the draws it gets.
struct Expected {
    std::size_t draws;
    int value;
};

Expected walk(const std::vector<int>& left, const std::vector<int>& right, int root, const std::vector<int>& d) {
    // left/right: child of each value, or -1.
    std::vector<int> path{root};
    std::size_t used = 0;
    for (int at = root; at != -1;) {
        const int bit = d[used++] & 1;
        at = bit ? right.at(static_cast<std::size_t>(at)) : left.at(static_cast<std::size_t>(at));
        if (at != -1) {
            path.push_back(at);
        }
    }
    if (path.size() == 1) {
        return {used, root};
    }
    const std::size_t k = static_cast<std::size_t>(d[used++] & 0x7FFF) % (path.size() - 1);
    return {used, path[k + 1]};
}

TEST_F(Queries, RandomElementsWalkTheTreeWithTheDrawsTheyMake) {
    // Shapes of small trees over the values 0..3: left and right child of each.
    struct Case {
        std::vector<int> adds;
        std::vector<int> left, right;
    };
    const std::vector<Case> cases = {
        {{2}, {-1, -1, -1, -1}, {-1, -1, -1, -1}},
        {{2, 1, 3}, {-1, -1, 1, -1}, {-1, -1, 3, -1}},
        {{1, 2, 3}, {-1, -1, -1, -1}, {-1, 2, 3, -1}},
        {{3, 2, 1, 0}, {-1, 0, 1, 2}, {-1, -1, -1, -1}},
        {{1, 0, 3, 2}, {-1, 0, -1, 2}, {-1, 3, -1, -1}},
    };
    for (int use_indices : {0, 1}) {
        for (std::size_t c = 0; c < cases.size(); ++c) {
            Instance& i = host.create(1, use_indices);
            for (int v : cases[c].adds) {
                host.event(i, "Add Integer: %0", {Param::of(v)});
                host.event(i, "Add Float: %0", {Param::of(static_cast<float>(v))});
                host.event(i, "Add String: %0", {Param::of(std::string(1, static_cast<char>('0' + v)))});
            }
            for (unsigned seed = 1; seed <= 24; ++seed) {
                SCOPED_TRACE("case " + std::to_string(c) + " seed " + std::to_string(seed));
                const int root = cases[c].adds.front();
                for (int kind = 0; kind < 3; ++kind) {
                    const std::vector<int> d = draws::reseed(seed * 7919U + static_cast<unsigned>(kind), 16);
                    const Expected e = walk(cases[c].left, cases[c].right, root, d);
                    if (kind == 0) {
                        EXPECT_EQ(integer(i, "IntegersRandomElement("), e.value);
                    } else if (kind == 1) {
                        EXPECT_EQ(floating(i, "FloatsRandomElement("), static_cast<float>(e.value));
                    } else {
                        EXPECT_EQ(text(i, "StringsRandomElement$("), std::string(1, static_cast<char>('0' + e.value)));
                    }
                    EXPECT_EQ(draws::made(), e.draws);
                }
            }
            host.destroy(i);
        }
    }
}

TEST_F(Queries, ScriptedDrawsPickTheDocumentedElements) {
    if (!draws::scriptable()) {
        GTEST_SKIP() << "the runtime's generator cannot be scripted here; seeded draws cover it";
    }
    Instance& i = host.create(1, 0);
    for (int v : {1, 2, 3}) {
        host.event(i, "Add Integer: %0", {Param::of(v)});
    }
    // A chain 1 -> 2 -> 3 of right links; odd draws go right.
    // An even first draw ends the walk at the root: n = 1, the root, one draw.
    draws::script({0});
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 1);
    EXPECT_EQ(draws::made(), 1U);
    // Odd then even: n = 2, k = r2 mod 1 = 0: the node at depth 1.
    draws::script({1, 2, 99});
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 2);
    EXPECT_EQ(draws::made(), 3U);
    // Two odd draws reach 3, where any third draw ends the walk (n = 3); the
    // fourth picks 2 when even and 3 when odd.
    draws::script({1, 1, 0, 4});
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 2);
    draws::script({1, 1, 1, 7});
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 3);
    EXPECT_EQ(draws::made(), 4U);
    // Only the low 15 bits of a wider draw count.
    draws::script({1, 1, 1, 0x10000 + 1});
    EXPECT_EQ(integer(i, "IntegersRandomElement("), 3);
}

TEST_F(Queries, StringResultsWithoutAHostBuffer) {
    Instance& i = host.create(1, 1);
    host.event(i, "Add String: %0", {Param::of("kept")});
    host.give_no_result_buffer(true);
    i.set_result_flags(0);
    const word at = host.event(i, "StringElementAt$(", {Param::of(0)});
    ASSERT_NE(at, 0);
    EXPECT_EQ(Host::text_at(at), "");
    EXPECT_EQ(i.result_flags(), kStringFlag);
    const word random = host.event(i, "StringsRandomElement$(");
    ASSERT_NE(random, 0);
    EXPECT_EQ(Host::text_at(random), "");
    host.give_no_result_buffer(false);
    EXPECT_EQ(text(i, "StringElementAt$(", {Param::of(0)}), "kept");
}

}  // namespace
