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

constexpr float kInf = std::numeric_limits<float>::infinity();

float next_up(float v) { return std::nextafter(v, kInf); }

std::uint32_t bits(float v) {
    std::uint32_t b = 0;
    std::memcpy(&b, &v, sizeof b);
    return b;
}

TEST(Floats, SignedZerosAreOneValueAndTheFirstIsKept) {
    struct Case {
        float first;
        float second;
        std::uint32_t stored_bits;
    };
    for (const Case& c : {Case{0.0F, -0.0F, 0x00000000U}, Case{-0.0F, 0.0F, 0x80000000U}}) {
        SCOPED_TRACE(std::signbit(c.first) ? "-0.0 first" : "+0.0 first");
        Floats h(true);
        EXPECT_TRUE(do_add(h, c.first));
        EXPECT_FALSE(do_add(h, c.second));
        EXPECT_EQ(h.count, 1);
        ASSERT_NE(h.root, nullptr);
        EXPECT_EQ(h.root->left, nullptr);
        EXPECT_EQ(h.root->right, nullptr);
        EXPECT_EQ(bits(h.root->value), c.stored_bits);
        EXPECT_EQ(h.index->size(), 1U);
        EXPECT_TRUE(do_contains(h, c.second));
        EXPECT_EQ(do_position(h, c.second), 0);
        EXPECT_TRUE(do_remove(h, c.second));
        EXPECT_EQ(h.count, 0);
        EXPECT_EQ(h.root, nullptr);
        EXPECT_TRUE(h.index->empty());
    }
}

TEST(Floats, ShapesUnderIeeeOrder) {
    struct Case {
        const char* name;
        std::vector<float> adds;
        const char* shape;
        std::int32_t count;
    };
    const float tiny = std::numeric_limits<float>::denorm_min();
    const std::vector<Case> cases = {
        {"infinities either side", {1.5F, kInf, -kInf}, "1.5(-inf,inf)", 3},
        {"negative infinity below the lowest finite", {-kInf, std::numeric_limits<float>::lowest(), kInf},
         "-inf(-,-3.4028235e+38(-,inf))", 3},
        {"denormal above zero", {0.0F, tiny, -tiny}, "0(-1e-45,1e-45)", 3},
        {"negative below positive", {2.0F, -2.0F, -3.0F}, "2(-2(-3,-),-)", 3},
        {"duplicate 2.5", {2.5F, 2.5F}, "2.5", 1},
        {"zero between signs", {-0.0F, -1.0F, 1.0F, 0.0F}, "-0(-1,1)", 3},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        Floats h(true);
        for (const float v : c.adds) {
            do_add(h, v);
        }
        EXPECT_EQ(render(h), c.shape);
        EXPECT_EQ(h.count, c.count);
        EXPECT_EQ(h.index->size(), static_cast<std::uint32_t>(c.count));
        EXPECT_TRUE(collection_is_sound(h));
    }
}

TEST(Floats, LowestBitDifferenceMakesTwoValues) {
    for (const float v : {1.0F, -1.0F, 0.1F, 1e30F, std::numeric_limits<float>::denorm_min()}) {
        SCOPED_TRACE(v);
        Floats h;
        const float above = next_up(v);
        ASSERT_EQ(bits(above) - bits(v), v > 0 ? 1U : static_cast<std::uint32_t>(-1));
        do_add(h, v);
        EXPECT_TRUE(do_add(h, above));
        EXPECT_EQ(h.count, 2);
        ASSERT_NE(h.root->right, nullptr);
        EXPECT_EQ(bits(h.root->right->value), bits(above));
        EXPECT_TRUE(do_remove(h, v));
        EXPECT_FALSE(do_contains(h, v));
        EXPECT_TRUE(do_contains(h, above));
    }
}

TEST(Floats, NanIsNeverStoredFoundOrRemoved) {
    const float quiet = std::numeric_limits<float>::quiet_NaN();
    const float negative = -quiet;
    float payload = 0;
    const std::uint32_t payload_bits = 0x7F800001U;  // signalling pattern
    std::memcpy(&payload, &payload_bits, sizeof payload);
    for (const float nan : {quiet, negative, payload}) {
        SCOPED_TRACE(bits(nan));
        Floats h(true);
        for (const float v : {1.0F, -kInf, kInf, 0.0F}) {
            do_add(h, v);
        }
        const std::string shape = render(h);
        EXPECT_FALSE(do_add(h, nan));
        EXPECT_EQ(h.count, 4);
        EXPECT_EQ(render(h), shape);
        EXPECT_EQ(h.index->size(), 4U);
        EXPECT_FALSE(do_contains(h, nan));
        EXPECT_FALSE(do_remove(h, nan));
        EXPECT_EQ(h.count, 4);
        EXPECT_EQ(render(h), shape);
        EXPECT_EQ(do_position(h, nan), -1);

        Floats empty(true);
        EXPECT_FALSE(do_add(empty, nan));
        EXPECT_EQ(empty.count, 0);
        EXPECT_EQ(empty.root, nullptr);
        EXPECT_EQ(empty.index->size(), 0U);
    }
}

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

