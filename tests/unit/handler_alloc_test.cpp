// Memory exhaustion through the handlers: every allocation an event makes is
// made to fail in turn, with the library linked in so that its allocator can
// be reached. After each failure the whole instance must be as it was (or,
// for a load, consistent with the lines added so far), and nothing may leak.
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

#include "collections/memory.hpp"
#include "test_host.hpp"

namespace {

namespace fs = std::filesystem;
namespace memory = sorvel::memory;
using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;

// Everything an observer can see of one collection: the tree in order with
// its shape, the count, and the index read back through the expressions.
struct Snapshot {
    std::string tree;
    std::int32_t count = 0;
    std::vector<std::string> index;
    bool operator==(const Snapshot&) const = default;
};

std::string render(NodeView node, int collection) {
    if (!node) {
        return "-";
    }
    std::string value = collection == 0   ? std::to_string(node.integer())
                        : collection == 1 ? std::to_string(node.floating())
                                          : node.string();
    return "(" + render(node.left(), collection) + " " + value + " " + render(node.right(), collection) + ")";
}

std::size_t nodes(NodeView node) {
    std::size_t n = 0;
    // Right spine iteratively, left subtrees recursively: test trees are small.
    for (; node; node = node.right()) {
        n += 1 + nodes(node.left());
    }
    return n;
}

class HandlerMemory : public ::testing::Test {
protected:
    void TearDown() override { memory::fail_allocation_after(-1); }

    Snapshot snapshot(Instance& i, int collection) {
        Snapshot s;
        s.tree = render(NodeView{i.root(collection)}, collection);
        s.count = i.count(collection);
        const char* at = collection == 0 ? "IntegerElementAt(" : collection == 1 ? "FloatElementAt(" : "StringElementAt$(";
        for (std::int32_t p = 0; p < s.count + 1; ++p) {
            const auto result = host.event(i, at, {Param::of(p)});
            s.index.push_back(collection == 0   ? std::to_string(result)
                              : collection == 1 ? std::to_string(Host::float_bits(result))
                                                : Host::text_at(result));
        }
        return s;
    }

    // Builds a fresh instance, runs `prepare`, then `event` with the n-th of
    // its allocations failing, for every n the event makes.
    void sweep(int use_indices, const std::function<void(Instance&)>& prepare,
               const std::function<void(Instance&)>& event, const std::function<void(Instance&, bool)>& check) {
        const std::size_t baseline = memory::live_allocations();
        std::uint64_t made = 0;
        {
            Instance& i = host.create(0, use_indices);
            prepare(i);
            const auto before = memory::total_allocations();
            event(i);
            made = memory::total_allocations() - before;
            host.destroy(i);
        }
        ASSERT_EQ(memory::live_allocations(), baseline);
        for (std::uint64_t n = 0; n < made; ++n) {
            SCOPED_TRACE("allocation " + std::to_string(n) + " of " + std::to_string(made) + " fails");
            Instance& i = host.create(0, use_indices);
            prepare(i);
            const std::size_t live = memory::live_allocations();
            memory::fail_allocation_after(static_cast<long>(n));
            event(i);
            memory::fail_allocation_after(-1);
            check(i, memory::live_allocations() == live);
            host.destroy(i);
            EXPECT_EQ(memory::live_allocations(), baseline);
        }
    }

