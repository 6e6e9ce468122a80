// A bit per entry and, over groups of eight 64-bit words (one cache line), a
// Fenwick tree of how many are set: count i (from 1) counts the set bits of
// groups (i - lowest_bit(i), i]. It turns an entry into its rank among the
// set ones and a rank back into an entry in O(log n): a walk of the counts,
// small enough to stay in cache, then one line of bits. The owner provides
// the memory, so that it can keep everything in one block.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>

namespace sorvel {

class RankedBits {
public:
    static constexpr std::size_t kWordBits = 64;
    static constexpr std::size_t kGroupWords = 8;

    static constexpr std::size_t words_for(std::size_t entries) noexcept {
        return entries / kWordBits + (entries % kWordBits != 0 ? 1 : 0);
    }
    static constexpr std::size_t groups_for(std::size_t entries) noexcept {
        return (words_for(entries) + kGroupWords - 1) / kGroupWords;
    }
    // Bytes for the words and the counts of `entries` entries, words first.
    static constexpr std::size_t bytes_for(std::size_t entries) noexcept {
        return sizeof(std::uint64_t) * words_for(entries) + sizeof(std::size_t) * (groups_for(entries) + 1);
    }

    RankedBits() noexcept = default;
    // `memory` holds bytes_for(entries) bytes, 8-byte aligned; its content is
    // taken as it is until clear_all(), set_first() or recount().
    RankedBits(void* memory, std::size_t entries) noexcept
        : words_(static_cast<std::uint64_t*>(memory)),
          counts_(reinterpret_cast<std::size_t*>(words_ + words_for(entries))),
          word_count_(words_for(entries)),
          group_count_(groups_for(entries)) {}

    // Every bit clear, or only the first n set; the counts follow.
    void clear_all() noexcept { set_first(0); }
    void set_first(std::size_t n) noexcept {
        for (std::size_t w = 0; w < word_count_; ++w) {
            const std::size_t from = w * kWordBits;
            words_[w] = n >= from + kWordBits ? ~std::uint64_t{0} : n > from ? (std::uint64_t{1} << (n - from)) - 1 : 0;
        }
        recount();
    }

    // The counts from the words, in linear time.
    void recount() noexcept {
        for (std::size_t i = 1; i <= group_count_; ++i) {
            counts_[i] = popcount_words((i - 1) * kGroupWords, i * kGroupWords);
        }
        for (std::size_t i = 1; i <= group_count_; ++i) {
            const std::size_t up = i + lowest_bit(i);
            if (up <= group_count_) {
                counts_[up] += counts_[i];
            }
        }
    }

    [[nodiscard]] bool test(std::size_t i) const noexcept {
        return ((words_[i / kWordBits] >> (i % kWordBits)) & 1U) != 0;
    }
    void set(std::size_t i) noexcept {
        words_[i / kWordBits] |= std::uint64_t{1} << (i % kWordBits);
        for (std::size_t g = i / kWordBits / kGroupWords + 1; g <= group_count_; g += lowest_bit(g)) {
            ++counts_[g];
        }
    }
    void reset(std::size_t i) noexcept {
        words_[i / kWordBits] &= ~(std::uint64_t{1} << (i % kWordBits));
        for (std::size_t g = i / kWordBits / kGroupWords + 1; g <= group_count_; g += lowest_bit(g)) {
            --counts_[g];
        }
    }

    // How many set bits come before entry i.
    [[nodiscard]] std::size_t rank(std::size_t i) const noexcept {
        const std::size_t w = i / kWordBits;
        const std::uint64_t below = (std::uint64_t{1} << (i % kWordBits)) - 1;
        std::size_t before = static_cast<std::size_t>(std::popcount(words_[w] & below)) +
                             popcount_words(w / kGroupWords * kGroupWords, w);
        for (std::size_t g = w / kGroupWords; g != 0; g &= g - 1) {
            before += counts_[g];
        }
        return before;
    }

    // The set entry with k set entries before it; k is below the number set.
    [[nodiscard]] std::size_t select(std::size_t k) const noexcept {
        std::size_t group = 0;
        for (std::size_t step = std::bit_floor(group_count_); step != 0; step >>= 1) {
            if (group + step <= group_count_ && counts_[group + step] <= k) {
                group += step;
                k -= counts_[group];
            }
        }
        std::size_t w = group * kGroupWords;
        for (auto held = static_cast<std::size_t>(std::popcount(words_[w])); held <= k;
             held = static_cast<std::size_t>(std::popcount(words_[++w]))) {
            k -= held;
        }
        return w * kWordBits + nth_set_bit(words_[w], static_cast<unsigned>(k));
    }

    // The first set entry from i on, which has `rank` set entries before it:
    // a look at the next two words, then a search. i is within the entries.
    [[nodiscard]] std::size_t next(std::size_t i, std::size_t rank) const noexcept {
        std::size_t w = i / kWordBits;
        const std::uint64_t here = words_[w] & (~std::uint64_t{0} << (i % kWordBits));
        if (here != 0) {
            return w * kWordBits + static_cast<std::size_t>(std::countr_zero(here));
        }
        if (++w < word_count_ && words_[w] != 0) {
            return w * kWordBits + static_cast<std::size_t>(std::countr_zero(words_[w]));
        }
        return select(rank);
    }

    // For inspection.
    [[nodiscard]] std::size_t words() const noexcept { return word_count_; }
    [[nodiscard]] std::size_t groups() const noexcept { return group_count_; }
    [[nodiscard]] std::uint64_t word(std::size_t w) const noexcept { return words_[w]; }
    [[nodiscard]] std::size_t count(std::size_t i) const noexcept { return counts_[i]; }

    static constexpr std::size_t lowest_bit(std::size_t i) noexcept { return i & (~i + 1); }

private:
    [[nodiscard]] std::size_t popcount_words(std::size_t from, std::size_t to) const noexcept {
        std::size_t n = 0;
        for (std::size_t w = from; w < to && w < word_count_; ++w) {
            n += static_cast<std::size_t>(std::popcount(words_[w]));
        }
        return n;
    }

    // The place of the set bit that has n set bits below it, found by halving.
    static unsigned nth_set_bit(std::uint64_t bits, unsigned n) noexcept {
        unsigned place = 0;
        for (unsigned width = kWordBits / 2; width != 0; width /= 2) {
            const std::uint64_t lower = (bits >> place) & ((std::uint64_t{1} << width) - 1);
            const auto below = static_cast<unsigned>(std::popcount(lower));
            if (n >= below) {
                n -= below;
                place += width;
            }
        }
        return place;
    }

    std::uint64_t* words_ = nullptr;
    std::size_t* counts_ = nullptr;  // from 1; entry 0 is unused
    std::size_t word_count_ = 0;
    std::size_t group_count_ = 0;
};

}  // namespace sorvel
