// The order in which a collection's nodes were added. Entries point at nodes
// without owning them. Each node keeps the number of its slot in `order`; a
// removal leaves an empty slot rather than moving the later ones. A bit per
// slot marks the held ones, and a Fenwick tree counts them per 64 slots: small
// enough to stay in cache, it turns slots into positions and back in O(log n).
// Once empty slots outnumber the held ones, the slots are packed.
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
            // The block holding rank position + 1, then the bit within it.
            std::uint32_t block = 0;
            std::uint32_t rest = position + 1;
            for (std::uint32_t step = std::bit_floor(blocks()); step != 0; step >>= 1) {
                if (block + step <= blocks() && counts()[block + step] < rest) {
                    block += step;
                    rest -= counts()[block];
                }
            }
            std::uint64_t held = bits()[block];
            for (; rest > 1; --rest) {
                held &= held - 1;
            }
            slot = block * 64 + static_cast<std::uint32_t>(std::countr_zero(held));
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
        constexpr std::uint32_t kMax = std::numeric_limits<std::uint32_t>::max() / (sizeof(Node*) + 1) / 2 * 2;
        if (capacity_ >= kMax) {
            return false;
        }
        // Even, so that the bits after the slots are 8-byte aligned on 32-bit.
        std::uint32_t grown = capacity_ < 8 ? 8 : (capacity_ + capacity_ / 2 + 1) / 2 * 2;
        grown = grown > kMax || grown < capacity_ ? kMax : grown;
        const std::uint32_t words = words_for(grown);
        // One block: the slots, a bit per slot, then the counts from 1.
        void* block = memory::allocate(sizeof(Node*) * grown + 8 * words + 4 * (words + 1));
        if (block == nullptr) {
            return false;
        }
        auto** slots = static_cast<Node**>(block);
        auto* held = reinterpret_cast<std::uint64_t*>(slots + grown);
        if (capacity_ != 0) {
            std::memcpy(slots, slots_, sizeof(Node*) * used_);
            std::memcpy(held, bits(), 8 * blocks());
        }
        std::memset(held + blocks(), 0, 8 * (words - blocks()));
        memory::release(slots_);
        slots_ = slots;
        capacity_ = grown;
        count_blocks();
        return true;
    }

    // Appends after a successful reserve_one().
    void append(Node* node) noexcept {
        node->order = used_;
        slots_[used_] = node;
        bits()[used_ / 64] |= std::uint64_t{1} << (used_ % 64);
        add_to_counts(used_, 1);
        ++used_;
        ++size_;
    }

    // The position of a node, or -1 when the index does not hold it.
    [[nodiscard]] std::int32_t position_of(const Node* node) const noexcept {
        const std::uint32_t slot = node->order;
        if (slot >= used_ || slots_[slot] != node) {
            return -1;
        }
        auto before =
            static_cast<std::uint32_t>(std::popcount(bits()[slot / 64] & ((std::uint64_t{1} << (slot % 64)) - 1)));
        for (std::uint32_t i = slot / 64; i != 0; i &= i - 1) {
            before += counts()[i];
        }
        return static_cast<std::int32_t>(before);
    }

    // Empties the node's slot; the later entries stay where they are.
    void erase(const Node* node) noexcept {
        const std::uint32_t slot = node->order;
        slots_[slot] = nullptr;
        bits()[slot / 64] &= ~(std::uint64_t{1} << (slot % 64));
        add_to_counts(slot, 0U - 1U);
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
        if (slots_ != nullptr) {
            std::memset(bits(), 0, 8 * blocks());
            count_blocks();
        }
    }

private:
    static constexpr std::uint32_t kNoCursor = std::numeric_limits<std::uint32_t>::max();

    static std::uint32_t words_for(std::uint32_t slots) noexcept { return slots / 64 + (slots % 64 != 0 ? 1 : 0); }
    [[nodiscard]] std::uint32_t blocks() const noexcept { return words_for(capacity_); }
    [[nodiscard]] std::uint64_t* bits() const noexcept { return reinterpret_cast<std::uint64_t*>(slots_ + capacity_); }
    [[nodiscard]] std::uint32_t* counts() const noexcept { return reinterpret_cast<std::uint32_t*>(bits() + blocks()); }

    void add_to_counts(std::uint32_t slot, std::uint32_t change) noexcept {
        for (std::uint32_t i = slot / 64 + 1; i <= blocks(); i += i & (0U - i)) {
            counts()[i] += change;
        }
    }

    // The counts from the bits, in linear time.
    void count_blocks() noexcept {
        for (std::uint32_t i = 1; i <= blocks(); ++i) {
            counts()[i] = static_cast<std::uint32_t>(std::popcount(bits()[i - 1]));
        }
        for (std::uint32_t i = 1; i <= blocks(); ++i) {
            const std::uint32_t up = i + (i & (0U - i));
            if (up <= blocks()) {
                counts()[up] += counts()[i];
            }
        }
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
        std::memset(bits(), 0, 8 * blocks());
        for (std::uint32_t i = 0; i < kept; ++i) {
            bits()[i / 64] |= std::uint64_t{1} << (i % 64);
        }
        used_ = kept;
        count_blocks();
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
