// Collections against the standard library's ordered sets: adding and
// looking up a million values, removing from a million-value tree (against
// removal that re-inserts each moved subtree from the root, as the steps are
// first written down), and the heap a held value costs.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <random>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "bench_fields.hpp"
#include "collections/collections.hpp"

namespace {

using namespace sorvel;

constexpr std::size_t kValues = 1'000'000;

const std::vector<std::int32_t>& random_integers() {
    static const std::vector<std::int32_t> values = bench::random_ints(kValues, 20240601);
    return values;
}

const std::vector<std::string>& random_strings() {
    static const std::vector<std::string> values = bench::random_strings(kValues, 20240602, bench::kPrintable);
    return values;
}

template <class T>
std::vector<T> shuffled(const std::vector<T>& values, std::uint32_t seed) {
    std::vector<T> out = values;
    std::shuffle(out.begin(), out.end(), std::mt19937(seed));
    return out;
}

using test::Holder;

void fill(Holder<std::int32_t>& f, const std::vector<std::int32_t>& values) {
    IntegerCollection c = f.view();
    for (const std::int32_t v : values) {
        add(c, v);
    }
}

void fill(Holder<char*>& f, const std::vector<std::string>& values, bool case_sensitive) {
    StringCollection c = f.view();
    for (const std::string& s : values) {
        AddStringValue(c, s.c_str(), case_sensitive);
    }
}

// ---- Add -------------------------------------------------------------------

void BM_Add_Integers_Sorvel(benchmark::State& state) {
    const auto& values = random_integers();
    const bool with_index = state.range(0) != 0;
    for (auto _ : state) {
        Holder<std::int32_t> f(with_index, false);
        fill(f, values);
        benchmark::DoNotOptimize(f.count);
        state.PauseTiming();
        {
            IntegerCollection c = f.view();
            clear(c);
        }
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}
BENCHMARK(BM_Add_Integers_Sorvel)->ArgName("index")->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond);

void BM_Add_Integers_StdSet(benchmark::State& state) {
    const auto& values = random_integers();
    for (auto _ : state) {
        auto* set = new std::set<std::int32_t>();
        for (const std::int32_t v : values) {
            set->insert(v);
        }
        benchmark::DoNotOptimize(set->size());
        state.PauseTiming();
        delete set;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}
BENCHMARK(BM_Add_Integers_StdSet)->Unit(benchmark::kMillisecond);

void BM_Add_Strings_Sorvel(benchmark::State& state) {
    const auto& values = random_strings();
    const bool case_sensitive = state.range(0) != 0;
    for (auto _ : state) {
        Holder<char*> f(false, false);
        fill(f, values, case_sensitive);
        benchmark::DoNotOptimize(f.count);
        state.PauseTiming();
        {
            StringCollection c = f.view();
            clear(c);
        }
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}
BENCHMARK(BM_Add_Strings_Sorvel)->ArgName("case_sensitive")->Arg(1)->Arg(0)->Unit(benchmark::kMillisecond);

void BM_Add_Strings_StdSet(benchmark::State& state) {
    const auto& values = random_strings();
    for (auto _ : state) {
        auto* set = new std::set<std::string>();
        for (const std::string& s : values) {
            set->insert(s);
        }
        benchmark::DoNotOptimize(set->size());
        state.PauseTiming();
        delete set;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * values.size()));
}
BENCHMARK(BM_Add_Strings_StdSet)->Unit(benchmark::kMillisecond);

// ---- Contains --------------------------------------------------------------
// Every value looked up once, in an order unrelated to the adds; half of the
// probes are absent.

template <class T>
std::vector<T> probes_for(const std::vector<T>& held, const std::vector<T>& absent) {
    std::vector<T> probes(held.begin(), held.begin() + static_cast<std::ptrdiff_t>(held.size() / 2));
    probes.insert(probes.end(), absent.begin(), absent.begin() + static_cast<std::ptrdiff_t>(absent.size() / 2));
    return shuffled(probes, 7);
}

const std::vector<std::int32_t>& integer_probes() {
    static const std::vector<std::int32_t> probes = [] {
        return probes_for(random_integers(), bench::random_ints(kValues, 99));
    }();
    return probes;
}

const std::vector<std::string>& string_probes() {
    static const std::vector<std::string> probes = [] {
        std::vector<std::string> absent = random_strings();
        for (auto& s : absent) {
            // One byte longer and '~' at both ends: held only by a
            // one-in-94^7 coincidence.
            s += '~';
            s[0] = '~';
        }
        return probes_for(random_strings(), absent);
    }();
    return probes;
}

void BM_Contains_Integers_Sorvel(benchmark::State& state) {
    Holder<std::int32_t> f(false, false);
    fill(f, random_integers());
    const IntegerCollection c = f.view();
    const auto& probes = integer_probes();
    bench::time_contains(state, c, probes);
}
BENCHMARK(BM_Contains_Integers_Sorvel)->Unit(benchmark::kMillisecond);

void BM_Contains_Integers_StdSet(benchmark::State& state) {
    const auto& values = random_integers();
    const std::set<std::int32_t> set(values.begin(), values.end());
    const auto& probes = integer_probes();
    for (auto _ : state) {
        std::size_t found = 0;
        for (const std::int32_t v : probes) {
            found += set.count(v);
        }
        benchmark::DoNotOptimize(found);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * probes.size()));
}
BENCHMARK(BM_Contains_Integers_StdSet)->Unit(benchmark::kMillisecond);

void BM_Contains_Strings_Sorvel(benchmark::State& state) {
    const bool case_sensitive = state.range(0) != 0;
    Holder<char*> f(false, false);
    fill(f, random_strings(), case_sensitive);
    const StringCollection c = f.view();
    const auto& probes = string_probes();
    for (auto _ : state) {
        std::size_t found = 0;
        for (const std::string& s : probes) {
            found += contains(c, s.c_str(), case_sensitive) ? 1 : 0;
        }
        benchmark::DoNotOptimize(found);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * probes.size()));
}
BENCHMARK(BM_Contains_Strings_Sorvel)->ArgName("case_sensitive")->Arg(1)->Arg(0)->Unit(benchmark::kMillisecond);

