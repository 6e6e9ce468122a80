// Reporting a difference between the library and the model. The recent
// events are kept as values and put into words only when a difference is
// found: building texts for every event would cost more than running them.
// A difference ends the run with a description of the event, of what
// differed and of the events before it, and libFuzzer keeps the input.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "model.hpp"

namespace fuzzdriver {

using Text = sorvel::test::model::Instance::Text;

// One event as it ran.
struct Described {
    std::string_view name;                // the catalogue's display string, or a host call
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

// Keeps an event among the recent ones; SORVEL_FUZZ_TRACE=1 also prints it,
// to read an input back.
void record(Described what);
// Forgets the events of an input, once it has run.
void forget_events();

[[noreturn]] void mismatch(const std::string& what);

template <class T>
void expect_equal(const T& got, const T& want, const char* what) {
    if (!(got == want)) {
        mismatch(std::string(what) + ": library " + std::to_string(got) + ", model " + std::to_string(want));
    }
}

// Values as a report shows them: strings quoted with their odd bytes
// escaped, floats with their bits.
std::string show(const Text& text);
std::string show_float(std::uint32_t bits);

}  // namespace fuzzdriver
