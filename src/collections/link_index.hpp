// An ordered side structure over a collection's values that records, for each
// value, the link pointing at its node (the root field or a parent's left or
// right). It lets a deep tree be searched, grown and pruned in O(log n) while
// the tree itself keeps exactly the shape plain descents give it.
//
// It is a treap over one pooled array of entries. Priorities are a level
// (trailing zeros of a draw, geometric like a skip list's) above random low
// bits, so a tree built from sorted values with level = trailing zeros of the
// rank is a valid treap of the same distribution.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>

#include "collections/memory.hpp"

namespace sorvel {

template <class Node>
class LinkIndex {
public:
    using Value = decltype(Node::value);
    static constexpr std::uint32_t kNone = 0xFFFFFFFFU;

    struct Entry {
        Node** link;
        Value key;
        std::uint32_t left;
        std::uint32_t right;
        std::uint32_t priority;
    };

    // What a search found: the matching entry, or the neighbours of the key.
    struct Found {
        std::uint32_t match = kNone;
        std::uint32_t below = kNone;  // largest entry smaller than the key
        std::uint32_t above = kNone;  // smallest entry larger than the key
    };

    LinkIndex() noexcept = default;
    LinkIndex(const LinkIndex&) = delete;
    LinkIndex& operator=(const LinkIndex&) = delete;
    ~LinkIndex() { memory::release(pool_); }

    [[nodiscard]] bool built() const noexcept { return pool_ != nullptr; }
    [[nodiscard]] bool may_build(std::int32_t count) const noexcept { return count >= retry_at_; }
    [[nodiscard]] Node** link(std::uint32_t e) const noexcept { return pool_[e].link; }
    void relink(std::uint32_t e, Node** to) noexcept { pool_[e].link = to; }

    // Forgets everything; `retry_at` is the count before which no rebuild is
    // tried, so that memory pressure does not cost an O(n) pass per call.
    void drop(std::int32_t retry_at = 0) noexcept {
        memory::release(pool_);
        pool_ = nullptr;
        capacity_ = used_ = 0;
        free_ = root_ = kNone;
        retry_at_ = retry_at;
    }

    // Used when memory ran out: plain descents until the count has doubled.
    void give_up(std::int32_t count) noexcept { drop(count > 0x3FFFFFFF ? 0x7FFFFFFF : 2 * count); }

    // One in-order pass over the tree without recursion: the links still to
    // visit wait at the far end of the pool, which they never overlap with
    // the entries already written, since both are distinct nodes.
    void build(Node*& root, std::int32_t count) noexcept {
        const auto n = static_cast<std::uint32_t>(count);
        const std::uint32_t capacity = n + n / 2 + 16;
        if (capacity < n || capacity > 0xFFFFFFFFU / sizeof(Entry) ||
            (pool_ = static_cast<Entry*>(memory::allocate(sizeof(Entry) * capacity))) == nullptr) {
            give_up(count);
            return;
        }
        capacity_ = capacity;
        std::uint32_t done = 0;
        std::uint32_t waiting = 0;
        for (Node** at = &root;;) {
            for (; *at != nullptr; at = &(*at)->left) {
                pool_[n - ++waiting].link = at;
            }
            if (waiting == 0) {
                break;
            }
            at = pool_[n - waiting--].link;
            pool_[done++] = Entry{at, (*at)->value, kNone, kNone, 0};
            at = &(*at)->right;
        }
        // Rank r (from 1) gets level trailing_zeros(r): a perfectly balanced
        // treap whose children are found by halving steps.
        for (std::uint32_t r = 1; r <= n; ++r) {
            const int level = std::countr_zero(r);
            Entry& e = pool_[r - 1];
            e.priority = static_cast<std::uint32_t>(level) << 27;
            if (level > 0) {
                const std::uint32_t half = 1U << (level - 1);
                e.left = r - half - 1;
                std::uint32_t child = r + half;
                while (child > n && (child & 1U) == 0) {
                    child -= 1U << (std::countr_zero(child) - 1);
                }
                e.right = child > n ? kNone : child - 1;
            }
        }
        used_ = n;
        root_ = n == 0 ? kNone : std::bit_floor(n) - 1;
    }