TEST(Strings, ShapesInBothModes) {
    const std::vector<StringCase> cases = {
        {"folded duplicate keeps the first spelling", false, {"Apple", "APPLE"}, {}, "Apple", {"Apple"}},
        {"two spellings when case matters", true, {"Apple", "APPLE"}, {}, "Apple(APPLE,-)", {"Apple", "APPLE"}},
        {"underscore below letters when folded", false, {"M", "_", "a"}, {}, "M(_(-,a),-)", {"M", "_", "a"}},
        {"underscore between the cases", true, {"M", "_", "a"}, {}, "M(-,_(-,a))", {"M", "_", "a"}},
        {"byte 233 above z, folded", false, {"z", "\xE9", "Z"}, {}, "z(-,\xE9)", {"z", "\xE9"}},
        {"byte 233 above z, case-sensitive", true, {"z", "\xE9", "Z"}, {}, "z(Z,\xE9)", {"z", "\xE9", "Z"}},
        {"bytes above 127 never fold", false, {"\xE9", "\xC9"}, {}, "\xE9(\xC9,-)", {"\xE9", "\xC9"}},
        {"empty string is smallest", false, {"a", "", "", "A"}, {}, "a(\"\",-)", {"a", "\"\""}},
        {"prefix is smaller", true, {"ab", "abc", "a"}, {}, "ab(a,abc)", {"ab", "abc", "a"}},
        {"remove the root", false, {"m", "f", "t", "a", "h", "p", "x"}, {"m"}, "f(a,h(-,t(p,x)))",
         {"f", "t", "a", "h", "p", "x"}},
        {"remove under another spelling", false, {"b", "a", "c"}, {"A"}, "b(-,c)", {"b", "c"}},
        {"remove needs the exact case when it matters", true, {"b", "a", "c"}, {"A", "B"}, "b(a,c)", {"b", "a", "c"}},
        {"remove the empty string", false, {"b", "", "a"}, {""}, "b(a,-)", {"b", "a"}},
        {"folded apple goes", false, {"Apple"}, {"APPLE"}, ".", {}},
    };
    for (const bool with_index : {false, true}) {
        for (const StringCase& c : cases) {
            SCOPED_TRACE(std::string(c.name) + (with_index ? ", index on" : ", index off"));
            Strings h(with_index, c.case_sensitive);
            for (const std::string& s : c.adds) {
                do_add(h, s);
            }
            for (const std::string& s : c.removes) {
                do_remove(h, s);
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

TEST(Strings, ContainsInBothModes) {
    struct Case {
        const char* probe;
        bool folded;     // found in the case-insensitive collection
        bool sensitive;  // found in the case-sensitive collection
    };
    const std::vector<Case> cases = {
        {"Apple", true, true}, {"aPPLE", true, false}, {"apple", true, false}, {"APPLE", true, false},
        {"Appl", false, false}, {"Apples", false, false}, {"", true, true}, {"_", true, true},
        {"\xE9", true, true},   {"\xC9", false, false},  {"m", true, false}, {"M", true, true},
    };
    Strings folded(false, false);
    Strings sensitive(false, true);
    for (Strings* h : {&folded, &sensitive}) {
        for (const char* s : {"Apple", "", "_", "\xE9", "M"}) {
            do_add(*h, s);
        }
    }
    for (const Case& c : cases) {
        SCOPED_TRACE(c.probe);
        EXPECT_EQ(do_contains(folded, c.probe), c.folded);
        EXPECT_EQ(do_contains(sensitive, c.probe), c.sensitive);
    }
    Strings empty;
    EXPECT_FALSE(do_contains(empty, ""));
    EXPECT_FALSE(do_contains(empty, "a"));
}

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

TEST(Strings, AddAfterClearMakesANewRoot) {
    Strings h(true);
    for (const char* s : {"b", "a", "c"}) {
        do_add(h, s);
    }
    do_clear(h);
    EXPECT_EQ(h.root, nullptr);
    EXPECT_EQ(h.count, 0);
    do_add(h, "z");
    EXPECT_EQ(render(h), "z");
    EXPECT_EQ(index_values(h), std::vector<std::string>{"z"});
    EXPECT_EQ(do_position(h, "Z"), 0);
}

// Clearing one collection leaves the other two exactly as they were.
TEST(Clear, TouchesOnlyItsOwnCollection) {
    for (int cleared = 0; cleared < 3; ++cleared) {
        for (const bool with_index : {false, true}) {
            SCOPED_TRACE("clearing kind " + std::to_string(cleared) + (with_index ? ", index on" : ""));
            const std::int64_t live_before = static_cast<std::int64_t>(memory::live_allocations());
            {
                Ints ints(with_index);
                Floats floats(with_index);
                Strings strings(with_index);
                for (const std::int32_t v : {2, 1, 3}) do_add(ints, v);
                for (const float v : {2.5F, 1.5F, 3.5F}) do_add(floats, v);
                for (const char* v : {"b", "a", "c"}) do_add(strings, v);
                const std::vector<std::string> shapes = {render(ints), render(floats), render(strings)};
                const std::vector<std::vector<std::string>> orders = {index_values(ints), index_values(floats),
                                                                      index_values(strings)};
                if (cleared == 0) do_clear(ints);
                if (cleared == 1) do_clear(floats);
                if (cleared == 2) do_clear(strings);
                const std::vector<std::string> after = {render(ints), render(floats), render(strings)};
                const std::vector<std::int32_t> counts = {ints.count, floats.count, strings.count};
                const std::vector<std::vector<std::string>> orders_after = {
                    index_values(ints), index_values(floats), index_values(strings)};
                for (int k = 0; k < 3; ++k) {
                    if (k == cleared) {
                        EXPECT_EQ(after[k], ".");
                        EXPECT_EQ(counts[k], 0);
                        EXPECT_TRUE(orders_after[k].empty());
                    } else {
                        EXPECT_EQ(after[k], shapes[k]);
                        EXPECT_EQ(counts[k], 3);
                        EXPECT_EQ(orders_after[k], orders[k]);
                    }
                }
            }
            EXPECT_EQ(static_cast<std::int64_t>(memory::live_allocations()), live_before);
        }
    }
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
