#include "loading/load_lines.hpp"

#include <bit>
#include <cstdint>

#include "collections/memory.hpp"

namespace sorvel {
namespace {

bool ends_line(char byte) noexcept { return byte == '\n' || byte == '\r'; }

std::size_t lowest_bit(std::size_t i) noexcept { return i & (~i + 1); }

// A line is a non-empty run of bytes other than CR and LF; a zero byte is
// part of the run, it only cuts the string that reaches the collection.
std::size_t count_lines(const char* data, std::size_t length) noexcept {
    std::size_t lines = 0;
    bool in_line = false;
    for (std::size_t at = 0; at < length; ++at) {
        const bool end = ends_line(data[at]);
        if (!end && !in_line) {
            ++lines;
        }
        in_line = !end;
    }
    return lines;
}

// Each line is terminated in place and added as soon as its end is seen.
// The spare byte after the data terminates the last line.
void load_in_file_order(StringCollection& strings, bool case_sensitive, char* data, std::size_t length) noexcept {
    std::size_t start = 0;
    for (std::size_t at = 0; at <= length; ++at) {
        if (at == length || ends_line(data[at])) {
            if (at > start) {
                data[at] = '\0';
                AddStringValue(strings, data + start, case_sensitive);
            }
            start = at + 1;
        }
    }
}

// The lines not yet added, in file order. Each line has a presence bit, 64 to
// a word, and a binary indexed tree over the words counts the lines present:
// entry i (numbered from 1) counts those in words (i - lowest_bit(i), i].
// Finding the k-th remaining line and taking it out cost O(log n) each, and
// the lines left keep their file order exactly as in a list whose gap closes.
// Grouping by words keeps the tree small enough to stay in cache while the
// collection is searched between picks.
class RemainingLines {
public:
    static constexpr std::size_t kWordBits = 64;

    static std::size_t words_for(std::size_t lines) noexcept { return (lines + kWordBits - 1) / kWordBits; }
    static std::size_t tree_entries_for(std::size_t lines) noexcept { return 2 * std::bit_floor(words_for(lines)); }

    // `present` has room for words_for(lines) words, `tree` for
    // tree_entries_for(lines) entries.
    RemainingLines(std::uint64_t* present, std::size_t* tree, std::size_t lines) noexcept
        : present_(present), tree_(tree), words_(words_for(lines)), top_(std::bit_floor(words_)) {
        for (std::size_t w = 0; w < words_; ++w) {
            present_[w] = ~std::uint64_t{0};
        }
        const std::size_t last = lines % kWordBits;
        if (last != 0) {
            present_[words_ - 1] = (std::uint64_t{1} << last) - 1;
        }
        for (std::size_t i = 1; i <= words_; ++i) {
            tree_[i] = static_cast<std::size_t>(std::popcount(present_[i - 1]));
        }
        for (std::size_t i = 1; i <= words_; ++i) {
            const std::size_t parent = i + lowest_bit(i);
            if (parent <= words_) {
                tree_[parent] += tree_[i];
            }
        }
        // The padding counts more lines than can ever be skipped, so the
        // search never steps onto it and needs no bounds test.
        for (std::size_t i = words_ + 1; i < 2 * top_; ++i) {
            tree_[i] = lines;
        }
    }

    // Takes out the remaining line that has `skip` remaining lines before it
    // and gives its position, counted from 0.
    std::size_t take(std::size_t skip) noexcept {
        // The largest number of whole words that hold no more than `skip`
        // lines; the wanted line lies in the word after them.
        std::size_t word = 0;
        for (std::size_t step = top_; step != 0; step >>= 1) {
            const std::size_t next = word + step;
            if (tree_[next] <= skip) {
                word = next;
                skip -= tree_[next];
            }
        }
        const unsigned bit = nth_set_bit(present_[word], static_cast<unsigned>(skip));
        present_[word] &= ~(std::uint64_t{1} << bit);
        for (std::size_t i = word + 1; i <= words_; i += lowest_bit(i)) {
            --tree_[i];
        }
        return word * kWordBits + bit;
    }

private:
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

    std::uint64_t* present_;
    std::size_t* tree_;
    std::size_t words_;
    std::size_t top_;
};

// While lines remain: draw r, take the (r mod n)-th remaining line counted
// from the front, n being the number left, and add it.
void load_in_balanced_order(StringCollection& strings, bool case_sensitive, char* data, std::size_t length,
                            DrawSource draw) noexcept {
    const std::size_t lines = count_lines(data, length);
    if (lines == 0) {
        return;
    }
    // One block for the bookkeeping: the presence words first, as they need
    // the widest alignment, then the tree and the line starts.
    constexpr std::size_t kMaxLines = SIZE_MAX / 4 / sizeof(std::size_t);
    if (lines > kMaxLines) {
        return;
    }
    const std::size_t words = RemainingLines::words_for(lines);
    const std::size_t tree_entries = RemainingLines::tree_entries_for(lines);
    void* block =
        memory::allocate(sizeof(std::uint64_t) * words + sizeof(std::size_t) * (tree_entries + lines));
    if (block == nullptr) {
        return;
    }
    auto* present = static_cast<std::uint64_t*>(block);
    auto* tree = reinterpret_cast<std::size_t*>(present + words);
    std::size_t* starts = tree + tree_entries;

    std::size_t line = 0;
    bool in_line = false;
    for (std::size_t at = 0; at < length; ++at) {
        if (ends_line(data[at])) {
            data[at] = '\0';
            in_line = false;
        } else if (!in_line) {
            starts[line++] = at;
            in_line = true;
        }
    }
    data[length] = '\0';

    RemainingLines remaining_lines(present, tree, lines);
    auto pick = [&](std::size_t remaining) noexcept {
        return remaining_lines.take(static_cast<std::size_t>(draw() & kDrawMask) % remaining);
    };
    std::size_t next = pick(lines);
    for (std::size_t remaining = lines; remaining != 0; --remaining) {
        const char* chosen = data + starts[next];
        // The next line is picked before this one is added, so that its bytes
        // are on their way in while the collection is searched. Adding draws
        // nothing, so the lines are added in the order of their draws.
        if (remaining > 1) {
            next = pick(remaining - 1);
            __builtin_prefetch(data + starts[next]);
        }
        // A line that does not fit when memory runs out is left out and the
        // load goes on: every add is all or nothing, so the collection stays
        // consistent, a shorter later line may still fit, and the draws stay
        // one per line whatever happens to each.
        AddStringValue(strings, chosen, case_sensitive);
    }
    memory::release(block);
}

}  // namespace

void load_lines(StringCollection strings, bool case_sensitive, char* data, std::size_t length, bool balanced,
                DrawSource draw) noexcept {
    if (data == nullptr) {
        return;
    }
    if (balanced) {
        load_in_balanced_order(strings, case_sensitive, data, length, draw);
    } else {
        // As in balanced order, a line that does not fit is left out and the
        // lines after it are still added.
        load_in_file_order(strings, case_sensitive, data, length);
    }
}

}  // namespace sorvel
