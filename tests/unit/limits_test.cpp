// The core beyond the fuzzer's bounds: chains far deeper than any input
// builds, walks and balanced loads past the 32768 reach of one draw.
#include <gtest/gtest.h>

#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "counting_allocator.hpp"
#include "loading/load_lines.hpp"
#include "model.hpp"
#include "support.hpp"

namespace {

using namespace sorvel;
using sorvel::test::Holder;

// qemu and wine run a million-node chain for minutes; any depth far beyond
// what recursion fits in a small stack proves the point there.
#if defined(_WIN32)
constexpr std::size_t kDeep = 200'000;  // wine gives a thread at least 1 MiB of stack
#elif defined(__i386__)
constexpr std::size_t kDeep = 50'000;
#else
constexpr std::size_t kDeep = 1'000'000;
#endif

std::vector<int> directions(std::size_t n, int pattern) {
    std::vector<int> d(n);
    std::mt19937 random(7);
    for (std::size_t i = 0; i < n; ++i) {
        d[i] = pattern == 2 ? static_cast<int>(random() & 1) : pattern;
    }
    return d;
}

// Every operation on a chain of any depth, on a stack that any recursion
// along it would overflow; everything is freed at the end.
template <class V>
void deep_chain(int pattern) {
    const std::size_t live = test::counting::live();
    const std::vector<int> steps = directions(kDeep, pattern);
    ASSERT_TRUE(sorvel::test::run_on_small_stack([&] {
        Holder<V> h(false, true);
        test::link_chain(h, steps);
        Collection<V> c = h.view();
        const TreeNode<V>* deepest = h.root;
        for (const int d : steps) {
            deepest = d != 0 ? deepest->right : deepest->left;
        }
        const V last = deepest->value;
        std::vector<int> draws(steps.begin(), steps.end());
        draws.push_back(0);
        draws.push_back(32767);
        test::ScriptedDraws scripted{draws};
        const TreeNode<V>* picked = random_path_pick(static_cast<const TreeNode<V>*>(h.root), scripted.source());
        EXPECT_NE(picked, nullptr);
        if constexpr (std::is_same_v<V, char*>) {
            EXPECT_TRUE(contains(c, last, true));
            EXPECT_TRUE(remove(c, last, true));
            EXPECT_TRUE(AddStringValue(c, "0000000000", true));
        } else {
            EXPECT_TRUE(contains(c, last));
            EXPECT_TRUE(remove(c, last));
            EXPECT_TRUE(add(c, V{0}));
        }
        EXPECT_EQ(h.count, static_cast<std::int32_t>(kDeep + 1));
    })) << "the work on the small stack did not finish";
    EXPECT_EQ(test::counting::live(), live);
}

TEST(DeepChains, WorkAndFreeOnASmallStack) {
    for (int pattern : {0, 1, 2}) {  // left, right, zigzag
        SCOPED_TRACE(pattern);
        deep_chain<std::int32_t>(pattern);
        deep_chain<float>(pattern);
        deep_chain<char*>(pattern);
    }
}

// The pick is k + 1 steps down with k below 32768, on a path longer than that.
TEST(RandomPath, PicksOnWalksBeyond32768) {
    const std::vector<int> steps = directions(40'000, 2);
    Holder<std::int32_t> h(false, true);
    test::link_chain(h, steps);
    for (int pick : {0, 1, 16385, 32767}) {
        std::vector<int> draws(steps.begin(), steps.end());
        draws.push_back(1);               // the last node: either way ends the walk
        draws.push_back(pick | 0x10000);  // only the low 15 bits count
        test::ScriptedDraws scripted{draws};
        const IntegerNode* want = h.root;
        for (int step = 0; step <= pick; ++step) {
            want = steps[static_cast<std::size_t>(step)] != 0 ? want->right : want->left;
        }
        EXPECT_EQ(random_path_pick(static_cast<const IntegerNode*>(h.root), scripted.source()), want) << pick;
        EXPECT_EQ(scripted.used, draws.size());
    }
}

// More lines than one draw can reach: the first picks come from the first
// 32768 lines; the result is the reference model's, shape and draws alike.
TEST(BalancedLoad, BeyondTheReachOfOneDraw) {
    constexpr std::size_t kLines = 34'000;
    std::mt19937 random(11);
    std::string file;
    for (std::size_t i = 0; i < kLines; ++i) {
        file += std::to_string(random() % 1'000'000) + (i % 3 == 0 ? "\r\n" : "\n");
    }
    // Mostly the last line within reach, so the model's list stays cheap;
    // now and then any line.
    std::vector<int> draws;
    for (std::size_t left = kLines; left > 0; --left) {
        draws.push_back(left % 7 == 0 ? static_cast<int>(random() & 0x7FFF)
                                      : static_cast<int>(std::min<std::size_t>(left - 1, 32767)));
    }
    Holder<char*> h(false, true);
    StringCollection c = h.view();
    std::string bytes = file + '\0';
    test::ScriptedDraws scripted{draws};
    load_lines(c, false, bytes.data(), file.size(), true, scripted.source());

    sorvel::test::model::Instance model(0, 0);
    sorvel::test::model::Draws model_draws(draws);
    model.load(file, 1, model_draws);
    const auto& m = model.strings();
    EXPECT_EQ(scripted.used, model_draws.used());
    EXPECT_EQ(h.count, m.count);
    EXPECT_EQ(test::shape<char*>(h.root), test::preorder(
                                              m.root, sorvel::test::model::kNone,
                                              [&m](int n) {
                                                  return std::pair{m.at(n).left, m.at(n).right};
                                              },
                                              [&m](int n) { return m.at(n).value; }));
}

}  // namespace
