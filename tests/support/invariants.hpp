// Checkers of the invariants the library keeps beside its trees, read through
// the product's inspection interface only: the side structure (a treap of the
// links that point at the tree's nodes) and the insertion index (slots, their
// bits and the counts over the bits). Each gives a description of the first
// broken invariant, or an empty string. One check costs O(n) in the values
// and the index's capacity, so callers choose how often to run it.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "collections/collections.hpp"
#include "host/boundary.hpp"
#include "simulated_host.hpp"

namespace sorvel::test {

// The index on its own: a bit per slot, set exactly for the handed-out slots
// that hold a node, each node numbered with its slot, counts that agree with
// the bits, and as many held as the collection has values.
template <class Node>
std::string check_index(const InsertionIndex<Node>& index, std::int32_t count) {
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
        if (bit != (node != nullptr) || (node != nullptr && node->order != s)) {
            return "index: slot " + std::to_string(s) + " has its bit " + (bit ? "set" : "clear") + " and " +
                   (node != nullptr ? "a node numbered " + std::to_string(node->order) : "no node");
        }
        set += bit ? 1U : 0U;
    }
    // Count i covers the groups of words (i - lowest_bit(i), i].
    constexpr std::size_t kGroup = RankedBits::kGroupWords;
    if (bits.groups() != (bits.words() + kGroup - 1) / kGroup) {
        return "index: " + std::to_string(bits.groups()) + " counts for " + std::to_string(bits.words()) + " words";
    }
    for (std::size_t i = 1; i <= bits.groups(); ++i) {
        std::size_t recount = 0;
        for (std::size_t w = (i - RankedBits::lowest_bit(i)) * kGroup; w < i * kGroup && w < bits.words(); ++w) {
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
    return {};
}

// One collection. The tree and the side structure are both walked in order,
// side by side: the i-th entry must hold the i-th link of the tree (so that
// every node is reached once) and that node's value as its key, the keys must
// rise strictly under `order`, and no child may outrank its parent. With an
// index, every node of the tree must sit in its slot.
template <class Node, class Order>
std::string check_collection(Node* const* root, std::int32_t count, const SideStructure<Node>* structure,
                             const InsertionIndex<Node>* index, const Order& order) {
    using Side = SideStructure<Node>;
    if (index != nullptr) {
        if (std::string fault = check_index(*index, count); !fault.empty()) {
            return fault;
        }
    }
    const bool side = structure != nullptr && structure->built();
    if (side && structure->size() != static_cast<std::uint32_t>(count)) {
        return "side structure: " + std::to_string(structure->size()) + " entries for " + std::to_string(count) +
               " values";
    }
    std::vector<Node* const*> nodes;  // links whose left subtree is still to walk
    std::vector<std::uint32_t> entries;
    std::int32_t seen = 0;
    const typename Side::Entry* previous = nullptr;
    std::uint32_t e = side ? structure->root() : Side::kNone;
    for (Node* const* at = root; *at != nullptr || !nodes.empty();) {
        for (; *at != nullptr; at = &(*at)->left) {
            if (nodes.size() > static_cast<std::size_t>(count)) {
                return "tree: a path longer than the count of " + std::to_string(count);
            }
            nodes.push_back(at);
        }
        at = nodes.back();
        nodes.pop_back();
        if (++seen > count) {
            return "tree: more nodes than the count of " + std::to_string(count);
        }
        const Node* node = *at;
        if (index != nullptr && (node->order >= index->used() || index->slot(node->order) != node)) {
            return "index: a node of the tree is not in its slot " + std::to_string(node->order);
        }
        if (side) {
            for (; e != Side::kNone; e = structure->entry(e).left) {
                if (e >= structure->capacity() || entries.size() >= structure->size()) {
                    return "side structure: entry " + std::to_string(e) + " out of the pool or reached twice";
                }
                entries.push_back(e);
            }
            if (entries.empty()) {
                return "side structure: fewer entries in order than nodes in the tree";
            }
            const std::uint32_t x = entries.back();
            entries.pop_back();
            const typename Side::Entry& entry = structure->entry(x);
            for (const std::uint32_t child : {entry.left, entry.right}) {
                if (child != Side::kNone && child < structure->capacity() &&
                    structure->entry(child).priority > entry.priority) {
                    return "side structure: entry " + std::to_string(child) + " outranks its parent " +
                           std::to_string(x);
                }
            }
            if (entry.link != at || std::memcmp(&node->value, &entry.key, sizeof entry.key) != 0) {
                return "side structure: entry " + std::to_string(x) + " is not the tree's link in its place";
            }
            if (previous != nullptr && order(previous->key, entry.key) >= 0) {
                return "side structure: entry " + std::to_string(x) + " is out of order";
            }
            previous = &entry;
            e = entry.right;
        }
        at = &node->right;
    }
    if (seen != count) {
        return "tree: " + std::to_string(seen) + " nodes for a count of " + std::to_string(count);
    }
    if (side && (e != Side::kNone || !entries.empty())) {
        return "side structure: more entries in order than nodes in the tree";
    }
    return {};
}

// The strings of an instance of the library linked in, in the index's order,
// read from the slots rather than through the host.
inline std::vector<std::string> indexed_strings(const RunRecord& r) {
    std::vector<std::string> out;
    for (std::uint32_t s = 0; r.string_index != nullptr && s < r.string_index->used(); ++s) {
        if (const auto* node = r.string_index->slot(s)) {
            out.emplace_back(node->value);
        }
    }
    return out;
}

// One collection of an instance of the library linked in (the layouts are
// this program's own).
inline std::string check_collection(const RunRecord& r, simulated::Set set) {
    if (r.reader == nullptr) {
        return {};
    }
    const SideStructures& side = reinterpret_cast<const InstanceBlock*>(r.reader)->side;
    std::string fault;
    switch (set) {
        case simulated::Set::integers:
            fault = check_collection(&r.integer_root, r.integer_count, &side.integers, r.integer_index, IntegerOrder{});
            return fault.empty() ? fault : "integers: " + fault;
        case simulated::Set::floats:
            fault = check_collection(&r.float_root, r.float_count, &side.floats, r.float_index, FloatOrder{});
            return fault.empty() ? fault : "floats: " + fault;
        case simulated::Set::strings:
            fault = check_collection(&r.string_root, r.string_count, &side.strings, r.string_index,
                                     StringOrder{r.case_sensitive == 1});
            return fault.empty() ? fault : "strings: " + fault;
    }
    return {};
}

}  // namespace sorvel::test
