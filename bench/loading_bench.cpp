// Loading a file's lines: plain and balanced order on a large file of
// distinct random lines, the balanced order taken by a literal list whose gap
// closes (the quadratic yardstick), and a sorted file that builds a chain.
//
// Every iteration starts from an empty collection kept without an index and
// a fresh copy of the file (lines are terminated in place); the copy and the
// freeing of the tree afterwards are outside the timed part.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <map>
#include <random>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"
#include "collections/random_path.hpp"
#include "loading/load_lines.hpp"

namespace {

// Distinct lines of 12 to 26 random letters, LF-terminated: about 20 bytes
// a line, 20 MB for a million. Made once per size.
const std::string& random_file(std::size_t lines) {
    static std::map<std::size_t, std::string> made;
    auto found = made.find(lines);
    if (found != made.end()) {
        return found->second;
    }
    std::mt19937_64 random(lines);
    std::unordered_set<std::string> seen;
    seen.reserve(lines);
    std::string file;
    file.reserve(lines * 20);
    std::string line;
    while (seen.size() < lines) {
        line.assign(12 + random() % 15, ' ');
        for (char& c : line) {
            c = static_cast<char>('a' + random() % 26);
        }
        if (seen.insert(line).second) {
            file += line;
            file += '\n';
        }
    }
    return made.emplace(lines, std::move(file)).first->second;
}

// Lines that ascend: a plain load hangs each one right of the last.
const std::string& sorted_file(std::size_t lines) {
    static std::map<std::size_t, std::string> made;
    auto found = made.find(lines);
    if (found != made.end()) {
        return found->second;
    }
    std::string file;
    char line[32];
    for (std::size_t i = 0; i < lines; ++i) {
        std::snprintf(line, sizeof line, "line%08zu\n", i);
        file += line;
    }
    return made.emplace(lines, std::move(file)).first->second;
}

// A fixed sequence of 15-bit draws, the same in every iteration: a linear
// congruential generator of the kind C runtimes use for rand.
struct ScriptedDraws {
    std::uint32_t state = 1;
    static int next(void* context) noexcept {
        auto* self = static_cast<ScriptedDraws*>(context);
        self->state = self->state * 214013U + 2531011U;
        return static_cast<int>((self->state >> 16) & 0x7FFF);
    }
    sorvel::DrawSource source() { return sorvel::DrawSource{&ScriptedDraws::next, this}; }
};

// Without an index, with the side structure, as a collection of the product.
using Strings = sorvel::test::Holder<char*>;

std::size_t count_lines(const std::string& file) {
    std::size_t lines = 0;
    for (const char c : file) {
        lines += c == '\n' ? 1 : 0;
    }
    return lines;
}

template <class Load>
void run(benchmark::State& state, const std::string& file, Load&& load) {
    std::vector<char> work(file.size() + 1);
    Strings strings(false, true);
    for (auto _ : state) {
        state.PauseTiming();
        std::memcpy(work.data(), file.data(), file.size());
        ScriptedDraws draws;
        state.ResumeTiming();
        load(strings, work.data(), file.size(), draws);
        state.PauseTiming();
        benchmark::DoNotOptimize(strings.count);
        sorvel::clear(strings.view());
        state.ResumeTiming();
    }
    const std::size_t lines = count_lines(file);
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * lines));
    state.counters["lines"] = static_cast<double>(lines);
}

void load_with_library(Strings& strings, char* data, std::size_t length, ScriptedDraws& draws, bool balanced) {
    sorvel::StringCollection view = strings.view();
    sorvel::load_lines(view, true, data, length, balanced, draws.source());
}

// The balanced order taken literally: a vector of the lines in file order,
// the k-th from the front added and erased, the gap closing each time.
void load_with_list(Strings& strings, char* data, std::size_t length, ScriptedDraws& draws) {
    std::vector<std::string_view> list;
    std::size_t start = 0;
    for (std::size_t at = 0; at <= length; ++at) {
        if (at == length || data[at] == '\n' || data[at] == '\r') {
            if (at > start) {
                data[at] = '\0';
                list.emplace_back(data + start, at - start);
            }
            start = at + 1;
        }
    }
    sorvel::StringCollection view = strings.view();
    sorvel::DrawSource draw = draws.source();
    while (!list.empty()) {
        const std::size_t k = static_cast<std::size_t>(draw() & sorvel::kDrawMask) % list.size();
        sorvel::AddStringValue(view, list[k].data(), true);
        list.erase(list.begin() + static_cast<std::ptrdiff_t>(k));
    }
}

void BM_LoadPlain(benchmark::State& state) {
    const std::string& file = random_file(static_cast<std::size_t>(state.range(0)));
    run(state, file,
        [](Strings& s, char* d, std::size_t n, ScriptedDraws& r) { load_with_library(s, d, n, r, false); });
}

void BM_LoadBalanced(benchmark::State& state) {
    const std::string& file = random_file(static_cast<std::size_t>(state.range(0)));
    run(state, file, [](Strings& s, char* d, std::size_t n, ScriptedDraws& r) { load_with_library(s, d, n, r, true); });
}

void BM_LoadBalancedListReference(benchmark::State& state) {
    const std::string& file = random_file(static_cast<std::size_t>(state.range(0)));
    run(state, file, [](Strings& s, char* d, std::size_t n, ScriptedDraws& r) { load_with_list(s, d, n, r); });
}

void BM_LoadPlainSortedChain(benchmark::State& state) {
    const std::string& file = sorted_file(static_cast<std::size_t>(state.range(0)));
    run(state, file,
        [](Strings& s, char* d, std::size_t n, ScriptedDraws& r) { load_with_library(s, d, n, r, false); });
}

void BM_LoadBalancedSorted(benchmark::State& state) {
    const std::string& file = sorted_file(static_cast<std::size_t>(state.range(0)));
    run(state, file, [](Strings& s, char* d, std::size_t n, ScriptedDraws& r) { load_with_library(s, d, n, r, true); });
}

BENCHMARK(BM_LoadPlain)->Arg(100000)->Arg(1000000)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_LoadBalanced)->Arg(100000)->Arg(1000000)->Unit(benchmark::kMillisecond);
// A million lines would take the list about a hundred times as long as a
// hundred thousand (the erasing is quadratic), so 300,000 shows the trend.
BENCHMARK(BM_LoadBalancedListReference)->Arg(100000)->Arg(300000)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_LoadPlainSortedChain)->Arg(20000)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_LoadBalancedSorted)->Arg(20000)->Unit(benchmark::kMillisecond);

}  // namespace
