// Differential fuzzer: decodes its input into events for one to three object
// instances, runs them through the library's real handler tables by way of
// the test host (the library linked in, so libFuzzer sees its coverage, or
// one the host loaded, for the replay), with every draw scripted where the
// generator can be scripted and learnt in advance where it cannot. After
// every event it holds the library against the reference model in model.hpp:
// results, counts, result flags, host calls and their arguments, draws and
// the header bytes the library may not touch; tree shapes every few events,
// insertion order in sweeps, and both at the end of every input. Any
// difference aborts with a description of the event and the ones before it,
// and libFuzzer keeps the input.
//
// Input: one byte for the number of instances, then per instance a byte of
// option words and two bytes of a creation word; then events, one byte each
// (low 5 bits the kind, high 3 bits the instance) followed by the bytes their
// values take. Past its end the input reads as zeros. SORVEL_FUZZ_TRACE=1
// prints the events of an input as they run.
#include <unistd.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "driver.hpp"
#include "exports_table.hpp"
#include "invariants.hpp"
#include "model.hpp"
#include "support.hpp"
#include "test_host.hpp"

namespace {

namespace draws = sorvel::testhost::draws;
using sorvel::testhost::Host;
using sorvel::testhost::HostCall;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;
using sorvel::testhost::RecordLayout;
using sorvel::testhost::word;
using Routine = HostCall::Routine;
using Text = fuzzmodel::Instance::Text;

// Bounds that keep one execution in the millisecond range.
constexpr std::size_t kMaxEvents = 256;
constexpr std::size_t kMaxFileBytes = 160;
constexpr std::size_t kMinManyLines = 60;
constexpr std::size_t kMaxManyLines = 700;
constexpr std::size_t kManyLinesPerInput = 2000;
constexpr std::size_t kMaxSortedLines = 150;
constexpr std::size_t kPoolSize = 48;
constexpr std::size_t kHistory = 40;
constexpr std::size_t kSweepFull = 24;  // larger collections are sampled
constexpr std::size_t kMaxSweeps = 2;   // per input, besides the final one
constexpr std::size_t kMaxFailingLoadLines = 100;
constexpr std::size_t kTreeEvery = 32;      // events between whole-tree comparisons
constexpr std::int32_t kInspectSmall = 64;  // collections checked after every change
constexpr std::size_t kInspectEvery = 8;    // changes between checks of larger ones

constexpr std::uint16_t kFloatFlag = 0x4000;
constexpr std::uint16_t kStringFlag = 0x8000;

constexpr int kIntegers = 0;
constexpr int kFloats = 1;
constexpr int kStrings = 2;

// Option words: every on/off combination, and values other than 0 and 1.
constexpr std::array<std::int32_t, 4> kOptionWords = {-1, 0, 1, 2};

// ------------------------------------------------------------ reporting

// The recent events, kept as values and put into words only when a
// difference is found: building texts for every event would cost more than
// running the events.
struct Described {
    const char* name = "";
    std::optional<std::int64_t> integer;  // an integer parameter or position
    std::optional<std::uint32_t> bits;    // a float parameter
    std::optional<Text> text;             // a string parameter, or a file's first bytes
    std::string detail;                   // more, for the rare events that have it
    std::optional<std::int32_t> param_word;
    long failing = -1;  // the allocation made to fail
    std::size_t number = 0;
    int instance = 0;
    std::int32_t case_word = 0;
    std::int32_t index_word = 0;
    std::string line() const;
};
std::array<Described, kHistory> g_history;
std::size_t g_events = 0;  // described so far in this input
// SORVEL_FUZZ_TRACE=1 prints every event as it runs, to read an input back.
const bool g_trace = std::getenv("SORVEL_FUZZ_TRACE") != nullptr;

std::string hex32(std::uint32_t v) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08X", v);
    return text;
}

std::string show(const Text& text) {
    if (!text) {
        return "(null)";
    }
    std::string out = "\"";
    for (const char c : *text) {
        const auto byte = static_cast<unsigned char>(c);
        if (byte >= 0x20 && byte < 0x7F && byte != '"' && byte != '\\') {
            out += c;
        } else {
            char esc[8];
            std::snprintf(esc, sizeof esc, "\\x%02X", byte);
            out += esc;
        }
    }
    return out + "\"";
}

std::string show_float(std::uint32_t bits) {
    char text[48];
    std::snprintf(text, sizeof text, "%g[%s]", static_cast<double>(std::bit_cast<float>(bits)), hex32(bits).c_str());
    return text;
}

std::string Described::line() const {
    std::string out = "#" + std::to_string(number) + " instance " + std::to_string(instance) + " (case " +
                      std::to_string(case_word) + ", index " + std::to_string(index_word) + "): " + name;
    out += integer ? " " + std::to_string(*integer) : "";
    out += bits ? " " + show_float(*bits) : "";
    out += text ? " " + show(*text) : "";
    out += detail.empty() ? "" : " " + detail;
    out += param_word ? " word " + hex32(static_cast<std::uint32_t>(*param_word)) : "";
    return out + (failing >= 0 ? ", allocation " + std::to_string(failing) + " failing" : "");
}

[[noreturn]] void mismatch(const std::string& what) {
    std::fprintf(stderr, "\n=== sorvel differential fuzzer: MISMATCH\n");
    if (g_events > 0) {
        std::fprintf(stderr, "event: %s\n", g_history[(g_events - 1) % kHistory].line().c_str());
    }
    std::fprintf(stderr, "what:  %s\n", what.c_str());
    std::fprintf(stderr, "recent events (oldest first):\n");
    for (std::size_t i = g_events > kHistory ? g_events - kHistory : 0; i < g_events; ++i) {
        std::fprintf(stderr, "  %s\n", g_history[i % kHistory].line().c_str());
    }
    std::fflush(stderr);
    std::abort();
}

template <class T>
void expect_equal(const T& got, const T& want, const char* what) {
    if (!(got == want)) {
        mismatch(std::string(what) + ": library " + std::to_string(got) + ", model " + std::to_string(want));
    }
}

// ------------------------------------------------------------ input