void BM_Contains_Strings_StdSet(benchmark::State& state) {
    const auto& values = random_strings();
    const std::set<std::string> set(values.begin(), values.end());
    const auto& probes = string_probes();
    for (auto _ : state) {
        std::size_t found = 0;
        for (const std::string& s : probes) {
            found += set.count(s);
        }
        benchmark::DoNotOptimize(found);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * probes.size()));
}
BENCHMARK(BM_Contains_Strings_StdSet)->Unit(benchmark::kMillisecond);

// ---- Remove ----------------------------------------------------------------
// The literal removal: a tree of its own, built with the same adds so that it
// starts from the library's shape, where each moved subtree is re-inserted by
// walking down from the root. Kept here, apart from the library, as the
// yardstick the library's removal is measured against.

class LiteralIntegerTree {
public:
    struct Node {
        std::int32_t value;
        Node* left;
        Node* right;
    };

    LiteralIntegerTree() = default;
    LiteralIntegerTree(const LiteralIntegerTree&) = delete;
    LiteralIntegerTree& operator=(const LiteralIntegerTree&) = delete;
    ~LiteralIntegerTree() {
        std::vector<Node*> pending{root_};
        while (!pending.empty()) {
            Node* n = pending.back();
            pending.pop_back();
            if (n != nullptr) {
                pending.push_back(n->left);
                pending.push_back(n->right);
                delete n;
            }
        }
    }

    const Node* root() const { return root_; }

    void add(std::int32_t p) {
        Node* fresh = new Node{p, nullptr, nullptr};
        Node** link = &root_;
        while (*link != nullptr) {
            if (p == (*link)->value) {
                delete fresh;
                return;
            }
            link = p > (*link)->value ? &(*link)->right : &(*link)->left;
        }
        *link = fresh;
    }

    void remove(std::int32_t p) {
        if (root_ == nullptr) {
            return;
        }
        Node* removed = nullptr;
        if (root_->value == p) {
            removed = root_;
            root_ = nullptr;
            if (removed->left != nullptr) {
                root_ = removed->left;
                if (removed->right != nullptr) {
                    reinsert(removed->right);
                }
            } else {
                root_ = removed->right;
            }
        } else {
            Node* parent = root_;
            Node** followed = nullptr;
            for (;;) {
                followed = p > parent->value ? &parent->right : &parent->left;
                if (*followed == nullptr) {
                    return;
                }
                if ((*followed)->value == p) {
                    break;
                }
                parent = *followed;
            }
            removed = *followed;
            *followed = nullptr;
            if (removed->left != nullptr) {
                reinsert(removed->left);
            }
            if (removed->right != nullptr) {
                reinsert(removed->right);
            }
        }
        delete removed;
    }

private:
    void reinsert(Node* subtree) {
        Node* at = root_;
        for (;;) {
            Node*& link = subtree->value > at->value ? at->right : at->left;
            if (link == nullptr) {
                link = subtree;
                return;
            }
            at = link;
        }
    }

