// What the fuzzer's replays rely on but cannot show themselves: a Windows
// DLL's allocations are counted through its rerouted imports without
// miscounting the blocks its C runtime made before the rerouting, and the
// stdcall check around every call catches a callee that removes the wrong
// bytes. (Failing allocations of every event are the fuzzer's.)
#include <gtest/gtest.h>

#include <filesystem>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "simulated_host.hpp"

#if defined(_WIN32)
#include <windows.h>
#endif

namespace {

using sorvel::simulated::Host;
using sorvel::simulated::Instance;
using sorvel::simulated::Library;
using sorvel::simulated::Param;
using sorvel::simulated::word;

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