// Reads the fuzzer's bytes from the front; past the end it gives zeros.
class Input {
public:
    Input(const std::uint8_t* data, std::size_t size) : data_(data), size_(size) {}
    bool exhausted() const { return at_ >= size_; }
    std::uint8_t byte() { return at_ < size_ ? data_[at_++] : 0; }
    int small() { return static_cast<int>(byte()) - 128; }  // -128 to 127
    std::uint16_t u16() { return static_cast<std::uint16_t>(byte() | (byte() << 8)); }
    std::uint32_t u32() {
        const std::uint32_t low = u16();
        return low | (static_cast<std::uint32_t>(u16()) << 16);
    }

private:
    const std::uint8_t* data_;
    std::size_t size_;
    std::size_t at_ = 0;
};

// Values met so far, so that later events hit them again (duplicates,
// removals of held values, case variants).
template <class T>
class Pool {
public:
    void put(const T& v) {
        if (values_.size() < kPoolSize) {
            values_.push_back(v);
        } else {
            values_[next_++ % kPoolSize] = v;
        }
    }
    bool empty() const { return values_.empty(); }
    const T& pick(std::uint8_t b) const { return values_[b % values_.size()]; }

private:
    std::vector<T> values_;
    std::size_t next_ = 0;
};

class Values {
public:
    explicit Values(Input& in) : in_(in) {}

