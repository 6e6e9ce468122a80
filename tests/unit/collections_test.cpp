// Floats, strings and what sets them apart from integers: IEEE 754 order with
// its signed zeros, infinities and NaN; the two string comparisons; and
// clearing one collection among three.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

TEST(CompareStrings, SignsInBothModes) {
    struct Case {
        const char* a;
        const char* b;
        int sensitive;    // sign with the case-sensitive comparison
        int insensitive;  // sign with ASCII letters folded
    };
    const std::vector<Case> cases = {
        {"", "", 0, 0},
        {"", "a", -1, -1},
        {"a", "", 1, 1},
        {"abc", "abc", 0, 0},
        {"abc", "abd", -1, -1},
        {"ab", "abc", -1, -1},
        {"Apple", "APPLE", 1, 0},
        {"APPLE", "apple", -1, 0},
        {"Zebra", "apple", -1, 1},
        {"M", "_", -1, 1},
        {"_", "a", -1, -1},
        {"[", "a", -1, -1},
        {"`", "A", 1, -1},
        {"Z", "[", -1, 1},
        {"@", "a", -1, -1},
        {"z", "{", -1, -1},
        {"\xE9", "z", 1, 1},
        {"\xC9", "\xE9", -1, -1},  // no folding above 127
        {"\xFF", "\x01", 1, 1},
        {"a\xE9", "A\xE9", 1, 0},
        {"a\x7F", "a\x80", -1, -1},
    };
    auto sign = [](int v) { return (v > 0) - (v < 0); };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string("'") + c.a + "' vs '" + c.b + "'");
        EXPECT_EQ(sign(CompareStrings(c.a, c.b, true)), c.sensitive);
        EXPECT_EQ(sign(CompareStrings(c.a, c.b, false)), c.insensitive);
        EXPECT_EQ(sign(CompareStrings(c.b, c.a, true)), -c.sensitive);
        EXPECT_EQ(sign(CompareStrings(c.b, c.a, false)), -c.insensitive);
    }
}

TEST(CompareStrings, AgreesWithTheReferenceOnEveryBytePair) {
    for (int x = 1; x < 256; ++x) {
        for (int y = 1; y < 256; ++y) {
            const char a[] = {static_cast<char>(x), '\0'};
            const char b[] = {static_cast<char>(y), '\0'};
            for (const bool sensitive : {false, true}) {
                const int got = CompareStrings(a, b, sensitive);
                ASSERT_EQ((got > 0) - (got < 0), reference_compare(a, b, sensitive))
                    << x << " vs " << y << (sensitive ? " sensitive" : " insensitive");
            }
        }
    }
}

struct StringCase {
    const char* name;
    bool case_sensitive;
    std::vector<std::string> adds;
    std::vector<std::string> removes;
    const char* shape;
    std::vector<std::string> index;
};

TEST(Strings, NodeHoldsItsOwnCopy) {
    Strings h(true, false);
    std::string caller = "Pear";
    do_add(h, caller);
    caller[0] = 'X';
    ASSERT_NE(h.root, nullptr);
    EXPECT_STREQ(h.root->value, "Pear");
    EXPECT_NE(static_cast<const void*>(h.root->value), static_cast<const void*>(caller.c_str()));
    EXPECT_TRUE(do_contains(h, "pear"));
}

TEST(Clear, EmptyCollectionStillEndsAtZero) {
    Ints h(true);
    do_clear(h);
    EXPECT_EQ(h.count, 0);
    EXPECT_EQ(h.root, nullptr);
    EXPECT_TRUE(h.index->empty());
    do_clear(h);
    EXPECT_EQ(h.count, 0);
}

TEST(Clear, FreesEveryNode) {
    const std::size_t before = memory::live_allocations();
    Strings h(false);
    for (int i = 0; i < 50; ++i) {
        do_add(h, "s" + std::to_string(i * 7 % 50));
    }
    EXPECT_GT(memory::live_allocations(), before);
    do_clear(h);
    EXPECT_EQ(memory::live_allocations(), before);
}

}  // namespace
}  // namespace sorvel::test
