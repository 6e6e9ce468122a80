// An ordered side structure over a collection's values that records, for each
// value, the link pointing at its node (the root field or a parent's left or
// right). It lets a deep tree be searched, grown and pruned in O(log n) while
// the tree itself keeps exactly the shape plain descents give it.
//
// It is a treap over one pooled array of entries, every entry with a random
// priority, so its expected depth is about 1.39 log2 n after any sequence of
// operations: the shape depends only on the keys held and on priorities that
// no order of Adds and Removes can see.
#pragma once

#include <cstdint>
#include <cstring>

#include "collections/memory.hpp"

namespace sorvel {

template <class Node>
class SideStructure {
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
        std::uint32_t parent = kNone;  // the entry whose child the match is
        std::uint32_t below = kNone;   // the last entry passed on the left, or the largest smaller
        std::uint32_t above = kNone;   // smallest entry larger than the key
    };

    SideStructure() noexcept = default;
    SideStructure(const SideStructure&) = delete;
    SideStructure& operator=(const SideStructure&) = delete;
    ~SideStructure() { memory::release(pool_); }

    [[nodiscard]] bool built() const noexcept { return pool_ != nullptr; }
    [[nodiscard]] Node** link(std::uint32_t e) const noexcept { return pool_[e].link; }
    void relink(std::uint32_t e, Node** to) noexcept { pool_[e].link = to; }

    // For inspection: the top entry, the entries in use, an entry.
    [[nodiscard]] std::uint32_t root() const noexcept { return root_; }
    [[nodiscard]] std::uint32_t size() const noexcept { return size_; }
    [[nodiscard]] std::uint32_t capacity() const noexcept { return capacity_; }
    [[nodiscard]] const Entry& entry(std::uint32_t e) const noexcept { return pool_[e]; }

    // Whether a descent of `depth` nodes, too deep for plain descents, may
    // start a build. After memory ran out, builds wait until descents have
    // passed as many nodes as the count: the retry then costs no more than
    // the descents it saves, and a failure that passes costs O(n) once.
    [[nodiscard]] bool may_build(std::uint32_t depth) noexcept {
        if (wait_ <= depth) {
            wait_ = 0;
            return true;
        }
        wait_ -= depth;
        return false;
    }

    // Forgets everything.
    void drop() noexcept {
        memory::release(pool_);
        pool_ = nullptr;
        capacity_ = used_ = size_ = 0;
        free_ = root_ = kNone;
    }

    // Used when memory ran out: plain descents for a while.
    void give_up(std::int32_t count) noexcept {
        drop();
        wait_ = count < 1 ? 1U : static_cast<std::uint32_t>(count);
    }

    // Builds the structure over the tree in O(n). False, with nothing held,
    // when memory ran out.
    bool build(Node*& root, std::int32_t count) noexcept {
        drop();
        const auto n = static_cast<std::uint32_t>(count);
        const std::uint32_t capacity = fitting(n);
        if (capacity < n || capacity > 0xFFFFFFFFU / sizeof(Entry) ||
            (pool_ = static_cast<Entry*>(memory::allocate(sizeof(Entry) * capacity))) == nullptr) {
            return false;
        }
        gather(pool_, n, root);
        capacity_ = capacity;
        used_ = size_ = n;
        root_ = cartesian(n);
        return true;
    }

    // Once a fifth of the entries are free, those in use move to a block that
    // fits them, in two passes over the pool; kept as they are when memory
    // runs out. Growth by a tenth leaves a margin above this, so a few Adds
    // and Removes around one size never resize back and forth.
    void fit() noexcept {
        if (std::uint64_t{size_} * 5 > std::uint64_t{capacity_} * 4 || capacity_ <= 64) {
            return;
        }
        const std::uint32_t capacity = fitting(size_);
        auto* pool = static_cast<Entry*>(memory::allocate(sizeof(Entry) * capacity));
        if (pool == nullptr) {
            return;
        }
        // Each entry in use is copied; its old place keeps its new number.
        std::uint32_t kept = 0;
        for (std::uint32_t e = 0; e < used_; ++e) {
            if (pool_[e].link != nullptr) {
                pool[kept] = pool_[e];
                pool_[e].priority = kept++;
            }
        }
        auto renumber = [this](std::uint32_t e) noexcept { return e == kNone ? kNone : pool_[e].priority; };
        for (std::uint32_t e = 0; e < kept; ++e) {
            pool[e].left = renumber(pool[e].left);
            pool[e].right = renumber(pool[e].right);
        }
        root_ = renumber(root_);
        memory::release(pool_);
        pool_ = pool;
        capacity_ = capacity;
        used_ = kept;
        free_ = kNone;
    }

