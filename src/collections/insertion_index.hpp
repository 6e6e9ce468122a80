// The order in which a collection's nodes were added. Entries point at nodes
// without owning them. Each node keeps the number of its slot in `order`; a
// removal leaves an empty slot rather than moving the later ones, and a
// RankedBits over the slots turns slots into positions and back.
//
// Memory follows the count. A full block whose empty slots are more than a
// quarter of those handed out is packed in place instead of grown. A removal
// that leaves half the capacity or less held moves the entries to a block
// half as large again as their number, if one can be had (or else, with more
// empty slots than held ones, packs them). Clear gives the block back.
#pragma once

#include <cstdint>
#include <cstring>
#include <limits>

#include "collections/memory.hpp"
#include "collections/ranked_bits.hpp"

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

    // For inspection: slots handed out, room, a slot (null once emptied) and
    // the bits of the held slots.
    [[nodiscard]] std::uint32_t used() const noexcept { return used_; }
    [[nodiscard]] std::uint32_t capacity() const noexcept { return capacity_; }
    [[nodiscard]] const Node* slot(std::uint32_t s) const noexcept { return slots_[s]; }
    [[nodiscard]] const RankedBits& held() const noexcept { return held_; }

    // The node at a position below size(). A walk through consecutive
    // positions steps from the slot found last instead of searching.
    [[nodiscard]] Node* at(std::uint32_t position) const noexcept {
        if (used_ == size_) {
            return slots_[position];
        }
        std::uint32_t s = 0;
        if (cursor_slot_ != kNoCursor && position == cursor_position_) {
            s = cursor_slot_;
        } else if (cursor_slot_ != kNoCursor && position == cursor_position_ + 1) {
            s = static_cast<std::uint32_t>(held_.next(cursor_slot_ + 1, position));
        } else {
            s = static_cast<std::uint32_t>(held_.select(position));
        }
        cursor_position_ = position;
        cursor_slot_ = s;
        return slots_[s];
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
        constexpr std::uint32_t kMax = std::numeric_limits<std::uint32_t>::max() / (sizeof(Node*) + 1) / 2 * 2;
        if (capacity_ >= kMax) {
            return false;
        }
        std::uint32_t grown = roomy(capacity_);
        grown = grown > kMax || grown < capacity_ ? kMax : grown;
        return move_to(grown);
    }

    // Appends after a successful reserve_one().
    void append(Node* node) noexcept {
        node->order = used_;
        slots_[used_] = node;
        held_.set(used_);
        ++used_;
        ++size_;
    }

    // The position of a node the index holds.
    [[nodiscard]] std::int32_t position_of(const Node* node) const noexcept {
        return static_cast<std::int32_t>(held_.rank(node->order));
    }

    // Empties the node's slot; the later entries stay where they are.
    void erase(const Node* node) noexcept {
        const std::uint32_t s = node->order;
        slots_[s] = nullptr;
        held_.reset(s);
        --size_;
        if (cursor_slot_ != kNoCursor && s <= cursor_slot_) {
            if (s == cursor_slot_) {
                cursor_slot_ = kNoCursor;
            } else {
                --cursor_position_;
            }
        }
        // Shrinking is best-effort: without a smaller block the entries are
        // packed where they are.
        if (size_ <= capacity_ / 2 && capacity_ > kSmallest && move_to(roomy(size_))) {
            return;
        }
        if (used_ - size_ > size_) {
            pack();
        }
    }

    // Gives the block back: the cost follows the nodes cleared, not the peak.
    void clear() noexcept {
        memory::release(slots_);
        slots_ = nullptr;
        held_ = RankedBits();
        size_ = used_ = capacity_ = 0;
        cursor_slot_ = kNoCursor;
    }

private:
    static constexpr std::uint32_t kNoCursor = std::numeric_limits<std::uint32_t>::max();
    static constexpr std::uint32_t kSmallest = 8;

    // Room for n entries and half as many again, even.
    static std::uint32_t roomy(std::uint32_t n) noexcept {
        const std::uint32_t room = (n + n / 2 + 1) / 2 * 2;
        return room < kSmallest ? kSmallest : room;
    }

    // One block: the slots, then the bits and counts (8-byte aligned, as the
    // capacity is even).
    bool move_to(std::uint32_t capacity) noexcept {
        void* block = memory::allocate(sizeof(Node*) * capacity + RankedBits::bytes_for(capacity));
        if (block == nullptr) {
            return false;
        }
        auto** slots = static_cast<Node**>(block);
        std::uint32_t kept = 0;
        for (std::uint32_t i = 0; i < used_; ++i) {
            if (slots_[i] != nullptr) {
                slots_[i]->order = kept;
                slots[kept++] = slots_[i];
            }
        }
        memory::release(slots_);
        slots_ = slots;
        capacity_ = capacity;
        held_ = RankedBits(slots + capacity, capacity);
        renumbered(kept);
        return true;
    }

    // Moves the held entries to the front and renumbers them.
    void pack() noexcept {
        std::uint32_t kept = 0;
        for (std::uint32_t i = 0; i < used_; ++i) {
            if (slots_[i] != nullptr) {
                slots_[i]->order = kept;
                slots_[kept++] = slots_[i];
            }
        }
        renumbered(kept);
    }

    void renumbered(std::uint32_t kept) noexcept {
        used_ = kept;
        held_.set_first(kept);
        cursor_slot_ = kNoCursor;
    }

    Node** slots_ = nullptr;  // null where a removed node was
    RankedBits held_;
    std::uint32_t used_ = 0;  // slots handed out
    std::uint32_t size_ = 0;  // nodes held
    std::uint32_t capacity_ = 0;
    mutable std::uint32_t cursor_position_ = 0;
    mutable std::uint32_t cursor_slot_ = kNoCursor;
};

}  // namespace sorvel
