#include "session.hpp"

#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string_view>
#include <utility>

#include "draws.hpp"
#include "driver.hpp"
#include "host/catalogue.hpp"
#include "invariants.hpp"

namespace fuzzdriver {
namespace {

namespace catalogue = sorvel::catalogue;
namespace draws = sorvel::test::draws;
using sorvel::simulated::Host;
using sorvel::simulated::HostCall;
using sorvel::simulated::Param;
using Routine = HostCall::Routine;

constexpr std::size_t kSweepFull = 24;  // larger collections are sampled
constexpr std::size_t kMaxFailingLoadLines = 100;
constexpr std::uint16_t kFloatFlag = 0x4000;
constexpr std::uint16_t kStringFlag = 0x8000;

// The display string of an event, as the catalogue has it.
constexpr std::string_view display(catalogue::Kind kind, std::size_t number) {
    for (const catalogue::Event& e : catalogue::kEvents) {
        if (e.kind == kind && e.number == number) {
            return e.display;
        }
    }
    return "?";
}

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

Param float_param(std::uint32_t bits) {
    // The 32 bits exactly as the host gives a float, zero-extended.
    return Param::raw_word(static_cast<word>(static_cast<std::uintptr_t>(bits)));
}

Param text_param(const Text& t) {
    return t ? Param::of(*t) : Param::null();
}

ExpectedCall event_param(const Subject& s, word selector) {
    return {Routine::read_event_param, {s.host->address(), selector, word{0}}};
}

ExpectedCall expr_param(const Subject& s, word type, std::int32_t param_word) {
    // Only the low 16 bits of the parameter word reach the host, sign-extended.
    const auto arrives = static_cast<word>(static_cast<std::int16_t>(static_cast<std::uint16_t>(param_word & 0xFFFF)));
    return {Routine::read_first_expr_param, {s.host->address(), type, arrives}};
}

ExpectedCall result_space(const Subject& s, const std::string& text) {
    return {Routine::alloc_result_string, {s.host->address(), word{0}, static_cast<word>(text.size() + 1)}};
}

std::vector<std::string> model_index(const sorvel::test::model::Instance& m) {
    std::vector<std::string> out;
    for (const int slot : m.strings().index) {
        out.push_back(m.strings().at(slot).value);
    }
    return out;
}

}  // namespace

Session::Session(const std::uint8_t* data, std::size_t size)
    : decoder_(data, size), host_(library()), allocations_(host_.library().allocations()), inspect_(inspectable()) {
    live_at_start_ = allocations_ != nullptr ? allocations_->live() : 0;
}

void Session::run() {
    call_exports();
    const std::size_t instances = decoder_.instances();
    for (std::size_t i = 0; i < instances; ++i) {
        subjects_.emplace_back();
        create(subjects_.back(), static_cast<int>(i), decoder_.options());
    }
    const auto models = [this]() -> const std::vector<const sorvel::test::model::Instance*>& {
        models_.clear();
        for (const Subject& s : subjects_) {
            models_.push_back(s.model.get());
        }
        return models_;
    };
    while (decoder_.next(models(), event_)) {
        event_number_ = event_.ordinal;
        run_event(event_);
    }
    event_number_ = Decoder::kMaxEvents;
    for (Subject& s : subjects_) {
        for (const Set set : sorvel::simulated::kSets) {
            compare_tree(s, set);
            check_invariants(s, set);
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

void Session::begin(const Subject& s, Described what) const {
    what.number = event_number_;
    what.instance = s.number;
    what.case_word = s.model->case_word();
    what.index_word = s.model->index_word();
    record(std::move(what));
}

void Session::create(Subject& s, int number, const Options& o) {
    s.number = number;
    s.model = std::make_unique<sorvel::test::model::Instance>(o.case_word, o.index_word);
    begin(s, {.name = "CreateRunObject"});
    s.host = &host_.create(o.case_word, o.index_word, o.creation8, o.creation12);
    check_created(s, o);
}

void Session::run_event(const Event& e) {
    Subject& s = subjects_[e.instance];
    switch (e.kind) {
        case Event::Kind::condition: condition(s, e); break;
        case Event::Kind::action: action(s, e); break;
        case Event::Kind::expression: expression(s, e.number, e.integer, e.bits, e.text, e.param_word, e.draws); break;
        case Event::Kind::sweep: sweep(s); break;
        case Event::Kind::compare:
            for (Subject& each : subjects_) {
                for (const Set set : sorvel::simulated::kSets) {
                    compare_tree(each, set);
                }
            }
            break;
        case Event::Kind::recreate:
            for (const Set set : sorvel::simulated::kSets) {
                compare_tree(s, set);
            }
            begin(s, {.name = "DestroyRunObject, then a new instance in its place"});
            host_.destroy(*s.host);
            create(s, s.number, e.options);
            break;
    }
}

void Session::condition(Subject& s, const Event& e) {
    bool want = false;
    Param p;
    ExpectedCall call;
    switch (e.number) {
        case 0:
            want = s.model->contains_integer(*e.integer);
            p = Param::of(*e.integer);
            call = event_param(s, 0);
            break;
        case 1:
            want = s.model->contains_float(std::bit_cast<float>(*e.bits));
            p = float_param(*e.bits);
            call = event_param(s, 2);
            break;
        default:
            want = s.model->contains_string(*e.text);
            p = text_param(*e.text);
            call = event_param(s, -1);
            break;
    }
    begin(
        s,
        {.name = display(catalogue::Kind::condition, e.number), .integer = e.integer, .bits = e.bits, .text = e.text});
    const std::uint16_t flags = prepare(s, {});
    params_.assign(1, p);
    const word got = host_.condition(*s.host, e.number, params_);
    expect_equal(got, static_cast<word>(want ? 1 : 0), "condition result");
    calls_.assign(1, call);
    check_calls(calls_);
    finish(s, flags, 0, 0, std::nullopt);
}

void Session::action(Subject& s, const Event& e) {
    const std::size_t number = e.number;
    long failing = allocations_ == nullptr ? -1 : e.failing;
    if (number == 9 && e.lines > kMaxFailingLoadLines) {
        failing = -1;  // each outcome of a failing load is a model run: keep them few
    }
    std::optional<sorvel::test::model::Instance> before;
    if (failing >= 0) {
        before.emplace(*s.model);
    }
    std::vector<Param>& params = params_;
    std::vector<ExpectedCall>& calls = calls_;
    params.clear();
    calls.clear();
    Described what{.name = display(catalogue::Kind::action, number),
                   .integer = e.integer,
                   .bits = e.bits,
                   .text = e.text,
                   .failing = failing};
    const Set touched = number < 9 ? static_cast<Set>(number / 3) : Set::strings;
    const bool adds = number % 3 == 0;
    sorvel::test::model::Draws model_draws({});
    std::optional<bool> opens;  // for Load From File: whether the file opens
    switch (number) {
        case 2:
        case 5:
        case 8: s.model->clear(touched); break;
        case 0:
        case 1:
            adds ? s.model->add_integer(*e.integer) : s.model->remove_integer(*e.integer);
            params = {Param::of(*e.integer)};
            calls = {event_param(s, 0)};
            break;
        case 3:
        case 4: {
            const float v = std::bit_cast<float>(*e.bits);
            adds ? s.model->add_float(v) : s.model->remove_float(v);
            params = {float_param(*e.bits)};
            calls = {event_param(s, 2)};
            break;
        }
        case 6:
        case 7:
            adds ? s.model->add_string(*e.text) : s.model->remove_string(*e.text);
            params = {text_param(*e.text)};
            calls = {event_param(s, -1)};
            break;
        default: {
            Text name;
            if (e.file == Event::File::written) {
                write_file(e.contents);
                name = file_path();
                opens = true;
            } else if (e.file == Event::File::missing) {
                name = missing_path();
                opens = false;
            }
            model_draws = sorvel::test::model::Draws(e.draws);
            s.model->load(opens == true ? std::optional(e.contents) : std::nullopt, e.balance, model_draws);
            what.integer = e.balance;
            what.text = opens == true ? Text(e.contents.substr(0, 96)) : name;
            what.detail = opens == true ? "(" + std::to_string(e.contents.size()) + " bytes, " +
                                              std::to_string(e.lines) + " lines)"
                                        : "";
            params = {text_param(name), Param::of(e.balance)};
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
    begin(s, std::move(what));
    const std::uint16_t flags = prepare(s, e.draws);
    if (failing >= 0) {
        allocations_->fail_after(failing);
    }
    const word got = host_.action(*s.host, number, params);
    if (failing >= 0) {
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
    if (before && number == 9) {
        draws_used = outcome_of_failing_load(s, *before, e, draws_used);
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
std::size_t Session::outcome_of_failing_load(Subject& s, const sorvel::test::model::Instance& before, const Event& e,
                                             std::size_t full_draws) {
    const std::size_t made = draws::made();
    // Tree and index both: two outcomes can differ in the order of
    // additions alone, which leaves the same tree when the lines do not
    // meet on their way down. The index is read once, when a tree matches.
    std::optional<std::vector<std::string>> index;
    const auto matches = [&](const sorvel::test::model::Instance& m, std::size_t used) {
        if (used != made || m.strings_size() != s.host->count(Set::strings) ||
            tree_difference(s.host->root(Set::strings), m.strings())) {
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
    const std::optional<std::string> contents =
        e.file == Event::File::written ? std::optional(e.contents) : std::nullopt;
    // The line left out is about the failing allocation's number less the
    // buffers made before the first line: try there first, then outwards.
    const std::size_t guess = std::min(e.lines - 1, static_cast<std::size_t>(e.failing > 2 ? e.failing - 2 : 0));
    std::vector<std::size_t> order;
    for (std::size_t away = 0; order.size() < e.lines; ++away) {
        if (guess + away < e.lines) {
            order.push_back(guess + away);
        }
        if (away != 0 && away <= guess) {
            order.push_back(guess - away);
        }
    }
    for (const std::size_t left_out : order) {
        sorvel::test::model::Instance candidate = before;
        sorvel::test::model::Draws d(e.draws);
        candidate.load(contents, e.balance, d, left_out);
        if (matches(candidate, d.used())) {
            *s.model = std::move(candidate);
            return d.used();
        }
    }
    mismatch(
        "the strings after a load with a failing allocation match no outcome: neither the full load, "
        "nor none, nor one line left out (library drew " +
        std::to_string(made) + " times, holds " + std::to_string(s.host->count(Set::strings)) + " strings)");
}

// The string index read back: from its slots where the library is this
// program's own, else through StringElementAt$, with the result flags put
// back as they were.
std::vector<std::string> Session::library_index(Subject& s) {
    if (inspect_) {
        return sorvel::test::indexed_strings(*reinterpret_cast<const sorvel::RunRecord*>(s.host->record()));
    }
    std::vector<std::string> out;
    const std::uint16_t flags = s.host->result_flags();
    for (std::int32_t p = 0; s.indexes[static_cast<std::size_t>(Set::strings)] != 0 && p < s.host->count(Set::strings);
         ++p) {
        out.push_back(Host::text_at(host_.expression(*s.host, 11, {Param::of(p)}, 0)));
    }
    s.host->set_result_flags(flags);
    host_.clear_calls();
    return out;
}

// Runs an expression and checks everything about it; used both for the
// input's expression events and for the sweeps over the indexes.
void Session::expression(Subject& s, std::size_t number, std::optional<std::int32_t> integer_param,
                         std::optional<std::uint32_t> float_param_bits, const std::optional<Text>& text_param_value,
                         std::int32_t param_word, const std::vector<int>& script) {
    const sorvel::test::model::Instance& m = *s.model;
    sorvel::test::model::Draws model_draws(script);
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
    begin(s, {.name = display(catalogue::Kind::expression, number),
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
            finish(s, flags, 0, model_draws.used(), std::nullopt);
            break;
        case Result::floating:
            if (low != want_float) {
                mismatch("float result: library " + show_float(low) + ", model " + show_float(want_float));
            }
            finish(s, flags, kFloatFlag, model_draws.used(), std::nullopt);
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
            finish(s, flags, kStringFlag, model_draws.used(), std::nullopt);
            break;
    }
}

// The positions of each index, one before and one past each end, and
// the position of each held value, all through the expressions. Large
// collections are sampled with a stride (whose phase moves from sweep to
// sweep), so a sweep costs a few hundred handler calls at most.
void Session::sweep(Subject& s) {
    const sorvel::test::model::Instance& m = *s.model;
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

}  // namespace fuzzdriver
