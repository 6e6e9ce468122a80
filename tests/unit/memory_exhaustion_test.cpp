// Running out of memory: each allocation that an add or a remove makes is
// made to fail in turn. A failed change must leave count, tree and index
// exactly as they were and leak nothing; the run in which no allocation
// fails must end where an undisturbed run ends.
#include <gtest/gtest.h>

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

// Everything a caller can observe of a collection.
struct Snapshot {
    std::string shape;
    std::int32_t count = 0;
    std::vector<std::string> index;
    bool operator==(const Snapshot&) const = default;
};

template <class V>
Snapshot snapshot(const Holder<V>& h) {
    return Snapshot{render(h), h.count, index_values(h)};
}

// Distinct values for each kind, in an order that gives a bushy tree.
template <class V>
auto value_number(int i) {
    const int n = (i * 37) % 101 - 50;
    if constexpr (std::is_same_v<V, char*>) {
        // Mixed case: in a case-insensitive collection "K7" and "k7" are one.
        return std::string(n % 2 == 0 ? "K" : "k") + std::to_string(n);
    } else if constexpr (std::is_same_v<V, float>) {
        return static_cast<float>(n) / 4.0F;
    } else {
        return static_cast<std::int32_t>(n);
    }
}

template <class V>
using Key = decltype(value_number<V>(0));

template <class V>
struct Op {
    bool is_add;
    Key<V> value;
};

template <class V>
bool apply(Holder<V>& h, const Op<V>& op) {
    return op.is_add ? do_add(h, op.value) : do_remove(h, op.value);
}

template <class V>
void build(Holder<V>& h, int prefix) {
    for (int i = 0; i < prefix; ++i) {
        do_add(h, value_number<V>(i));
    }
}

// Allocations one held value costs, measured rather than assumed.
template <class V>
std::uint64_t allocations_per_value() {
    Holder<V> h(false);
    const std::uint64_t before = memory::total_allocations();
    do_add(h, value_number<V>(0));
    return memory::total_allocations() - before;
}

struct Outcome {
    std::uint64_t allocations = 0;  // made by the undisturbed run
    bool changed = false;
};

// Runs op on a collection built from the first `prefix` values, once
// undisturbed and then with allocation n failing for n = 0, 1, 2, ... until
// the op runs without reaching a failure.
template <class V>
Outcome exhaust(bool with_index, int prefix, const Op<V>& op) {
    Outcome outcome;
    Snapshot before;
    Snapshot after;
    std::size_t live_change = 0;
    bool result = false;
    {
        Holder<V> h(with_index);
        build(h, prefix);
        before = snapshot(h);
        const std::size_t live = memory::live_allocations();
        const std::uint64_t total = memory::total_allocations();
        result = apply(h, op);
        outcome.allocations = memory::total_allocations() - total;
        live_change = memory::live_allocations() - live;
        after = snapshot(h);
        EXPECT_TRUE(collection_is_sound(h));
        // The index follows the insertion order: appended at the end on an
        // add, the removed value's entry gone on a remove.
        if (with_index) {
            std::vector<std::string> want = before.index;
            if (op.is_add && result) {
                want.push_back(show(op.value));
            }
            if (!op.is_add && result) {
                std::erase(want, show(op.value));
            }
            EXPECT_EQ(after.index, want);
        }
    }
    outcome.changed = !(after == before);
    EXPECT_EQ(result, outcome.changed);

    for (long n = 0;; ++n) {
        SCOPED_TRACE("allocation " + std::to_string(n) + " fails");
        Holder<V> h(with_index);
        build(h, prefix);
        EXPECT_EQ(snapshot(h), before);
        const std::size_t live = memory::live_allocations();
        memory::fail_allocation_after(n);
        const bool got = apply(h, op);
        memory::fail_allocation_after(-1);
        EXPECT_TRUE(collection_is_sound(h));
        if (static_cast<std::uint64_t>(n) < outcome.allocations) {
            EXPECT_FALSE(got);
            EXPECT_EQ(snapshot(h), before);
            // Retried with memory to spare, the op ends exactly where the
            // undisturbed run did, with the same net allocations: nothing
            // the failed attempt made was lost. (An index that already grew
            // may keep its larger block; it is reused, not leaked.)
            EXPECT_EQ(apply(h, op), result);
            EXPECT_EQ(snapshot(h), after);
            EXPECT_TRUE(collection_is_sound(h));
            EXPECT_EQ(memory::live_allocations() - live, live_change);
            continue;
        }
        EXPECT_EQ(got, result);
        EXPECT_EQ(snapshot(h), after);
        EXPECT_EQ(memory::live_allocations() - live, live_change);
        break;
    }
    return outcome;
}