    Host host{Library::linked_in()};
};

struct AddCase {
    const char* display;
    int collection;
    Param value;
};

TEST_F(HandlerMemory, FailedAddsLeaveEverythingAsItWas) {
    const std::vector<AddCase> cases = {
        {"Add Integer: %0", 0, Param::of(25)},
        {"Add Float: %0", 1, Param::of(2.5F)},
        {"Add String: %0", 2, Param::of("twenty-five")},
    };
    for (const auto& c : cases) {
        for (int use_indices : {0, 1}) {
            SCOPED_TRACE(std::string(c.display) + (use_indices ? " with index" : ""));
            Snapshot before;
            // Eight values fill the index's first block, so the add must grow it.
            auto prepare = [&](Instance& i) {
                for (int v = 0; v < 8; ++v) {
                    host.event(i, c.display,
                               {c.collection == 0   ? Param::of(v * 10)
                                : c.collection == 1 ? Param::of(static_cast<float>(v) * 10)
                                                    : Param::of("value" + std::to_string(v))});
                }
                before = snapshot(i, c.collection);
            };
            sweep(use_indices, prepare, [&](Instance& i) { host.event(i, c.display, {c.value}); },
                  [&](Instance& i, bool nothing_leaked) {
                      EXPECT_EQ(snapshot(i, c.collection), before);
                      EXPECT_TRUE(nothing_leaked);
                  });
        }
    }
}

TEST_F(HandlerMemory, RemoveNeverAllocates) {
    Instance& i = host.create(1, 1);
    for (int v : {5, 3, 8, 1, 4}) {
        host.event(i, "Add Integer: %0", {Param::of(v)});
        host.event(i, "Add String: %0", {Param::of(std::to_string(v))});
    }
    memory::fail_allocation_after(0);
    host.event(i, "Remove Integer: %0", {Param::of(5)});
    host.event(i, "Remove String: %0", {Param::of("3")});
    host.event(i, "Clear Floats");
    memory::fail_allocation_after(-1);
    EXPECT_EQ(i.count(0), 4);
    EXPECT_EQ(i.count(2), 4);
    host.destroy(i);
}

TEST_F(HandlerMemory, CreationWithoutMemoryStillServesEveryEvent) {
    const std::size_t baseline = memory::live_allocations();
    for (long n = 0; n < 4; ++n) {
        SCOPED_TRACE("creation allocation " + std::to_string(n) + " fails");
        memory::fail_allocation_after(n);
        Instance& i = host.create(1, 1);
        memory::fail_allocation_after(-1);
        // Without its indexes the instance behaves as with "Use Indicies" off.
        const bool indexed = i.index(0) != 0;
        EXPECT_EQ(indexed, i.index(1) != 0);
        EXPECT_EQ(indexed, i.index(2) != 0);
        host.event(i, "Add Integer: %0", {Param::of(7)});
        EXPECT_EQ(host.event(i, "IntegersSize("), 1);
        EXPECT_EQ(host.event(i, "IndexOfIntegerElement(", {Param::of(7)}), indexed ? 0 : -1);
        EXPECT_EQ(host.event(i, "IntegerElementAt(", {Param::of(0)}), indexed ? 7 : 0);
        host.destroy(i);
        EXPECT_EQ(memory::live_allocations(), baseline);
    }
}

TEST_F(HandlerMemory, FailedLoadsKeepWhatWasAdded) {
    const fs::path path = fs::temp_directory_path() / "sorvel-alloc-load.txt";
    std::ofstream(path, std::ios::binary) << "delta\nalpha\ncharlie\nbravo\nalpha\necho\n";
    for (int balance : {0, 1}) {
        for (int use_indices : {0, 1}) {
            SCOPED_TRACE("balance " + std::to_string(balance) + " index " + std::to_string(use_indices));
            sweep(use_indices, [](Instance&) {},
                  [&](Instance& i) {
                      host.event(i, "Load From File: %0 into Strings (Balance: %1)",
                                 {Param::of(path.string()), Param::of(balance)});
                  },
                  [&](Instance& i, bool) {
                      EXPECT_EQ(host.open_handles(), 0U);
                      EXPECT_EQ(static_cast<std::size_t>(i.count(2)), nodes(NodeView{i.root(2)}));
                      if (use_indices == 1) {
                          const Snapshot s = snapshot(i, 2);
                          for (std::int32_t p = 0; p < s.count; ++p) {
                              EXPECT_EQ(host.event(i, "IndexOfStringElement(", {Param::of(s.index[static_cast<std::size_t>(p)])}), p);
                          }
                      }
                  });
        }
    }
    fs::remove(path);
}

}  // namespace
