// Many instances at once, every option value, every event: nothing leaks and
// nothing answers out of turn.
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "collections/memory.hpp"
#include "host/catalogue.hpp"
#include "test_host.hpp"

namespace {

namespace memory = sorvel::memory;
using sorvel::catalogue::Kind;
using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::Param;

#if defined(__x86_64__) && !defined(_WIN32)
constexpr int kRounds = 20;
constexpr int kInstances = 10000;
#else
constexpr int kRounds = 3;  // qemu and wine are slow
constexpr int kInstances = 500;
#endif

TEST(Stress, RoundsOfInstancesLeaveNoAllocationBehind) {
    Host host(Library::linked_in());
    const std::size_t baseline = memory::live_allocations();
    std::mt19937 random(42);
    for (int round = 0; round < kRounds; ++round) {
        std::vector<Instance*> instances;
        instances.reserve(kInstances);
        for (int n = 0; n < kInstances; ++n) {
            Instance& i = host.create(static_cast<std::int32_t>(random() % 4) - 1,
                                      static_cast<std::int32_t>(random() % 4) - 1);
            const int values = static_cast<int>(random() % 12);
            for (int v = 0; v < values; ++v) {
                const auto x = static_cast<std::int32_t>(random() % 64) - 32;
                switch (random() % 5) {
                    case 0: host.event(i, "Add Integer: %0", {Param::of(x)}); break;
                    case 1: host.event(i, "Add Float: %0", {Param::of(static_cast<float>(x) / 4)}); break;
                    case 2: host.event(i, "Add String: %0", {Param::of("s" + std::to_string(x))}); break;
                    case 3: host.event(i, "Remove Integer: %0", {Param::of(x)}); break;
                    default: host.event(i, "Remove String: %0", {Param::of("S" + std::to_string(x))}); break;
                }
            }
            ASSERT_GE(host.event(i, "IntegersSize("), 0);
            host.event(i, "IntegersRandomElement(");
            host.event(i, "StringsRandomElement$(");
            host.event(i, "IndexOfFloatElement(", {Param::of(0.25F)});
            instances.push_back(&i);
        }
        for (Instance* i : instances) {
            host.destroy(*i);
        }
        ASSERT_EQ(memory::live_allocations(), baseline) << "round " << round;
    }
}

// Every event under every combination of option words from -1 to 2: only the
// value 1 turns an option on.
TEST(Stress, EveryEventWithEveryOptionValue) {
    Host host(Library::linked_in());
    const std::size_t baseline = memory::live_allocations();
    for (std::int32_t case_word = -1; case_word <= 2; ++case_word) {
        for (std::int32_t index_word = -1; index_word <= 2; ++index_word) {
            SCOPED_TRACE("options " + std::to_string(case_word) + " " + std::to_string(index_word));
            Instance& i = host.create(case_word, index_word);
            EXPECT_EQ(i.index(0) != 0, index_word == 1);
            for (const auto& e : sorvel::catalogue::kEvents) {
                std::vector<Param> params;
                for (std::size_t p = 0; p < e.param_count; ++p) {
                    switch (e.params[p].value) {
                        case sorvel::catalogue::Value::integer: params.push_back(Param::of(p == 0 ? 0 : 1)); break;
                        case sorvel::catalogue::Value::floating: params.push_back(Param::of(0.5F)); break;
                        case sorvel::catalogue::Value::string: params.push_back(Param::of("Ab")); break;
                    }
                }
                const auto result = host.event(i, e.display, params);
                if (e.kind == Kind::action) {
                    EXPECT_EQ(result, 0) << e.display;
                } else if (e.kind == Kind::condition) {
                    EXPECT_TRUE(result == 0 || result == 1) << e.display;
                }
            }
            // Adds ran before their removes, so the strings hold nothing but
            // the case option decides whether "ab" finds "Ab".
            host.event(i, "Add String: %0", {Param::of("Ab")});
            EXPECT_EQ(host.event(i, "%o: Contains String: %0", {Param::of("ab")}), case_word == 1 ? 0 : 1);
            EXPECT_EQ(host.event(i, "IndexOfStringElement(", {Param::of("Ab")}), index_word == 1 ? 0 : -1);
            host.destroy(i);
        }
    }
    EXPECT_EQ(memory::live_allocations(), baseline);
}

}  // namespace
