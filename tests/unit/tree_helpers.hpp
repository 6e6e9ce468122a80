// Helpers shared by the collection tests: a holder that owns the fields a
// collection view points at, a compact rendering of tree shapes, an invariant
// check written independently of the library, chains built directly in the
// node layout, and a runner with a deliberately small stack.
#pragma once

#include <gtest/gtest.h>

#include <charconv>
#include <cstdint>
#include <cstring>
#include <functional>
#include <new>
#include <set>
#include <string>
#include <type_traits>
#include <vector>

#include "collections/collections.hpp"
#include "collections/memory.hpp"

#include "small_stack.hpp"

namespace sorvel::test {

// Owns what a collection view refers to; frees tree and index at the end.
template <class V>
struct Holder {
    using Node = TreeNode<V>;
    using Index = InsertionIndex<Node>;

    Node* root = nullptr;
    std::int32_t count = 0;
    Index* index = nullptr;
    bool case_sensitive = false;  // read by the string operations only

    explicit Holder(bool with_index = false, bool sensitive = false) : case_sensitive(sensitive) {
        if (with_index) {
            index = create_index<Node>();
        }
    }
    Holder(const Holder&) = delete;
    Holder& operator=(const Holder&) = delete;
    ~Holder() {
        Collection<V> c = view();
        clear(c);
        destroy_index(index);
    }

    Collection<V> view() { return Collection<V>{root, count, index}; }
};

using Ints = Holder<std::int32_t>;
using Floats = Holder<float>;
using Strings = Holder<char*>;

// One spelling of each operation for all three kinds, so tests can be typed.
template <class V>
    requires std::is_arithmetic_v<V>
inline bool do_add(Holder<V>& h, std::type_identity_t<V> v) {
    auto c = h.view();
    return add(c, v);
}
inline bool do_add(Strings& h, const std::string& v) {
    auto c = h.view();
    return AddStringValue(c, v.c_str(), h.case_sensitive);
}
template <class V>
    requires std::is_arithmetic_v<V>
inline bool do_remove(Holder<V>& h, std::type_identity_t<V> v) {
    auto c = h.view();
    return remove(c, v);
}
inline bool do_remove(Strings& h, const std::string& v) {
    auto c = h.view();
    return remove(c, v.c_str(), h.case_sensitive);
}
inline bool do_contains(Ints& h, std::int32_t v) { return contains(h.view(), v); }
inline bool do_contains(Floats& h, float v) { return contains(h.view(), v); }
inline bool do_contains(Strings& h, const std::string& v) { return contains(h.view(), v.c_str(), h.case_sensitive); }
inline std::int32_t do_position(Ints& h, std::int32_t v) { return position_of(h.view(), v); }
inline std::int32_t do_position(Floats& h, float v) { return position_of(h.view(), v); }
inline std::int32_t do_position(Strings& h, const std::string& v) {
    return position_of(h.view(), v.c_str(), h.case_sensitive);
}
template <class V>
void do_clear(Holder<V>& h) {
    auto c = h.view();
    clear(c);
}

// Reference orders, written from the rules rather than taken from the library:
// signed integers, IEEE 754 floats, unsigned bytes with optional folding of
// 'A'..'Z' only.
inline int reference_compare(std::int32_t a, std::int32_t b, bool = false) { return (a > b) - (a < b); }
inline int reference_compare(float a, float b, bool = false) { return (a > b) - (a < b); }
inline int reference_compare(const char* a, const char* b, bool case_sensitive) {
    for (std::size_t i = 0;; ++i) {
        int x = static_cast<unsigned char>(a[i]);
        int y = static_cast<unsigned char>(b[i]);
        if (!case_sensitive) {
            if (x >= 'A' && x <= 'Z') x += 'a' - 'A';
            if (y >= 'A' && y <= 'Z') y += 'a' - 'A';
        }
        if (x != y) return x < y ? -1 : 1;
        if (x == 0) return 0;
    }
}
inline int reference_compare(const std::string& a, const std::string& b, bool case_sensitive) {
    return reference_compare(a.c_str(), b.c_str(), case_sensitive);
}
inline int reference_compare(const char* a, const std::string& b, bool case_sensitive) {
    return reference_compare(a, b.c_str(), case_sensitive);
}

// Values as the renderings show them; the empty string is written "".
inline std::string show(std::int32_t v) { return std::to_string(v); }
// Shortest spelling that reads back as the same float.
inline std::string show(float v) {
    char buffer[32];
    const auto end = std::to_chars(buffer, buffer + sizeof buffer, v).ptr;
    return std::string(buffer, end);
}
inline std::string show(const char* v) { return *v == '\0' ? std::string("\"\"") : std::string(v); }
inline std::string show(const std::string& v) { return show(v.c_str()); }

// "v" for a leaf, "v(L,R)" otherwise, "-" for a missing child, "." for an
// empty tree. Any node type with value/left/right renders the same way.
template <class Node>
std::string render(const Node* node) {
    if (node == nullptr) {
        return ".";
    }
    std::string out = show(node->value);
    if (node->left == nullptr && node->right == nullptr) {
        return out;
    }
    out += '(';
    out += node->left == nullptr ? std::string("-") : render(node->left);
    out += ',';
    out += node->right == nullptr ? std::string("-") : render(node->right);
    out += ')';
    return out;
}
template <class V>
std::string render(const Holder<V>& h) {
    return render(h.root);
}

// Iterative in-order walk: safe on chains of any depth.
template <class Node, class Visit>
void walk_in_order(Node* root, Visit&& visit) {
    std::vector<Node*> stack;
    Node* at = root;
    while (at != nullptr || !stack.empty()) {
        while (at != nullptr) {
            stack.push_back(at);
            at = at->left;
        }
        at = stack.back();
        stack.pop_back();
        visit(at);
        at = at->right;
    }
}

// Values of the index entries, position 0 first.
template <class V>
std::vector<std::string> index_values(const Holder<V>& h) {
    std::vector<std::string> out;
    if (h.index != nullptr) {
        for (std::uint32_t i = 0; i < h.index->size(); ++i) {
            out.push_back(show(h.index->at(i)->value));
        }
    }
    return out;
}

// The whole-collection invariants: strict order under the reference order,
// count equal to the number of nodes, and an index (when kept) holding each
// node exactly once and nothing else.
template <class V>
::testing::AssertionResult collection_is_sound(const Holder<V>& h) {
    using Node = TreeNode<V>;
    std::vector<const Node*> nodes;
    walk_in_order(static_cast<const Node*>(h.root), [&](const Node* n) { nodes.push_back(n); });
    for (std::size_t i = 1; i < nodes.size(); ++i) {
        if (reference_compare(nodes[i - 1]->value, nodes[i]->value, h.case_sensitive) >= 0) {
            return ::testing::AssertionFailure()
                   << "out of order at in-order position " << i << ": " << show(nodes[i - 1]->value) << " then "
                   << show(nodes[i]->value);
        }
    }
    if (static_cast<std::size_t>(h.count) != nodes.size()) {
        return ::testing::AssertionFailure() << "count " << h.count << " but " << nodes.size() << " nodes";
    }
    if (h.index != nullptr) {
        if (h.index->size() != nodes.size()) {
            return ::testing::AssertionFailure()
                   << "index holds " << h.index->size() << " entries for " << nodes.size() << " nodes";
        }
        std::set<const Node*> in_tree(nodes.begin(), nodes.end());
        std::set<const Node*> seen;
        for (std::uint32_t i = 0; i < h.index->size(); ++i) {
            const Node* entry = h.index->at(i);
            if (in_tree.count(entry) == 0) {
                return ::testing::AssertionFailure() << "index position " << i << " points outside the tree";
            }
            if (!seen.insert(entry).second) {
                return ::testing::AssertionFailure() << "index position " << i << " repeats a node";
            }
        }
    }
    return ::testing::AssertionSuccess();
}

// Nodes made the way the library makes them: one block from the library's
// allocator, a string's characters right behind its node.
template <class V>
TreeNode<V>* make_node(V value) {
    void* block = memory::allocate(sizeof(TreeNode<V>));
    auto* node = new (block) TreeNode<V>();
    node->value = value;
    node->left = nullptr;
    node->right = nullptr;
    return node;
}
inline StringNode* make_string_node(const std::string& text) {
    void* block = memory::allocate(sizeof(StringNode) + text.size() + 1);
    auto* node = new (block) StringNode();
    char* copy = reinterpret_cast<char*>(node + 1);
    std::memcpy(copy, text.c_str(), text.size() + 1);
    node->value = copy;
    node->left = nullptr;
    node->right = nullptr;
    return node;
}

// The value at chain position i (0 = root) for a chain of the given depth:
// leaning right the values ascend, leaning left they descend.
inline std::int32_t chain_int(std::int32_t i, std::int32_t depth, bool leans_right) {
    return leans_right ? i + 1 : depth - i;
}
inline std::string chain_string(std::int32_t i, std::int32_t depth, bool leans_right) {
    std::string digits = std::to_string(chain_int(i, depth, leans_right));
    return std::string(8 - digits.size(), '0') + digits;
}

// Builds a chain in linear time by linking each new node below the deepest.
template <class V>
void build_chain(Holder<V>& h, std::int32_t depth, bool leans_right) {
    using Node = TreeNode<V>;
    Node* deepest = nullptr;
    for (std::int32_t i = 0; i < depth; ++i) {
        Node* node = nullptr;
        if constexpr (std::is_same_v<V, char*>) {
            node = make_string_node(chain_string(i, depth, leans_right));
        } else {
            node = make_node<V>(static_cast<V>(chain_int(i, depth, leans_right)));
        }
        if (deepest == nullptr) {
            h.root = node;
        } else if (leans_right) {
            deepest->right = node;
        } else {
            deepest->left = node;
        }
        deepest = node;
        ++h.count;
        if (h.index != nullptr) {
            h.index->reserve_one();
            h.index->append(node);
        }
    }
}

// Depth of the deep-chain tests. The 32-bit and Windows test builds run under
// qemu and wine, where a million-node chain would take minutes; any depth far
// beyond what recursion fits in the small stack still proves the point there.
// wine gives a thread at least 1 MiB of stack whatever is asked for, so the
// Windows depth is chosen to overflow that too.
#if defined(_WIN32)
inline constexpr std::int32_t kDeepChain = 200'000;
#elif defined(__i386__)
inline constexpr std::int32_t kDeepChain = 50'000;
#else
inline constexpr std::int32_t kDeepChain = 1'000'000;
#endif

// Runs fn on a fresh thread whose whole stack is 256 KiB, so that any step
// whose stack use grows with tree depth overflows it.
inline void run_on_small_stack(const std::function<void()>& fn) {
    ASSERT_TRUE(sorvel::testing::run_on_small_stack(fn)) << "the work on the small stack did not finish";
}

}  // namespace sorvel::test