    template <class Key, class Order>
    Found find(const Key& key, const Order& order) const noexcept {
        Found f;
        for (std::uint32_t e = root_; e != kNone;) {
            const int c = order(key, pool_[e].key);
            if (c == 0) {
                f.match = e;
                // The neighbours, as a removal with two subtrees needs the one below.
                for (std::uint32_t l = pool_[e].left; l != kNone; l = pool_[l].right) {
                    f.below = l;
                }
                return f;
            }
            if (c > 0) {
                f.below = e;
                e = pool_[e].right;
            } else {
                f.above = e;
                e = pool_[e].left;
            }
        }
        return f;
    }

    // False when the pool cannot grow; the caller then drops the structure.
    template <class Order>
    bool insert(Node** at, const Order& order) noexcept {
        if (free_ == kNone && used_ == capacity_ && !grow()) {
            return false;
        }
        std::uint32_t x = free_;
        if (x != kNone) {
            free_ = pool_[x].left;
        } else {
            x = used_++;
        }
        seed_ ^= seed_ << 13;
        seed_ ^= seed_ >> 17;
        seed_ ^= seed_ << 5;
        const auto level = static_cast<std::uint32_t>(std::countr_zero(seed_ | 0x80000000U));
        pool_[x] = Entry{at, (*at)->value, kNone, kNone, (level << 27) | ((seed_ * 2654435761U) >> 5)};
        std::uint32_t* slot = &root_;
        while (*slot != kNone && pool_[*slot].priority > pool_[x].priority) {
            slot = order(pool_[x].key, pool_[*slot].key) > 0 ? &pool_[*slot].right : &pool_[*slot].left;
        }
        // Everything below the slot splits around the new key.
        std::uint32_t* small = &pool_[x].left;
        std::uint32_t* large = &pool_[x].right;
        for (std::uint32_t t = *slot; t != kNone;) {
            if (order(pool_[x].key, pool_[t].key) > 0) {
                *small = t;
                small = &pool_[t].right;
                t = *small;
            } else {
                *large = t;
                large = &pool_[t].left;
                t = *large;
            }
        }
        *small = *large = kNone;
        *slot = x;
        return true;
    }

    template <class Order>
    void erase(std::uint32_t x, const Order& order) noexcept {
        std::uint32_t* slot = &root_;
        while (*slot != x) {
            slot = order(pool_[x].key, pool_[*slot].key) > 0 ? &pool_[*slot].right : &pool_[*slot].left;
        }
        // The two subtrees merge by priority in place of the entry.
        std::uint32_t a = pool_[x].left;
        std::uint32_t b = pool_[x].right;
        while (a != kNone && b != kNone) {
            if (pool_[a].priority > pool_[b].priority) {
                *slot = a;
                slot = &pool_[a].right;
                a = *slot;
            } else {
                *slot = b;
                slot = &pool_[b].left;
                b = *slot;
            }
        }
        *slot = a != kNone ? a : b;
        pool_[x].left = free_;
        free_ = x;
    }

private:
    bool grow() noexcept {
        const std::uint32_t bigger = capacity_ + capacity_ / 2 + 16;
        if (bigger < capacity_ || bigger > 0xFFFFFFFFU / sizeof(Entry)) {
            return false;
        }
        auto* pool = static_cast<Entry*>(memory::allocate(sizeof(Entry) * bigger));
        if (pool == nullptr) {
            return false;
        }
        std::memcpy(pool, pool_, sizeof(Entry) * used_);
        memory::release(pool_);
        pool_ = pool;
        capacity_ = bigger;
        return true;
    }

    Entry* pool_ = nullptr;
    std::uint32_t capacity_ = 0;
    std::uint32_t used_ = 0;
    std::uint32_t free_ = kNone;
    std::uint32_t root_ = kNone;
    std::uint32_t seed_ = 0x9E3779B9U;
    std::int32_t retry_at_ = 0;
};

}  // namespace sorvel
