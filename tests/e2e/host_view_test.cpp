// The library as a host sees it, where the differential fuzzer does not
// look: the catalogue and information block,
// the parameter word, result flags and space, allocation failure at
// creation, and real files through the system.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "exports_table.hpp"
#include "host/catalogue.hpp"
#include "simulated_host.hpp"
#include "support.hpp"

namespace {

using sorvel::simulated::Host;
using sorvel::simulated::HostCall;
using sorvel::simulated::Instance;
using sorvel::simulated::Library;
using sorvel::simulated::Param;
using sorvel::simulated::RecordLayout;
using sorvel::simulated::Set;
using sorvel::simulated::word;
using Routine = HostCall::Routine;
namespace catalogue = sorvel::catalogue;
namespace expected = sorvel::test::expected;

// One host over the built library, and what every test must leave.
class HostTest : public ::testing::Test {
protected:
    void TearDown() override {
        // On i386 every call into the library is checked for the stdcall
        // contract: the callee must have removed exactly its arguments.
        EXPECT_EQ(Library::stack_errors(), 0U) << "a callee removed the wrong number of argument bytes";
        EXPECT_EQ(host.open_handles(), 0U) << "every opened file is closed";
        EXPECT_EQ(host.bad_closes(), 0U) << "only opened handles are closed";
    }

    Host host{Library::built()};
};

template <class T>
T at(const unsigned char* bytes, std::size_t offset) {
    T v;
    std::memcpy(&v, bytes + offset, sizeof v);
    return v;
}

TEST_F(HostTest, InformationBlockAndHandlerTables) {
    for (unsigned char fill : {0x00, 0xAB}) {
        host.read_infos(fill);
        const unsigned char* b = host.info_block().data();
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoCounts), 3);
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoCounts + 2), 10);
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoCounts + 4), 12);
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoCounts + 6), 28) << "EditRecord size";
        EXPECT_EQ(at<std::uint32_t>(b, RecordLayout::kInfoFlags), expected::kInfoFlags);
        EXPECT_EQ(b[RecordLayout::kInfoLetter], expected::kInfoLetter);
        EXPECT_EQ(b[RecordLayout::kInfoUntouched], fill) << "byte 25 is the host's";
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoZero), 0);
        EXPECT_EQ(std::string(reinterpret_cast<const char*>(b) + RecordLayout::kInfoIdentifier, 4), "LVRS");
        EXPECT_EQ(at<std::uint16_t>(b, RecordLayout::kInfoVersion), expected::kVersion);
        EXPECT_EQ(b[RecordLayout::kInfoSize], fill) << "nothing written beyond the block";
    }
    // Every handler once, each table ending in a null; later loader calls
    // find the same tables.
    const Host::Tables first = host.tables();
    host.dll_main(2);
    host.dll_main(3);
    std::vector<word> handlers;
    for (int kind = 0; kind < 3; ++kind) {
        const std::size_t n = kind == 0 ? 3 : kind == 1 ? 10 : 12;
        for (std::size_t i = 0; i < n; ++i) {
            handlers.push_back(host.table_entry(kind, i));
            EXPECT_NE(handlers.back(), 0);
        }
        EXPECT_EQ(host.table_entry(kind, n), 0);
    }
    std::sort(handlers.begin(), handlers.end());
    EXPECT_EQ(std::unique(handlers.begin(), handlers.end()), handlers.end()) << "25 distinct handlers";
    EXPECT_EQ(host.tables().actions, first.actions);
}

// An instance whose reader or indexes could not be had still serves every
// event, as with the option off, and destruction frees what was had.
TEST(Creation, WithoutMemoryEveryEventStillWorks) {
    Host host(sorvel::test::counted_library());
    const auto* allocations = host.library().allocations();
    ASSERT_NE(allocations, nullptr);
    const std::size_t live = allocations->live();
    for (long failing = 0; failing < 5; ++failing) {
        allocations->fail_after(failing);
        Instance& instance = host.create(0, 1);
        allocations->fail_after(-1);
        host.action(instance, 0, {Param::of(std::int32_t{4})});
        host.action(instance, 6, {Param::of("x")});
        EXPECT_EQ(host.condition(instance, 0, {Param::of(std::int32_t{4})}), 1) << failing;
        EXPECT_EQ(host.expression(instance, 7, {Param::of(std::int32_t{0})}),
                  instance.index(Set::integers) != 0 ? 4 : 0);
        EXPECT_EQ(Host::text_at(host.expression(instance, 5)), "x");
        const auto indexes = std::count_if(sorvel::simulated::kSets.begin(), sorvel::simulated::kSets.end(),
                                           [&](Set set) { return instance.index(set) != 0; });
        EXPECT_TRUE(indexes == 0 || indexes == 3) << "all three indexes or none";
        host.destroy(instance);
        EXPECT_EQ(allocations->live(), live) << "allocation " << failing << " failing";
    }
}

class Files : public HostTest {
protected:
    void SetUp() override {
        std::random_device entropy;
        do {
            dir_ = std::filesystem::temp_directory_path() / ("sorvel-files-" + std::to_string(entropy()));
        } while (!std::filesystem::create_directories(dir_));
    }
    void TearDown() override {
        HostTest::TearDown();
        std::error_code ignored;
        std::filesystem::remove_all(dir_, ignored);
    }
    std::filesystem::path dir_;
};

TEST_F(Files, MissingFilesDirectoriesAndShortReads) {
    const std::string path = (dir_ / "lines.txt").string();
    std::ofstream(path, std::ios::binary) << "one\r\ntwo\nthree";
    struct Case {
        std::string name;
        std::uint32_t overstated;
        std::int32_t strings;
    };
    for (const Case& c : std::vector<Case>{{(dir_ / "none.txt").string(), 0, 0},
                                           {dir_.string(), 0, 0},
                                           {path, 0, 3},
                                           {path, 5, 3},
                                           {path, 100000, 3}}) {
        SCOPED_TRACE(c.name + " overstated by " + std::to_string(c.overstated));
        Instance& instance = host.create(1, 1);
        host.overstate_file_size(c.overstated);
        host.action(instance, 9, {Param::of(c.name), Param::of(std::int32_t{0})});
        host.overstate_file_size(0);
        EXPECT_EQ(instance.count(Set::strings), c.strings);
        EXPECT_EQ(host.open_handles(), 0U);
        if (c.strings == 3) {  // only what the read gave, never bytes beyond it
            EXPECT_EQ(Host::text_at(host.expression(instance, 11, {Param::of(std::int32_t{2})})), "three");
        }
        host.destroy(instance);
    }
}

}  // namespace
