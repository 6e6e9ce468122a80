// The insertion index and the position queries over it. A position is
// defined by a scan of the index from position 0 for the first node whose
// value equals the key; the library answers without scanning, so every
// answer here is checked against that scan.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <random>
#include <string>
#include <type_traits>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {
namespace {

template <class V, class Key>
std::int32_t scanned_position(const Holder<V>& h, const Key& key) {
    if (h.index == nullptr) {
        return -1;
    }
    for (std::uint32_t i = 0; i < h.index->size(); ++i) {
        if constexpr (std::is_same_v<V, char*>) {
            if (reference_compare(h.index->at(i)->value, key.c_str(), h.case_sensitive) == 0) {
                return static_cast<std::int32_t>(i);
            }
        } else if (h.index->at(i)->value == key) {
            return static_cast<std::int32_t>(i);
        }
    }
    return -1;
}

// The value at a position as the tests write it, "none" for no node.
template <class V>
std::string value_at(Holder<V>& h, std::int32_t position) {
    const TreeNode<V>* node = node_at(h.view(), position);
    return node == nullptr ? std::string("none") : show(node->value);
}

template <class V>
::testing::AssertionResult node_at_matches_index(Holder<V>& h) {
    const Collection<V> c = h.view();
    const std::int32_t size = h.index == nullptr ? 0 : static_cast<std::int32_t>(h.index->size());
    for (std::int32_t i = 0; i < size; ++i) {
        if (node_at(c, i) != h.index->at(static_cast<std::uint32_t>(i))) {
            return ::testing::AssertionFailure() << "node_at(" << i << ") is not the index entry";
        }
    }
    for (const std::int32_t outside :
         {-1, size, size + 1, std::numeric_limits<std::int32_t>::min(), std::numeric_limits<std::int32_t>::max()}) {
        if (node_at(c, outside) != nullptr) {
            return ::testing::AssertionFailure() << "node_at(" << outside << ") is not null";
        }
    }
    return ::testing::AssertionSuccess();
}

// Random adds and removes; after each, every probe's position is the scanned
// one and the index is in insertion order.
template <class V, class Make>
void check_positions(std::uint32_t seed, bool case_sensitive, int steps, Make make) {
    using Value = decltype(make(std::declval<std::mt19937&>()));
    std::mt19937 random(seed);
    Holder<V> h(true, case_sensitive);
    std::vector<Value> probes;
    for (int step = 0; step < steps; ++step) {
        const Value v = make(random);
        probes.push_back(v);
        if (random() % 3 != 0) {
            do_add(h, v);
        } else {
            do_remove(h, probes[random() % probes.size()]);
        }
        ASSERT_TRUE(collection_is_sound(h)) << "step " << step;
        ASSERT_TRUE(node_at_matches_index(h)) << "step " << step;
        for (std::size_t p = probes.size() > 40 ? probes.size() - 40 : 0; p < probes.size(); ++p) {
            ASSERT_EQ(do_position(h, probes[p]), scanned_position(h, probes[p]))
                << "step " << step << " probe " << show(probes[p]);
        }
    }
}

TEST(Positions, EqualTheScanOfTheIndex) {
    check_positions<std::int32_t>(21, false, 600,
                                  [](std::mt19937& r) { return static_cast<std::int32_t>(r() % 120) - 60; });
    check_positions<float>(22, false, 600, [](std::mt19937& r) {
        return r() % 10 == 0 ? -0.0F : static_cast<float>(static_cast<int>(r() % 120) - 60) / 2.0F;
    });
    for (const bool sensitive : {false, true}) {
        check_positions<char*>(23, sensitive, 600, [](std::mt19937& r) {
            const std::string alphabet = "aAbBcC_";
            std::string s;
            for (unsigned i = r() % 3; i > 0; --i) {
                s += alphabet[r() % alphabet.size()];
            }
            return s;
        });
    }
}

TEST(Positions, WrapAroundDuringAppendsAndErases) {
    Ints h(true);
    std::vector<std::int32_t> order;
    for (std::int32_t v = 0; v < 10; ++v) {
        do_add(h, v * 10);
        order.push_back(v * 10);
    }
    // Each round appends two and erases one from the front half, so the
    // numbering wraps in the first rounds and many times over afterwards.
    for (std::int32_t round = 0; round < 60; ++round) {
        for (const std::int32_t v : {1000 + 2 * round, 1001 + 2 * round}) {
            do_add(h, v);
            order.push_back(v);
        }
        const std::size_t at = static_cast<std::size_t>(round) % (order.size() / 2);
        const std::int32_t gone = order[at];
        do_remove(h, gone);
        order.erase(order.begin() + static_cast<std::ptrdiff_t>(at));
        std::vector<std::string> want;
        for (const std::int32_t v : order) {
            want.push_back(std::to_string(v));
        }
        ASSERT_EQ(index_values(h), want) << "round " << round;
        for (std::size_t i = 0; i < order.size(); ++i) {
            ASSERT_EQ(do_position(h, order[i]), static_cast<std::int32_t>(i)) << "round " << round;
        }
        ASSERT_EQ(do_position(h, gone), -1);
    }
}

// The index class on its own: entries are nodes it does not own.
TEST(InsertionIndexClass, AppendEraseAndPositionsAgreeWithAVector) {
    std::vector<IntegerNode> nodes(200);
    for (std::size_t i = 0; i < nodes.size(); ++i) {
        nodes[i].value = static_cast<std::int32_t>(i);
    }
    InsertionIndex<IntegerNode> index;
    std::vector<IntegerNode*> model;
    std::vector<bool> held(nodes.size(), false);
    std::mt19937 random(41);
    for (int step = 0; step < 2000; ++step) {
        const std::size_t pick = random() % nodes.size();
        if (!held[pick]) {
            ASSERT_TRUE(index.reserve_one());
            index.append(&nodes[pick]);
            model.push_back(&nodes[pick]);
        } else {
            index.erase(&nodes[pick]);
            model.erase(std::find(model.begin(), model.end(), &nodes[pick]));
        }
        held[pick] = !held[pick];
        ASSERT_EQ(index.size(), model.size());
        for (std::size_t i = 0; i < nodes.size(); ++i) {
            const auto at = std::find(model.begin(), model.end(), &nodes[i]);
            const std::int32_t want = at == model.end() ? -1 : static_cast<std::int32_t>(at - model.begin());
            ASSERT_EQ(index.position_of(&nodes[i]), want) << "step " << step << " node " << i;
        }
    }
    index.clear();
    EXPECT_TRUE(index.empty());
}

}  // namespace
}  // namespace sorvel::test
