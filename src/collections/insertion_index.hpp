// The order in which a collection's nodes were added. Entries point at nodes
// without owning them. Each node keeps the number of its slot in `order`; a
// removal leaves an empty slot rather than moving the later ones, and a
// Fenwick tree over the occupied slots turns slots into positions and back in
// O(log n). Once empty slots outnumber the held ones, the slots are packed.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <limits>

#include "collections/memory.hpp"

namespace sorvel {

template <class Node>
class InsertionIndex {
public:
    InsertionIndex() noexcept = default;
    InsertionIndex(const InsertionIndex&) = delete;
    InsertionIndex& operator=(const InsertionIndex&) = delete;
    ~InsertionIndex() { memory::release(slots_); }

    [[nodiscard]] std::uint32_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }

    // The node at a position below size(). A walk through consecutive
    // positions steps from the slot found last instead of searching.
    [[nodiscard]] Node* at(std::uint32_t position) const noexcept {
        if (used_ == size_) {
            return slots_[position];
        }
        std::uint32_t slot = 0;
        if (cursor_slot_ != kNoCursor && position == cursor_position_ + 1) {
            slot = cursor_slot_ + 1;
            while (slots_[slot] == nullptr) {
                ++slot;
            }
        } else if (cursor_slot_ != kNoCursor && position == cursor_position_) {
            slot = cursor_slot_;
        } else {
            // Descend the Fenwick tree to the slot holding rank position + 1.
            std::uint32_t rest = position + 1;
            for (std::uint32_t step = std::bit_floor(used_); step != 0; step >>= 1) {
                if (slot + step <= used_ && counts()[slot + step] < rest) {
                    slot += step;
                    rest -= counts()[slot];
                }
            }
        }
        cursor_position_ = position;
        cursor_slot_ = slot;
        return slots_[slot];
    }

    // Makes room for one more entry; false when memory ran out, with the
    // index unchanged.
    bool reserve_one() noexcept {
        if (used_ < capacity_) {
            return true;
        }
        if (used_ - size_ > used_ / 4) {
            pack();
            return true;
        }
        constexpr std::uint32_t kMax = std::numeric_limits<std::uint32_t>::max() / (sizeof(Node*) + 4) - 1;
        if (capacity_ >= kMax) {
            return false;
        }
        std::uint32_t grown = capacity_ < 8 ? 8 : capacity_ + capacity_ / 2;
        grown = grown > kMax || grown < capacity_ ? kMax : grown;
        // One block: the slots, then the Fenwick counts from 1.
        void* block = memory::allocate((sizeof(Node*) + 4) * grown + 4);
        if (block == nullptr) {
            return false;
        }
        auto** slots = static_cast<Node**>(block);
        auto* counts = reinterpret_cast<std::uint32_t*>(slots + grown);
        if (used_ != 0) {
            // A count covers slots below it only, so the old ones stay right.
            std::memcpy(slots, slots_, sizeof(Node*) * used_);
            std::memcpy(counts, this->counts(), 4 * (used_ + 1));
        }
        memory::release(slots_);
        slots_ = slots;
        capacity_ = grown;
        return true;
    }

    // Appends after a successful reserve_one().
    void append(Node* node) noexcept {
        node->order = used_;
        slots_[used_++] = node;
        // The count at slot i covers (i - lowbit(i), i]: one plus what the
        // smaller counts below it already hold.
        std::uint32_t sum = 1;
        const std::uint32_t low = used_ & (0U - used_);
        for (std::uint32_t i = used_ - 1; i > used_ - low; i &= i - 1) {
            sum += counts()[i];
        }
        counts()[used_] = sum;
        ++size_;
    }

    // The position of a node, or -1 when the index does not hold it.
    [[nodiscard]] std::int32_t position_of(const Node* node) const noexcept {
        if (node->order >= used_ || slots_[node->order] != node) {
            return -1;
        }
        std::uint32_t before = 0;
        for (std::uint32_t i = node->order; i != 0; i &= i - 1) {
            before += counts()[i];
        }
        return static_cast<std::int32_t>(before);
    }

    // Empties the node's slot; the later entries stay where they are.
    void erase(const Node* node) noexcept {
        const std::uint32_t slot = node->order;
        slots_[slot] = nullptr;
        for (std::uint32_t i = slot + 1; i <= used_; i += i & (0U - i)) {
            --counts()[i];
        }
        --size_;
        if (cursor_slot_ != kNoCursor && slot <= cursor_slot_) {
            cursor_slot_ = slot == cursor_slot_ ? kNoCursor : cursor_slot_;
            --cursor_position_;
        }
        if (used_ - size_ > size_) {
            pack();
        }
    }

    void clear() noexcept {
        size_ = used_ = 0;
        cursor_slot_ = kNoCursor;
    }

private:
    static constexpr std::uint32_t kNoCursor = std::numeric_limits<std::uint32_t>::max();

    [[nodiscard]] std::uint32_t* counts() const noexcept {
        return reinterpret_cast<std::uint32_t*>(slots_ + capacity_);
    }

    // Moves the held entries to the front, renumbers them and rebuilds the
    // counts in linear time.
    void pack() noexcept {
        std::uint32_t kept = 0;
        for (std::uint32_t i = 0; i < used_; ++i) {
            if (slots_[i] != nullptr) {
                slots_[i]->order = kept;
                slots_[kept++] = slots_[i];
            }
        }
        used_ = kept;
        for (std::uint32_t i = 1; i <= used_; ++i) {
            counts()[i] = 1;
        }
        for (std::uint32_t i = 1; i <= used_; ++i) {
            const std::uint32_t up = i + (i & (0U - i));
            if (up <= used_) {
                counts()[up] += counts()[i];
            }
        }
        cursor_slot_ = kNoCursor;
    }

    Node** slots_ = nullptr;  // null where a removed node was
    std::uint32_t used_ = 0;  // slots handed out
    std::uint32_t size_ = 0;  // nodes held
    std::uint32_t capacity_ = 0;
    mutable std::uint32_t cursor_position_ = 0;
    mutable std::uint32_t cursor_slot_ = kNoCursor;
};

}  // namespace sorvel
