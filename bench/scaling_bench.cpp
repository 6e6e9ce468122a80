// How each operation scales as a collection grows: random input from 10^3 to
// 10^6 values, chains (sorted input) built through the exported interface up
// to 20,000 values, and deeper chains built directly in the tree model.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <map>
#include <memory>
#include <random>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"
#include "collections/random_path.hpp"
#include "simulated_host.hpp"

namespace {

using namespace sorvel;
using bench::random_ints;
using test::Holder;

struct Lcg {
    std::uint32_t state = 12345;
    static int next(void* self) noexcept {
        auto* g = static_cast<Lcg*>(self);
        g->state = g->state * 1103515245U + 12345U;
        return static_cast<int>((g->state >> 16) & 0x7FFF);
    }
    DrawSource source() { return {next, this}; }
};

// One random tree per size, with its index, kept for the read-only queries.
Holder<std::int32_t>& random_tree(std::size_t n) {
    static std::map<std::size_t, std::unique_ptr<Holder<std::int32_t>>> trees;
    auto& f = trees[n];
    if (!f) {
        f = std::make_unique<Holder<std::int32_t>>(true, false);
        IntegerCollection c = f->view();
        for (const std::int32_t v : random_ints(n, 7)) {
            add(c, v);
        }
    }
    return *f;
}

void sizes(benchmark::internal::Benchmark* b) {
    for (std::int64_t n : {1'000, 10'000, 100'000, 1'000'000}) {
        b->Arg(n);
    }
}

void BM_Scale_Add(benchmark::State& state) {
    const auto values = random_ints(static_cast<std::size_t>(state.range(0)), 7);
    for (auto _ : state) {
        Holder<std::int32_t> f(false, false);
        IntegerCollection c = f.view();
        for (const std::int32_t v : values) {
            add(c, v);
        }
        state.PauseTiming();
        clear(c);
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Scale_Add)->Apply(sizes)->Unit(benchmark::kMicrosecond);

void BM_Scale_Contains(benchmark::State& state) {
    Holder<std::int32_t>& f = random_tree(static_cast<std::size_t>(state.range(0)));
    const auto probes = random_ints(static_cast<std::size_t>(state.range(0)), 7);  // every held value
    std::size_t i = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(contains(f.view(), probes[i++ % probes.size()]));
    }
}
BENCHMARK(BM_Scale_Contains)->Apply(sizes);

void BM_Scale_IndexOf(benchmark::State& state) {
    Holder<std::int32_t>& f = random_tree(static_cast<std::size_t>(state.range(0)));
    const auto probes = random_ints(static_cast<std::size_t>(state.range(0)), 7);
    std::size_t i = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(position_of(f.view(), probes[i++ % probes.size()]));
    }
}
BENCHMARK(BM_Scale_IndexOf)->Apply(sizes);

void BM_Scale_RandomElement(benchmark::State& state) {
    Holder<std::int32_t>& f = random_tree(static_cast<std::size_t>(state.range(0)));
    Lcg draws;
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const IntegerNode*>(f.root), draws.source()));
    }
}
BENCHMARK(BM_Scale_RandomElement)->Apply(sizes);

// Removes a tenth of the values (at most 10,000) from a fresh tree.
void BM_Scale_Remove(benchmark::State& state) {
    const auto n = static_cast<std::size_t>(state.range(0));
    const bool with_index = state.range(1) != 0;
    const auto values = random_ints(n, 7);
    const std::size_t removals = std::min<std::size_t>(n / 10, 10'000);
    for (auto _ : state) {
        state.PauseTiming();
        Holder<std::int32_t> f(with_index, false);
        IntegerCollection c = f.view();
        for (const std::int32_t v : values) {
            add(c, v);
        }
        state.ResumeTiming();
        for (std::size_t r = 0; r < removals; ++r) {
            remove(c, values[(r * 7919) % n]);
        }
        state.PauseTiming();
        clear(c);
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * removals));
}
BENCHMARK(BM_Scale_Remove)
    ->ArgsProduct({{1'000, 10'000, 100'000, 1'000'000}, {0, 1}})
    ->ArgNames({"n", "index"})
    ->Unit(benchmark::kMicrosecond);

// ---- Chains through the exported interface ----------------------------------

void BM_Chain_Interface_Add(benchmark::State& state) {
    using simulated::Param;
    const auto n = static_cast<std::int32_t>(state.range(0));
    simulated::Host host(simulated::Library::linked_in());
    for (auto _ : state) {
        simulated::Instance& i = host.create(1, 0);
        for (std::int32_t v = 0; v < n; ++v) {
            host.event(i, "Add Integer: %0", {Param::of(v)});
        }
        benchmark::DoNotOptimize(host.event(i, "%o: Contains Integer: %0", {Param::of(n - 1)}));
        state.PauseTiming();
        host.destroy(i);
        host.clear_calls();
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Chain_Interface_Add)->Arg(1'000)->Arg(5'000)->Arg(20'000)->Unit(benchmark::kMillisecond);

void BM_Chain_Interface_RandomElement(benchmark::State& state) {
    using simulated::Param;
    const auto n = static_cast<std::int32_t>(state.range(0));
    simulated::Host host(simulated::Library::linked_in());
    simulated::Instance& i = host.create(1, 0);
    for (std::int32_t v = 0; v < n; ++v) {
        host.event(i, "Add Integer: %0", {Param::of(v)});
    }
    for (auto _ : state) {
        benchmark::DoNotOptimize(host.event(i, "IntegersRandomElement("));
    }
    host.destroy(i);
}
BENCHMARK(BM_Chain_Interface_RandomElement)->Arg(1'000)->Arg(5'000)->Arg(20'000);

// ---- Deeper chains, linked directly at the deepest node ----------------------

struct Chain {
    Holder<std::int32_t> fields{false, false};
    explicit Chain(std::int32_t n) {
        IntegerNode** link = &fields.root;
        for (std::int32_t v = 0; v < n; ++v) {
            auto* node = new (memory::allocate(sizeof(IntegerNode))) IntegerNode();
            node->value = v;
            *link = node;
            link = &node->right;
        }
        fields.count = n;
    }
};

void BM_Chain_Model_ContainsDeepest(benchmark::State& state) {
    const auto n = static_cast<std::int32_t>(state.range(0));
    Chain chain(n);
    for (auto _ : state) {
        benchmark::DoNotOptimize(contains(chain.fields.view(), n - 1));
    }
}
BENCHMARK(BM_Chain_Model_ContainsDeepest)->Arg(20'000)->Arg(100'000)->Arg(1'000'000)->Unit(benchmark::kMicrosecond);

void BM_Chain_Model_RandomElement(benchmark::State& state) {
    Chain chain(static_cast<std::int32_t>(state.range(0)));
    Lcg draws;
    for (auto _ : state) {
        benchmark::DoNotOptimize(random_path_pick(static_cast<const IntegerNode*>(chain.fields.root), draws.source()));
    }
}
BENCHMARK(BM_Chain_Model_RandomElement)->Arg(20'000)->Arg(100'000)->Arg(1'000'000);

void BM_Chain_Model_Clear(benchmark::State& state) {
    for (auto _ : state) {
        state.PauseTiming();
        Chain chain(static_cast<std::int32_t>(state.range(0)));
        state.ResumeTiming();
        IntegerCollection c = chain.fields.view();
        clear(c);
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Chain_Model_Clear)->Arg(20'000)->Arg(100'000)->Arg(1'000'000)->Unit(benchmark::kMicrosecond);

}  // namespace