    template <class Key, class Order>
    Found find(const Key& key, const Order& order) const noexcept {
        Found f;
        for (std::uint32_t e = root_; e != kNone;) {
            const int c = order(key, pool_[e].key);
            if (c == 0) {
                f.match = e;
                return f;
            }
            f.parent = e;
            if (c > 0) {
                f.below = e;
                e = pool_[e].right;
            } else {
                f.above = e;
                e = pool_[e].left;
            }
        }
        f.parent = kNone;
        return f;
    }

    // The entry of the largest key below a match: the end of the right spine
    // of its left subtree, or else the last entry the search passed on the
    // left.
    [[nodiscard]] std::uint32_t below(const Found& f) const noexcept {
        std::uint32_t below = f.below;
        for (std::uint32_t l = pool_[f.match].left; l != kNone; l = pool_[l].right) {
            below = l;
        }
        return below;
    }

    // False when the pool cannot grow; the caller then gives up.
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
        ++size_;
        pool_[x] = Entry{at, (*at)->value, kNone, kNone, next_priority()};
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

    // Takes out entry x, whose parent find() gave.
    void erase(std::uint32_t x, std::uint32_t parent) noexcept {
        std::uint32_t* slot = parent == kNone           ? &root_
                              : pool_[parent].left == x ? &pool_[parent].left
                                                        : &pool_[parent].right;
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
        pool_[x].link = nullptr;  // marks a free entry
        pool_[x].left = free_;
        free_ = x;
        --size_;
    }

private:
    // Room for n entries and a sixteenth more.
    static std::uint32_t fitting(std::uint32_t n) noexcept { return n + n / 16 + 4; }

    // xorshift32: cheap, and apart from the C runtime's generator, whose
    // draws belong to the random picks and balanced loads.
    std::uint32_t next_priority() noexcept {
        seed_ ^= seed_ << 13;
        seed_ ^= seed_ >> 17;
        seed_ ^= seed_ << 5;
        return seed_;
    }

    // Writes the n links of the tree in order into pool[0, n). One pass
    // without recursion: the links still to visit wait at the far end of the
    // pool, which they never overlap with the entries already written, since
    // both are distinct nodes.
    static void gather(Entry* pool, std::uint32_t n, Node*& root) noexcept {
        std::uint32_t done = 0;
        std::uint32_t waiting = 0;
        for (Node** at = &root;;) {
            for (; *at != nullptr; at = &(*at)->left) {
                pool[n - ++waiting].link = at;
            }
            if (waiting == 0) {
                break;
            }
            at = pool[n - waiting--].link;
            pool[done++] = Entry{at, (*at)->value, kNone, kNone, 0};
            at = &(*at)->right;
        }
    }

    // Random priorities over the n ordered entries, and the treap they make,
    // in O(n): the right spine is kept as a stack linked upwards through
    // `right`, and turned back down at the end.
    std::uint32_t cartesian(std::uint32_t n) noexcept {
        std::uint32_t top = kNone;
        for (std::uint32_t i = 0; i < n; ++i) {
            Entry& e = pool_[i];
            e.priority = next_priority();
            std::uint32_t below = kNone;
            while (top != kNone && pool_[top].priority < e.priority) {
                const std::uint32_t up = pool_[top].right;
                pool_[top].right = below;
                below = top;
                top = up;
            }
            e.left = below;
            e.right = top;
            top = i;
        }
        std::uint32_t below = kNone;
        while (top != kNone) {
            const std::uint32_t up = pool_[top].right;
            pool_[top].right = below;
            below = top;
            top = up;
        }
        return below;
    }

    bool grow() noexcept {
        const std::uint32_t bigger = capacity_ + capacity_ / 10 + 16;
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
    std::uint32_t used_ = 0;  // entries handed out, freed ones included
    std::uint32_t size_ = 0;  // entries in use
    std::uint32_t free_ = kNone;
    std::uint32_t root_ = kNone;
    std::uint32_t seed_ = 0x9E3779B9U;
    std::uint32_t wait_ = 0;  // nodes descents must pass before a build
};

}  // namespace sorvel
