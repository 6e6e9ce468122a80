// Decoding an input into events for one to three object instances.
//
// Input: five bytes of words for the exports; one byte for the number of
// instances, then per instance a byte of option words and two bytes of a
// creation word; then events, one byte each (low 5 bits the kind, high 3
// bits the instance) followed by the bytes their values take. Past its end
// the input reads as zeros.
//
// Kinds: 0 to 2 the conditions, 3 to 12 the actions and 13 to 24 the
// expressions, in the catalogue's order; 25 a sweep of the indexes (twice
// per input, then a comparison of every tree); 26 the instance destroyed and
// created anew; 27 a walk by position (below); 28 to 30 more adds, so that
// trees grow; 31 an add or a load during which one allocation fails.
//
// A walk reads one collection position by position, and between the reads
// asks IndexOf of the values read, removes them or a value at or just behind
// the position, adds them back (at the end of the insertion order), and
// steps back or around: the index keeps state from one query to the next
// that only such runs reach. Its steps are events of their own, decoded one
// at a time, as each depends on what the ones before it did.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "model.hpp"
#include "values.hpp"

namespace fuzzdriver {

using sorvel::simulated::Set;

std::int32_t count_of(const sorvel::test::model::Instance& m, Set set);

// The words of a new instance: its two options and the creation words.
struct Options {
    std::int32_t case_word = 0;
    std::int32_t index_word = 0;
    std::int32_t creation8 = 0;
    std::int32_t creation12 = 0;
};

struct Event {
    enum class Kind : std::uint8_t { condition, action, expression, sweep, compare, recreate };
    // Load From File: a file written with `contents`, one that cannot be
    // opened, or no name at all.
    enum class File : std::uint8_t { written, missing, none };

    Kind kind = Kind::condition;
    std::size_t instance = 0;
    std::size_t number = 0;               // within its kind, as the catalogue numbers it
    std::size_t ordinal = 0;              // in the input; a walk's steps share one
    std::optional<std::int32_t> integer;  // an integer parameter or a position
    std::optional<std::uint32_t> bits;    // a float parameter
    std::optional<Text> text;             // a string parameter
    std::int32_t param_word = 0;          // of an expression
    std::vector<int> draws;               // what the generator gives
    long failing = -1;                    // the allocation, from 0 in the event, made to fail
    File file = File::none;
    std::string contents;
    std::size_t lines = 0;
    std::int32_t balance = 0;
    Options options;  // of a recreated instance
};

class Decoder {
public:
    static constexpr std::size_t kMaxEvents = 256;

    Decoder(const std::uint8_t* data, std::size_t size) : in_(data, size), values_(in_) {}

    // The exports' arguments come from this seed; GetInfos gets the code.
    std::uint64_t export_seed() { return in_.u32(); }
    std::int32_t info_code() { return in_.small() % 10; }
    std::size_t instances() { return 1 + in_.byte() % 3U; }
    Options options();

    // The next event, decoded against the models of the instances as they
    // stand; false once the input or the budget of events is spent.
    bool next(const std::vector<const sorvel::test::model::Instance*>& models, Event& out);

private:
    // A value read by a walk: the field of its collection's kind counts.
    struct Held {
        std::int32_t integer = 0;
        std::uint32_t bits = 0;
        Text text;
    };
    struct Walk {
        std::size_t steps = 0;  // left
        std::size_t instance = 0;
        Set set = Set::integers;
        std::int32_t position = 0;
        std::optional<Held> last;     // read last
        std::optional<Held> removed;  // removed last
    };

    void condition(Event& out);
    void action(Event& out, std::size_t number, long failing);
    void expression(Event& out, const sorvel::test::model::Instance& m, std::size_t number);
    bool walk_step(const sorvel::test::model::Instance& m, Event& out);
    void read(const sorvel::test::model::Instance& m, Event& out, std::int32_t position);
    void with_value(Event& out, const Held& v) const;
    std::optional<Held> remember_read(const sorvel::test::model::Instance& m, Set set, std::int32_t position);
    static std::optional<Held> held_at(const sorvel::test::model::Instance& m, Set set, std::int32_t p);

    Input in_;
    Values values_;
    std::size_t events_ = 0;
    std::size_t sweeps_ = 0;
    Walk walk_;
};

}  // namespace fuzzdriver
