// The order in which a collection's nodes were added. Entries point at nodes
// without owning them. Each appended node gets an increasing order number, so
// the entries are sorted by it and a node's position is a binary search away.
#pragma once

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
    ~InsertionIndex() { memory::release(items_); }

    [[nodiscard]] std::uint32_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }
    [[nodiscard]] Node* at(std::uint32_t position) const noexcept { return items_[position]; }

    // Makes room for one more entry; false when memory ran out, with the
    // index unchanged.
    bool reserve_one() noexcept {
        if (size_ < capacity_) {
            return true;
        }
        constexpr std::uint32_t kMaxCapacity = std::numeric_limits<std::uint32_t>::max() / sizeof(Node*);
        if (capacity_ >= kMaxCapacity) {
            return false;
        }
        std::uint32_t grown = capacity_ < 8 ? 8 : capacity_ + capacity_ / 2;
        if (grown > kMaxCapacity || grown < capacity_) {
            grown = kMaxCapacity;
        }
        auto** bigger = static_cast<Node**>(memory::allocate(sizeof(Node*) * grown));
        if (bigger == nullptr) {
            return false;
        }
        if (size_ != 0) {
            std::memcpy(bigger, items_, sizeof(Node*) * size_);
        }
        memory::release(items_);
        items_ = bigger;
        capacity_ = grown;
        return true;
    }

    // Appends after a successful reserve_one().
    void append(Node* node) noexcept {
        if (next_order_ == std::numeric_limits<std::uint32_t>::max()) {
            renumber();
        }
        node->order = next_order_++;
        items_[size_++] = node;
    }

    // The position of a node held in the index, or -1.
    [[nodiscard]] std::int32_t position_of(const Node* node) const noexcept {
        std::uint32_t low = 0;
        std::uint32_t high = size_;
        while (low < high) {
            const std::uint32_t mid = low + (high - low) / 2;
            if (items_[mid]->order < node->order) {
                low = mid + 1;
            } else {
                high = mid;
            }
        }
        if (low < size_ && items_[low] == node) {
            return static_cast<std::int32_t>(low);
        }
        return -1;
    }

    // Erases the entry of a node; the later entries move one toward the front.
    void erase(const Node* node) noexcept {
        const std::int32_t position = position_of(node);
        if (position < 0) {
            return;
        }
        const auto at = static_cast<std::uint32_t>(position);
        std::memmove(items_ + at, items_ + at + 1, sizeof(Node*) * (size_ - at - 1));
        --size_;
    }

    void clear() noexcept {
        size_ = 0;
        next_order_ = 0;
    }

    // Starts numbering at `first`; lets tests reach the wrap-around.
    void restart_numbering_at(std::uint32_t first) noexcept {
        renumber();
        if (first > next_order_) {
            for (std::uint32_t i = 0; i < size_; ++i) {
                items_[i]->order += first - size_;
            }
            next_order_ = first;
        }
    }

private:
    // Order numbers only need to increase along the index; when they would
    // run out, the entries are numbered afresh from 0.
    void renumber() noexcept {
        for (std::uint32_t i = 0; i < size_; ++i) {
            items_[i]->order = i;
        }
        next_order_ = size_;
    }

    Node** items_ = nullptr;
    std::uint32_t size_ = 0;
    std::uint32_t capacity_ = 0;
    std::uint32_t next_order_ = 0;
};

}  // namespace sorvel
