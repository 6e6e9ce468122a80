// Owns the fields a collection view refers to, as a run record owns them:
// the tests and the benchmarks hold their collections in it.
#pragma once

#include <cstdint>
#include <vector>

#include "collections/collections.hpp"

namespace sorvel::test {

// Frees tree, index and side structure at the end. Without the side
// structure the view descends plainly.
template <class V>
struct Holder {
    using Node = TreeNode<V>;
    Node* root = nullptr;
    std::int32_t count = 0;
    InsertionIndex<Node>* index = nullptr;
    SideStructure<Node> side;
    bool with_side;

    Holder(bool with_index, bool structure)
        : index(with_index ? create_index<Node>() : nullptr), with_side(structure) {}
    Holder(const Holder&) = delete;
    Holder& operator=(const Holder&) = delete;
    ~Holder() {
        Collection<V> c = view();
        clear(c);
        destroy_index(index);
    }
    Collection<V> view() { return Collection<V>{root, count, index, with_side ? &side : nullptr}; }
    // The values at positions 0, 1, ... of the index.
    std::vector<V> positions() {
        std::vector<V> out;
        for (std::int32_t p = 0; index != nullptr && p < count; ++p) {
            out.push_back(node_at(view(), p)->value);
        }
        return out;
    }
};

}  // namespace sorvel::test