template <class V>
void exhaust_every_operation() {
    const std::size_t live_at_start = memory::live_allocations();
    const std::uint64_t per_value = allocations_per_value<V>();
    ASSERT_GE(per_value, 1U);
    for (const bool with_index : {false, true}) {
        SCOPED_TRACE(with_index ? "index on" : "index off");
        int growths = 0;
        // Adds into collections of every size up to 40: with the index on,
        // some of them must grow the index, and that allocation fails too.
        for (int prefix = 0; prefix <= 40; ++prefix) {
            SCOPED_TRACE("add to " + std::to_string(prefix) + " values");
            const Outcome o = exhaust<V>(with_index, prefix, Op<V>{true, value_number<V>(prefix)});
            EXPECT_TRUE(o.changed);
            if (with_index) {
                EXPECT_TRUE(o.allocations == per_value || o.allocations == per_value + 1);
                growths += o.allocations == per_value + 1 ? 1 : 0;
            } else {
                EXPECT_EQ(o.allocations, per_value);
            }
        }
        if (with_index) {
            EXPECT_GE(growths, 3);
        }

        // A duplicate changes nothing however its allocations go.
        for (const int which : {0, 5, 11}) {
            SCOPED_TRACE("duplicate of value " + std::to_string(which));
            EXPECT_FALSE(exhaust<V>(with_index, 12, Op<V>{true, value_number<V>(which)}).changed);
        }

        // Removes: root, inner nodes, leaves, absent values, the only value.
        // None allocates, so the first run already has nothing to fail.
        struct RemoveCase {
            int prefix;
            int value;
            bool present;
        };
        for (const RemoveCase& r : {RemoveCase{12, 0, true}, RemoveCase{12, 1, true}, RemoveCase{12, 5, true},
                                    RemoveCase{12, 11, true}, RemoveCase{12, 60, false}, RemoveCase{1, 0, true},
                                    RemoveCase{0, 0, false}}) {
            SCOPED_TRACE("remove value " + std::to_string(r.value) + " of " + std::to_string(r.prefix));
            const std::size_t live = memory::live_allocations();
            const Outcome o = exhaust<V>(with_index, r.prefix, Op<V>{false, value_number<V>(r.value)});
            EXPECT_EQ(o.allocations, 0U);
            EXPECT_EQ(o.changed, r.present);
            EXPECT_EQ(memory::live_allocations(), live);
        }
    }
    EXPECT_EQ(memory::live_allocations(), live_at_start);
}

TEST(MemoryExhaustion, Integers) { exhaust_every_operation<std::int32_t>(); }
TEST(MemoryExhaustion, Floats) { exhaust_every_operation<float>(); }
TEST(MemoryExhaustion, Strings) { exhaust_every_operation<char*>(); }

// A remove gives back exactly what its value's add took.
TEST(MemoryExhaustion, RemoveFreesWhatTheAddTook) {
    Strings h(false);
    build(h, 10);
    const std::size_t live = memory::live_allocations();
    do_add(h, "a much longer string than the others, to make its own block");
    const std::size_t grown = memory::live_allocations() - live;
    memory::fail_allocation_after(0);
    EXPECT_TRUE(do_remove(h, "A MUCH LONGER STRING THAN THE OTHERS, TO MAKE ITS OWN BLOCK"));
    memory::fail_allocation_after(-1);
    EXPECT_EQ(memory::live_allocations(), live);
    EXPECT_GE(grown, 1U);
}

TEST(MemoryExhaustion, IndexCreationCanFail) {
    const std::size_t live = memory::live_allocations();
    memory::fail_allocation_after(0);
    InsertionIndex<IntegerNode>* index = create_index<IntegerNode>();
    memory::fail_allocation_after(-1);
    EXPECT_EQ(index, nullptr);
    EXPECT_EQ(memory::live_allocations(), live);
}

// A long run of adds with a failure every few allocations: whatever fails,
// the collection stays whole and holds exactly the values that went in.
TEST(MemoryExhaustion, RepeatedFailuresKeepTheCollectionWhole) {
    for (const bool with_index : {false, true}) {
        Ints h(with_index);
        std::vector<std::string> kept;
        for (int i = 0; i < 101; ++i) {
            memory::fail_allocation_after(i % 3);
            const bool added = do_add(h, value_number<std::int32_t>(i));
            memory::fail_allocation_after(-1);
            if (added) {
                kept.push_back(std::to_string(value_number<std::int32_t>(i)));
            }
            ASSERT_TRUE(collection_is_sound(h)) << i;
            ASSERT_EQ(h.count, static_cast<std::int32_t>(kept.size()));
            if (with_index) {
                ASSERT_EQ(index_values(h), kept);
            }
        }
        EXPECT_GT(kept.size(), 30U);
    }
}

}  // namespace
}  // namespace sorvel::test
