// A collection's fields, owned by a benchmark as a run record owns them.
#pragma once

#include <cstdint>

#include "collections/collections.hpp"

namespace sorvel::bench {

template <class V>
struct Fields {
    TreeNode<V>* root = nullptr;
    std::int32_t count = 0;
    InsertionIndex<TreeNode<V>>* index = nullptr;
    LinkIndex<TreeNode<V>> links;
    bool with_links = false;  // false: plain descents, as before the side structure

    explicit Fields(bool with_index = false, bool linked = false) : with_links(linked) {
        if (with_index) {
            index = create_index<TreeNode<V>>();
        }
    }
    Fields(const Fields&) = delete;
    Fields& operator=(const Fields&) = delete;
    ~Fields() {
        Collection<V> c = view();
        clear(c);
        destroy_index(index);
    }
    Collection<V> view() { return Collection<V>{root, count, index, with_links ? &links : nullptr}; }
};

}  // namespace sorvel::bench
