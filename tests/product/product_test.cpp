// The shipped DLL itself, mapped by the 32-bit x86 test host: broken copies
// fail to load with a message naming the problem, its generator is msvcrt's,
// and every allocation of an Add or a Load may fail without a crash, a leak
// or a half-made change.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <string>
#include <vector>

#include "support.hpp"
#include "test_host.hpp"

namespace {

namespace draws = sorvel::testhost::draws;
namespace fs = std::filesystem;
using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;
using Bytes = std::vector<unsigned char>;

fs::path temp_file(const std::string& name) {  // other builds' tests may run at the same time
    return fs::temp_directory_path() / ("sorvel-" + std::to_string(::getpid()) + "-" + name);
}

std::uint32_t u32_at(const Bytes& b, std::size_t at) {
    std::uint32_t v = 0;
    std::memcpy(&v, b.data() + at, sizeof v);
    return v;
}

// The file offset of an address in the image, through the section table.
std::size_t file_offset(const Bytes& b, std::uint32_t rva) {
    const std::size_t pe = u32_at(b, 0x3C);
    const std::size_t table = pe + 24 + (b[pe + 20] | (b[pe + 21] << 8U));
    for (std::size_t at = table; at < table + 40U * (b[pe + 6] | (b[pe + 7] << 8U)); at += 40) {
        if (rva >= u32_at(b, at + 12) && rva < u32_at(b, at + 12) + u32_at(b, at + 16)) {
            return u32_at(b, at + 20) + (rva - u32_at(b, at + 12));
        }
    }
    throw std::runtime_error("address outside every section");
}

TEST(ProductDll, BrokenCopiesFailWithAClearMessage) {
    const char* product = std::getenv("SORVEL_TEST_LIBRARY");
    ASSERT_NE(product, nullptr) << "SORVEL_TEST_LIBRARY names the product DLL";
    std::ifstream in(product, std::ios::binary);
    const Bytes dll{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
    const std::size_t pe = u32_at(dll, 0x3C);
    const std::vector<std::pair<std::function<void(Bytes&)>, const char*>> cases = {
        {[](Bytes& b) {
             const char name[] = "ReadFile";  // with its terminating zero
             std::search(b.begin(), b.end(), name, name + sizeof name)[7] = 'X';
         },
         "unknown import KERNEL32.dll!ReadFilX"},
        {[pe](Bytes& b) { b[pe + 1] = 'X'; }, "no PE signature"},
        {[pe](Bytes& b) { b[pe + 4] = 0x64, b[pe + 5] = 0x86; }, "wrong machine type 0x8664"},
        {[](Bytes& b) { b.resize(b.size() / 2); }, "truncated file"},
        {[pe](Bytes& b) { b.resize(pe + 40); }, "truncated file"},
        {[pe](Bytes& b) {
             const std::size_t ordinals = file_offset(b, u32_at(b, file_offset(b, u32_at(b, pe + 120)) + 36));
             b[ordinals] = 0xFF, b[ordinals + 1] = 0xFF;
         },
         "out of range"},
        {[pe](Bytes& b) { b[file_offset(b, u32_at(b, pe + 160)) + 9] = 0x70; }, "unsupported relocation type 7"},
    };
    for (const auto& [break_it, message] : cases) {
        Bytes copy = dll;
        break_it(copy);
        const fs::path path = temp_file("broken.dll");
        std::ofstream(path, std::ios::binary)
            .write(reinterpret_cast<const char*>(copy.data()), static_cast<std::streamsize>(copy.size()));
        try {
            Library::load(path.string());
            ADD_FAILURE() << "loaded, though " << message;
        } catch (const std::runtime_error& e) {
            EXPECT_NE(std::string(e.what()).find(message), std::string::npos) << e.what();
            EXPECT_NE(std::string(e.what()).find(path.string()), std::string::npos) << e.what();
        }
        fs::remove(path);
    }
}

TEST(ProductDll, DrawsFromMsvcrtsGenerator) {
    const auto library = Library::built();  // the generator is the mapped image's
    EXPECT_EQ(draws::reseed(1, 3), (std::vector<int>{41, 18467, 6334}));
}

// The strings in order and both counts: all a failure may change.
std::string contents(Instance& instance) {
    return std::to_string(instance.count(0)) + "/" + std::to_string(instance.count(2)) + ":" +
           sorvel::test::preorder(
               instance.root(2), sorvel::testhost::word{0},
               [](sorvel::testhost::word n) {
                   return std::pair{NodeView{n}.left().address, NodeView{n}.right().address};
               },
               [](sorvel::testhost::word n) { return NodeView{n}.string(); });
}

TEST(ProductDll, EveryAllocationOfAnAddOrALoadMayFail) {
    Host host(Library::built());
    const auto* allocations = host.library().allocations();
    ASSERT_NE(allocations, nullptr);
    const fs::path file = temp_file("sweep.txt");
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
    fs::remove(file);
    EXPECT_EQ(Library::stack_errors(), 0U);
}

}  // namespace
