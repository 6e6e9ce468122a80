// Unlucky orders of Adds, Removes, Clears and queries, each against a fresh
// random tree of the same size in the same run.
//
// A family is a script: untimed steps that make its state, then a timed
// sample of operations. With fresh 1 the counterpart runs instead: a random
// tree of the size the family's tree has when its sample starts, then the
// same kinds of operations in the same order on random targets (new random
// values to add, random held values to remove or look up, random positions).
// Times are per operation (the per_op counter); scripts/bench-pairs.py puts
// each family beside its counterpart.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdint>
#include <ctime>
#include <random>
#include <utility>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"
#include "counting_allocator.hpp"

namespace {

using namespace sorvel;
using test::Holder;

enum class Op : std::uint8_t { Add, Remove, Contains, IndexOf, ElementAt, Clear };

struct Step {
    Op op;
    std::int32_t value;  // a position for ElementAt
};

// Steps with the count they leave behind; every Add adds a new value and
// every Remove removes a held one.
struct Script {
    std::vector<Step> steps;
    std::size_t count = 0;

    void add(std::int32_t v) {
        steps.push_back({Op::Add, v});
        ++count;
    }
    void remove(std::int32_t v) {
        steps.push_back({Op::Remove, v});
        --count;
    }
    void query(Op op, std::int32_t v) { steps.push_back({op, v}); }
    void clear() {
        steps.push_back({Op::Clear, 0});
        count = 0;
    }
};

struct Case {
    bool index = false;
    Script setup;
    Script timed;
    long fail_after = -1;  // >= 0: in the last set-up step, the allocation after this many fails
    int rounds = 0;        // set-up and sample played this many times; 0: by size
};

// Distinct random values in a fixed order: enough for every family.
const std::vector<std::int32_t>& stream() {
    static const std::vector<std::int32_t> values = [] {
        constexpr std::size_t kWanted = 4'000'000;
        const std::vector<std::int32_t> raw = bench::random_ints(kWanted + kWanted / 256, 23);
        std::vector<std::uint32_t> order(raw.size());
        for (std::uint32_t i = 0; i < order.size(); ++i) {
            order[i] = i;
        }
        std::stable_sort(order.begin(), order.end(), [&](std::uint32_t a, std::uint32_t b) { return raw[a] < raw[b]; });
        std::vector<bool> repeat(raw.size());
        for (std::size_t i = 1; i < order.size(); ++i) {
            repeat[order[i]] = raw[order[i]] == raw[order[i - 1]];
        }
        std::vector<std::int32_t> out;
        for (std::size_t i = 0; i < raw.size() && out.size() < kWanted; ++i) {
            if (!repeat[i]) {
                out.push_back(raw[i]);
            }
        }
        return out;
    }();
    return values;
}

std::vector<std::int32_t> first(std::size_t n) {
    return {stream().begin(), stream().begin() + static_cast<std::ptrdiff_t>(n)};
}

std::vector<std::int32_t> sorted(std::vector<std::int32_t> v) {
    std::sort(v.begin(), v.end());
    return v;
}

std::vector<std::int32_t> shuffled(std::vector<std::int32_t> v, std::uint32_t seed) {
    std::shuffle(v.begin(), v.end(), std::mt19937(seed));
    return v;
}

std::size_t sample(std::size_t n) {
    return std::max<std::size_t>(n / 10, 1'000);
}

// The same kinds of operations on a fresh random tree of the family's size.
Case fresh_counterpart(const Case& family) {
    Case fresh;
    fresh.index = family.index;
    fresh.rounds = family.rounds;
    const std::vector<std::int32_t>& values = stream();
    std::size_t next = 0;
    std::vector<std::int32_t> held;
    for (; next < family.setup.count; ++next) {
        fresh.setup.add(values[next]);
        held.push_back(values[next]);
    }
    std::mt19937 random(17);
    const auto pick = [&] { return static_cast<std::size_t>(random() % std::max<std::size_t>(held.size(), 1)); };
    for (const Step& step : family.timed.steps) {
        switch (step.op) {
            case Op::Add:
                fresh.timed.add(values[next]);
                held.push_back(values[next++]);
                break;
            case Op::Remove: {
                const std::size_t at = pick();
                fresh.timed.remove(held[at]);
                held[at] = held.back();
                held.pop_back();
                break;
            }
            case Op::Contains:
            case Op::IndexOf: fresh.timed.query(step.op, held.empty() ? 0 : held[pick()]); break;
            case Op::ElementAt: fresh.timed.query(step.op, static_cast<std::int32_t>(pick())); break;
            case Op::Clear:
                fresh.timed.clear();
                held.clear();
                break;
        }
    }
    return fresh;
}

std::int64_t play(IntegerCollection c, const Step* from, const Step* to) {
    std::int64_t seen = 0;
    for (const Step* s = from; s != to; ++s) {
        switch (s->op) {
            case Op::Add: seen += add(c, s->value) ? 1 : 0; break;
            case Op::Remove: seen += remove(c, s->value) ? 1 : 0; break;
            case Op::Contains: seen += contains(c, s->value) ? 1 : 0; break;
            case Op::IndexOf: seen += position_of(c, s->value); break;
            case Op::ElementAt: {
                const IntegerNode* node = node_at(c, s->value);
                seen += node == nullptr ? 0 : node->value;
                break;
            }
            case Op::Clear: clear(c); break;
        }
    }
    return seen;
}

std::int64_t play(IntegerCollection c, const Script& script) {
    return play(c, script.steps.data(), script.steps.data() + script.steps.size());
}

// Allocation failures through the simulated host's counting allocator, which
// stands behind the allocation seam in this program.
std::uint64_t allocations_so_far() {
    return test::counting::total();
}
void fail_allocation_after(long n) {
    test::counting::fail_after(n);
}

// The last Add of a script that allocates more than its node (a growth of
// the side structure) and how many blocks it allocates; -1 when none does.
std::pair<std::ptrdiff_t, long> last_growth(const Script& adds) {
    Holder<std::int32_t> f(false, true);
    IntegerCollection c = f.view();
    std::pair<std::ptrdiff_t, long> found{-1, 0};
    for (std::size_t i = 0; i < adds.steps.size(); ++i) {
        const std::uint64_t before = allocations_so_far();
        play(c, &adds.steps[i], &adds.steps[i] + 1);
        if (const auto made = static_cast<long>(allocations_so_far() - before); made >= 2) {
            found = {static_cast<std::ptrdiff_t>(i), made};
        }
    }
    return found;
}

// Plays the set-up untimed and the sample timed, `rounds` times.
void run(benchmark::State& state, const Case& family, std::int64_t fresh) {
    const Case k = fresh != 0 ? fresh_counterpart(family) : family;
    const auto n = static_cast<std::size_t>(state.range(0));
    const int rounds = k.rounds != 0 ? k.rounds : static_cast<int>(std::max<std::size_t>(100'000 / n, 1));
    const std::ptrdiff_t failing = k.fail_after >= 0 ? static_cast<std::ptrdiff_t>(k.setup.steps.size()) - 1 : -1;
    std::int64_t seen = 0;
    for (auto _ : state) {
        for (int r = 0; r < rounds; ++r) {
            state.PauseTiming();
            auto* f = new Holder<std::int32_t>(k.index, true);
            IntegerCollection c = f->view();
            const Step* steps = k.setup.steps.data();
            if (failing >= 0) {
                play(c, steps, steps + failing);
                fail_allocation_after(k.fail_after);
                play(c, steps + failing, steps + failing + 1);
                fail_allocation_after(-1);
                if (f->side.built()) {
                    state.SkipWithError("the failure did not reach the side structure");
                }
            }
            play(c, steps + std::max<std::ptrdiff_t>(failing + 1, 0), steps + k.setup.steps.size());
            if (static_cast<std::size_t>(f->count) != k.setup.count) {
                state.SkipWithError("the set-up left another count than its script");
            }
            state.ResumeTiming();
            seen += play(c, k.timed);
            state.PauseTiming();
            delete f;
            state.ResumeTiming();
        }
    }
    benchmark::DoNotOptimize(seen);
    const auto ops = static_cast<double>(k.timed.steps.size()) * rounds;
    state.counters["per_op"] = benchmark::Counter(ops, benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    state.SetItemsProcessed(static_cast<std::int64_t>(ops));  // for scripts/charts.sh
    state.counters["held"] = static_cast<double>(k.setup.count);
}

// Sizes first, the family's own arguments, fresh last.
void sizes(benchmark::internal::Benchmark* b, const std::vector<std::vector<std::int64_t>>& variants) {
    std::vector<std::vector<std::int64_t>> args{{10'000, 100'000, 1'000'000}};
    for (const auto& v : variants) {
        args.push_back(v);
    }
    args.push_back({0, 1});
    b->ArgsProduct(args)->Iterations(1)->Unit(benchmark::kMillisecond);
}

// ---- Adds in a shape: sorted, reverse, zigzag --------------------------------
// op 0: the n Adds themselves; 1: Contains, 2: Remove of random held values after.

void BM_Adv_Shape(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    std::vector<std::int32_t> order = sorted(first(n));
    if (state.range(1) == 2) {
        std::reverse(order.begin(), order.end());
    } else if (state.range(1) == 3) {
        const std::vector<std::int32_t> ascending = order;
        for (std::size_t i = 0; i < n; ++i) {
            order[i] = ascending[i % 2 == 0 ? i / 2 : n - 1 - i / 2];
        }
    }
    Case k;
    Script& into = state.range(2) == 0 ? k.timed : k.setup;
    for (const std::int32_t v : order) {
        into.add(v);
    }
    const std::vector<std::int32_t> targets = shuffled(order, 3);
    for (std::size_t i = 0; state.range(2) != 0 && i < sample(n); ++i) {
        if (state.range(2) == 1) {
            k.timed.query(Op::Contains, targets[i]);
        } else {
            k.timed.remove(targets[i]);
        }
    }
    run(state, k, state.range(3));
}
BENCHMARK(BM_Adv_Shape)->ArgNames({"n", "order", "op", "fresh"})->Apply([](auto* b) {
    sizes(b, {{1, 2, 3}, {0, 1, 2}});
});

// ---- Sliding window: add the newest, remove the oldest ------------------------
// Random or ascending values; the window has slid over n values before the sample.

void BM_Adv_Window(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const std::size_t s = sample(n);
    std::vector<std::int32_t> values = first(2 * n + s);
    if (state.range(1) != 0) {
        values = sorted(values);
    }
    Case k;
    k.index = state.range(2) != 0;
    for (std::size_t i = 0; i < 2 * n + s; ++i) {
        Script& into = i < 2 * n ? k.setup : k.timed;
        into.add(values[i]);
        if (i >= n) {
            into.remove(values[i - n]);
        }
    }
    run(state, k, state.range(3));
}
BENCHMARK(BM_Adv_Window)->ArgNames({"n", "ascending", "index", "fresh"})->Apply([](auto* b) {
    sizes(b, {{0, 1}, {0, 1}});
});

// ---- A window whose first value stays -------------------------------------------
// The index holds the first slot and a run of empty ones before the window.
// reads 0: each step adds, removes the oldest but the first and reads
// positions 0 and 1; reads 1: only the two reads, alternating.

void BM_Adv_FirstStays(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const std::size_t s = sample(n);
    const std::vector<std::int32_t> values = first(3 * n + s);
    Case k;
    k.index = true;
    for (std::size_t i = 0; i < 3 * n; ++i) {
        k.setup.add(values[i]);
        if (i >= n) {
            k.setup.remove(values[i - n + 1]);
        }
    }
    for (std::size_t i = 3 * n; i < 3 * n + s; ++i) {
        if (state.range(1) == 0) {
            k.timed.add(values[i]);
            k.timed.remove(values[i - n + 1]);
        }
        k.timed.query(Op::ElementAt, 0);
        k.timed.query(Op::ElementAt, 1);
    }
    run(state, k, state.range(2));
}
BENCHMARK(BM_Adv_FirstStays)->ArgNames({"n", "reads", "fresh"})->Apply([](auto* b) { sizes(b, {{0, 1}}); });

// ---- Thinning: removing every second value in ascending order ------------------
// Over a random tree whose side structure 200 larger sorted values made (pre
// 0), the same after removing a random tenth (pre 1), or a random tree that
// random removal of 60 % deepened (pre 2). op 0: the thinning itself; 1:
// Contains, 2: Remove of random survivors after it.

void BM_Adv_Thin(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const int pre = static_cast<int>(state.range(1));
    const std::vector<std::int32_t> values = first(n + 200);
    const std::vector<std::int32_t> ascending = sorted(values);
    Case k;
    std::vector<std::int32_t> random_part;
    for (const std::int32_t v : values) {
        if (v < ascending[n]) {
            k.setup.add(v);
            random_part.push_back(v);
        }
    }
    for (std::size_t i = n; pre != 2 && i < n + 200; ++i) {
        k.setup.add(ascending[i]);
    }
    const std::size_t doomed = pre == 1 ? n / 10 : pre == 2 ? n * 6 / 10 : 0;
    std::vector<std::int32_t> order = shuffled(random_part, 4);
    for (std::size_t i = 0; i < doomed; ++i) {
        k.setup.remove(order[i]);
    }
    std::vector<std::int32_t> held = sorted({order.begin() + static_cast<std::ptrdiff_t>(doomed), order.end()});
    if (pre != 2) {
        held.insert(held.end(), ascending.begin() + static_cast<std::ptrdiff_t>(n), ascending.end());
    }
    Script& thinning = state.range(2) == 0 ? k.timed : k.setup;
    std::vector<std::int32_t> survivors;
    for (std::size_t i = 0; i < held.size(); ++i) {
        if (i % 2 == 1) {
            thinning.remove(held[i]);
        } else {
            survivors.push_back(held[i]);
        }
    }
    survivors = shuffled(survivors, 5);
    for (std::size_t i = 0; state.range(2) != 0 && i < std::min(sample(n), survivors.size()); ++i) {
        if (state.range(2) == 1) {
            k.timed.query(Op::Contains, survivors[i]);
        } else {
            k.timed.remove(survivors[i]);
        }
    }
    run(state, k, state.range(3));
}
BENCHMARK(BM_Adv_Thin)->ArgNames({"n", "pre", "op", "fresh"})->Apply([](auto* b) { sizes(b, {{0, 1, 2}, {0, 1, 2}}); });

// ---- Clear and refill with small sorted batches ------------------------------
// 100,000 Adds in batches of the first argument, each batch ascending.

void BM_Adv_Refill(benchmark::State& state) {
    const auto batch = static_cast<std::size_t>(state.range(0));
    const std::vector<std::int32_t> values = first(100'000);
    Case k;
    k.rounds = 1;
    for (std::size_t from = 0; from < values.size(); from += batch) {
        k.timed.clear();
        const std::vector<std::int32_t> part =
            sorted({values.begin() + static_cast<std::ptrdiff_t>(from),
                    values.begin() + static_cast<std::ptrdiff_t>(std::min(from + batch, values.size()))});
        for (const std::int32_t v : part) {
            k.timed.add(v);
        }
    }
    run(state, k, state.range(1));
}
BENCHMARK(BM_Adv_Refill)
    ->ArgNames({"batch", "fresh"})
    ->ArgsProduct({{200, 1'000, 5'000}, {0, 1}})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

// ---- Small Clears after a large peak --------------------------------------------
// A peak of n values with the index, cleared; then Clears of 10 new values.
// The counterpart never grew.

void BM_Adv_PeakClears(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const std::vector<std::int32_t> values = first(n + 100'000);
    Case k;
    k.index = true;
    for (std::size_t i = 0; i < n; ++i) {
        k.setup.add(values[i]);
    }
    k.setup.clear();
    for (std::size_t i = n; i < n + 100'000; i += 10) {
        for (std::size_t j = i; j < i + 10; ++j) {
            k.timed.add(values[j]);
        }
        k.timed.clear();
    }
    k.rounds = 1;
    run(state, k, state.range(1));
}
BENCHMARK(BM_Adv_PeakClears)->ArgNames({"n", "fresh"})->Apply([](auto* b) { sizes(b, {}); });

// ---- A flat window after the side structure failed to grow ----------------------
// Ascending values (a chain) fill the window up to the last Add before n that
// grows the side structure; with fail 1 that growth cannot get memory. Then
// the window slides; at most 10,000 steps are timed.

void BM_Adv_FailWindow(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const std::size_t s = std::min<std::size_t>(sample(n), 10'000);
    const std::vector<std::int32_t> values = sorted(first(n + s));
    Script fill;
    for (std::size_t i = 0; i < n; ++i) {
        fill.add(values[i]);
    }
    const auto [growth, blocks] = last_growth(fill);
    if (growth < 0) {
        state.SkipWithError("the side structure never grows");
        return;
    }
    const auto w = static_cast<std::size_t>(growth) + 1;
    Case k;
    k.fail_after = state.range(1) != 0 ? blocks - 1 : -1;
    for (std::size_t i = 0; i < w + s; ++i) {
        Script& into = i < w ? k.setup : k.timed;
        into.add(values[i]);
        if (i >= w) {
            into.remove(values[i - w]);
        }
    }
    run(state, k, state.range(2));
}
BENCHMARK(BM_Adv_FailWindow)->ArgNames({"n", "fail", "fresh"})->Apply([](auto* b) { sizes(b, {{0, 1}}); });

// ---- Positions after removals ------------------------------------------------------
// n random values with the index, then a random share removed. op 0: IndexOf,
// 1: Contains of random survivors, 2: ElementAt at random positions.

Case after_removals(std::size_t n, std::size_t percent) {
    const std::vector<std::int32_t> values = first(n);
    Case k;
    k.index = true;
    for (const std::int32_t v : values) {
        k.setup.add(v);
    }
    const std::vector<std::int32_t> order = shuffled(values, 6);
    const std::size_t doomed = n * percent / 100;
    for (std::size_t i = 0; i < doomed; ++i) {
        k.setup.remove(order[i]);
    }
    return k;
}

void BM_Adv_Positions(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    Case k = after_removals(n, static_cast<std::size_t>(state.range(1)));
    const std::size_t doomed = n - k.setup.count;
    const std::vector<std::int32_t> order = shuffled(first(n), 6);
    std::mt19937 random(8);
    for (std::size_t i = 0; i < sample(n); ++i) {
        if (state.range(2) == 2) {
            k.timed.query(Op::ElementAt, static_cast<std::int32_t>(random() % k.setup.count));
        } else {
            k.timed.query(state.range(2) == 0 ? Op::IndexOf : Op::Contains, order[doomed + random() % k.setup.count]);
        }
    }
    run(state, k, state.range(3));
}
BENCHMARK(BM_Adv_Positions)->ArgNames({"n", "removed", "op", "fresh"})->Apply([](auto* b) {
    sizes(b, {{50, 90}, {0, 1, 2}});
});

// IndexOf against Contains of the same values on one tree: batches of each
// in turn, CPU time of this thread.
double thread_seconds() {
    timespec t{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &t);
    return static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_nsec) * 1e-9;
}

void BM_Adv_IndexOfAgainstContains(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const Case k = after_removals(n, static_cast<std::size_t>(state.range(1)));
    const std::vector<std::int32_t> order = shuffled(first(n), 6);
    const std::vector<std::int32_t> survivors(order.begin() + static_cast<std::ptrdiff_t>(n - k.setup.count),
                                              order.end());
    Script index_of;
    Script contains;
    std::mt19937 random(9);
    for (std::size_t i = 0; i < std::max<std::size_t>(sample(n), 100'000); ++i) {
        const std::int32_t v = survivors[random() % survivors.size()];
        index_of.query(Op::IndexOf, v);
        contains.query(Op::Contains, v);
    }
    Holder<std::int32_t> f(true, true);
    play(f.view(), k.setup);
    constexpr std::size_t kBatch = 1'000;
    double seconds[2] = {};
    std::int64_t seen = 0;
    for (auto _ : state) {
        for (std::size_t from = 0; from < index_of.steps.size(); from += kBatch) {
            const std::size_t to = std::min(from + kBatch, index_of.steps.size());
            for (int which = 0; which < 2; ++which) {
                const Step* steps = (which == 0 ? index_of : contains).steps.data();
                const double start = thread_seconds();
                seen += play(f.view(), steps + from, steps + to);
                seconds[which] += thread_seconds() - start;
            }
        }
    }
    benchmark::DoNotOptimize(seen);
    const auto ops = static_cast<double>(index_of.steps.size() * state.iterations());
    state.counters["indexof_ns"] = seconds[0] / ops * 1e9;
    state.counters["contains_ns"] = seconds[1] / ops * 1e9;
    state.counters["ratio"] = seconds[0] / seconds[1];
}
BENCHMARK(BM_Adv_IndexOfAgainstContains)
    ->ArgNames({"n", "removed"})
    ->ArgsProduct({{10'000, 100'000, 1'000'000}, {50}})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

// ---- Memory per held value after removals ----------------------------------------
// Heap in use per held value after a removal pattern, against a fresh
// collection given the same survivors in their insertion order (side structure
// included when that order needs one). pattern 0: random values, a random
// share removed; 1: ascending values (deep), a random share removed; 2: random
// values and 200 larger sorted ones, thinned in ascending order (50: every
// second removed; 99: all but every hundredth); 3: a peak of n, cleared,
// then 100 new values.

void BM_Adv_Memory(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const int pattern = static_cast<int>(state.range(1));
    const auto percent = static_cast<std::size_t>(state.range(2));
    const bool with_index = state.range(3) != 0;
    std::vector<std::int32_t> adds = first(n + 200);
    const std::vector<std::int32_t> ascending = sorted(adds);
    Script script;
    std::vector<std::int32_t> removed;
    if (pattern == 1) {
        adds.assign(ascending.begin(), ascending.begin() + static_cast<std::ptrdiff_t>(n));
    } else if (pattern == 2) {
        adds.erase(std::remove_if(adds.begin(), adds.end(), [&](std::int32_t v) { return v >= ascending[n]; }),
                   adds.end());
        adds.insert(adds.end(), ascending.begin() + static_cast<std::ptrdiff_t>(n), ascending.end());
        for (std::size_t i = 0; i < ascending.size(); ++i) {
            if (percent == 50 ? i % 2 == 1 : i % 100 != 0) {
                removed.push_back(ascending[i]);
            }
        }
    } else {
        adds.resize(pattern == 3 ? n + 100 : n);
    }
    if (pattern < 2) {
        removed = shuffled(adds, 6);
        removed.resize(n * percent / 100);
    }
    for (std::size_t i = 0; i < adds.size(); ++i) {
        if (pattern == 3 && i == n) {
            script.clear();
        }
        script.add(adds[i]);
    }
    for (const std::int32_t v : removed) {
        script.remove(v);
    }
    Script fresh;
    const std::vector<std::int32_t> gone = sorted(removed);
    for (std::size_t i = pattern == 3 ? n : 0; i < adds.size(); ++i) {
        if (!std::binary_search(gone.begin(), gone.end(), adds[i])) {
            fresh.add(adds[i]);
        }
    }
    for (auto _ : state) {
        double per_value[2] = {};
        for (int which = 0; which < 2; ++which) {
            const std::size_t before = bench::heap_in_use();
            auto* f = new Holder<std::int32_t>(with_index, true);
            play(f->view(), which == 0 ? script : fresh);
            per_value[which] = static_cast<double>(bench::heap_in_use() - before) / static_cast<double>(f->count);
            if (static_cast<std::size_t>(f->count) != fresh.count) {
                state.SkipWithError("the two collections hold different counts");
            }
            delete f;
        }
        state.counters["bytes_per_value"] = per_value[0];
        state.counters["fresh_bytes_per_value"] = per_value[1];
        state.counters["ratio"] = per_value[0] / per_value[1];
        state.counters["held"] = static_cast<double>(fresh.count);
    }
}
BENCHMARK(BM_Adv_Memory)
    ->ArgNames({"n", "pattern", "removed", "index"})
    ->ArgsProduct({{10'000, 100'000, 1'000'000}, {0, 1, 2}, {50, 99}, {0, 1}})
    ->ArgsProduct({{10'000, 100'000, 1'000'000}, {3}, {100}, {0, 1}})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

}  // namespace
