// Expectations from the model: one input's events run through the library's
// real handler tables by way of the simulated host (the library linked in, so
// libFuzzer sees its coverage, or one the host loaded, for the replay), with
// every draw scripted where the generator can be scripted and learnt in
// advance where it cannot. After every event the library is held against
// the reference model in model.hpp: results, counts, result flags, host calls
// and their arguments, draws and the header bytes the library may not touch;
// tree shapes and the invariants of the side structures every few events,
// insertion order in sweeps, and all of these at the end of every input.
//
// session.cpp runs the events and predicts them with the model; checks.cpp
// holds what every event is checked against.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "decode.hpp"
#include "model.hpp"
#include "report.hpp"
#include "simulated_host.hpp"

namespace fuzzdriver {

using sorvel::simulated::word;

// One instance, in the library and in the model.
struct Subject {
    sorvel::simulated::Instance* host = nullptr;
    std::unique_ptr<sorvel::test::model::Instance> model;
    std::array<word, 3> indexes{};
    word reader = 0;
    int number = 0;
};

// What one host routine call must look like; an argument of nullopt is not
// checked (pointers the library takes from the host).
struct ExpectedCall {
    sorvel::simulated::HostCall::Routine routine;
    std::array<std::optional<word>, 3> args;
    std::size_t count() const { return routine == sorvel::simulated::HostCall::Routine::close_file ? 1 : 3; }
};

// Walks the library's string tree and the model's side by side: the model's
// node at which they first differ (sorvel::test::model::kNone: at a missing one), or
// nothing when they agree.
std::optional<int> tree_difference(word root, const sorvel::test::model::Collection<std::string>& c);

class Session {
public:
    Session(const std::uint8_t* data, std::size_t size);
    void run();

private:
    // session.cpp: the events.
    void create(Subject& s, int number, const Options& o);
    void run_event(const Event& e);
    void condition(Subject& s, const Event& e);
    void action(Subject& s, const Event& e);
    std::size_t outcome_of_failing_load(Subject& s, const sorvel::test::model::Instance& before, const Event& e,
                                        std::size_t full_draws);
    std::vector<std::string> library_index(Subject& s);
    void expression(Subject& s, std::size_t number, std::optional<std::int32_t> integer_param,
                    std::optional<std::uint32_t> float_param_bits, const std::optional<Text>& text_param_value,
                    std::int32_t param_word, const std::vector<int>& script);
    void sweep(Subject& s);
    void begin(const Subject& s, Described what) const;

    // checks.cpp: what every event is checked against.
    void call_exports();
    void check_created(Subject& s, const Options& o);
    void check_header(const Subject& s);
    void check_calls(const std::vector<ExpectedCall>& expected);
    std::uint16_t prepare(Subject& s, std::vector<int> script);
    void finish(Subject& s, std::uint16_t flags_before, std::uint16_t flags_added, std::size_t draws_used,
                std::optional<Set> touched);
    void compare_tree(Subject& s, Set set);
    void check_invariants(Subject& s, Set set);

    Decoder decoder_;
    sorvel::simulated::Host host_;
    std::vector<Subject> subjects_;
    std::vector<const sorvel::test::model::Instance*> models_;  // the subjects', for the decoder
    std::size_t event_number_ = 0;
    std::size_t handler_calls_ = 0;
    const sorvel::simulated::Library::Allocations* allocations_;  // null: no failure can be injected
    // Reused from call to call, so that an event allocates nothing of its own.
    std::vector<sorvel::simulated::Param> params_;
    std::vector<ExpectedCall> calls_;
    Event event_;
    std::size_t live_at_start_ = 0;
    std::size_t sweeps_ = 0;
    bool inspect_;             // the side structures can be checked
    std::size_t changes_ = 0;  // of collections past the small ones
};

}  // namespace fuzzdriver
