#include "collections/collections.hpp"

#include <array>
#include <cmath>
#include <new>

namespace sorvel {
namespace {

// The depth past which plain descents call for a side structure. Random
// trees stay near 1.39 log2 n deep on average and below 3 log2 n at worst,
// so they never reach it; degenerate shapes of every size do. Test builds
// fix a small bound, so that small collections run through the structure.
std::uint32_t descent_bound(std::int32_t count) noexcept {
#ifdef SORVEL_DESCENT_BOUND
    static_cast<void>(count);
    return SORVEL_DESCENT_BOUND;
#else
    return 3 * static_cast<std::uint32_t>(std::bit_width(static_cast<std::uint32_t>(count))) + 8;
#endif
}

// Where a key sits. `link` points at the link to its node or, for a search
// made to add, at the null link where it would hang; it is null when the
// side structure answered that the key is absent and no leaf was asked for.
// With the side structure, also what its search found.
template <class Node>
struct Place {
    static constexpr std::uint32_t kNone = SideStructure<Node>::kNone;
    Node** link;
    bool held;
    typename SideStructure<Node>::Found found = {};  // found.match: the key's entry, or none
};

enum class Search : bool { value, leaf };

template <class V, class Key, class Order>
Place<TreeNode<V>> locate(const Collection<V>& c, const Key& key, const Order& order, Search search) noexcept {
    using Node = TreeNode<V>;
    SideStructure<Node>* side = c.side;
    if (side != nullptr && side->built()) {
        const auto f = side->find(key, order);
        if (f.match != side->kNone) {
            return {side->link(f.match), true, f};
        }
        if (search == Search::value) {
            return {nullptr, false};
        }
        // A new leaf hangs from its predecessor's right link or, when that is
        // taken, from its successor's left link.
        Node* below = f.below == side->kNone ? nullptr : *side->link(f.below);
        if (below != nullptr && below->right == nullptr) {
            return {&below->right, false};
        }
        return {f.above == side->kNone ? &c.root : &(*side->link(f.above))->left, false};
    }
    std::uint32_t depth = 0;
    Node** link = TreeSteps<Node>::descend(c.root, key, order, depth);
    if (depth > descent_bound(c.count) && side != nullptr && side->may_build(depth)) {
        if (side->build(c.root, c.count)) {
            return locate(c, key, order, search);
        }
        side->give_up(c.count);
    }
    return {link, *link != nullptr};
}

template <class V, class Key, class Order>
bool contains_key(const Collection<V>& c, const Key& key, const Order& order) noexcept {
    return locate(c, key, order, Search::value).held;
}

// Leaf insertion. The node is made only once the value is known to be new
// and the index has room, so a failure leaves everything as it was. The side
// structure follows, or is dropped if it cannot grow.
template <class V, class Key, class Order, class Make>
bool add_key(Collection<V>& c, const Key& key, const Order& order, Make&& make) noexcept {
    using Node = TreeNode<V>;
    const Place<Node> place = locate(c, key, order, Search::leaf);
    if (place.held) {
        return false;
    }
    Node** link = place.link;
    if (c.index != nullptr && !c.index->reserve_one()) {
        return false;
    }
    Node* node = make();
    if (node == nullptr) {
        return false;
    }
    node->left = nullptr;
    node->right = nullptr;
    node->order = 0;
    *link = node;
    if (c.index != nullptr) {
        c.index->append(node);
    }
    ++c.count;
    if (c.side != nullptr && c.side->built() && !c.side->insert(link, order)) {
        c.side->give_up(c.count);
    }
    return true;
}

template <class V, class Key, class Order>
bool remove_key(Collection<V>& c, const Key& key, const Order& order) noexcept {
    using Node = TreeNode<V>;
    const Place<Node> place = locate(c, key, order, Search::value);
    if (!place.held) {
        return false;
    }
    Node* removed = *place.link;
    Node* smaller = removed->left;
    Node* larger = removed->right;
    Node* below = nullptr;
    if (smaller != nullptr && larger != nullptr) {
        // The largest smaller key is the left subtree's largest node.
        below = place.found.match != Place<Node>::kNone ? *c.side->link(c.side->below(place.found))
                                                        : TreeSteps<Node>::largest(smaller);
    }
    TreeSteps<Node>::detach(place.link, below);
    // Only the two children now hang from other links.
    if (place.found.match != Place<Node>::kNone) {
        c.side->erase(place.found.match, place.found.parent);
        if (smaller != nullptr) {
            c.side->relink(c.side->find(smaller->value, order).match, place.link);
        }
        if (larger != nullptr) {
            c.side->relink(c.side->find(larger->value, order).match, smaller != nullptr ? &below->right : place.link);
        }
    }
    if (c.index != nullptr) {
        c.index->erase(removed);
    }
    // A string's characters share the node's block, so one release frees both.
    memory::release(removed);
    --c.count;
    if (place.found.match != Place<Node>::kNone) {
        c.side->fit();
    }
    return true;
}

template <class V>
void free_nodes(TreeNode<V>* root) noexcept {
    TreeSteps<TreeNode<V>>::dispose_all(root, [](TreeNode<V>* node) { memory::release(node); });
}

template <class V>
void clear_collection(Collection<V>& c) noexcept {
    c.count = 0;
    if (c.side != nullptr) {
        c.side->drop();
    }
    if (c.index != nullptr) {
        c.index->clear();
    }
    TreeNode<V>* root = c.root;
    c.root = nullptr;
    free_nodes(root);
}

template <class V, class Key, class Order>
std::int32_t position_of_key(const Collection<V>& c, const Key& key, const Order& order) noexcept {
    if (c.index == nullptr || c.index->empty()) {
        return -1;
    }
    const Place<TreeNode<V>> place = locate(c, key, order, Search::value);
    return place.held ? c.index->position_of(*place.link) : -1;
}

template <class V>
TreeNode<V>* make_number_node(V value) noexcept {
    void* block = memory::allocate(sizeof(TreeNode<V>));
    if (block == nullptr) {
        return nullptr;
    }
    auto* node = new (block) TreeNode<V>();
    node->value = value;
    return node;
}

// 'A'..'Z' folded to 'a'..'z', every other byte as it is.
constexpr auto kFolded = [] {
    std::array<unsigned char, 256> table{};
    for (unsigned c = 0; c < 256; ++c) {
        table[c] = static_cast<unsigned char>(c - 'A' < 26U ? c + 32U : c);
    }
    return table;
}();

}  // namespace

int CompareStrings(const char* a, const char* b, bool case_sensitive) noexcept {
    const auto* x = reinterpret_cast<const unsigned char*>(a);
    const auto* y = reinterpret_cast<const unsigned char*>(b);
    if (case_sensitive) {
        for (;; ++x, ++y) {
            if (*x != *y) {
                return *x < *y ? -1 : 1;
            }
            if (*x == 0) {
                return 0;
            }
        }
    }
    for (;; ++x, ++y) {
        if (*x == *y) {
            if (*x == 0) {
                return 0;
            }
            continue;
        }
        // Only a difference needs folding: equal bytes stay equal.
        const unsigned p = kFolded[*x];
        const unsigned q = kFolded[*y];
        if (p != q) {
            return p < q ? -1 : 1;
        }
    }
}

bool contains(IntegerCollection c, std::int32_t value) noexcept {
    return contains_key(c, value, IntegerOrder{});
}

bool contains(FloatCollection c, float value) noexcept {
    return !std::isnan(value) && contains_key(c, value, FloatOrder{});
}

bool contains(StringCollection c, const char* value, bool case_sensitive) noexcept {
    return value != nullptr && contains_key(c, value, StringOrder{case_sensitive});
}

bool add(IntegerCollection c, std::int32_t value) noexcept {
    return add_key(c, value, IntegerOrder{}, [value] { return make_number_node(value); });
}

bool add(FloatCollection c, float value) noexcept {
    return !std::isnan(value) && add_key(c, value, FloatOrder{}, [value] { return make_number_node(value); });
}

bool AddStringValue(StringCollection c, const char* value, bool case_sensitive) noexcept {
    if (value == nullptr) {
        return false;
    }
    return add_key(c, value, StringOrder{case_sensitive}, [value]() -> StringNode* {
        const std::size_t length = std::strlen(value);
        // The characters follow the node in the same block; the node owns them.
        void* block = memory::allocate(sizeof(StringNode) + length + 1);
        if (block == nullptr) {
            return nullptr;
        }
        auto* node = new (block) StringNode();
        char* copy = reinterpret_cast<char*>(node + 1);
        std::memcpy(copy, value, length + 1);
        node->value = copy;
        return node;
    });
}

bool remove(IntegerCollection c, std::int32_t value) noexcept {
    return remove_key(c, value, IntegerOrder{});
}

bool remove(FloatCollection c, float value) noexcept {
    return !std::isnan(value) && remove_key(c, value, FloatOrder{});
}

bool remove(StringCollection c, const char* value, bool case_sensitive) noexcept {
    return value != nullptr && remove_key(c, value, StringOrder{case_sensitive});
}

void clear(IntegerCollection c) noexcept {
    clear_collection(c);
}
void clear(FloatCollection c) noexcept {
    clear_collection(c);
}
void clear(StringCollection c) noexcept {
    clear_collection(c);
}

void free_tree(IntegerNode* root) noexcept {
    free_nodes(root);
}
void free_tree(FloatNode* root) noexcept {
    free_nodes(root);
}
void FreeStringTree(StringNode* root) noexcept {
    free_nodes(root);
}

std::int32_t position_of(IntegerCollection c, std::int32_t value) noexcept {
    return position_of_key(c, value, IntegerOrder{});
}

std::int32_t position_of(FloatCollection c, float value) noexcept {
    return std::isnan(value) ? -1 : position_of_key(c, value, FloatOrder{});
}

std::int32_t position_of(StringCollection c, const char* value, bool case_sensitive) noexcept {
    return value == nullptr ? -1 : position_of_key(c, value, StringOrder{case_sensitive});
}

}  // namespace sorvel
