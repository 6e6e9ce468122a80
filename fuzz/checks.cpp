// What every event is checked against: the exports' fixed answers, the
// record after creation and its header bytes, the host calls the library
// made, result flags, draws and counts after every handler call, the trees
// against the model's, and the invariants of the side structures.
#include <array>
#include <cstring>
#include <string_view>
#include <utility>

#include "draws.hpp"
#include "exports_table.hpp"
#include "invariants.hpp"
#include "session.hpp"
#include "support.hpp"

namespace fuzzdriver {
namespace {

namespace draws = sorvel::test::draws;
using sorvel::simulated::HostCall;
using sorvel::simulated::Library;
using sorvel::simulated::NodeView;
using sorvel::simulated::RecordLayout;
using Routine = HostCall::Routine;

constexpr std::size_t kTreeEvery = 32;      // events between whole-tree comparisons
constexpr std::int32_t kInspectSmall = 64;  // collections checked after every change
constexpr std::size_t kInspectEvery = 8;    // changes between checks of larger ones

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

// Walks both trees side by side. Gives the model's node at which they
// first differ (kNone: at a missing one), or nothing when they agree.
template <class V, class Same>
std::optional<int> difference(word root, const sorvel::test::model::Collection<V>& c, Same same) {
    std::vector<std::pair<word, int>> pending{{root, c.root}};
    while (!pending.empty()) {
        const auto [lib, mod] = pending.back();
        pending.pop_back();
        if ((lib == 0) != (mod == sorvel::test::model::kNone) || (lib != 0 && !same(NodeView{lib}, c.at(mod).value))) {
            return mod;
        }
        if (lib != 0) {
            pending.emplace_back(NodeView{lib}.left().address, c.at(mod).left);
            pending.emplace_back(NodeView{lib}.right().address, c.at(mod).right);
        }
    }
    return std::nullopt;
}

}  // namespace

std::optional<int> tree_difference(word root, const sorvel::test::model::Collection<std::string>& c) {
    return difference(root, c, [](NodeView n, const std::string& v) { return n.string() == v; });
}

// Every export once per input, with words the input chose: the stubs
// give their fixed answers whatever they are given, and call nothing.
// Every export once per input, with words the input chose: the stubs
// give their fixed answers whatever they are given, and call nothing.
void Session::call_exports() {
    Library& library = host_.library();
    std::uint64_t state = decoder_.export_seed();
    const std::int32_t code = decoder_.info_code();
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        std::array<word, 7> w{};
        for (word& x : w) {
            x = static_cast<word>(static_cast<std::int32_t>(Values::mix(state)));
        }
        word want = e.answer;
        if (std::string_view(e.name) == "GetInfos") {
            w[0] = code;
            want = 0;
            for (const auto& a : sorvel::test::expected::kInfos) {
                want = a.code == code ? a.answer : want;
            }
        } else if (std::string_view(e.name) == "GetRunObjectDataSize") {
            want = static_cast<word>(RecordLayout::kRunRecordSize);
        } else if (std::string_view(e.name) == "HandleRunObject") {
            want = sorvel::test::expected::kHandleRunObject;
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

// What CreateRunObject must have left in the record.
void Session::check_created(Subject& s, const Options& o) {
    sorvel::simulated::Instance& h = *s.host;
    expect_equal(h.i32(RecordLayout::kCaseSensitive), o.case_word, "case-sensitive flag as stored");
    expect_equal(h.i32(RecordLayout::kUseIndices), o.index_word, "use-indices flag as stored");
    expect_equal(h.i32(RecordLayout::kCreationWordA), o.creation8, "creation word at byte 76");
    expect_equal(h.i32(RecordLayout::kCreationWordB), o.creation12, "creation word at byte 84");
    s.reader = h.pointer(RecordLayout::kReader);
    if (s.reader == 0) {
        mismatch("no ParamReader after CreateRunObject");
    }
    for (const Set set : sorvel::simulated::kSets) {
        const auto c = static_cast<std::size_t>(set);
        s.indexes[c] = h.index(set);
        if ((h.index(set) != 0) != (o.index_word == 1)) {
            mismatch("index " + std::to_string(c) + " present: " + std::to_string(h.index(set) != 0) +
                     ", option word " + std::to_string(o.index_word));
        }
        expect_equal(h.count(set), 0, "count after creation");
        expect_equal(h.root(set), word{0}, "root after creation");
    }
    expect_equal(h.result_flags(), std::uint16_t{0}, "result flags after creation");
    host_.clear_calls();
    check_header(s);
}

// The library writes no header byte besides the two creation words and
// the result flags, and keeps its own fields that never change.
void Session::check_header(const Subject& s) {
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
    for (const Set set : sorvel::simulated::kSets) {
        expect_equal(s.host->index(set), s.indexes[static_cast<std::size_t>(set)], "index pointer");
    }
}

void Session::check_calls(const std::vector<ExpectedCall>& expected) {
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
                mismatch(std::string("argument ") + std::to_string(a) + " of " + routine_name(got[i].routine) + ": " +
                         std::to_string(got[i].args[a]) + ", expected " + std::to_string(*expected[i].args[a]) +
                         "; made:" + listing());
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
std::uint16_t Session::prepare(Subject& s, std::vector<int> script) {
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

void Session::finish(Subject& s, std::uint16_t flags_before, std::uint16_t flags_added, std::size_t draws_used,
                     std::optional<Set> touched) {
    expect_equal(s.host->result_flags(), static_cast<std::uint16_t>(flags_before | flags_added), "result flags");
    expect_equal(draws::made(), draws_used, "draws made");
    for (const Set set : sorvel::simulated::kSets) {
        static constexpr std::array<const char*, 3> kCounts = {"integer count", "float count", "string count"};
        expect_equal(s.host->count(set), count_of(*s.model, set), kCounts[static_cast<std::size_t>(set)]);
    }
    check_header(s);
    // Whole trees are compared on a schedule (and at the end of every
    // input): results, counts, calls and draws already show most faults
    // at once, and a walk per event would cost more than the event.
    if (touched && event_number_ % kTreeEvery == 0) {
        compare_tree(s, *touched);
    }
    // The side structure and the index after every change of a small
    // collection, and every few changes of a larger one: a broken
    // invariant shows within a few events, at a bounded cost per event.
    if (touched && (count_of(*s.model, *touched) <= kInspectSmall || ++changes_ % kInspectEvery == 0)) {
        check_invariants(s, *touched);
    }
}

void Session::compare_tree(Subject& s, Set set) {
    const sorvel::test::model::Instance& m = *s.model;
    const word root = s.host->root(set);
    const std::optional<int> at =
        set == Set::integers
            ? difference(root, m.integers(), [](NodeView n, std::int32_t v) { return n.integer() == v; })
        : set == Set::floats
            ? difference(root, m.floats(),
                         [](NodeView n, float v) {
                             return std::bit_cast<std::uint32_t>(n.floating()) == std::bit_cast<std::uint32_t>(v);
                         })
            : tree_difference(root, m.strings());
    if (at) {
        mismatch("collection " + std::to_string(static_cast<int>(set)) + ": the trees differ at model node " +
                 std::to_string(*at) + " (" + std::to_string(count_of(m, set)) + " nodes)");
    }
}

void Session::check_invariants(Subject& s, Set set) {
    if (!inspect_) {
        return;
    }
    const std::string fault =
        sorvel::test::check_collection(*reinterpret_cast<const sorvel::RunRecord*>(s.host->record()), set);
    if (!fault.empty()) {
        mismatch("invariant broken: " + fault);
    }
}

}  // namespace fuzzdriver
