#include "values.hpp"

#include <array>
#include <bit>
#include <limits>

#include "draws.hpp"

namespace fuzzdriver {
namespace {

namespace draws = sorvel::test::draws;

// Bounds that keep one execution in the millisecond range.
constexpr std::size_t kMaxFileBytes = 160;
constexpr std::size_t kMinManyLines = 60;
constexpr std::size_t kMaxManyLines = 700;
constexpr std::size_t kMaxSortedLines = 150;

}  // namespace

std::int32_t Values::integer() {
    using Limit = std::numeric_limits<std::int32_t>;
    static constexpr std::array<std::int32_t, 12> kEdges = {
        Limit::min(), Limit::max(), 0, -1, 1, Limit::min() + 1, Limit::max() - 1, 65535, 65536, -65536, 32767, 32768};
    std::int32_t v = 0;
    const std::uint8_t b = in_.byte();
    switch (b % 8) {
        case 0:
        case 1: v = in_.small(); break;
        case 2: v = kEdges[in_.byte() % kEdges.size()]; break;
        case 3: v = static_cast<std::int32_t>(in_.u32()); break;
        case 7: v = in_.byte() % 8; break;
        default: v = ints_.empty() ? in_.small() : ints_.pick(in_.byte()); break;
    }
    ints_.put(v);
    return v;
}

// The 32 bits of a float, NaNs with any payload included.
std::uint32_t Values::float_bits() {
    static constexpr std::array<std::uint32_t, 20> kEdges = {
        0x00000000, 0x80000000,              // +0.0, -0.0
        0x7F800000, 0xFF800000,              // +inf, -inf
        0x7FC00000, 0xFFC00000, 0x7F800001,  // quiet NaNs, a signalling NaN
        0x7FBFFFFF, 0xFFFFFFFF, 0x7FFFFFFF,  // more NaN payloads
        0x00000001, 0x80000001,              // smallest denormals
        0x007FFFFF, 0x807FFFFF,              // largest denormals
        0x00800000, 0x7F7FFFFF, 0xFF7FFFFF,  // FLT_MIN, FLT_MAX, -FLT_MAX
        0x3F800000, 0x3F800001, 0x3F7FFFFF,  // 1.0 and its neighbours
    };
    std::uint32_t bits = 0;
    const std::uint8_t b = in_.byte();
    switch (b % 10) {
        case 0: bits = std::bit_cast<std::uint32_t>(static_cast<float>(in_.small())); break;
        case 1: bits = kEdges[in_.byte() % kEdges.size()]; break;
        case 2: {  // NaN: all-ones exponent, non-zero payload, either sign
            const std::uint32_t raw = in_.u32();
            bits = (raw & 0x80000000U) | 0x7F800000U | (raw & 0x007FFFFFU) | ((raw & 0x007FFFFFU) == 0 ? 1U : 0U);
            break;
        }
        case 3: {  // denormal (or a zero), either sign
            const std::uint32_t raw = in_.u32();
            bits = (raw & 0x80000000U) | (raw & 0x007FFFFFU);
            break;
        }
        case 4: bits = in_.u32(); break;
        case 8:  // a neighbouring bit pattern of a value met before
            bits = floats_.empty() ? 0U : floats_.pick(in_.byte()) + ((b & 0x10) != 0 ? 1U : 0xFFFFFFFFU);
            break;
        case 9: bits = std::bit_cast<std::uint32_t>(static_cast<float>(in_.small()) / 4.0F); break;
        default: bits = floats_.empty() ? 0U : floats_.pick(in_.byte()); break;
    }
    floats_.put(bits);
    return bits;
}

// A string parameter: nullopt stands for a null pointer from the host.
Text Values::text(bool allow_null) {
    static constexpr char kAlphabet[] = "aAbBmMzZ_[`^\\]{|}~@09 \x7F\x80\xE9\xFF";
    constexpr std::size_t kLetters = sizeof kAlphabet - 1;
    std::string s;
    const std::uint8_t b = in_.byte();
    switch (b % 10) {
        case 0: break;  // the empty string
        case 1:
        case 2: {
            const std::size_t length = in_.byte() % 6;
            for (std::size_t i = 0; i < length; ++i) {
                s += kAlphabet[in_.byte() % kLetters];
            }
            break;
        }
        case 5: {  // the same letters in other cases
            s = strings_.empty() ? std::string("Ab") : strings_.pick(in_.byte());
            std::uint8_t flips = in_.byte();
            for (char& c : s) {
                if ((flips & 1) != 0) {
                    if (c >= 'a' && c <= 'z') {
                        c = static_cast<char>(c - 'a' + 'A');
                    } else if (c >= 'A' && c <= 'Z') {
                        c = static_cast<char>(c - 'A' + 'a');
                    }
                }
                flips = static_cast<std::uint8_t>((flips >> 1) | (flips << 7));
            }
            break;
        }
        case 6: {  // any bytes, zero, CR and LF included
            const std::size_t length = in_.byte() % 12;
            for (std::size_t i = 0; i < length; ++i) {
                s += static_cast<char>(in_.byte());
            }
            break;
        }
        case 7: {  // a prefix of a held string, or one with a byte more
            s = strings_.empty() ? std::string("m") : strings_.pick(in_.byte());
            const std::uint8_t how = in_.byte();
            if ((how & 1) != 0 && !s.empty()) {
                s.resize(how % s.size());
            } else {
                s += kAlphabet[(how >> 1) % kLetters];
            }
            break;
        }
        case 8:
            if (allow_null) {
                return std::nullopt;
            }
            break;
        case 9:  // a zero byte cuts the string the library sees
            s = strings_.empty() ? std::string("z") : strings_.pick(in_.byte());
            s += '\0';
            s += kAlphabet[in_.byte() % kLetters];
            break;
        default: s = strings_.empty() ? std::string("a") : strings_.pick(in_.byte()); break;
    }
    strings_.put(s.substr(0, s.find('\0')));
    return s;
}

// A position for the value-at-position expressions.
std::int32_t Values::position(std::int32_t count) {
    static constexpr std::array<std::int32_t, 8> kEdges = {std::numeric_limits<std::int32_t>::min(),
                                                           std::numeric_limits<std::int32_t>::max(),
                                                           -1,
                                                           -65536,
                                                           65536,
                                                           65537,
                                                           -2,
                                                           0x10000 - 1};
    const std::uint8_t b = in_.byte();
    switch (b % 4) {
        case 0: return static_cast<std::int32_t>(in_.byte() % (static_cast<unsigned>(count) + 3U)) - 1;
        case 1: return near_ + in_.small() % 3;  // around the position read last
        case 2: return kEdges[in_.byte() % kEdges.size()];
        default: return integer();
    }
}

// The second argument of an expression handler: any 32-bit value.
std::int32_t Values::param_word() {
    static constexpr std::array<std::uint32_t, 10> kEdges = {0x00010001, 0x0000FFFF, 0x00008000, 0x00007FFF,
                                                             0xFFFF8000, 0x80000000, 0x12345678, 0xFFFFFFFF,
                                                             0x00010000, 0x7FFFFFFF};
    const std::uint8_t b = in_.byte();
    switch (b % 4) {
        case 0: return 0;
        case 1: return static_cast<std::int32_t>(in_.u32());
        case 2: return static_cast<std::int32_t>(kEdges[in_.byte() % kEdges.size()]);
        default: return in_.small();
    }
}

// The bytes of a text file: lines made of the strings above, ended in
// every way, with blank lines, zero bytes and stray bytes between them.
std::string Values::file() {
    const std::uint8_t shape = in_.byte();
    if (shape >= 240 && many_lines_left_ >= kMinManyLines) {
        return many_lines();
    }
    const std::size_t target = shape % kMaxFileBytes;
    std::string bytes;
    while (bytes.size() < target && !in_.exhausted()) {
        const std::uint8_t b = in_.byte();
        switch (b % 10) {
            case 0: bytes += '\n'; break;
            case 1: bytes += '\r'; break;
            case 2: bytes += "\r\n"; break;
            case 3: bytes += "\n\r"; break;
            case 4: bytes += '\0'; break;
            case 5: bytes += static_cast<char>(in_.byte()); break;
            default: bytes += *text(false); break;
        }
    }
    if (bytes.size() > kMaxFileBytes) {
        bytes.resize(kMaxFileBytes);
    }
    return bytes;
}

// Hundreds of short lines, so that balanced loading has long lists to
// pick from: numbers below a modulus (small ones repeat), optionally
// with letters in either case, zero bytes and blank lines, or sorted.
std::string Values::many_lines() {
    // A budget per input keeps an input of many big loads fast.
    // Long loads are rarer than short ones: a line costs about as much as
    // an event, so inputs full of long loads would starve the rest.
    const std::uint16_t size = in_.u16();
    std::size_t lines = kMinManyLines + (size % (kMaxManyLines - kMinManyLines + 1) >> (size >> 14) * 2);
    lines = lines < many_lines_left_ ? lines : many_lines_left_;
    many_lines_left_ -= lines;
    const std::uint32_t modulus = 1U + in_.u16();
    const std::uint8_t style = in_.byte();
    if ((style & 8) != 0 && lines > kMaxSortedLines) {
        // Sorted lines loaded in file order make a chain, and the model
        // descends it literally: quadratic in the chain's length.
        many_lines_left_ += lines - kMaxSortedLines;
        lines = kMaxSortedLines;
    }
    std::uint64_t state = in_.u32();
    static constexpr std::array<const char*, 5> kEnds = {"\n", "\r\n", "\r", "\n\n", "\n\r"};
    std::string bytes;
    for (std::size_t i = 0; i < lines; ++i) {
        const std::uint64_t r = mix(state);
        std::string line = (style & 8) != 0 ? std::to_string(100000 + i) : std::to_string(r % modulus);
        if ((style & 1) != 0) {
            line.insert(line.begin(), ((r >> 40) & 1) != 0 ? 'A' : 'a');
        }
        if ((style & 2) != 0 && ((r >> 20) & 15) == 0) {
            line += '\0';
            line += 'x';
        }
        bytes += line;
        bytes += kEnds[(r >> 32) % kEnds.size()];
    }
    return bytes;
}

std::int32_t Values::balance() {
    static constexpr std::array<std::int32_t, 4> kBalance = {0, 1, 2, -1};
    const std::uint8_t b = in_.byte();
    return b < 240 ? kBalance[b % 4] : static_cast<std::int32_t>(in_.u32());
}

// Values for the generator: some full-width (the library keeps 15 bits),
// some already 15-bit, some all alike, some straight from the input.
std::vector<int> Values::draws(std::size_t needed) {
    std::vector<int> out;
    const std::size_t n = needed + 3;  // extra: a library that draws too often still gets values
    out.reserve(n);
    const std::uint8_t mode = in_.byte();
    std::uint64_t state = in_.u16() * 0x9E3779B97F4A7C15ULL + mode;
    const auto next = [&state] { return static_cast<int>(mix(state) & 0x7FFFFFFF); };
    const int same = static_cast<int>(in_.u16());
    for (std::size_t i = 0; i < n; ++i) {
        switch (mode % 5) {
            case 0: out.push_back(next()); break;
            case 1: out.push_back(next() & 0x7FFF); break;
            case 2: out.push_back(same); break;
            case 3: out.push_back(i < 16 ? static_cast<int>(in_.u16()) : next()); break;
            default: out.push_back(next() & 0xFF); break;
        }
    }
    // Where the runtime's generator cannot be scripted (a Windows C
    // runtime shared with a loaded DLL), the values are the generator's
    // own, learnt in advance from a seed the input chose.
    return draws::scriptable() ? out : draws::reseed(static_cast<unsigned>(mix(state)), n);
}

}  // namespace fuzzdriver