    Node* root_ = nullptr;
};

// Pre-order comparison of two trees' values and links, without recursion.
template <class A, class B>
bool same_shape(const A* a, const B* b) {
    std::vector<std::pair<const A*, const B*>> pending{{a, b}};
    while (!pending.empty()) {
        auto [x, y] = pending.back();
        pending.pop_back();
        if ((x == nullptr) != (y == nullptr)) {
            return false;
        }
        if (x == nullptr) {
            continue;
        }
        if (x->value != y->value) {
            return false;
        }
        pending.emplace_back(x->left, y->left);
        pending.emplace_back(x->right, y->right);
    }
    return true;
}

// The first `size` random integers are added; a tenth of them, in another
// order, are removed.
struct RemovalRun {
    std::vector<std::int32_t> adds;
    std::vector<std::int32_t> removes;
};

const RemovalRun& removal_run(std::size_t size) {
    static std::vector<std::pair<std::size_t, RemovalRun>> runs;
    for (const auto& [n, run] : runs) {
        if (n == size) {
            return run;
        }
    }
    RemovalRun run;
    run.adds.assign(random_integers().begin(), random_integers().begin() + static_cast<std::ptrdiff_t>(size));
    run.removes = shuffled(run.adds, 11);
    run.removes.resize(size / 10);
    runs.emplace_back(size, std::move(run));
    return runs.back().second;
}

// Both trees are built in every iteration of both contenders, node by node
// alternately, so that each finds the heap and its nodes' placement alike:
// removal is bound by cache misses along the path, and placement would
// otherwise weigh more than the removal steps themselves.
struct BothTrees {
    Holder<std::int32_t> library;
    LiteralIntegerTree literal;

    BothTrees(const std::vector<std::int32_t>& adds, bool with_index) : library(with_index, false) {
        IntegerCollection c = library.view();
        for (const std::int32_t v : adds) {
            add(c, v);
            literal.add(v);
        }
    }
};

// Once per size, untimed: both removals end in the same shape.
bool removals_agree(std::size_t size) {
    const RemovalRun& run = removal_run(size);
    BothTrees trees(run.adds, false);
    if (!same_shape(trees.library.root, trees.literal.root())) {
        return false;
    }
    IntegerCollection c = trees.library.view();
    for (const std::int32_t v : run.removes) {
        remove(c, v);
        trees.literal.remove(v);
    }
    return same_shape(trees.library.root, trees.literal.root());
}

