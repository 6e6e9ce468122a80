#include "loading/load_lines.hpp"

#include <cstdint>

#include "collections/memory.hpp"
#include "collections/ranked_bits.hpp"

namespace sorvel {
namespace {

bool ends_line(char byte) noexcept {
    return byte == '\n' || byte == '\r';
}

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

// While lines remain: draw r, take the (r mod n)-th remaining line counted
// from the front, n being the number left, and add it.
void load_in_balanced_order(StringCollection& strings, bool case_sensitive, char* data, std::size_t length,
                            DrawSource draw) noexcept {
    const std::size_t lines = count_lines(data, length);
    if (lines == 0) {
        return;
    }
    // One block for the bookkeeping: a bit per line still to add, as the
    // bits need the widest alignment, then the line starts. The lines left
    // keep their file order, as in a list whose gaps close.
    constexpr std::size_t kMaxLines = SIZE_MAX / 4 / sizeof(std::size_t);
    if (lines > kMaxLines) {
        return;
    }
    const std::size_t bits_bytes = RankedBits::bytes_for(lines);
    void* block = memory::allocate(bits_bytes + sizeof(std::size_t) * lines);
    if (block == nullptr) {
        return;
    }
    auto* starts = reinterpret_cast<std::size_t*>(static_cast<char*>(block) + bits_bytes);

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

    RankedBits remaining_lines(block, lines);
    remaining_lines.set_first(lines);
    auto pick = [&](std::size_t remaining) noexcept {
        const std::size_t taken = remaining_lines.select(static_cast<std::size_t>(draw() & kDrawMask) % remaining);
        remaining_lines.reset(taken);
        return taken;
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
