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

// The lines not yet added, as a binary indexed tree of presence counts over
// the line positions, numbered from 1. Entry i counts the remaining lines
// among positions (i - lowest_bit(i), i]. Finding the k-th remaining line and
// taking it out cost O(log n) each, and the lines left keep their file order
// exactly as in a list whose gap closes.
class RemainingLines {
public:
    // `tree` has room for entries 0 .. 2 * bit_floor(lines) - 1.
    RemainingLines(std::size_t* tree, std::size_t lines) noexcept
        : tree_(tree), lines_(lines), top_(std::bit_floor(lines)) {
        for (std::size_t i = 1; i <= lines_; ++i) {
            tree_[i] = lowest_bit(i);
        }
        // The padding counts more lines than can ever be skipped, so the
        // search never steps onto it and needs no bounds test.
        for (std::size_t i = lines_ + 1; i < 2 * top_; ++i) {
            tree_[i] = lines_;
        }
    }

    static std::size_t entries_for(std::size_t lines) noexcept { return 2 * std::bit_floor(lines); }

    // Takes out the remaining line that has `skip` remaining lines before it
    // and gives its position, counted from 0.
    std::size_t take(std::size_t skip) noexcept {
        // The largest position whose prefix holds no more than `skip` lines;
        // the wanted line is the one after it.
        std::size_t position = 0;
        for (std::size_t step = top_; step != 0; step >>= 1) {
            const std::size_t next = position + step;
            if (tree_[next] <= skip) {
                position = next;
                skip -= tree_[next];
            }
        }
        for (std::size_t i = position + 1; i <= lines_; i += lowest_bit(i)) {
            --tree_[i];
        }
        return position;
    }

private:
    std::size_t* tree_;
    std::size_t lines_;
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
    // One block for the bookkeeping: the line starts, then the tree.
    constexpr std::size_t kMaxLines = SIZE_MAX / sizeof(std::size_t) / 4;
    if (lines > kMaxLines) {
        return;
    }
    const std::size_t entries = lines + RemainingLines::entries_for(lines);
    auto* block = static_cast<std::size_t*>(memory::allocate(sizeof(std::size_t) * entries));
    if (block == nullptr) {
        return;
    }
    std::size_t* starts = block;

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

    RemainingLines remaining_lines(block + lines, lines);
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

void load_lines(StringCollection& strings, bool case_sensitive, char* data, std::size_t length, bool balanced,
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
