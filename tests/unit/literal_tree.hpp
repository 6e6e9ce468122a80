// A tree that follows the add and removal steps literally: every moved
// subtree is re-inserted by walking down from the root, and the insertion
// index is a plain vector scanned from the front. The library's removal takes
// shortcuts; this one deliberately does not, so comparing shapes after the
// same operations checks that the shortcuts change nothing.
#pragma once

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "tree_helpers.hpp"

namespace sorvel::test {

template <class T>
class LiteralTree {
public:
    struct Node {
        T value;
        Node* left = nullptr;
        Node* right = nullptr;
    };

    explicit LiteralTree(bool case_sensitive = false) : case_sensitive_(case_sensitive) {}
    LiteralTree(const LiteralTree&) = delete;
    LiteralTree& operator=(const LiteralTree&) = delete;
    ~LiteralTree() {
        // Iterative, so the deep chains of some tests cannot exhaust the stack.
        std::vector<Node*> pending{root_};
        while (!pending.empty()) {
            Node* n = pending.back();
            pending.pop_back();
            if (n != nullptr) {
                pending.push_back(n->left);
                pending.push_back(n->right);
                delete n;
            }
        }
    }

    const Node* root() const { return root_; }
    std::int32_t count() const { return count_; }

    std::vector<std::string> index_values() const {
        std::vector<std::string> out;
        for (const Node* n : index_) {
            out.push_back(show(n->value));
        }
        return out;
    }

    // Leaf insertion: count first, node before any comparison, undone on a
    // duplicate.
    void add(const T& p) {
        ++count_;
        Node* fresh = new Node{p};
        if (root_ == nullptr) {
            root_ = fresh;
        } else {
            Node* at = root_;
            for (;;) {
                const int c = cmp(p, at->value);
                if (c == 0) {
                    --count_;
                    delete fresh;
                    return;
                }
                Node*& link = c > 0 ? at->right : at->left;
                if (link == nullptr) {
                    link = fresh;
                    break;
                }
                at = link;
            }
        }
        index_.push_back(fresh);
    }

    // Removal by re-insertion, step by step.
    void remove(const T& p) {
        --count_;
        if (root_ == nullptr) {
            ++count_;
            return;
        }
        Node* removed = nullptr;
        if (cmp(root_->value, p) == 0) {
            removed = root_;
            root_ = nullptr;
            if (removed->left != nullptr) {
                root_ = removed->left;
                if (removed->right != nullptr) {
                    reinsert(removed->right, root_);
                }
            } else {
                root_ = removed->right;
            }
        } else {
            Node* parent = root_;
            Node** followed = nullptr;
            for (;;) {
                const int c = cmp(p, parent->value);
                followed = c > 0 ? &parent->right : &parent->left;
                if (*followed == nullptr) {
                    ++count_;
                    return;
                }
                if (cmp(p, (*followed)->value) == 0) {
                    break;
                }
                parent = *followed;
            }
            removed = *followed;
            *followed = nullptr;
            if (removed->left != nullptr) {
                reinsert(removed->left, root_);
            }
            if (removed->right != nullptr) {
                reinsert(removed->right, root_);
            }
        }
        removed->left = nullptr;
        removed->right = nullptr;
        auto entry = std::find(index_.begin(), index_.end(), removed);
        if (entry != index_.end()) {
            index_.erase(entry);
        }
        delete removed;
    }

private:
    int cmp(const T& a, const T& b) const { return reference_compare(a, b, case_sensitive_); }

    // Subtree re-insertion: only the subtree root's value is compared, and
    // the subtree hangs whole at the first null link.
    void reinsert(Node* subtree, Node* at) {
        for (;;) {
            Node*& link = cmp(subtree->value, at->value) > 0 ? at->right : at->left;
            if (link == nullptr) {
                link = subtree;
                return;
            }
            at = link;
        }
    }

    Node* root_ = nullptr;
    std::int32_t count_ = 0;
    std::vector<Node*> index_;
    bool case_sensitive_;
};

}  // namespace sorvel::test
