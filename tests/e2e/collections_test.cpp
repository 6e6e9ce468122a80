// The conditions and the collection actions, end to end through the handler
// tables of the built library.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "small_stack.hpp"
#include "test_host.hpp"

namespace {

using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;

constexpr int kIntegers = 0;
constexpr int kFloats = 1;
constexpr int kStrings = 2;

// "value(left,right)", "-" for an empty link, leaves without parentheses.
template <class Show>
std::string shape(NodeView node, const Show& show) {
    if (!node) {
        return "-";
    }
    std::string out = show(node);
    if (node.left() || node.right()) {
        out += "(" + shape(node.left(), show) + "," + shape(node.right(), show) + ")";
    }
    return out;
}

std::string int_shape(const Instance& i) {
    return shape(NodeView{i.root(kIntegers)}, [](NodeView n) { return std::to_string(n.integer()); });
}
std::string string_shape(const Instance& i) {
    return shape(NodeView{i.root(kStrings)}, [](NodeView n) { return n.string(); });
}
std::string float_shape(const Instance& i) {
    return shape(NodeView{i.root(kFloats)}, [](NodeView n) {
        char text[32];
        std::snprintf(text, sizeof text, "%g", static_cast<double>(n.floating()));
        return std::string(text);
    });
}

class Collections : public ::testing::Test {
protected:
    void TearDown() override { EXPECT_EQ(Library::stack_errors(), 0U); }

    void add_ints(Instance& i, std::initializer_list<int> values) {
        for (int v : values) {
            host.event(i, "Add Integer: %0", {Param::of(v)});
        }
    }
    void add_strings(Instance& i, std::initializer_list<const char*> values) {
        for (const char* v : values) {
            host.event(i, "Add String: %0", {Param::of(v)});
        }
    }

