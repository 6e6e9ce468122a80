// Checkers of the invariants the library keeps beside its trees, read through
// the product's inspection interface only: the side structure (a treap of the
// links that point at the tree's nodes) and the insertion index (slots, their
// bits and the counts over the bits). Each gives a description of the first
// broken invariant, or an empty string. They cost O(n log n) in the size of
// the collection, so callers choose how often to run them.
#pragma once

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "collections/collections.hpp"
#include "host/boundary.hpp"

namespace sorvel::test {

// The tree's nodes with the links that point at them, in no order; empty when
// the walk meets more nodes than `count` (a cycle, or a count too low).
template <class Node>
std::vector<Node* const*> tree_links(Node* const* root, std::int32_t count) {
    std::vector<Node* const*> links;
    std::vector<Node* const*> pending{root};
    while (!pending.empty()) {
        Node* const* at = pending.back();
        pending.pop_back();
        if (*at == nullptr) {
            continue;
        }
        if (links.size() == static_cast<std::size_t>(count)) {
            return {};
        }
        links.push_back(at);
        pending.push_back(&(*at)->left);
        pending.push_back(&(*at)->right);
    }
    return links;
}

// The side structure, when built: a treap whose in-order keys rise strictly
// under `order`, whose priorities never rise downwards, and whose entries are
// exactly the links of the tree, each with the value of the node it points at.
template <class Node, class Order>
std::string check_links(const LinkIndex<Node>& links, Node* const* root, std::int32_t count, const Order& order) {
    if (!links.built()) {
        return {};
    }
    using Index = LinkIndex<Node>;
    if (links.size() != static_cast<std::uint32_t>(count)) {
        return "side structure holds " + std::to_string(links.size()) + " entries for " + std::to_string(count) +
               " values";
    }
    std::vector<Node* const*> held;
    std::vector<std::uint32_t> seen;
    // In order, without recursion: the entries whose left side is done wait.
    std::vector<std::uint32_t> waiting;
    const typename Index::Entry* previous = nullptr;
    for (std::uint32_t e = links.root(); e != Index::kNone || !waiting.empty();) {
        for (; e != Index::kNone; e = links.entry(e).left) {
            if (e >= links.capacity()) {
                return "side structure: a child " + std::to_string(e) + " past the pool's " +
                       std::to_string(links.capacity()) + " entries";
            }
            if (seen.size() + waiting.size() > links.size()) {
                return "side structure: more entries reachable than it holds (a cycle or a shared entry)";
            }
            waiting.push_back(e);
        }
        e = waiting.back();
        waiting.pop_back();
        seen.push_back(e);
        const typename Index::Entry& x = links.entry(e);
        for (const std::uint32_t child : {x.left, x.right}) {
            if (child != Index::kNone && links.entry(child).priority > x.priority) {
                return "side structure: entry " + std::to_string(child) + " has a higher priority than its parent " +
                       std::to_string(e);
            }
        }
        if (previous != nullptr && order(previous->key, x.key) >= 0) {
            return "side structure: entry " + std::to_string(e) + " is out of order";
        }
        if (x.link == nullptr || *x.link == nullptr || std::memcmp(&(*x.link)->value, &x.key, sizeof x.key) != 0) {
            return "side structure: entry " + std::to_string(e) + " does not point at the node of its key";
        }
        held.push_back(x.link);
        previous = &x;
        e = x.right;
    }
    std::sort(seen.begin(), seen.end());
    if (seen.size() != links.size() || std::adjacent_find(seen.begin(), seen.end()) != seen.end()) {
        return "side structure: " + std::to_string(seen.size()) + " entries reachable, some twice, of " +
               std::to_string(links.size());
    }
    std::vector<Node* const*> tree = tree_links(root, count);
    std::sort(tree.begin(), tree.end());
    std::sort(held.begin(), held.end());
    if (tree != held) {
        return "side structure: its links are not the tree's links";
    }
    return {};
}

// The insertion index: a bit per slot, set exactly for the handed-out slots
// that hold a node, each node numbered with its slot; counts that agree with
// the bits; and every node of the tree held.
template <class Node>
std::string check_index(const InsertionIndex<Node>& index, Node* const* root, std::int32_t count) {
    const RankedBits& bits = index.held();
    constexpr std::size_t kBits = RankedBits::kWordBits;
    if (index.used() > index.capacity() || bits.words() * kBits < index.capacity()) {
        return "index: " + std::to_string(index.used()) + " slots used of " + std::to_string(index.capacity()) +
               ", bits for " + std::to_string(bits.words() * kBits);
    }
    std::size_t set = 0;
    for (std::size_t s = 0; s < bits.words() * kBits; ++s) {
        const bool bit = ((bits.word(s / kBits) >> (s % kBits)) & 1U) != 0;
        const Node* node = s < index.used() ? index.slot(static_cast<std::uint32_t>(s)) : nullptr;
        if (bit != (node != nullptr)) {
            return "index: the bit of slot " + std::to_string(s) + " is " + (bit ? "set" : "clear") + " for " +
                   (node != nullptr    ? "a held node"
                    : s < index.used() ? "an emptied slot"
                                       : "a slot not handed out");
        }
        if (node != nullptr && node->order != s) {
            return "index: the node in slot " + std::to_string(s) + " is numbered " + std::to_string(node->order);
        }
        set += bit ? 1U : 0U;
    }
    for (std::size_t i = 1; i <= bits.words(); ++i) {
        std::size_t recount = 0;
        for (std::size_t w = i - RankedBits::lowest_bit(i); w < i; ++w) {
            recount += static_cast<std::size_t>(std::popcount(bits.word(w)));
        }
        if (bits.count(i) != recount) {
            return "index: count " + std::to_string(i) + " is " + std::to_string(bits.count(i)) + ", its words hold " +
                   std::to_string(recount);
        }
    }
    if (index.size() != set || set != static_cast<std::size_t>(count)) {
        return "index: size " + std::to_string(index.size()) + ", " + std::to_string(set) + " bits set, " +
               std::to_string(count) + " values";
    }
    for (Node* const* link : tree_links(root, count)) {
        const Node* node = *link;
        if (node->order >= index.used() || index.slot(node->order) != node) {
            return "index: a node of the tree is not in its slot " + std::to_string(node->order);
        }
    }
    return {};
}

// Both, for one collection of an instance of the library linked in (the
// layouts are this program's own): 0 integers, 1 floats, 2 strings.
inline std::string check_collection(const RunRecord& r, int collection) {
    if (r.reader == nullptr) {
        return {};
    }
    const LinkIndexes& links = reinterpret_cast<const InstanceBlock*>(r.reader)->links;
    const auto check = [](const char* name, const auto& side, auto* const* root, std::int32_t count, const auto* index,
                          const auto& order) {
        std::string fault = check_links(side, root, count, order);
        if (fault.empty() && index != nullptr) {
            fault = check_index(*index, root, count);
        }
        return fault.empty() ? fault : name + (": " + fault);
    };
    switch (collection) {
        case 0:
            return check("integers", links.integers, &r.integer_root, r.integer_count, r.integer_index, IntegerOrder{});
        case 1: return check("floats", links.floats, &r.float_root, r.float_count, r.float_index, FloatOrder{});
        default:
            return check("strings", links.strings, &r.string_root, r.string_count, r.string_index,
                         StringOrder{r.case_sensitive == 1});
    }
}

}  // namespace sorvel::test
