// The values an input's bytes stand for: integers, float bits, strings,
// positions, parameter words, the bytes of text files and generator draws.
// Each kind mixes edge cases, values met before (so that later events hit
// them again: duplicates, removals of held values, case variants) and plain
// bytes from the input.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "model.hpp"
#include "simulated_host.hpp"

namespace fuzzdriver {

using Text = sorvel::test::model::Instance::Text;

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

// The last values met of one kind.
template <class T>
class Pool {
public:
    static constexpr std::size_t kSize = 48;
    void put(const T& v) {
        if (values_.size() < kSize) {
            values_.push_back(v);
        } else {
            values_[next_++ % kSize] = v;
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

    std::int32_t integer();
    // The 32 bits of a float, NaNs with any payload included.
    std::uint32_t float_bits();
    // A string parameter: nullopt stands for a null pointer from the host.
    Text text(bool allow_null = true);
    // A position for the value-at-position expressions.
    std::int32_t position(std::int32_t count);
    // The second argument of an expression handler: any 32-bit value.
    std::int32_t param_word();
    // The bytes of a text file.
    std::string file();
    std::int32_t balance();
    // At least `needed` values for the generator.
    std::vector<int> draws(std::size_t needed);

    // What a read by position gave: later positions gather around it, and
    // later values (removals, re-adds) pick it up from the pools.
    void read_at(std::int32_t position) { near_ = position; }
    void met(std::int32_t v) { ints_.put(v); }
    void met(float v) { floats_.put(std::bit_cast<std::uint32_t>(v)); }
    void met(const std::string& v) { strings_.put(v); }

    // splitmix64: a stream of well-mixed values from one seed.
    static std::uint64_t mix(std::uint64_t& state) {
        state += 0x9E3779B97F4A7C15ULL;
        std::uint64_t z = state;
        z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ULL;
        z = (z ^ (z >> 27)) * 0x94D049BB133111EBULL;
        return z ^ (z >> 31);
    }

private:
    std::string many_lines();

    // A budget of lines per input keeps an input of many big loads fast.
    static constexpr std::size_t kManyLinesPerInput = 2000;

    Input& in_;
    std::size_t many_lines_left_ = kManyLinesPerInput;
    Pool<std::int32_t> ints_;
    Pool<std::uint32_t> floats_;
    Pool<std::string> strings_;
    std::int32_t near_ = 0;
};

}  // namespace fuzzdriver