void BM_Remove_Integers_Sorvel(benchmark::State& state) {
    const auto size = static_cast<std::size_t>(state.range(0));
    const bool with_index = state.range(1) != 0;
    if (!removals_agree(size)) {
        state.SkipWithError("the library's removal and the literal one end in different shapes");
        return;
    }
    const RemovalRun& run = removal_run(size);
    for (auto _ : state) {
        state.PauseTiming();
        auto* trees = new BothTrees(run.adds, with_index);
        IntegerCollection c = trees->library.view();
        state.ResumeTiming();
        for (const std::int32_t v : run.removes) {
            remove(c, v);
        }
        benchmark::DoNotOptimize(trees->library.count);
        state.PauseTiming();
        delete trees;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * run.removes.size()));
}
BENCHMARK(BM_Remove_Integers_Sorvel)
    ->ArgNames({"size", "index"})
    ->Args({1'000'000, 0})
    ->Args({20'000, 0})
    ->Iterations(5)
    ->Unit(benchmark::kMillisecond);
// Each removal also closes the gap in an index of up to a million entries,
// seconds per run: one run is enough.
BENCHMARK(BM_Remove_Integers_Sorvel)
    ->ArgNames({"size", "index"})
    ->Args({1'000'000, 1})
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

void BM_Remove_Integers_Literal(benchmark::State& state) {
    const auto size = static_cast<std::size_t>(state.range(0));
    if (!removals_agree(size)) {
        state.SkipWithError("the library's removal and the literal one end in different shapes");
        return;
    }
    const RemovalRun& run = removal_run(size);
    for (auto _ : state) {
        state.PauseTiming();
        auto* trees = new BothTrees(run.adds, false);
        state.ResumeTiming();
        for (const std::int32_t v : run.removes) {
            trees->literal.remove(v);
        }
        benchmark::DoNotOptimize(trees->literal.root());
        state.PauseTiming();
        delete trees;
        state.ResumeTiming();
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * run.removes.size()));
}
BENCHMARK(BM_Remove_Integers_Literal)
    ->ArgNames({"size"})
    ->Arg(1'000'000)
    ->Arg(20'000)
    ->Iterations(5)
    ->Unit(benchmark::kMillisecond);

// ---- Memory ----------------------------------------------------------------
// Heap bytes in use per held value, measured by the C library's allocator
// statistics, so that its own per-block overhead counts for every contender
// alike. std::set's requested bytes are counted by its allocator as well.

std::size_t g_requested = 0;

template <class T>
struct CountingAllocator {
    using value_type = T;
    CountingAllocator() = default;
    template <class U>
    // Implicit: the set rebinds it to its node type.
    CountingAllocator(const CountingAllocator<U>&) noexcept {}
    T* allocate(std::size_t n) {
        g_requested += n * sizeof(T);
        return std::allocator<T>().allocate(n);
    }
    void deallocate(T* p, std::size_t n) noexcept {
        g_requested -= n * sizeof(T);
        std::allocator<T>().deallocate(p, n);
    }
    template <class U>
    bool operator==(const CountingAllocator<U>&) const noexcept {
        return true;
    }
};

using CountedString = std::basic_string<char, std::char_traits<char>, CountingAllocator<char>>;

void report_memory(benchmark::State& state, std::size_t heap, std::size_t requested, std::size_t held) {
    state.counters["heap_bytes_per_value"] = static_cast<double>(heap) / static_cast<double>(held);
    if (requested != 0) {
        state.counters["requested_bytes_per_value"] = static_cast<double>(requested) / static_cast<double>(held);
    }
    state.counters["values"] = static_cast<double>(held);
}

void BM_Memory_Integers_Sorvel(benchmark::State& state) {
    const bool with_index = state.range(0) != 0;
    for (auto _ : state) {
        const std::size_t heap = bench::heap_in_use();
        Holder<std::int32_t> f(with_index, false);
        fill(f, random_integers());
        report_memory(state, bench::heap_in_use() - heap, 0, static_cast<std::size_t>(f.count));
    }
}
BENCHMARK(BM_Memory_Integers_Sorvel)->ArgName("index")->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);

void BM_Memory_Integers_StdSet(benchmark::State& state) {
    for (auto _ : state) {
        const std::size_t heap = bench::heap_in_use();
        const std::size_t requested = g_requested;
        std::set<std::int32_t, std::less<>, CountingAllocator<std::int32_t>> set;
        for (const std::int32_t v : random_integers()) {
            set.insert(v);
        }
        report_memory(state, bench::heap_in_use() - heap, g_requested - requested, set.size());
    }
}
BENCHMARK(BM_Memory_Integers_StdSet)->Iterations(1)->Unit(benchmark::kMillisecond);

void BM_Memory_Strings_Sorvel(benchmark::State& state) {
    const bool with_index = state.range(0) != 0;
    for (auto _ : state) {
        const std::size_t heap = bench::heap_in_use();
        Holder<char*> f(with_index, false);
        fill(f, random_strings(), true);
        report_memory(state, bench::heap_in_use() - heap, 0, static_cast<std::size_t>(f.count));
    }
}
BENCHMARK(BM_Memory_Strings_Sorvel)->ArgName("index")->Arg(0)->Arg(1)->Iterations(1)->Unit(benchmark::kMillisecond);

void BM_Memory_Strings_StdSet(benchmark::State& state) {
    for (auto _ : state) {
        const std::size_t heap = bench::heap_in_use();
        const std::size_t requested = g_requested;
        std::set<CountedString, std::less<>, CountingAllocator<CountedString>> set;
        for (const std::string& s : random_strings()) {
            set.emplace(s.data(), s.size());
        }
        report_memory(state, bench::heap_in_use() - heap, g_requested - requested, set.size());
    }
}
BENCHMARK(BM_Memory_Strings_StdSet)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace
