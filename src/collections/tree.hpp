// The tree model shared by the three collections: a plain binary search tree
// that is never rebalanced. The steps are written once, parameterised by the
// value type and an order, and never allocate.
#pragma once

#include <cstddef>
#include <cstdint>

namespace sorvel {

namespace detail {
// value, left, right sit where a host reading nodes expects them: the value
// first, then the two links, each a word apart. The insertion order number
// fills the padding after a 4-byte value on 64-bit builds and trails
// otherwise, so it costs no extra bytes where it can be helped.
template <class V, bool InPadding = (sizeof(V) == 4 && sizeof(void*) == 8)>
struct NodeFields;

template <class V>
struct NodeFields<V, true> {
    V value;
    std::uint32_t order;
    NodeFields* left;
    NodeFields* right;
};

template <class V>
struct NodeFields<V, false> {
    V value;
    NodeFields* left;
    NodeFields* right;
    std::uint32_t order;
};
}  // namespace detail

// One element of a collection. `order` numbers the node among the successful
// Adds of its collection while an insertion index is kept.
template <class V>
using TreeNode = detail::NodeFields<V>;

// An order gives the sign of comparing a key with a held value:
// positive when the key is larger, negative when smaller, zero when equal.
template <class Node>
struct TreeSteps {
    // Descent: the link that points at the node equal to key, or the null
    // link where key would hang as a new leaf. `depth` counts the nodes passed.
    template <class Key, class Order>
    static Node** descend(Node*& root, const Key& key, const Order& order, std::uint32_t& depth) noexcept {
        Node** link = &root;
        depth = 0;
        while (*link != nullptr) {
            const int c = order(key, (*link)->value);
            if (c == 0) {
                break;
            }
            ++depth;
            link = c > 0 ? &(*link)->right : &(*link)->left;
        }
        return link;
    }

    // The largest node of a subtree: the end of its right spine.
    static Node* largest(Node* node) noexcept {
        while (node->right != nullptr) {
            node = node->right;
        }
        return node;
    }

    // Removal by re-insertion, detaching the node that *link points at.
    // Re-inserting the left subtree from the root ends at this same link, and
    // re-inserting the right subtree then runs down the left subtree's right
    // spine, so both are hung there directly: same shape, no walk from the
    // root. `below` is the largest node of the left subtree when both exist.
    static Node* detach(Node** link, Node* below) noexcept {
        Node* removed = *link;
        if (removed->left != nullptr) {
            *link = removed->left;
            if (removed->right != nullptr) {
                below->right = removed->right;
            }
        } else {
            *link = removed->right;
        }
        removed->left = nullptr;
        removed->right = nullptr;
        return removed;
    }

    // Frees every node below and including root, in linear time and constant
    // stack: a left child is rotated up until the node at hand has none.
    template <class Dispose>
    static void dispose_all(Node* root, Dispose&& dispose) noexcept {
        while (root != nullptr) {
            if (Node* l = root->left) {
                root->left = l->right;
                l->right = root;
                root = l;
            } else {
                Node* next = root->right;
                dispose(root);
                root = next;
            }
        }
    }
};

}  // namespace sorvel