    std::int32_t integer() {
        using Limit = std::numeric_limits<std::int32_t>;
        static constexpr std::array<std::int32_t, 12> kEdges = {
            Limit::min(),     Limit::max(), 0,     -1,     1,     Limit::min() + 1,
            Limit::max() - 1, 65535,        65536, -65536, 32767, 32768};
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
    std::uint32_t float_bits() {
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
    Text text(bool allow_null = true) {
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
    std::int32_t position(std::int32_t count) {
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

    // What a read by position gave: later positions gather around it, and
    // later values (removals, re-adds) pick it up from the pools.
    void read_at(std::int32_t position) { near_ = position; }
    void met(std::int32_t v) { ints_.put(v); }
    void met(float v) { floats_.put(std::bit_cast<std::uint32_t>(v)); }
    void met(const std::string& v) { strings_.put(v); }

    // The second argument of an expression handler: any 32-bit value.
    std::int32_t param_word() {
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
    std::string file() {
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
    std::string many_lines() {
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

    std::int32_t balance() {
        static constexpr std::array<std::int32_t, 4> kBalance = {0, 1, 2, -1};
        const std::uint8_t b = in_.byte();
        return b < 240 ? kBalance[b % 4] : static_cast<std::int32_t>(in_.u32());
    }

    // Values for the generator: some full-width (the library keeps 15 bits),
    // some already 15-bit, some all alike, some straight from the input.
    std::vector<int> draws(std::size_t needed) {
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

    // splitmix64: a stream of well-mixed values from one seed.
    static std::uint64_t mix(std::uint64_t& state) {
        state += 0x9E3779B97F4A7C15ULL;
        std::uint64_t z = state;
        z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ULL;
        z = (z ^ (z >> 27)) * 0x94D049BB133111EBULL;
        return z ^ (z >> 31);
    }

private:
    Input& in_;
    std::size_t many_lines_left_ = kManyLinesPerInput;
    Pool<std::int32_t> ints_;
    Pool<std::uint32_t> floats_;
    Pool<std::string> strings_;
    std::int32_t near_ = 0;
};

// ------------------------------------------------------------ the file

// One file per process, so parallel fuzzing jobs do not share it; in memory
// where the system offers it, as a file is written for every load.
std::filesystem::path file_folder() {
    std::error_code error;
    return std::filesystem::is_directory("/dev/shm", error) ? std::filesystem::path("/dev/shm")
                                                            : std::filesystem::temp_directory_path();
}

// Written for every load and removed when the process ends.
const std::string& file_path() {
    static const struct File {
        std::string path = (file_folder() / ("sorvel-fuzz-" + std::to_string(::getpid()) + ".txt")).string();
        ~File() { std::remove(path.c_str()); }
    } file;
    return file.path;
}

const std::string& missing_path() {
    static const std::string path =
        (file_folder() / ("sorvel-fuzz-" + std::to_string(::getpid()) + "-missing") / "none.txt").string();
    return path;
}

void write_file(const std::string& bytes) {
    std::FILE* file = std::fopen(file_path().c_str(), "wb");
    if (file == nullptr || std::fwrite(bytes.data(), 1, bytes.size(), file) != bytes.size() || std::fclose(file) != 0) {
        std::fprintf(stderr, "fuzzer: cannot write %s\n", file_path().c_str());
        std::abort();
    }
}

// ------------------------------------------------------------ one instance

// A value of one collection: the field of its kind counts.
struct Operand {
    std::int32_t integer = 0;
    std::uint32_t bits = 0;
    Text text;
};

struct Subject {
    Instance* host = nullptr;
    std::unique_ptr<fuzzmodel::Instance> model;
    std::array<word, 3> indexes{};
    word reader = 0;
    int number = 0;
};

Param float_param(std::uint32_t bits) {
    // The 32 bits exactly as the host gives a float, zero-extended.
    return Param::raw_word(static_cast<word>(static_cast<std::uintptr_t>(bits)));
}

Param text_param(const Text& t) {
    return t ? Param::of(*t) : Param::null();
}

// What one host routine call must look like; an argument of nullopt is not
// checked (pointers the library takes from the host).
struct ExpectedCall {
    Routine routine;
    std::array<std::optional<word>, 3> args;
    std::size_t count() const { return routine == Routine::close_file ? 1 : 3; }
};

const char* routine_name(Routine r) {
    switch (r) {
        case Routine::read_event_param: return "HostReadEventParam";
        case Routine::read_first_expr_param: return "HostReadFirstExprParam";
        case Routine::read_next_expr_param: return "HostReadNextExprParam";
        case Routine::alloc_result_string: return "HostAllocResultString";
        case Routine::open_file: return "HostOpenFile";
        case Routine::close_file: return "HostCloseFile";
    }
    return "?";
}

class Session {
public:
    explicit Session(Input& in)
        : in_(in),
          values_(in),
          host_(fuzzdriver::library()),
          allocations_(host_.library().allocations()),
          inspect_(fuzzdriver::inspectable()) {
        live_at_start_ = allocations_ != nullptr ? allocations_->live() : 0;
    }

    void run() {
        call_exports();
        const std::size_t instances = 1 + in_.byte() % 3;
        for (std::size_t i = 0; i < instances; ++i) {
            subjects_.emplace_back();
            create(subjects_.back(), static_cast<int>(i));
        }
        for (std::size_t n = 0; n < kMaxEvents && !in_.exhausted(); ++n) {
            event_number_ = n;
            one_event();
        }
        event_number_ = kMaxEvents;
        for (Subject& s : subjects_) {
            for (int c = 0; c < 3; ++c) {
                compare_tree(s, c);
                check_invariants(s, c);
            }
            sweep(s);
        }
        for (Subject& s : subjects_) {
            begin(s, {.name = "DestroyRunObject"});
            host_.destroy(*s.host);
        }
        // Every node, string, index and reader the instances had is freed.
        if (allocations_ != nullptr) {
            expect_equal(allocations_->live(), live_at_start_, "library allocations still live");
        }
    }

private:
    // -------------------------------------------------- bookkeeping

    // Every export once per input, with words the input chose: the stubs
    // give their fixed answers whatever they are given, and call nothing.
    void call_exports() {
        Library& library = host_.library();
        std::uint64_t state = in_.u32();
        const std::int32_t code = in_.small() % 10;
        for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
            std::array<word, 7> w{};
            for (word& x : w) {
                x = static_cast<word>(static_cast<std::int32_t>(Values::mix(state)));
            }
            word want = e.answer;
            if (std::string_view(e.name) == "GetInfos") {
                w[0] = code;
                want = 0;
                for (const auto& a : sorvel::test::kInfoAnswers) {
                    want = a.code == code ? a.answer : want;
                }
            } else if (std::string_view(e.name) == "GetRunObjectDataSize") {
                want = static_cast<word>(RecordLayout::kRunRecordSize);
            } else if (std::string_view(e.name) == "HandleRunObject") {
                want = 2;
            } else if (!e.stub) {
                continue;  // the rest take the host's records: the session calls them
            }
            if (sorvel::test::call_with(library, library.symbol(e.name), e.args, w) != want) {
                mismatch(std::string(e.name) + " does not give " + std::to_string(want));
            }
        }
        // Null records give the fixed answers and touch nothing.
        expect_equal(library.call_export("GetRunObjectInfos", {0, 0}), word{1}, "GetRunObjectInfos without a block");
        expect_equal(library.call_export("CreateRunObject", {0, 0, 0}), word{0}, "CreateRunObject without a record");
        expect_equal(library.call_export("DestroyRunObject", {0, 0}), word{0}, "DestroyRunObject without a record");
        expect_equal(host_.calls().size(), std::size_t{0}, "host calls made by exports");
    }

    void begin(const Subject& s, Described what) {
        what.number = event_number_;
        what.instance = s.number;
        what.case_word = s.model->case_word();
        what.index_word = s.model->index_word();
        Described& d = g_history[g_events++ % kHistory];
        d = std::move(what);
        if (g_trace) {
            std::fprintf(stderr, "%s\n", d.line().c_str());
        }
    }

    void create(Subject& s, int number) {
        const std::uint8_t options = in_.byte();
        const std::int32_t case_word = kOptionWords[options & 3];
        const std::int32_t index_word = kOptionWords[(options >> 2) & 3];
        const auto creation8 = static_cast<std::int32_t>(static_cast<std::int16_t>(in_.u16()));
        const auto creation12 = static_cast<std::int32_t>(static_cast<std::uint32_t>(options) * 0x91000193U);
        s.number = number;
        s.model = std::make_unique<fuzzmodel::Instance>(case_word, index_word);
        begin(s, {.name = "CreateRunObject"});
        s.host = &host_.create(case_word, index_word, creation8, creation12);
        Instance& h = *s.host;
        expect_equal(h.i32(RecordLayout::kCaseSensitive), case_word, "case-sensitive flag as stored");
        expect_equal(h.i32(RecordLayout::kUseIndices), index_word, "use-indices flag as stored");
        expect_equal(h.i32(RecordLayout::kCreationWordA), creation8, "creation word at byte 76");
        expect_equal(h.i32(RecordLayout::kCreationWordB), creation12, "creation word at byte 84");
        s.reader = h.pointer(RecordLayout::kReader);
        if (s.reader == 0) {
            mismatch("no ParamReader after CreateRunObject");
        }
        for (int c = 0; c < 3; ++c) {
            s.indexes[static_cast<std::size_t>(c)] = h.index(c);
            if ((h.index(c) != 0) != (index_word == 1)) {
                mismatch("index " + std::to_string(c) + " present: " + std::to_string(h.index(c) != 0) +
                         ", option word " + std::to_string(index_word));
            }
            expect_equal(h.count(c), 0, "count after creation");
            expect_equal(h.root(c), word{0}, "root after creation");
        }
        expect_equal(h.result_flags(), std::uint16_t{0}, "result flags after creation");
        host_.clear_calls();
        check_header(s);
    }

    // The library writes no header byte besides the two creation words and
    // the result flags, and keeps its own fields that never change.
    void check_header(const Subject& s) {
        // The stretches between the library's own fields, all still zero.
        static constexpr std::array<std::pair<std::size_t, std::size_t>, 5> kUntouched{
            {{0, RecordLayout::kHeaderPointer},
             {RecordLayout::kHeaderPointer + sizeof(word), RecordLayout::kCreationWordA},
             {RecordLayout::kCreationWordA + 4, RecordLayout::kCreationWordB},
             {RecordLayout::kCreationWordB + 4, RecordLayout::kResultFlags},
             {RecordLayout::kResultFlags + 2, RecordLayout::kReader}}};
        static constexpr std::array<unsigned char, RecordLayout::kReader> kZeros{};
        for (const auto& [from, to] : kUntouched) {
            if (std::memcmp(s.host->record() + from, kZeros.data(), to - from) != 0) {
                mismatch("a header byte from " + std::to_string(from) + " to " + std::to_string(to) + " was written");
            }
        }
        expect_equal(s.host->pointer(RecordLayout::kReader), s.reader, "ParamReader pointer");
        expect_equal(s.host->i32(RecordLayout::kCaseSensitive), s.model->case_word(), "case-sensitive flag");
        expect_equal(s.host->i32(RecordLayout::kUseIndices), s.model->index_word(), "use-indices flag");
        for (int c = 0; c < 3; ++c) {
            expect_equal(s.host->index(c), s.indexes[static_cast<std::size_t>(c)], "index pointer");
        }
    }

    void check_calls(const std::vector<ExpectedCall>& expected) {
        const std::vector<HostCall>& got = host_.calls();
        const auto listing = [&got] {
            std::string out;
            for (const HostCall& c : got) {
                out += std::string(" ") + routine_name(c.routine) + "(";
                for (std::size_t a = 0; a < c.args.size(); ++a) {
                    out += (a == 0 ? "" : ",") + std::to_string(c.args[a]);
                }
                out += ")";
            }
            return out;
        };
        if (got.size() != expected.size()) {
            mismatch("host calls: " + std::to_string(got.size()) + " made, " + std::to_string(expected.size()) +
                     " expected; made:" + listing());
        }
        for (std::size_t i = 0; i < got.size(); ++i) {
            if (got[i].routine != expected[i].routine || got[i].args.size() != expected[i].count()) {
                mismatch("host call " + std::to_string(i) + " is " + routine_name(got[i].routine) + ", expected " +
                         routine_name(expected[i].routine) + "; made:" + listing());
            }
            for (std::size_t a = 0; a < got[i].args.size(); ++a) {
                if (expected[i].args[a] && *expected[i].args[a] != got[i].args[a]) {
                    mismatch(std::string("argument ") + std::to_string(a) + " of " + routine_name(got[i].routine) +
                             ": " + std::to_string(got[i].args[a]) + ", expected " +
                             std::to_string(*expected[i].args[a]) + "; made:" + listing());
                }
            }
        }
        expect_equal(host_.unconsumed_params(), std::size_t{0}, "parameters left unread");
        expect_equal(host_.missing_params(), std::size_t{0}, "parameters read beyond those given");
        expect_equal(host_.open_handles(), std::size_t{0}, "files left open");
        expect_equal(host_.bad_closes(), std::size_t{0}, "closes of handles not open");
    }

    // Sets the stage for one handler call: result flags with a pattern that
    // must survive, the calls list cleared, the generator scripted.
    std::uint16_t prepare(Subject& s, std::vector<int> script) {
        // Any bits, the two result bits included: none may be cleared.
        const auto flags = static_cast<std::uint16_t>((++handler_calls_ * 0x9E37U + 0x1234U) & 0xFFFFU);
        s.host->set_result_flags(flags);
        host_.clear_calls();
        if (draws::scriptable()) {
            draws::script(std::move(script));
        } else if (script.empty()) {
            draws::reseed(0, 0);  // counting starts here
        }
        return flags;
    }

    void finish(Subject& s, std::uint16_t flags_before, std::uint16_t flags_added, std::size_t draws_used,
                int touched) {
        expect_equal(s.host->result_flags(), static_cast<std::uint16_t>(flags_before | flags_added), "result flags");
        expect_equal(draws::made(), draws_used, "draws made");
        for (int c = 0; c < 3; ++c) {
            static constexpr std::array<const char*, 3> kCounts = {"integer count", "float count", "string count"};
            expect_equal(s.host->count(c), count_of(*s.model, c), kCounts[static_cast<std::size_t>(c)]);
        }
        check_header(s);
        // Whole trees are compared on a schedule (and at the end of every
        // input): results, counts, calls and draws already show most faults
        // at once, and a walk per event would cost more than the event.
        if (touched >= 0 && event_number_ % kTreeEvery == 0) {
            compare_tree(s, touched);
        }
        // The side structure and the index after every change of a small
        // collection, and every few changes of a larger one: a broken
        // invariant shows within a few events, at a bounded cost per event.
        if (touched >= 0 && (count_of(*s.model, touched) <= kInspectSmall || ++changes_ % kInspectEvery == 0)) {
            check_invariants(s, touched);
        }
    }

    void check_invariants(Subject& s, int collection) {
        if (!inspect_) {
            return;
        }
        const std::string fault =
            sorvel::test::check_collection(*reinterpret_cast<const sorvel::RunRecord*>(s.host->record()), collection);
        if (!fault.empty()) {
            mismatch("invariant broken: " + fault);
        }
    }

    static std::int32_t count_of(const fuzzmodel::Instance& m, int c) {
        switch (c) {
            case kIntegers: return m.integers_size();
            case kFloats: return m.floats_size();
            default: return m.strings_size();
        }
    }

    // Walks both trees side by side. Gives the model's node at which they
    // first differ (kNone: at a missing one), or nothing when they agree.
    template <class V, class Same>
    static std::optional<int> difference(word root, const fuzzmodel::Collection<V>& c, Same same) {
        std::vector<std::pair<word, int>> pending{{root, c.root}};
        while (!pending.empty()) {
            const auto [lib, mod] = pending.back();
            pending.pop_back();
            if ((lib == 0) != (mod == fuzzmodel::kNone) || (lib != 0 && !same(NodeView{lib}, c.at(mod).value))) {
                return mod;
            }
            if (lib != 0) {
                pending.emplace_back(NodeView{lib}.left().address, c.at(mod).left);
                pending.emplace_back(NodeView{lib}.right().address, c.at(mod).right);
            }
        }
        return std::nullopt;
    }

    static std::optional<int> difference(word root, const fuzzmodel::Collection<std::string>& c) {
        return difference(root, c, [](NodeView n, const std::string& v) { return n.string() == v; });
    }

    void compare_tree(Subject& s, int collection) {
        const fuzzmodel::Instance& m = *s.model;
        const word root = s.host->root(collection);
        const std::optional<int> at =
            collection == kIntegers
                ? difference(root, m.integers(), [](NodeView n, std::int32_t v) { return n.integer() == v; })
            : collection == kFloats
                ? difference(root, m.floats(),
                             [](NodeView n, float v) {
                                 return std::bit_cast<std::uint32_t>(n.floating()) == std::bit_cast<std::uint32_t>(v);
                             })
                : difference(root, m.strings());
        if (at) {
            mismatch("collection " + std::to_string(collection) + ": the trees differ at model node " +
                     std::to_string(*at) + " (" + std::to_string(count_of(m, collection)) + " nodes)");
        }
    }

    // -------------------------------------------------- handlers

    ExpectedCall event_param(const Subject& s, word selector) {
        return {Routine::read_event_param, {s.host->address(), selector, word{0}}};
    }

    ExpectedCall expr_param(const Subject& s, word type, std::int32_t param_word) {
        // Only the low 16 bits of the parameter word reach the host, sign-extended.
        const auto arrives =
            static_cast<word>(static_cast<std::int16_t>(static_cast<std::uint16_t>(param_word & 0xFFFF)));
        return {Routine::read_first_expr_param, {s.host->address(), type, arrives}};
    }

    ExpectedCall result_space(const Subject& s, const std::string& text) {
        return {Routine::alloc_result_string, {s.host->address(), word{0}, static_cast<word>(text.size() + 1)}};
    }

    void condition(Subject& s, std::size_t number) {
        bool want = false;
        Param p;
        ExpectedCall call;
        Described what;
        switch (number) {
            case 0: {
                const std::int32_t v = values_.integer();
                want = s.model->contains_integer(v);
                p = Param::of(v);
                call = event_param(s, 0);
                what = {.name = "Contains Integer", .integer = v};
                break;
            }
            case 1: {
                const std::uint32_t bits = values_.float_bits();
                want = s.model->contains_float(std::bit_cast<float>(bits));
                p = float_param(bits);
                call = event_param(s, 2);
                what = {.name = "Contains Float", .bits = bits};
                break;
            }
            default: {
                const Text t = values_.text();
                want = s.model->contains_string(t);
                p = text_param(t);
                call = event_param(s, -1);
                what = {.name = "Contains String", .text = t};
                break;
            }
        }
        begin(s, std::move(what));
        const std::uint16_t flags = prepare(s, {});
        params_.assign(1, p);
        const word got = host_.condition(*s.host, number, params_);
        expect_equal(got, static_cast<word>(want ? 1 : 0), "condition result");
        calls_.assign(1, call);
        check_calls(calls_);
        finish(s, flags, 0, 0, -1);
    }

    // `failing_allocation`: for an add, the library's allocation (counted
    // from 0 within the event) that is made to fail, or -1. `given`: the
    // value of an add or remove, instead of one taken from the input.
    void action(Subject& s, std::size_t number, long failing_allocation = -1, const Operand* given = nullptr) {
        if (allocations_ == nullptr) {
            failing_allocation = -1;
        }
        std::optional<fuzzmodel::Instance> before;
        if (failing_allocation >= 0) {
            before.emplace(*s.model);
        }
        std::vector<Param>& params = params_;
        std::vector<ExpectedCall>& calls = calls_;
        params.clear();
        calls.clear();
        std::vector<int> script;
        Described what;
        int touched = kIntegers;
        fuzzmodel::Draws model_draws({});
        std::optional<bool> opens;  // for Load From File: whether the file opens
        struct LoadArguments {
            std::optional<std::string> contents;
            std::int32_t balance;
            std::size_t lines;
        };
        std::optional<LoadArguments> load;
        static constexpr std::array<const char*, 9> kNames = {"Add Integer", "Remove Integer", "Clear Integers",
                                                              "Add Float",   "Remove Float",   "Clear Floats",
                                                              "Add String",  "Remove String",  "Clear Strings"};
        touched = number < 9 ? static_cast<int>(number / 3) : kStrings;
        const bool adds = number % 3 == 0;
        switch (number) {
            case 2:
            case 5:
            case 8: s.model->clear(touched); break;
            case 0:
            case 1: {
                const std::int32_t v = given != nullptr ? given->integer : values_.integer();
                adds ? s.model->add_integer(v) : s.model->remove_integer(v);
                params = {Param::of(v)};
                calls = {event_param(s, 0)};
                what.integer = v;
                break;
            }
            case 3:
            case 4: {
                const std::uint32_t bits = given != nullptr ? given->bits : values_.float_bits();
                adds ? s.model->add_float(std::bit_cast<float>(bits))
                     : s.model->remove_float(std::bit_cast<float>(bits));
                params = {float_param(bits)};
                calls = {event_param(s, 2)};
                what.bits = bits;
                break;
            }
            case 6:
            case 7: {
                const Text t = given != nullptr ? given->text : values_.text();
                adds ? s.model->add_string(t) : s.model->remove_string(t);
                params = {text_param(t)};
                calls = {event_param(s, -1)};
                what.text = t;
                break;
            }
            default: {
                const std::uint8_t which = in_.byte() % 8;
                std::optional<std::string> contents;
                Text name;
                if (which < 6) {
                    contents = values_.file();
                    write_file(*contents);
                    name = file_path();
                    opens = true;
                } else if (which == 6) {
                    name = missing_path();
                    opens = false;
                }
                const std::int32_t balance = values_.balance();
                const std::size_t lines = contents ? fuzzmodel::split_lines(*contents).size() : 0;
                script = values_.draws(balance != 0 ? lines : 0);
                model_draws = fuzzmodel::Draws(script);
                s.model->load(contents, balance, model_draws);
                if (lines > kMaxFailingLoadLines) {
                    failing_allocation = -1;  // each outcome is a model run: keep them few
                    before.reset();
                }
                load = LoadArguments{contents, balance, lines};
                what = {.name = "Load From File",
                        .integer = balance,
                        .text = contents ? Text(contents->substr(0, 96)) : name,
                        .detail = contents ? "(" + std::to_string(contents->size()) + " bytes, " +
                                                 std::to_string(lines) + " lines)"
                                           : ""};
                params = {text_param(name), Param::of(balance)};
                calls = {event_param(s, -1), event_param(s, 0)};
                if (name) {
                    calls.push_back({Routine::open_file, {std::nullopt, std::nullopt, word{0}}});
                    if (*opens) {
                        calls.push_back({Routine::close_file, {std::nullopt}});
                    }
                }
                break;
            }
        }
        what.name = number < 9 ? kNames[number] : what.name;
        what.failing = failing_allocation;
        begin(s, std::move(what));
        const std::uint16_t flags = prepare(s, script);
        if (failing_allocation >= 0) {
            allocations_->fail_after(failing_allocation);
        }
        const word got = host_.action(*s.host, number, params);
        if (failing_allocation >= 0) {
            allocations_->fail_after(-1);
        }
        expect_equal(got, word{0}, "action result");
        check_calls(calls);
        if (opens) {
            const std::vector<HostCall>& made = host_.calls();
            const word handle = made[2].result;
            if ((handle != -1) != *opens) {
                mismatch("HostOpenFile gave " + std::to_string(handle) + " for " +
                         (*opens ? "the file" : "a missing file"));
            }
            if (*opens && made[3].args[0] != handle) {
                mismatch("HostCloseFile got " + std::to_string(made[3].args[0]) + ", not the handle " +
                         std::to_string(handle));
            }
            // The name itself was the host's and is gone once the handler returned.
            if (made[2].args[0] != made[0].result) {
                mismatch("HostOpenFile got another pointer than the name the host gave");
            }
        }
        // After the checks of the calls: reading the index back makes calls of its own.
        std::size_t draws_used = model_draws.used();
        if (before && load) {
            draws_used =
                outcome_of_failing_load(s, *before, load->contents, load->balance, load->lines, script, draws_used);
        } else if (before && s.host->count(touched) == count_of(*before, touched)) {
            // The library promises all or nothing when memory runs out: an
            // add that did not happen must have left everything as it was.
            *s.model = *before;
        }
        finish(s, flags, 0, draws_used, touched);
    }

    // A load during which one allocation failed may, by the library's own
    // promise, end in one of these ways: as if nothing failed, as if the
    // load did nothing at all (the file buffer or the balanced bookkeeping
    // could not be had: nothing added, nothing drawn), or with exactly one
    // line's add left out and everything else done. The model takes the
    // outcome whose strings, shape and draws are the library's; none
    // matching is a mismatch. Gives the number of draws of that outcome.
    std::size_t outcome_of_failing_load(Subject& s, const fuzzmodel::Instance& before,
                                        const std::optional<std::string>& contents, std::int32_t balance,
                                        std::size_t lines, const std::vector<int>& script, std::size_t full_draws) {
        const std::size_t made = draws::made();
        // Tree and index both: two outcomes can differ in the order of
        // additions alone, which leaves the same tree when the lines do not
        // meet on their way down. The index is read once, when a tree matches.
        std::optional<std::vector<std::string>> index;
        const auto matches = [&](const fuzzmodel::Instance& m, std::size_t used) {
            if (used != made || m.strings_size() != s.host->count(kStrings) ||
                difference(s.host->root(kStrings), m.strings())) {
                return false;
            }
            if (!index) {
                index = library_index(s);
            }
            return *index == model_index(m);
        };
        if (matches(*s.model, full_draws)) {
            return full_draws;
        }
        if (matches(before, 0)) {
            *s.model = before;
            return 0;
        }
        for (std::size_t left_out = 0; left_out < lines; ++left_out) {
            fuzzmodel::Instance candidate = before;
            fuzzmodel::Draws d(script);
            candidate.load(contents, balance, d, left_out);
            if (matches(candidate, d.used())) {
                *s.model = std::move(candidate);
                return d.used();
            }
        }
        mismatch(
            "the strings after a load with a failing allocation match no outcome: neither the full load, "
            "nor none, nor one line left out (library drew " +
            std::to_string(made) + " times, holds " + std::to_string(s.host->count(kStrings)) + " strings)");
    }

    // The string index read back through StringElementAt$; the result flags
    // are put back as they were.
    std::vector<std::string> library_index(Subject& s) {
        std::vector<std::string> out;
        const std::uint16_t flags = s.host->result_flags();
        for (std::int32_t p = 0; s.indexes[kStrings] != 0 && p < s.host->count(kStrings); ++p) {
            out.push_back(Host::text_at(host_.expression(*s.host, 11, {Param::of(p)}, 0)));
        }
        s.host->set_result_flags(flags);
        host_.clear_calls();
        return out;
    }

    static std::vector<std::string> model_index(const fuzzmodel::Instance& m) {
        std::vector<std::string> out;
        for (const int slot : m.strings().index) {
            out.push_back(m.strings().at(slot).value);
        }
        return out;
    }

    // Runs an expression and checks everything about it; used both for the
    // input's expression events and for the sweeps over the indexes.
    void expression(Subject& s, std::size_t number, std::optional<std::int32_t> integer_param,
                    std::optional<std::uint32_t> float_param_bits, const std::optional<Text>& text_param_value,
                    std::int32_t param_word, const std::vector<int>& script) {
        const fuzzmodel::Instance& m = *s.model;
        fuzzmodel::Draws model_draws(script);
        std::vector<Param>& params = params_;
        std::vector<ExpectedCall>& calls = calls_;
        params.clear();
        calls.clear();
        if (integer_param) {
            params.push_back(Param::of(*integer_param));
            calls.push_back(expr_param(s, 0, param_word));
        } else if (float_param_bits) {
            params.push_back(float_param(*float_param_bits));
            calls.push_back(expr_param(s, 2, param_word));
        } else if (text_param_value) {
            params.push_back(text_param(*text_param_value));
            calls.push_back(expr_param(s, 1, param_word));
        }
        begin(s, {.name = kExpressionNames[number],
                  .integer = integer_param,
                  .bits = float_param_bits,
                  .text = text_param_value,
                  .param_word = param_word});

        enum class Result { integer, floating, text };
        Result kind = Result::integer;
        std::int32_t want_integer = 0;
        std::uint32_t want_float = 0;
        std::string want_text;
        switch (number) {
            case 0: want_integer = m.integers_size(); break;
            case 1: want_integer = m.integers_random(model_draws); break;
            case 2: want_integer = m.floats_size(); break;
            case 3:
                kind = Result::floating;
                want_float = std::bit_cast<std::uint32_t>(m.floats_random(model_draws));
                break;
            case 4: want_integer = m.strings_size(); break;
            case 5:
                kind = Result::text;
                want_text = m.strings_random(model_draws);
                break;
            case 6: want_integer = m.index_of_integer(*integer_param); break;
            case 7: want_integer = m.integer_at(*integer_param); break;
            case 8: want_integer = m.index_of_float(std::bit_cast<float>(*float_param_bits)); break;
            case 9:
                kind = Result::floating;
                want_float = std::bit_cast<std::uint32_t>(m.float_at(*integer_param));
                break;
            case 10: want_integer = m.index_of_string(*text_param_value); break;
            default:
                kind = Result::text;
                want_text = m.string_at(*integer_param);
                break;
        }
        // Now and then the host has no space for a string result.
        const bool no_buffer = kind == Result::text && param_word % 61 == 7;
        if (kind == Result::text) {
            calls.push_back(result_space(s, want_text));
        }
        host_.give_no_result_buffer(no_buffer);

        const std::uint16_t flags = prepare(s, script);
        const word got = host_.expression(*s.host, number, params, static_cast<word>(param_word));
        host_.give_no_result_buffer(false);
        check_calls(calls);
        const auto low = static_cast<std::uint32_t>(static_cast<std::uintptr_t>(got));
        switch (kind) {
            case Result::integer:
                expect_equal(static_cast<std::int32_t>(low), want_integer, "integer result");
                finish(s, flags, 0, model_draws.used(), -1);
                break;
            case Result::floating:
                if (low != want_float) {
                    mismatch("float result: library " + show_float(low) + ", model " + show_float(want_float));
                }
                finish(s, flags, kFloatFlag, model_draws.used(), -1);
                break;
            case Result::text:
                // A host that gave no buffer gets an empty string of the library's own.
                if (got == 0 || (got != host_.calls().back().result) != no_buffer) {
                    mismatch("string result is not the buffer the host gave");
                }
                want_text = no_buffer ? std::string() : want_text;
                if (const std::string text = Host::text_at(got); text != want_text) {
                    mismatch("string result: library " + show(text) + ", model " + show(want_text));
                }
                finish(s, flags, kStringFlag, model_draws.used(), -1);
                break;
        }
    }

    void expression_event(Subject& s, std::size_t number) {
        const std::int32_t word_value = values_.param_word();
        std::vector<int> script;
        std::optional<std::int32_t> integer_param;
        std::optional<std::uint32_t> float_bits;
        std::optional<Text> text;
        switch (number) {
            case 1: script = values_.draws(s.model->height(kIntegers) + 1); break;
            case 3: script = values_.draws(s.model->height(kFloats) + 1); break;
            case 5: script = values_.draws(s.model->height(kStrings) + 1); break;
            case 6: integer_param = values_.integer(); break;
            case 7: integer_param = values_.position(s.model->integers_size()); break;
            case 8: float_bits = values_.float_bits(); break;
            case 9: integer_param = values_.position(s.model->floats_size()); break;
            case 10: text = values_.text(); break;
            case 11: integer_param = values_.position(s.model->strings_size()); break;
            default: break;
        }
        expression(s, number, integer_param, float_bits, text, word_value, script);
        if (number == 7 || number == 9 || number == 11) {
            remember_read(s, static_cast<int>(number - 7) / 2, *integer_param);
        }
    }

    // The value a collection holds at a position, as the model has it.
    static std::optional<Operand> held_at(const fuzzmodel::Instance& m, int c, std::int32_t p) {
        if (p < 0 || p >= count_of(m, c)) {
            return std::nullopt;
        }
        Operand v;
        switch (c) {
            case kIntegers: v.integer = m.integer_at(p); break;
            case kFloats: v.bits = std::bit_cast<std::uint32_t>(m.float_at(p)); break;
            default: v.text = m.string_at(p); break;
        }
        return v;
    }

    // After a read by position: what it gave joins the values later events pick.
    std::optional<Operand> remember_read(const Subject& s, int c, std::int32_t p) {
        std::optional<Operand> v = held_at(*s.model, c, p);
        if (v) {
            values_.read_at(p);
            if (c == kIntegers) {
                values_.met(v->integer);
            } else if (c == kFloats) {
                values_.met(std::bit_cast<float>(v->bits));
            } else {
                values_.met(*v->text);
            }
        }
        return v;
    }

    std::optional<Operand> read(Subject& s, int c, std::int32_t p) {
        expression(s, 7 + 2 * static_cast<std::size_t>(c), p, std::nullopt, std::nullopt, p, {});
        return remember_read(s, c, p);
    }

    void index_of(Subject& s, int c, const Operand& v) {
        expression(s, 6 + 2 * static_cast<std::size_t>(c), c == kIntegers ? std::optional(v.integer) : std::nullopt,
                   c == kFloats ? std::optional(v.bits) : std::nullopt,
                   c == kStrings ? std::optional<Text>(v.text) : std::nullopt, 0, {});
    }

    // A walk through the positions of one collection, interleaved with
    // IndexOf and with removals and re-adds of the values it reads, and with
    // reads around the positions they touched: the index keeps state from
    // one query to the next that only such runs reach.
    void walk(Subject& s) {
        const std::uint8_t head = in_.byte();
        const int c = head % 3;
        const auto count = [&] { return count_of(*s.model, c); };
        std::int32_t p = static_cast<std::int32_t>(in_.byte() % (static_cast<unsigned>(count()) + 2U)) - 1;
        std::optional<Operand> last;     // read last
        std::optional<Operand> removed;  // removed last
        const std::size_t steps = 3 + (head >> 2) % 14;
        for (std::size_t i = 0; i < steps; ++i) {
            const std::uint8_t op = in_.byte();
            const long failing = (op >> 3) % 4 == 3 ? (op >> 5) % 3 : -1;
            switch (op % 8) {
                case 0:
                case 1:
                case 2:  // onwards
                    if (std::optional<Operand> v = read(s, c, p++)) {
                        last = std::move(v);
                    }
                    break;
                case 3:  // back, or around
                    p += (op >> 3) % 5 - 2;
                    if (std::optional<Operand> v = read(s, c, p)) {
                        last = std::move(v);
                    }
                    break;
                case 4:
                    if (last || removed) {
                        index_of(s, c, last && (op & 8) == 0 ? *last : removed ? *removed : *last);
                    }
                    break;
                case 5:  // the value just read
                    if (last) {
                        action(s, 3 * static_cast<std::size_t>(c) + 1, -1, &*last);
                        removed = std::move(last);
                        last.reset();
                        p -= (op >> 3) & 1;
                    }
                    break;
                case 6:  // back in, at the end; or a duplicate
                    if (removed || last) {
                        action(s, 3 * static_cast<std::size_t>(c), failing, removed ? &*removed : &*last);
                    }
                    break;
                default:  // the value at the position, unread
                    if (std::optional<Operand> v = held_at(*s.model, c, p)) {
                        action(s, 3 * static_cast<std::size_t>(c) + 1, -1, &*v);
                        removed = std::move(v);
                    }
                    break;
            }
            p = std::clamp(p, std::int32_t{-1}, count());
        }
    }

    // The positions of each index, one before and one past each end, and
    // the position of each held value, all through the expressions. Large
    // collections are sampled with a stride (whose phase moves from sweep to
    // sweep), so a sweep costs a few hundred handler calls at most.
    void sweep(Subject& s) {
        const fuzzmodel::Instance& m = *s.model;
        ++sweeps_;
        const auto positions = [this](std::int32_t count, const auto& at) {
            const std::size_t n = static_cast<std::size_t>(count);
            const std::size_t step = n <= kSweepFull ? 1 : (n + kSweepFull - 1) / kSweepFull;
            at(-1);
            for (std::size_t p = step == 1 ? 0 : sweeps_ % step; p < n; p += step) {
                at(static_cast<std::int32_t>(p));
            }
            if (n > 0) {
                at(count - 1);
            }
            at(count);
        };
        positions(m.integers_size(), [&](std::int32_t p) { expression(s, 7, p, std::nullopt, std::nullopt, p, {}); });
        positions(m.floats_size(), [&](std::int32_t p) { expression(s, 9, p, std::nullopt, std::nullopt, p, {}); });
        positions(m.strings_size(), [&](std::int32_t p) { expression(s, 11, p, std::nullopt, std::nullopt, p, {}); });
        const auto held = [this](std::size_t n, const auto& at) {
            const std::size_t step = n <= kSweepFull ? 1 : (n + kSweepFull - 1) / kSweepFull;
            for (std::size_t i = step == 1 ? 0 : sweeps_ % step; i < n; i += step) {
                at(i);
            }
        };
        held(m.integers().index.size(), [&](std::size_t i) {
            expression(s, 6, m.integers().at(m.integers().index[i]).value, std::nullopt, std::nullopt, 0, {});
        });
        held(m.floats().index.size(), [&](std::size_t i) {
            const float v = m.floats().at(m.floats().index[i]).value;
            expression(s, 8, std::nullopt, std::bit_cast<std::uint32_t>(v), std::nullopt, 0, {});
        });
        held(m.strings().index.size(), [&](std::size_t i) {
            expression(s, 10, std::nullopt, std::nullopt, Text(m.strings().at(m.strings().index[i]).value), 0, {});
        });
    }

    void one_event() {
        const std::uint8_t op = in_.byte();
        Subject& s = subjects_[(op >> 5) % subjects_.size()];
        const unsigned kind = op & 31U;
        if (kind < 3) {
            condition(s, kind);
        } else if (kind < 13) {
            action(s, kind - 3);
        } else if (kind < 25) {
            expression_event(s, kind - 13);
        } else if (kind == 25 && sweeps_ < kMaxSweeps) {
            sweep(s);
        } else if (kind == 26) {
            for (int c = 0; c < 3; ++c) {
                compare_tree(s, c);
            }
            begin(s, {.name = "DestroyRunObject, then a new instance in its place"});
            host_.destroy(*s.host);
            create(s, s.number);
        } else if (kind == 27) {
            walk(s);
        } else if (kind == 25) {
            for (Subject& each : subjects_) {
                for (int c = 0; c < 3; ++c) {
                    compare_tree(each, c);
                }
            }
        } else if (kind < 31) {
            // More adds than anything else, so that trees grow.
            static constexpr std::array<std::size_t, 3> kAdds = {0, 6, 3};
            action(s, kAdds[kind - 28]);
        } else {
            // An add or a load during which one allocation fails.
            const std::uint8_t b = in_.byte();
            if (b % 4 == 3) {
                // Half the time one of the first three allocations: the file
                // buffer, the balanced bookkeeping, the first line's node.
                action(s, 9, (b & 4) != 0 ? (b >> 3) % 3 : (b >> 3) % 32);
            } else {
                static constexpr std::array<std::size_t, 3> kAdds = {0, 3, 6};
                action(s, kAdds[b % 4], (b >> 2) % 3);
            }
        }
    }

    static constexpr std::array<const char*, 12> kExpressionNames = {
        "IntegersSize(",          "IntegersRandomElement(", "FloatsSize(",
        "FloatsRandomElement(",   "StringsSize(",           "StringsRandomElement$(",
        "IndexOfIntegerElement(", "IntegerElementAt(",      "IndexOfFloatElement(",
        "FloatElementAt(",        "IndexOfStringElement(",  "StringElementAt$("};

    Input& in_;
    Values values_;
    Host host_;
    std::vector<Subject> subjects_;
    std::size_t event_number_ = 0;
    std::size_t handler_calls_ = 0;
    const Library::Allocations* allocations_;  // null: no failure can be injected
    // Reused from call to call, so that an event allocates nothing of its own.
    std::vector<Param> params_;
    std::vector<ExpectedCall> calls_;
    std::size_t live_at_start_ = 0;
    std::size_t sweeps_ = 0;
    bool inspect_;             // the side structures can be checked
    std::size_t changes_ = 0;  // of collections past kInspectSmall
};

}  // namespace

namespace {
const std::shared_ptr<Library>& linked_in() {
    static const std::shared_ptr<Library> library = Library::linked_in();
    return library;
}
}  // namespace

std::shared_ptr<Library>& fuzzdriver::library() {
    static std::shared_ptr<Library> chosen = linked_in();
    return chosen;
}

bool fuzzdriver::inspectable() {
    return library() == linked_in();
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    g_events = 0;
    Input in(data, size);
    {
        Session session(in);
        session.run();
    }
    // Nothing of this input may stay allocated, or libFuzzer runs it again
    // to look for a leak.
    for (Described& d : g_history) {
        d = {};
    }
    return 0;
}
