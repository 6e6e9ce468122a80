// The built library as a host runs it, where allocations may fail: every
// allocation of an Add or a Load fails in turn without a crash, a leak or a
// half-made change. A Windows DLL is counted through its rerouted imports;
// a shared object that dlopen loaded cannot be, so the library linked in
// stands in for it. Also: the stdcall check catches a wrong callee.
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "draws.hpp"
#include "simulated_host.hpp"
#include "support.hpp"

#if defined(_WIN32)
#include <windows.h>
#endif

namespace {

namespace draws = sorvel::test::draws;
using sorvel::simulated::Host;
using sorvel::simulated::Instance;
using sorvel::simulated::Library;
using sorvel::simulated::NodeView;
using sorvel::simulated::Param;
using sorvel::simulated::Set;
using sorvel::simulated::word;

// The strings in order and both counts: all a failure may change.
std::string contents(Instance& instance) {
    return std::to_string(instance.count(Set::integers)) + "/" + std::to_string(instance.count(Set::strings)) + ":" +
           sorvel::test::preorder(
               instance.root(Set::strings), word{0},
               [](word n) {
                   return std::pair{NodeView{n}.left().address, NodeView{n}.right().address};
               },
               [](word n) { return NodeView{n}.string(); });
}

TEST(Allocation, EveryAllocationOfAnAddOrALoadMayFail) {
#if defined(_WIN32)
    ASSERT_NE(Library::built()->allocations(), nullptr) << "the DLL's allocator imports were not rerouted";
#endif
    Host host(sorvel::test::counted_library());
    const auto* allocations = host.library().allocations();
    ASSERT_NE(allocations, nullptr);
    const auto file =
        std::filesystem::temp_directory_path() / ("sorvel-sweep-" + std::to_string(std::random_device{}()) + ".txt");
    std::ofstream(file, std::ios::binary) << "delta\nalpha\r\ncharlie\n\nbravo\nalpha\necho";
    const std::vector<std::pair<const char*, std::vector<Param>>> events = {
        {"Add Integer: %0", {Param::of(std::int32_t{7})}},
        {"Add String: %0", {Param::of("k")}},
        {"Load From File: %0 into Strings (Balance: %1)", {Param::of(file.string()), Param::of(std::int32_t{0})}},
        {"Load From File: %0 into Strings (Balance: %1)", {Param::of(file.string()), Param::of(std::int32_t{1})}},
    };
    for (const auto& [event, params] : events) {
        for (const std::int32_t indices : {0, 1}) {
            std::string before, whole;
            for (long fail = -1;; ++fail) {  // until the event no longer reaches the failing allocation
                SCOPED_TRACE(std::string(event) + ", index " + std::to_string(indices) + ", failing " +
                             std::to_string(fail));
                const std::size_t live = allocations->live();
                Instance& instance = host.create(0, indices);
                for (const char* v : {"a", "b", "c", "d", "e", "f", "g", "h"}) {  // the next value grows the index
                    host.event(instance, "Add String: %0", {Param::of(v)});
                    host.event(instance, "Add Integer: %0", {Param::of(static_cast<std::int32_t>(*v))});
                }
                before = contents(instance);
                draws::reseed(5, 0);
                const std::uint64_t start = allocations->total();
                allocations->fail_after(fail);
                host.event(instance, event, params);
                allocations->fail_after(-1);
                const bool reached = fail >= 0 && allocations->total() - start >= static_cast<std::uint64_t>(fail);
                const std::string after = contents(instance);
                host.destroy(instance);
                EXPECT_EQ(allocations->live(), live) << "nothing leaks";
                if (fail < 0) {
                    whole = after;
                } else if (std::string(event).rfind("Add", 0) == 0) {
                    EXPECT_TRUE(after == before || after == whole) << after;  // all or nothing
                } else {
                    EXPECT_EQ(after.substr(0, 2), before.substr(0, 2)) << "the integers are untouched";
                }
                if (fail >= 0 && !reached) {
                    EXPECT_EQ(after, whole);
                    break;
                }
            }
        }
    }
    std::filesystem::remove(file);
    EXPECT_EQ(Library::stack_errors(), 0U);
}

#if defined(_WIN32)
// The C runtime in a DLL allocates as it attaches, before the simulated host
// reroutes its imports, and frees that as it detaches: such blocks pass to
// the C runtime uncounted, so loading, using and unloading a second copy
// leaves the count where it was.
TEST(Allocation, BlocksFromBeforeTheReroutingPassUncounted) {
    const auto* allocations = Library::built()->allocations();
    ASSERT_NE(allocations, nullptr);
    const auto copy =
        std::filesystem::temp_directory_path() / ("sorvel-copy-" + std::to_string(std::random_device{}()) + ".dll");
    char built[MAX_PATH] = {};
    ASSERT_NE(GetModuleFileNameA(reinterpret_cast<HMODULE>(Library::built()->module_handle()), built, MAX_PATH), 0U);
    std::filesystem::copy_file(built, copy);
    const std::size_t live = allocations->live();
    {
        Host host(Library::load(copy.string()));
        ASSERT_NE(host.library().allocations(), nullptr);
        Instance& instance = host.create(0, 1);
        host.event(instance, "Add Integer: %0", {Param::of(std::int32_t{1})});
        EXPECT_GT(allocations->live(), live);
    }  // destroyed, then unloaded
    EXPECT_EQ(allocations->live(), live);
    std::filesystem::remove(copy);
}
#endif

#if defined(__i386__)
word __attribute__((stdcall)) takes_one(word a) {
    return a;
}
word __attribute__((stdcall)) takes_two(word a, word b) {
    return a + b;
}
word __attribute__((cdecl)) leaves_two(word a, word b) {
    return a - b;
}

// The check that every end-to-end call passes counts each callee that
// removes other than its own argument bytes, and the calls still return.
TEST(StackCheck, CatchesACalleeThatRemovesTheWrongBytes) {
    static_assert(Library::kChecksStack);
    const auto library = Library::linked_in();
    struct Case {
        void* callee;
        bool one_word;               // else two
        std::optional<word> result;  // none where the callee reads a word it was not given
        std::size_t errors;
    };
    const std::vector<Case> cases = {
        {reinterpret_cast<void*>(&takes_two), false, 8, 0},
        {reinterpret_cast<void*>(&takes_one), false, 5, 1},            // removes 4 bytes of 8
        {reinterpret_cast<void*>(&takes_two), true, std::nullopt, 1},  // removes 8 bytes of 4
        {reinterpret_cast<void*>(&leaves_two), false, 2, 1},           // removes none
    };
    Library::reset_stack_errors();
    for (const Case& c : cases) {
        const std::size_t before = Library::stack_errors();
        const word got = c.one_word ? library->call(c.callee, {5}) : library->call(c.callee, {5, 3});
        if (c.result) {
            EXPECT_EQ(got, *c.result);
        }
        EXPECT_EQ(Library::stack_errors() - before, c.errors) << (c.one_word ? "one word" : "two words");
    }
    Library::reset_stack_errors();
}
#endif

}  // namespace
