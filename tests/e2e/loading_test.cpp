// Load From File end to end: the host opens real files, the library reads
// them once, splits them into lines and adds them plain or balanced.
#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "test_host.hpp"

namespace {

namespace draws = sorvel::testhost::draws;
namespace fs = std::filesystem;
using sorvel::testhost::Host;
using sorvel::testhost::HostCall;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::Param;

constexpr const char* kLoad = "Load From File: %0 into Strings (Balance: %1)";

#if defined(__x86_64__) && !defined(_WIN32)
constexpr bool kHeavyCases = true;  // large files run on the native build only
#else
constexpr bool kHeavyCases = false;
#endif

class Loading : public ::testing::Test {
protected:
    void SetUp() override {
        static std::atomic<int> serial{0};
        dir_ = fs::temp_directory_path() / ("sorvel-load-" + std::to_string(serial++) + "-" +
                                            std::to_string(reinterpret_cast<std::uintptr_t>(this) % 100000));
        fs::create_directories(dir_);
    }
    void TearDown() override {
        EXPECT_EQ(host.open_handles(), 0U) << "every opened file is closed";
        EXPECT_EQ(Library::stack_errors(), 0U);
        std::error_code ignored;
        fs::remove_all(dir_, ignored);
    }

    std::string file(const std::string& name, const std::string& bytes) {
        const fs::path path = dir_ / name;
        std::ofstream(path, std::ios::binary) << bytes;
        return path.string();
    }

    void load(Instance& i, const std::string& path, std::int32_t balance) {
        host.event(i, kLoad, {Param::of(path), Param::of(balance)});
    }

    // Strings in index order (the instance must keep an index).
    std::vector<std::string> held(Instance& i) {
        std::vector<std::string> out;
        for (std::int32_t p = 0; p < i.count(2); ++p) {
            out.push_back(Host::text_at(host.event(i, "StringElementAt$(", {Param::of(p)})));
        }
        return out;
    }

