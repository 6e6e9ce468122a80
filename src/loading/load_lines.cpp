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

// Draws k = r mod n and adds the k-th remaining line counted from the front,
// n being the number of lines left, until none is left. The remaining lines
// are kept as a binary indexed tree of presence counts over the line
// positions, so finding the k-th one and taking it out are O(log n) each and
// the order is exactly that of removing from a list whose gap closes.
void load_in_balanced_order(StringCollection& strings, bool case_sensitive, char* data, std::size_t length,
                            DrawSource draw) noexcept {
    const std::size_t lines = count_lines(data, length);
    if (lines == 0) {
        return;
    }
    // One block: the line starts, then the tree at positions 1..lines.
    constexpr std::size_t kMaxLines = (SIZE_MAX / sizeof(std::size_t) - 1) / 2;
    if (lines > kMaxLines) {
        return;
    }
    auto* block = static_cast<std::size_t*>(memory::allocate(sizeof(std::size_t) * (2 * lines + 1)));
    if (block == nullptr) {
        return;
    }
    std::size_t* starts = block;
    std::size_t* tree = block + lines;

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

    // With every line present, entry i counts the lines (i - lowest_bit(i), i].
    for (std::size_t i = 1; i <= lines; ++i) {
        tree[i] = lowest_bit(i);
    }
    const std::size_t top = std::bit_floor(lines);
    for (std::size_t remaining = lines; remaining != 0; --remaining) {
        std::size_t skip = static_cast<std::size_t>(draw() & kDrawMask) % remaining;
        // The largest position whose prefix holds no more than `skip` lines;
        // the wanted line is the next one.
        std::size_t position = 0;
        for (std::size_t step = top; step != 0; step >>= 1) {
            const std::size_t next = position + step;
            if (next <= lines && tree[next] <= skip) {
                position = next;
                skip -= tree[next];
            }
        }
        for (std::size_t i = position + 1; i <= lines; i += lowest_bit(i)) {
            --tree[i];
        }
        // A line that does not fit when memory runs out is left out and the
        // load goes on: every add is all or nothing, so the collection stays
        // consistent, a shorter later line may still fit, and the draws stay
        // one per line whatever happens to each.
        AddStringValue(strings, data + starts[position], case_sensitive);
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
