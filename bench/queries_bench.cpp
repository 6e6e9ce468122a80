// Queries on collections of 100,000 values: the position of a value against
// the scan of the insertion index that defines it, the value at a position,
// and the random element on random trees and on chains.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"
#include "collections/random_path.hpp"

namespace {

using namespace sorvel;

constexpr std::size_t kValues = 100'000;
constexpr std::int32_t kChain = 20'000;

using test::Holder;

struct Data {
    std::vector<std::int32_t> integers;
    std::vector<std::string> strings;
    std::vector<std::int32_t> integer_probes;  // held values, shuffled
    std::vector<std::string> string_probes;
};

const Data& data() {
    static const Data d = [] {
        Data out;
        out.integers = bench::random_ints(kValues, 31337);
        out.strings = bench::random_strings(kValues, 31338, bench::kLetters);
        out.integer_probes = out.integers;
        out.string_probes = out.strings;
        std::shuffle(out.integer_probes.begin(), out.integer_probes.end(), std::mt19937(1));
        std::shuffle(out.string_probes.begin(), out.string_probes.end(), std::mt19937(2));
        return out;
    }();
    return d;
}

Holder<std::int32_t>& integer_collection() {
    static Holder<std::int32_t> f(true, false);
    if (f.count == 0) {
        IntegerCollection c = f.view();
        for (const std::int32_t v : data().integers) {
            add(c, v);
        }
    }
    return f;
}

Holder<char*>& string_collection() {
    static Holder<char*> f(true, false);
    if (f.count == 0) {
        StringCollection c = f.view();
        for (const std::string& s : data().strings) {
            AddStringValue(c, s.c_str(), false);
        }
    }
    return f;
}

// The position as defined: scan the index from position 0 for the first
// node whose value equals the key. Kept here as the yardstick.
std::int32_t scan_position(const IntegerCollection& c, std::int32_t value) {
    if (c.index == nullptr) {
        return -1;
    }
    for (std::uint32_t i = 0; i < c.index->size(); ++i) {
        if (c.index->at(i)->value == value) {
            return static_cast<std::int32_t>(i);
        }
    }
    return -1;
}

std::int32_t scan_position(const StringCollection& c, const char* value) {
    if (c.index == nullptr) {
        return -1;
    }
    for (std::uint32_t i = 0; i < c.index->size(); ++i) {
        if (CompareStrings(c.index->at(i)->value, value, false) == 0) {
            return static_cast<std::int32_t>(i);
        }
    }
    return -1;
}

// ---- IndexOf ---------------------------------------------------------------

void BM_IndexOfInteger_Sorvel(benchmark::State& state) {
    const IntegerCollection c = integer_collection().view();
    const auto& probes = data().integer_probes;
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(position_of(c, probes[next]));
        next = next + 1 == probes.size() ? 0 : next + 1;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_IndexOfInteger_Sorvel);

void BM_IndexOfInteger_LinearScan(benchmark::State& state) {
    const IntegerCollection c = integer_collection().view();
    const auto& probes = data().integer_probes;
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(scan_position(c, probes[next]));
        next = next + 1 == probes.size() ? 0 : next + 1;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_IndexOfInteger_LinearScan)->Unit(benchmark::kMicrosecond);

void BM_IndexOfString_Sorvel(benchmark::State& state) {
    const StringCollection c = string_collection().view();
    const auto& probes = data().string_probes;
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(position_of(c, probes[next].c_str(), false));
        next = next + 1 == probes.size() ? 0 : next + 1;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_IndexOfString_Sorvel);

void BM_IndexOfString_LinearScan(benchmark::State& state) {
    const StringCollection c = string_collection().view();
    const auto& probes = data().string_probes;
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(scan_position(c, probes[next].c_str()));
        next = next + 1 == probes.size() ? 0 : next + 1;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_IndexOfString_LinearScan)->Unit(benchmark::kMicrosecond);

// ---- ElementAt -------------------------------------------------------------

void BM_IntegerElementAt_Sorvel(benchmark::State& state) {
    const IntegerCollection c = integer_collection().view();
    std::mt19937 random(5);
    std::vector<std::int32_t> positions(4096);
    for (auto& p : positions) {
        p = static_cast<std::int32_t>(random() % kValues);
    }
    std::size_t next = 0;
    for (auto _ : state) {
        // As the expression gives it: the value, or 0 out of range.
        const IntegerNode* node = node_at(c, positions[next]);
        benchmark::DoNotOptimize(node == nullptr ? 0 : node->value);
        next = (next + 1) & 4095;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_IntegerElementAt_Sorvel);

void BM_StringElementAt_Sorvel(benchmark::State& state) {
    const StringCollection c = string_collection().view();
    std::mt19937 random(6);
    std::vector<std::int32_t> positions(4096);
    for (auto& p : positions) {
        p = static_cast<std::int32_t>(random() % kValues);
    }
    std::size_t next = 0;
    for (auto _ : state) {
        const StringNode* node = node_at(c, positions[next]);
        benchmark::DoNotOptimize(node == nullptr ? "" : node->value);
        next = (next + 1) & 4095;
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_StringElementAt_Sorvel);

// ---- Random element ----------------------------------------------------------
// Draws from the runtime generator, as the expressions do.

void BM_RandomElement_Integers_RandomTree(benchmark::State& state) {
    const IntegerCollection c = integer_collection().view();
    const DrawSource draws = runtime_draws();
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const IntegerNode*>(c.root), draws));
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_RandomElement_Integers_RandomTree);

void BM_RandomElement_Strings_RandomTree(benchmark::State& state) {
    const StringCollection c = string_collection().view();
    const DrawSource draws = runtime_draws();
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const StringNode*>(c.root), draws));
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_RandomElement_Strings_RandomTree);

// Ascending adds make a chain of right links; about half of the walks stop
// at once, the rest go a geometric distance down.
void BM_RandomElement_Integers_Chain(benchmark::State& state) {
    Holder<std::int32_t> f(false, false);
    IntegerCollection c = f.view();
    for (std::int32_t v = 0; v < kChain; ++v) {
        add(c, v);
    }
    const DrawSource draws = runtime_draws();
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const IntegerNode*>(c.root), draws));
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_RandomElement_Integers_Chain);

// The worst case on the same chain: every draw follows the chain to its end.
void BM_RandomElement_Integers_ChainWalkedToTheEnd(benchmark::State& state) {
    Holder<std::int32_t> f(false, false);
    IntegerCollection c = f.view();
    for (std::int32_t v = 0; v < kChain; ++v) {
        add(c, v);
    }
    std::uint32_t counter = 0;
    const DrawSource odd_draws{[](void* context) noexcept {
                                   auto* n = static_cast<std::uint32_t*>(context);
                                   *n = *n * 1103515245U + 12345U;
                                   return static_cast<int>((*n >> 16) & 0x7FFF) | 1;
                               },
                               &counter};
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const IntegerNode*>(c.root), odd_draws));
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));
}
BENCHMARK(BM_RandomElement_Integers_ChainWalkedToTheEnd)->Unit(benchmark::kMicrosecond);

}  // namespace