    Host host{Library::built()};
    fs::path dir_;
};

struct SplitCase {
    const char* name;
    std::string bytes;
    std::vector<std::string> lines;
};

TEST_F(Loading, SplitsLinesAtCrAndLf) {
    const std::vector<SplitCase> cases = {
        {"crlf", "a\r\nb\r\n", {"a", "b"}},
        {"blank lines", "a\n\n\nb", {"a", "b"}},
        {"lfcr and lone cr", "a\n\rb\rc", {"a", "b", "c"}},
        {"no terminator", "abc", {"abc"}},
        {"one byte", "x", {"x"}},
        {"only line ends", "\r\n\n\r\r\n", {}},
        {"empty file", "", {}},
        {"spaces kept", "  a  \n", {"  a  "}},
        {"zero byte inside", std::string("ab\0cd\nz", 7), {"ab", "z"}},
        {"zero byte first", std::string("\0x\ny", 4), {"", "y"}},
        {"byte-order mark", "\xEF\xBB\xBF" "first\nsecond", {"\xEF\xBB\xBF" "first", "second"}},
        {"duplicates", "a\na\n", {"a"}},
        {"folded case", "Abc\nabc\n", {"Abc"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        Instance& i = host.create(0, 1);
        const std::size_t opens = host.opens();
        load(i, file(std::string(c.name) + ".txt", c.bytes), 0);
        EXPECT_EQ(held(i), c.lines);
        EXPECT_EQ(host.opens(), opens + 1);
        host.destroy(i);
    }
}

TEST_F(Loading, CaseSensitiveKeepsBothSpellings) {
    Instance& i = host.create(1, 1);
    load(i, file("case.txt", "Abc\nabc\n"), 0);
    EXPECT_EQ(held(i), (std::vector<std::string>{"Abc", "abc"}));
}

TEST_F(Loading, JoinsWhatIsHeldAndAddsNothingTwice) {
    Instance& i = host.create(1, 1);
    host.event(i, "Add String: %0", {Param::of("b")});
    const std::string path = file("join.txt", "a\nb\nc\n");
    load(i, path, 0);
    EXPECT_EQ(held(i), (std::vector<std::string>{"b", "a", "c"}));
    load(i, path, 0);
    load(i, path, 1);
    EXPECT_EQ(i.count(2), 3);
}

TEST_F(Loading, UnopenableFilesChangeNothing) {
    Instance& i = host.create(1, 1);
    host.event(i, "Add String: %0", {Param::of("kept")});
    const std::string missing = (dir_ / "missing.txt").string();
    const std::string directory = dir_.string();
    for (const std::string& name : {missing, directory}) {
        for (std::int32_t balance : {0, 1}) {
            draws::reseed(5, 4);
            load(i, name, balance);
            EXPECT_EQ(draws::made(), 0U);
            EXPECT_EQ(held(i), (std::vector<std::string>{"kept"}));
        }
    }
    // A null name from the host: nothing is opened, drawn or added.
    host.clear_calls();
    draws::reseed(5, 4);
    host.event(i, kLoad, {Param::null(), Param::of(1)});
    EXPECT_EQ(draws::made(), 0U);
    EXPECT_EQ(host.calls_to(HostCall::Routine::open_file), 0U);
    EXPECT_EQ(held(i), (std::vector<std::string>{"kept"}));
}

TEST_F(Loading, ReadsOnlyWhatTheReadGave) {
    Instance& i = host.create(1, 1);
    host.overstate_file_size(1000);  // the host reports more than the file holds
    load(i, file("short.txt", "a\nb"), 0);
    host.overstate_file_size(0);
    EXPECT_EQ(held(i), (std::vector<std::string>{"a", "b"}));
}

// The order a balanced load must add lines in, from the draws it is given:
// a list in file order, each pick counted from the front, the gap closed.
std::vector<std::string> front_counted(const std::vector<std::string>& lines, const std::vector<int>& d) {
    std::vector<std::size_t> list(lines.size());
    for (std::size_t l = 0; l < list.size(); ++l) {
        list[l] = l;
    }
    std::vector<std::string> order;
    for (std::size_t used = 0; !list.empty(); ++used) {
        const std::size_t k = static_cast<std::size_t>(d.at(used) & 0x7FFF) % list.size();
        order.push_back(lines[list[k]]);
        list.erase(list.begin() + static_cast<std::ptrdiff_t>(k));
    }
    return order;
}

TEST_F(Loading, BalancedOrderFollowsTheDraws) {
    std::mt19937 random(3);
    for (int round = 0; round < 6; ++round) {
        const std::size_t n = round == 5 ? 33000 : 1 + random() % 300;
        if (n > 1000 && !kHeavyCases) {
            continue;
        }
        std::vector<std::string> lines;
        std::string bytes;
        for (std::size_t l = 0; l < n; ++l) {
            lines.push_back("line" + std::to_string(l));
            bytes += lines.back() + (l % 3 == 0 ? "\r\n" : "\n");
        }
        const std::string path = file("balanced" + std::to_string(round) + ".txt", bytes);
        for (std::int32_t balance : {1, 2, -1}) {
            SCOPED_TRACE("round " + std::to_string(round) + " balance " + std::to_string(balance));
            Instance& i = host.create(1, 1);
            const std::vector<int> d = draws::reseed(static_cast<unsigned>(round * 31 + 7), n);
            load(i, path, balance);
            EXPECT_EQ(draws::made(), n);
            EXPECT_EQ(held(i), front_counted(lines, d));
            host.destroy(i);
        }
    }
}

TEST_F(Loading, BalancedDrawsOncePerLineDuplicatesIncluded) {
    Instance& i = host.create(0, 1);
    const std::string path = file("dups.txt", "a\nB\nb\na\n");
    draws::reseed(9, 4);
    load(i, path, 1);
    EXPECT_EQ(draws::made(), 4U);
    EXPECT_EQ(i.count(2), 2);
}

TEST_F(Loading, ScriptedBalancedOrder) {
    if (!draws::scriptable()) {
        GTEST_SKIP() << "seeded draws cover this where rand cannot be scripted";
    }
    Instance& i = host.create(1, 1);
    const std::string path = file("abc.txt", "a\nb\nc\n");
    draws::script({1, 1, 0});
    load(i, path, 1);
    EXPECT_EQ(held(i), (std::vector<std::string>{"b", "c", "a"}));
    EXPECT_EQ(draws::made(), 3U);
}

TEST_F(Loading, LargeFiles) {
    if (!kHeavyCases) {
        GTEST_SKIP() << "large files run on the native build only";
    }
    Instance& i = host.create(1, 0);
    const std::string line(10 * 1024 * 1024, 'x');
    load(i, file("long-line.txt", "a\n" + line + "\nb"), 0);
    EXPECT_EQ(i.count(2), 3);
    EXPECT_EQ(host.event(i, "%o: Contains String: %0", {Param::of(line)}), 1);
    host.destroy(i);

    Instance& many = host.create(1, 0);
    std::string bytes;
    bytes.reserve(12 * 1000000);
    std::mt19937 random(17);
    for (int l = 0; l < 1000000; ++l) {
        bytes += std::to_string(random()) + "-" + std::to_string(l) + "\n";
    }
    const std::string path = file("million.txt", bytes);
    load(many, path, 0);
    EXPECT_EQ(many.count(2), 1000000);
    load(many, path, 1);
    EXPECT_EQ(many.count(2), 1000000);
}

}  // namespace
