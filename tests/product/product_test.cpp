// The shipped DLL itself, mapped by the 32-bit x86 test host: broken copies
// of it fail to load with a message naming the problem, its generator is
// msvcrt's, and every allocation of an Add or a Load may fail without a
// crash, a leak or a half-made change.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <set>
#include <string>
#include <tuple>
#include <vector>

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

// Unique per process: other builds' tests may run at the same time.
fs::path temp_file(const std::string& name) {
    return fs::temp_directory_path() / ("sorvel-" + std::to_string(::getpid()) + "-" + name);
}

std::string product_path() {
    const char* path = std::getenv("SORVEL_TEST_LIBRARY");
    return path != nullptr ? path : "";
}

Bytes read_file(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

std::uint32_t u32_at(const Bytes& b, std::size_t at) {
    std::uint32_t v = 0;
    std::memcpy(&v, b.data() + at, sizeof v);
    return v;
}

// The file offset of an address in the image, through the section table.
std::size_t file_offset(const Bytes& b, std::uint32_t rva) {
    const std::size_t pe = u32_at(b, 0x3C);
    const std::size_t sections = b[pe + 6] | (b[pe + 7] << 8U);
    const std::size_t table = pe + 24 + (b[pe + 20] | (b[pe + 21] << 8U));
    for (std::size_t s = 0; s < sections; ++s) {
        const std::size_t at = table + s * 40;
        const std::uint32_t address = u32_at(b, at + 12);
        if (rva >= address && rva < address + u32_at(b, at + 16)) {
            return u32_at(b, at + 20) + (rva - address);
        }
    }
    throw std::runtime_error("address outside every section");
}

struct BrokenCopy {
    const char* what;
    std::function<void(Bytes&)> break_it;
    const char* message;
};

TEST(ProductDll, BrokenCopiesFailWithAClearMessage) {
    const Bytes product = read_file(product_path());
    ASSERT_GT(product.size(), 4096U) << "SORVEL_TEST_LIBRARY names the product DLL";
    const std::size_t pe = u32_at(product, 0x3C);
    const BrokenCopy cases[] = {
        {"a missing import",
         [](Bytes& b) {
             const char name[] = "ReadFile";  // with its terminating zero
             auto at = std::search(b.begin(), b.end(), name, name + sizeof name);
             ASSERT_NE(at, b.end());
             at[7] = 'X';
         },
         "unknown import KERNEL32.dll!ReadFilX"},
        {"a corrupted header", [pe](Bytes& b) { b[pe + 1] = 'X'; }, "no PE signature"},
        {"a wrong machine", [pe](Bytes& b) { b[pe + 4] = 0x64, b[pe + 5] = 0x86; }, "wrong machine type 0x8664"},
        {"a truncated file", [](Bytes& b) { b.resize(b.size() / 2); }, "truncated file"},
        {"a cut header", [pe](Bytes& b) { b.resize(pe + 40); }, "truncated file"},
        {"an export ordinal out of range",
         [pe](Bytes& b) {
             const std::size_t exports = file_offset(b, u32_at(b, pe + 24 + 96));
             const std::size_t ordinals = file_offset(b, u32_at(b, exports + 36));
             b[ordinals] = 0xFF, b[ordinals + 1] = 0xFF;
         },
         "out of range"},
        {"an unsupported relocation",
         [pe](Bytes& b) {
             const std::size_t relocations = file_offset(b, u32_at(b, pe + 24 + 96 + 5 * 8));
             b[relocations + 9] = 0x70;  // the first entry's type: 7
         },
         "unsupported relocation type 7"},
    };
    for (const BrokenCopy& c : cases) {
        SCOPED_TRACE(c.what);
        Bytes copy = product;
        c.break_it(copy);
        const fs::path path = temp_file("broken.dll");
        std::ofstream(path, std::ios::binary)
            .write(reinterpret_cast<const char*>(copy.data()), static_cast<std::streamsize>(copy.size()));
        try {
            Library::load(path.string());
            ADD_FAILURE() << "loaded";
        } catch (const std::runtime_error& e) {
            const std::string message = e.what();
            EXPECT_NE(message.find(c.message), std::string::npos) << message;
            EXPECT_NE(message.find(path.string()), std::string::npos) << message;
        }
        fs::remove(path);
    }
}

TEST(ProductDll, DrawsFromMsvcrtsGenerator) {
    const auto library = Library::built();
    EXPECT_EQ(draws::reseed(1, 3), (std::vector<int>{41, 18467, 6334}));
    Host host(library);
    Instance& instance = host.create(0, 0);
    for (std::int32_t v = 0; v < 8; ++v) {
        host.event(instance, "Add Integer: %0", {Param::of(v)});
    }
    // The image's rand steps the generator that reseed predicts.
    draws::reseed(1, 0);
    host.event(instance, "IntegersRandomElement(");
    const std::size_t made = draws::made();
    library->seed_rand(1);
    const auto first = host.event(instance, "IntegersRandomElement(");
    draws::reseed(1, 0);
    EXPECT_EQ(host.event(instance, "IntegersRandomElement("), first);
    EXPECT_EQ(draws::made(), made);
}

// ------------------------------------------------------------ allocation failures

// Everything a host can see of an instance's strings and integers: the trees
// in order, the counts and the indexes.
struct Snapshot {
    std::vector<std::string> trees[2];
    std::vector<std::string> indexes[2];
    std::int32_t counts[2] = {};
    bool operator==(const Snapshot&) const = default;
};

void in_order(NodeView node, int collection, std::vector<std::string>& out) {
    while (node) {  // right spines iteratively: sorted loads make long chains
        in_order(node.left(), collection, out);
        out.push_back(collection == 0 ? std::to_string(node.integer()) : node.string());
        node = node.right();
    }
}

Snapshot snapshot(Host& host, Instance& instance, bool indices) {
    Snapshot s;
    for (int c = 0; c < 2; ++c) {
        const int kind = c == 0 ? 0 : 2;
        in_order(NodeView{instance.root(kind)}, c, s.trees[c]);
        s.counts[c] = instance.count(kind);
        for (std::int32_t p = 0; indices && p < s.counts[c]; ++p) {
            const auto result =
                host.event(instance, c == 0 ? "IntegerElementAt(" : "StringElementAt$(", {Param::of(p)});
            s.indexes[c].push_back(c == 0 ? std::to_string(result) : Host::text_at(result));
        }
    }
    return s;
}

// Sound whatever failed: each count is its tree's size, each index holds
// its tree's values, and the tree is sorted.
void expect_sound(const Snapshot& s, bool indices) {
    for (int c = 0; c < 2; ++c) {
        EXPECT_EQ(static_cast<std::size_t>(s.counts[c]), s.trees[c].size());
        if (indices) {
            EXPECT_EQ(std::multiset<std::string>(s.indexes[c].begin(), s.indexes[c].end()),
                      std::multiset<std::string>(s.trees[c].begin(), s.trees[c].end()));
        }
    }
    EXPECT_TRUE(std::is_sorted(s.trees[1].begin(), s.trees[1].end(), [](const std::string& a, const std::string& b) {
        return std::strcmp(a.c_str(), b.c_str()) < 0;
    }));
}

struct SweepCase {
    const char* what;
    std::vector<const char*> events;  // each with its parameters below
    std::vector<std::vector<Param>> params;
    bool one_change;               // all or nothing; else any subset of the lines
    std::uint64_t allocations[2];  // index off, on: a full index grows once per new value that needs it
};

TEST(ProductDll, EveryAllocationOfAnAddOrALoadMayFail) {
    const auto library = Library::built();
    const auto* allocations = library->allocations();
    ASSERT_NE(allocations, nullptr);
    const fs::path file = temp_file("sweep.txt");
    std::ofstream(file, std::ios::binary) << "delta\nalpha\r\ncharlie\n\nbravo\nalpha\necho";
    constexpr const char* kLoad = "Load From File: %0 into Strings (Balance: %1)";
    const SweepCase cases[] = {
        {"add an integer", {"Add Integer: %0"}, {{Param::of(std::int32_t{7})}}, true, {1, 2}},
        {"add a string", {"Add String: %0"}, {{Param::of("k")}}, true, {1, 2}},
        {"add a string held already", {"Add String: %0"}, {{Param::of("B")}}, true, {0, 0}},
        {"load plain", {kLoad}, {{Param::of(file.string()), Param::of(std::int32_t{0})}}, false, {6, 8}},
        {"load balanced", {kLoad}, {{Param::of(file.string()), Param::of(std::int32_t{1})}}, false, {7, 9}},
    };
    Host host(library);
    for (const SweepCase& c : cases) {
        for (const std::int32_t indices : {0, 1}) {
            SCOPED_TRACE(std::string(c.what) + (indices == 1 ? ", index on" : ", index off"));
            // Eight values held: the next one grows a full index.
            const auto run = [&](long fail) {
                const std::size_t live = allocations->live();
                Instance& instance = host.create(0, indices);
                for (const char* v : {"a", "b", "c", "d", "e", "f", "g", "h"}) {
                    host.event(instance, "Add String: %0", {Param::of(v)});
                    host.event(instance, "Add Integer: %0", {Param::of(static_cast<std::int32_t>(*v))});
                }
                const Snapshot before = snapshot(host, instance, indices == 1);
                draws::reseed(5, 0);
                const std::uint64_t total = allocations->total();
                allocations->fail_after(fail);
                for (std::size_t e = 0; e < c.events.size(); ++e) {
                    host.event(instance, c.events[e], c.params[e]);
                }
                allocations->fail_after(-1);
                const std::uint64_t made = allocations->total() - total;
                const Snapshot after = snapshot(host, instance, indices == 1);
                host.destroy(instance);
                EXPECT_EQ(allocations->live(), live) << "nothing leaks";
                EXPECT_EQ(host.open_handles(), 0U);
                expect_sound(after, indices == 1);
                return std::make_tuple(made, before, after);
            };
            const auto [needed, before, whole] = run(-1);
            EXPECT_EQ(needed, c.allocations[indices]);
            for (long n = 0; static_cast<std::uint64_t>(n) < needed; ++n) {
                SCOPED_TRACE("allocation " + std::to_string(n) + " fails");
                const auto [made, same_before, after] = run(n);
                EXPECT_EQ(same_before, before);
                if (c.one_change) {
                    EXPECT_TRUE(after == before || after == whole);
                } else {
                    EXPECT_EQ(after.trees[0], before.trees[0]);
                    for (const std::string& s : after.trees[1]) {
                        EXPECT_TRUE(std::binary_search(whole.trees[1].begin(), whole.trees[1].end(), s)) << s;
                    }
                }
            }
        }
    }
    fs::remove(file);
    EXPECT_EQ(Library::stack_errors(), 0U);
}

}  // namespace