    Host host{Library::built()};
};

struct RemovalCase {
    const char* name;
    std::vector<int> adds;
    int removed;
    const char* shape_after;
};

TEST_F(Collections, IntegerRemovalReshapesLikeReinsertion) {
    const std::vector<RemovalCase> cases = {
        {"root with two children", {50, 30, 70, 20, 40, 60, 80}, 50, "30(20,40(-,70(60,80)))"},
        {"inner node", {50, 30, 70, 20, 40, 60, 80}, 30, "50(20(-,40),70(60,80))"},
        {"leaf", {50, 30, 70, 20}, 20, "50(30,70)"},
        {"root without left child", {50, 70, 60, 80}, 50, "70(60,80)"},
        {"only node", {50}, 50, "-"},
        {"absent value", {50, 30}, 40, "50(30,-)"},
        {"deepest of a right chain", {1, 2, 3, 4}, 4, "1(-,2(-,3))"},
        {"middle of a left chain", {4, 3, 2, 1}, 3, "4(2(1,-),-)"},
        {"signed order", {1, -1, 2147483647, -2147483647 - 1}, 1, "-1(-2147483648,2147483647)"},
    };
    for (const auto& c : cases) {
        for (int use_indices : {0, 1}) {
            SCOPED_TRACE(std::string(c.name) + (use_indices ? " with index" : ""));
            Instance& i = host.create(0, use_indices);
            for (int v : c.adds) {
                host.event(i, "Add Integer: %0", {Param::of(v)});
            }
            const int before = i.count(kIntegers);
            host.event(i, "Remove Integer: %0", {Param::of(c.removed)});
            EXPECT_EQ(int_shape(i), c.shape_after);
            const bool was_held = std::find(c.adds.begin(), c.adds.end(), c.removed) != c.adds.end();
            EXPECT_EQ(i.count(kIntegers), before - (was_held ? 1 : 0));
            EXPECT_EQ(host.event(i, "%o: Contains Integer: %0", {Param::of(c.removed)}), 0);
            host.destroy(i);
        }
    }
}

TEST_F(Collections, DuplicateAddsChangeNothing) {
    Instance& i = host.create(0, 1);
    add_ints(i, {5, 5});
    host.event(i, "Add Float: %0", {Param::of(2.5F)});
    host.event(i, "Add Float: %0", {Param::of(2.5F)});
    add_strings(i, {"x", "X"});
    EXPECT_EQ(i.count(kIntegers), 1);
    EXPECT_EQ(i.count(kFloats), 1);
    EXPECT_EQ(i.count(kStrings), 1);
    EXPECT_EQ(int_shape(i), "5");
    EXPECT_EQ(host.event(i, "IntegerElementAt(", {Param::of(1)}), 0);
    EXPECT_EQ(host.event(i, "IndexOfIntegerElement(", {Param::of(5)}), 0);
}

TEST_F(Collections, FloatsFollowIeeeOrder) {
    Instance& i = host.create(0, 1);
    host.event(i, "Add Float: %0", {Param::of(0.0F)});
    host.event(i, "Add Float: %0", {Param::of(-0.0F)});
    EXPECT_EQ(i.count(kFloats), 1);
    EXPECT_FALSE(std::signbit(NodeView{i.root(kFloats)}.floating()));
    EXPECT_EQ(host.event(i, "%o: Contains Float: %0", {Param::of(-0.0F)}), 1);
    host.event(i, "Remove Float: %0", {Param::of(-0.0F)});
    EXPECT_EQ(i.count(kFloats), 0);

    const float inf = std::numeric_limits<float>::infinity();
    for (float v : {1.5F, inf, -inf}) {
        host.event(i, "Add Float: %0", {Param::of(v)});
    }
    EXPECT_EQ(float_shape(i), "1.5(-inf,inf)");

    // Neighbouring bit patterns are distinct values.
    const float one = 1.0F;
    const float next = std::nextafter(one, 2.0F);
    host.event(i, "Add Float: %0", {Param::of(one)});
    host.event(i, "Add Float: %0", {Param::of(next)});
    EXPECT_EQ(i.count(kFloats), 5);
}

TEST_F(Collections, NaNIsNeverStored) {
    Instance& i = host.create(0, 1);
    const float nan = std::numeric_limits<float>::quiet_NaN();
    host.event(i, "Add Float: %0", {Param::of(1.0F)});
    host.event(i, "Add Float: %0", {Param::of(nan)});
    EXPECT_EQ(i.count(kFloats), 1);
    EXPECT_EQ(host.event(i, "%o: Contains Float: %0", {Param::of(nan)}), 0);
    host.event(i, "Remove Float: %0", {Param::of(nan)});
    EXPECT_EQ(i.count(kFloats), 1);
    EXPECT_EQ(float_shape(i), "1");
    EXPECT_EQ(host.event(i, "IndexOfFloatElement(", {Param::of(nan)}), -1);
}

TEST_F(Collections, NullStringsAreNoValue) {
    for (int use_indices : {0, 1}) {
        Instance& i = host.create(0, use_indices);
        add_strings(i, {"a"});
        host.event(i, "Add String: %0", {Param::null()});
        host.event(i, "Remove String: %0", {Param::null()});
        EXPECT_EQ(host.event(i, "%o: Contains String: %0", {Param::null()}), 0);
        EXPECT_EQ(host.event(i, "IndexOfStringElement(", {Param::null()}), -1);
        EXPECT_EQ(i.count(kStrings), 1);
        EXPECT_EQ(string_shape(i), "a");
        host.destroy(i);
    }
}

struct StringShapeCase {
    int case_sensitive;
    std::vector<const char*> adds;
    const char* removed;  // null: no removal
    const char* shape;
    int count;
};

TEST_F(Collections, StringShapesInBothModes) {
    const std::vector<StringShapeCase> cases = {
        {0, {"Apple", "APPLE"}, nullptr, "Apple", 1},
        {1, {"Apple", "APPLE"}, nullptr, "Apple(APPLE,-)", 2},
        {0, {"M", "_", "a"}, nullptr, "M(_(-,a),-)", 3},
        {1, {"M", "_", "a"}, nullptr, "M(-,_(-,a))", 3},
        {0, {"z", "\xE9"}, nullptr, "z(-,\xE9)", 2},
        {1, {"z", "\xE9"}, nullptr, "z(-,\xE9)", 2},
        {0, {"b", "", "c"}, nullptr, "b(,c)", 3},
        {1, {"m", "f", "t", "a", "h", "p", "x"}, "m", "f(a,h(-,t(p,x)))", 6},
        {0, {"Apple"}, "APPLE", "-", 0},
        {1, {"Apple"}, "APPLE", "Apple", 1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string("case-sensitive ") + std::to_string(c.case_sensitive) + " " + c.shape);
        Instance& i = host.create(c.case_sensitive, 0);
        for (const char* s : c.adds) {
            host.event(i, "Add String: %0", {Param::of(s)});
        }
        if (c.removed != nullptr) {
            host.event(i, "Remove String: %0", {Param::of(c.removed)});
        }
        EXPECT_EQ(string_shape(i), c.shape);
        EXPECT_EQ(i.count(kStrings), c.count);
        host.destroy(i);
    }
}

TEST_F(Collections, ContainsStringFollowsTheComparison) {
    Instance& folded = host.create(0, 0);
    Instance& exact = host.create(1, 0);
    for (Instance* i : {&folded, &exact}) {
        add_strings(*i, {"Apple", ""});
    }
    EXPECT_EQ(host.event(folded, "%o: Contains String: %0", {Param::of("aPPLE")}), 1);
    EXPECT_EQ(host.event(exact, "%o: Contains String: %0", {Param::of("apple")}), 0);
    EXPECT_EQ(host.event(exact, "%o: Contains String: %0", {Param::of("")}), 1);
}

TEST_F(Collections, ClearTouchesOnlyItsOwnCollection) {
    const char* clears[] = {"Clear Integers", "Clear Floats", "Clear Strings"};
    for (int cleared = 0; cleared < 3; ++cleared) {
        Instance& i = host.create(0, 1);
        add_ints(i, {1, 2});
        host.event(i, "Add Float: %0", {Param::of(1.0F)});
        add_strings(i, {"a", "b", "c"});
        const int counts[] = {2, 1, 3};
        host.event(i, clears[cleared]);
        for (int c = 0; c < 3; ++c) {
            EXPECT_EQ(i.count(c), c == cleared ? 0 : counts[c]);
            EXPECT_EQ(i.root(c) == 0, c == cleared);
        }
        // A value added after a clear is the new root.
        add_strings(i, {"q"});
        if (cleared == kStrings) {
            EXPECT_EQ(string_shape(i), "q");
        }
        host.destroy(i);
    }
}

TEST_F(Collections, ActionsGiveZeroAndConditionsOneOrZero) {
    Instance& i = host.create(1, 1);
    EXPECT_EQ(host.event(i, "Add Integer: %0", {Param::of(3)}), 0);
    EXPECT_EQ(host.event(i, "Remove Integer: %0", {Param::of(4)}), 0);
    EXPECT_EQ(host.event(i, "%o: Contains Integer: %0", {Param::of(3)}), 1);
    EXPECT_EQ(host.event(i, "%o: Contains Integer: %0", {Param::of(4)}), 0);
    EXPECT_EQ(host.event(i, "Clear Integers"), 0);
    EXPECT_EQ(host.event(i, "%o: Contains Integer: %0", {Param::of(3)}), 0);
}

// Chains as deep as the count: built through the interface, then freed on a
// small stack so that no freeing step may recurse along the chain.
TEST_F(Collections, DeepChainsAreFreedOnASmallStack) {
#if defined(__x86_64__) && !defined(_WIN32)
    constexpr int kDepth = 20000;
#else
    constexpr int kDepth = 3000;  // quadratic to build; qemu and wine are slow
#endif
    // Descending chains lean left and are cleared; ascending ones lean right
    // and are destroyed. Building is quadratic, so each is built once.
    for (int descending : {0, 1}) {
        {
            const int destroy = descending ? 0 : 1;
            Instance& i = host.create(1, 1);
            for (int n = 0; n < kDepth; ++n) {
                const int v = descending ? kDepth - n : n;
                host.event(i, "Add Integer: %0", {Param::of(v)});
                host.event(i, "Add Float: %0", {Param::of(static_cast<float>(v))});
                char text[16];
                std::snprintf(text, sizeof text, "%08d", v);
                host.event(i, "Add String: %0", {Param::of(text)});
            }
            for (int c = 0; c < 3; ++c) {
                ASSERT_EQ(i.count(c), kDepth);
            }
            const auto before = host.calls().size();
            const bool finished = sorvel::testing::run_on_small_stack([&] {
                if (destroy) {
                    host.destroy(i);
                } else {
                    host.event(i, "Clear Integers");
                    host.event(i, "Clear Floats");
                    host.event(i, "Clear Strings");
                }
            });
            EXPECT_TRUE(finished);
            EXPECT_EQ(host.calls().size(), before);
            if (!destroy) {
                for (int c = 0; c < 3; ++c) {
                    EXPECT_EQ(i.count(c), 0);
                    EXPECT_EQ(i.root(c), 0);
                }
                host.destroy(i);
            }
        }
    }
}

}  // namespace
