// Deep trees and the side structure of links: sorted input and removal of the
// oldest values against random input, the same build with plain descents and
// std::set; index-kept removal and positions.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"

namespace {

using namespace sorvel;
using bench::random_ints;
using test::Holder;

std::vector<std::string> random_strings(std::size_t n) {
    return bench::random_strings(n, 12, bench::kMixedCase);
}

bool put(Collection<std::int32_t>& c, std::int32_t v, bool) {
    return add(c, v);
}
bool put(Collection<char*>& c, const std::string& v, bool sensitive) {
    return AddStringValue(c, v.c_str(), sensitive);
}
bool has(const Collection<std::int32_t>& c, std::int32_t v, bool) {
    return contains(c, v);
}
bool has(const Collection<char*>& c, const std::string& v, bool sensitive) {
    return contains(c, v.c_str(), sensitive);
}
bool take(Collection<std::int32_t>& c, std::int32_t v) {
    return remove(c, v);
}

struct Folded {
    bool operator()(const std::string& a, const std::string& b) const {
        return CompareStrings(a.c_str(), b.c_str(), false) < 0;
    }
};

// Adds of n values, sorted (arg 1) or random (arg 0), with the side structure.
template <class T>
void add_all(benchmark::State& state, const std::vector<T>& random_order, bool linked = true) {
    std::vector<T> values = random_order;
    if (state.range(1) != 0) {
        std::sort(values.begin(), values.end());
    }
    for (auto _ : state) {
        auto* f = new Holder<std::conditional_t<std::is_same_v<T, std::string>, char*, T>>(false, linked);
        auto c = f->view();
        for (const T& v : values) {
            put(c, v, true);
        }
        benchmark::DoNotOptimize(f->count);
        state.PauseTiming();
        delete f;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}

void BM_Deep_AddIntegers(benchmark::State& state) {
    add_all(state, random_ints(static_cast<std::size_t>(state.range(0))));
}
void BM_Deep_AddStrings(benchmark::State& state) {
    add_all(state, random_strings(static_cast<std::size_t>(state.range(0))));
}
// Sorted Adds with plain descents: a chain, quadratic, so only small sizes.
void BM_Deep_AddIntegersPlain(benchmark::State& state) {
    add_all(state, random_ints(static_cast<std::size_t>(state.range(0))), false);
}
void scales(benchmark::internal::Benchmark* b) {
    for (const std::int64_t n : {1'000, 10'000, 100'000, 1'000'000}) {
        b->Args({n, 0})->Args({n, 1});
    }
    b->ArgNames({"n", "sorted"})->Unit(benchmark::kMillisecond);
}
BENCHMARK(BM_Deep_AddIntegers)->Apply(scales);
BENCHMARK(BM_Deep_AddStrings)->Apply(scales);
BENCHMARK(BM_Deep_AddIntegersPlain)->ArgNames({"n", "sorted"})->Args({1'000, 1})->Args({10'000, 1})->Args({20'000, 1});

// Contains of every survivor after removing the oldest tenth or half of n
// random values (fresh 0), or on a fresh tree of the survivors (fresh 1).
void BM_Deep_ContainsAfterRemovingOldest(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const std::vector<std::int32_t> values = random_ints(n);
    const std::size_t gone = n * static_cast<std::size_t>(state.range(1)) / 100;
    Holder<std::int32_t> f(false, true);
    IntegerCollection c = f.view();
    for (std::size_t i = state.range(2) != 0 ? gone : 0; i < n; ++i) {
        add(c, values[i]);
    }
    for (std::size_t i = 0; state.range(2) == 0 && i < gone; ++i) {
        remove(c, values[i]);
    }
    std::vector<std::int32_t> probes(values.begin() + static_cast<std::ptrdiff_t>(gone), values.end());
    std::shuffle(probes.begin(), probes.end(), std::mt19937(3));
    bench::time_contains(state, c, probes);
}
BENCHMARK(BM_Deep_ContainsAfterRemovingOldest)
    ->ArgNames({"n", "percent", "fresh"})
    ->ArgsProduct({{100'000, 1'000'000}, {10, 50}, {0, 1}});

// Removing half of n random values: the oldest half (random 0) or a random
// half (random 1). Index on or off (arg 2).
void remove_from_full(benchmark::State& state, std::size_t n, std::size_t removals, bool oldest, bool with_index,
                      bool linked) {
    const std::vector<std::int32_t> values = random_ints(n);
    std::vector<std::int32_t> doomed(values.begin(), values.begin() + static_cast<std::ptrdiff_t>(removals));
    if (!oldest) {
        doomed = values;
        std::shuffle(doomed.begin(), doomed.end(), std::mt19937(4));
        doomed.resize(removals);
    }
    for (auto _ : state) {
        state.PauseTiming();
        // Made and freed outside the timing: freeing the index after a
        // million nodes makes the allocator consolidate the whole heap.
        auto* f = new Holder<std::int32_t>(with_index, linked);
        IntegerCollection c = f->view();
        for (const std::int32_t v : values) {
            add(c, v);
        }
        state.ResumeTiming();
        for (const std::int32_t v : doomed) {
            take(c, v);
        }
        state.PauseTiming();
        delete f;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * removals));
}
void BM_Deep_RemoveHalf(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    remove_from_full(state, n, n / 2, state.range(1) == 0, false, true);
}
BENCHMARK(BM_Deep_RemoveHalf)
    ->ArgNames({"n", "random"})
    ->ArgsProduct({{100'000}, {0, 1}})
    ->Unit(benchmark::kMillisecond);

void BM_Index_Remove100kOf1M(benchmark::State& state) {
    remove_from_full(state, 1'000'000, 100'000, false, state.range(0) != 0, true);
}
BENCHMARK(BM_Index_Remove100kOf1M)->ArgName("index")->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond);

// Random input: the side structure present (links 1) against plain descents
// (links 0) in this build, and std::set (links 2). Kind 0 integers, 1 strings,
// 2 case-folded strings.
template <class Set, class T>
void set_add_or_find(benchmark::State& state, const std::vector<T>& values, bool find) {
    Set set;
    if (find) {
        set.insert(values.begin(), values.end());
    }
    for (auto _ : state) {
        std::size_t hits = 0;
        if (find) {
            for (const T& v : values) {
                hits += set.count(v);
            }
        } else {
            for (const T& v : values) {
                hits += set.insert(v).second ? 1 : 0;
            }
            state.PauseTiming();
            set.clear();
            state.ResumeTiming();
        }
        benchmark::DoNotOptimize(hits);
    }
}

template <class T>
void random_input(benchmark::State& state, const std::vector<T>& values, bool sensitive) {
    const bool find = state.range(3) != 0;
    if (state.range(2) == 2) {
        if constexpr (std::is_same_v<T, std::string>) {
            if (!sensitive) {
                set_add_or_find<std::set<std::string, Folded>>(state, values, find);
            } else {
                set_add_or_find<std::set<std::string>>(state, values, find);
            }
        } else {
            set_add_or_find<std::set<T>>(state, values, find);
        }
    } else {
        Holder<std::conditional_t<std::is_same_v<T, std::string>, char*, T>> f(false, state.range(2) == 1);
        auto c = f.view();
        for (const T& v : values) {
            if (find) {
                put(c, v, sensitive);
            }
        }
        std::vector<T> probes = values;
        std::shuffle(probes.begin(), probes.end(), std::mt19937(5));
        for (auto _ : state) {
            std::size_t hits = 0;
            for (const T& v : find ? probes : values) {
                hits += find ? has(c, v, sensitive) : put(c, v, sensitive);
            }
            benchmark::DoNotOptimize(hits);
            if (!find) {
                state.PauseTiming();
                clear(c);
                state.ResumeTiming();
            }
        }
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}

void BM_Random(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    if (state.range(1) == 0) {
        random_input(state, random_ints(n), true);
    } else {
        random_input(state, random_strings(n), state.range(1) == 1);
    }
}
BENCHMARK(BM_Random)
    ->ArgNames({"n", "kind", "links", "contains"})
    ->ArgsProduct({{1'000, 10'000, 100'000, 1'000'000}, {0, 1, 2}, {0, 1, 2}, {0, 1}})
    ->Unit(benchmark::kMicrosecond);

// Positions in 1,000,000 random values, after removing 100,000 of them at
// random (gaps 1) or none (gaps 0): walking positions 0, 1, 2, ... (walk 1)
// or at random (walk 0), and IndexOf.
Holder<std::int32_t>& index_fixture(bool gaps) {
    static Holder<std::int32_t>* made[2] = {};
    Holder<std::int32_t>*& f = made[gaps ? 1 : 0];
    if (f == nullptr) {
        f = new Holder<std::int32_t>(true, true);
        IntegerCollection c = f->view();
        std::vector<std::int32_t> values = random_ints(1'000'000);
        for (const std::int32_t v : values) {
            add(c, v);
        }
        std::shuffle(values.begin(), values.end(), std::mt19937(6));
        for (std::size_t i = 0; gaps && i < 100'000; ++i) {
            remove(c, values[i]);
        }
    }
    return *f;
}

void BM_Index_ElementAt(benchmark::State& state) {
    const IntegerCollection c = index_fixture(state.range(1) != 0).view();
    std::mt19937 random(7);
    std::int32_t next = 0;
    for (auto _ : state) {
        const std::int32_t at = state.range(0) != 0 ? next : static_cast<std::int32_t>(random() % 900'000);
        const IntegerNode* node = node_at(c, at);
        benchmark::DoNotOptimize(node == nullptr ? 0 : node->value);
        next = next + 1 == c.count ? 0 : next + 1;
    }
}
BENCHMARK(BM_Index_ElementAt)->ArgNames({"walk", "gaps"})->ArgsProduct({{1, 0}, {1, 0}});

// IndexOf (contains 0) against Contains (contains 1) of the same values.
void BM_Index_IndexOf(benchmark::State& state) {
    const IntegerCollection c = index_fixture(true).view();
    const std::vector<std::int32_t> values = random_ints(1'000'000);
    std::size_t next = 0;
    for (auto _ : state) {
        if (state.range(0) != 0) {
            benchmark::DoNotOptimize(contains(c, values[next]));
        } else {
            benchmark::DoNotOptimize(position_of(c, values[next]));
        }
        next = (next + 7919) % values.size();
    }
}
BENCHMARK(BM_Index_IndexOf)->ArgName("contains")->Arg(0)->Arg(1);

// Heap bytes per held integer, from the C library's statistics: random or
// sorted (deep) input, index off or on, side storage present or not.
void BM_Deep_Memory(benchmark::State& state) {
    std::vector<std::int32_t> values = random_ints(1'000'000);
    if (state.range(0) != 0) {
        std::sort(values.begin(), values.end());
    }
    for (auto _ : state) {
#if defined(__GLIBC__)
        const std::size_t before = bench::heap_in_use();
        Holder<std::int32_t> f(state.range(1) != 0, state.range(2) != 0);
        IntegerCollection c = f.view();
        for (const std::int32_t v : values) {
            add(c, v);
        }
        const std::size_t after = bench::heap_in_use();
        state.counters["heap_bytes_per_value"] = static_cast<double>(after - before) / static_cast<double>(f.count);
#endif
    }
}
BENCHMARK(BM_Deep_Memory)
    ->ArgNames({"sorted", "index", "links"})
    ->Args({0, 0, 0})
    ->Args({0, 0, 1})
    ->Args({0, 1, 0})
    ->Args({0, 1, 1})
    ->Args({1, 0, 1})
    ->Args({1, 1, 1})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

}  // namespace
