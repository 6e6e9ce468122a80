// Loading the lines of a file's bytes: splitting, plain order, balanced order
// against a literal list whose gap closes, and running out of memory at every
// allocation a small load makes.
#include <gtest/gtest.h>

#include <cstdint>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "collections/collections.hpp"
#include "collections/memory.hpp"
#include "collections/random_path.hpp"
#include "loading/load_lines.hpp"

namespace {

using namespace std::string_literals;
using sorvel::StringNode;

// The fields a string collection lives in, with an index unless told not to.
struct Strings {
    StringNode* root = nullptr;
    std::int32_t count = 0;
    sorvel::InsertionIndex<StringNode>* index = nullptr;

    explicit Strings(bool with_index = true) {
        if (with_index) {
            index = sorvel::create_index<StringNode>();
        }
    }
    Strings(const Strings&) = delete;
    Strings& operator=(const Strings&) = delete;
    ~Strings() {
        sorvel::FreeStringTree(root);
        sorvel::destroy_index(index);
    }

    sorvel::StringCollection view() { return sorvel::StringCollection{root, count, index}; }

    std::vector<std::string> in_index_order() const {
        std::vector<std::string> out;
        for (std::uint32_t i = 0; i < index->size(); ++i) {
            out.emplace_back(index->at(i)->value);
        }
        return out;
    }

    // In-order, iteratively: a plain load of sorted lines builds a chain.
    std::vector<const StringNode*> nodes_in_order() const {
        std::vector<const StringNode*> out;
        std::vector<const StringNode*> stack;
        const StringNode* at = root;
        while (at != nullptr || !stack.empty()) {
            while (at != nullptr) {
                stack.push_back(at);
                at = at->left;
            }
            at = stack.back();
            stack.pop_back();
            out.push_back(at);
            at = at->right;
        }
        return out;
    }

    std::set<std::string> held() const {
        std::set<std::string> out;
        for (const StringNode* node : nodes_in_order()) {
            out.emplace(node->value);
        }
        return out;
    }
};

// Draws taken from a script, counted; past its end the script gives 0.
struct ScriptedDraws {
    std::vector<int> values;
    std::size_t calls = 0;

    static int next(void* context) noexcept {
        auto* self = static_cast<ScriptedDraws*>(context);
        const std::size_t at = self->calls++;
        return at < self->values.size() ? self->values[at] : 0;
    }
    sorvel::DrawSource source() { return sorvel::DrawSource{&ScriptedDraws::next, this}; }
};

// Makes the chosen allocation fail, and disarms that whatever happens.
struct FailingAllocation {
    explicit FailingAllocation(long n) { sorvel::memory::fail_allocation_after(n); }
    FailingAllocation(const FailingAllocation&) = delete;
    FailingAllocation& operator=(const FailingAllocation&) = delete;
    ~FailingAllocation() { sorvel::memory::fail_allocation_after(-1); }
};

// Loads a copy of the bytes. The spare byte after them is a letter, so a last
// line that were not terminated in place would carry it into the collection.
void load(Strings& strings, std::string_view bytes, bool case_sensitive, bool balanced, ScriptedDraws& draws) {
    std::vector<char> buffer(bytes.begin(), bytes.end());
    buffer.push_back('#');
    sorvel::StringCollection view = strings.view();
    sorvel::load_lines(view, case_sensitive, buffer.data(), bytes.size(), balanced, draws.source());
}

// Written from the rules on their own, byte by byte with a pending line:
// each line as the collection will store it, cut at its first zero byte.
std::vector<std::string> split_lines(std::string_view bytes) {
    std::vector<std::string> lines;
    std::string pending;
    for (const char byte : bytes) {
        if (byte == '\n' || byte == '\r') {
            if (!pending.empty()) {
                lines.emplace_back(pending.c_str());
                pending.clear();
            }
        } else {
            pending.push_back(byte);
        }
    }
    if (!pending.empty()) {
        lines.emplace_back(pending.c_str());
    }
    return lines;
}

// The balanced order literally: a list in file order, the k-th line counted
// from the front taken out and the gap closed. Kept apart from the library on
// purpose, as the yardstick its faster bookkeeping is measured against.
std::vector<std::string> list_order(const std::vector<std::string>& lines, const std::vector<int>& draws) {
    std::vector<std::uint32_t> list(lines.size());
    for (std::size_t i = 0; i < lines.size(); ++i) {
        list[i] = static_cast<std::uint32_t>(i);
    }
    std::vector<std::string> added;
    std::size_t next_draw = 0;
    while (!list.empty()) {
        const std::size_t k = static_cast<std::size_t>(draws.at(next_draw++) & 0x7FFF) % list.size();
        added.push_back(lines[list[k]]);
        list.erase(list.begin() + static_cast<std::ptrdiff_t>(k));
    }
    return added;
}

std::string fold(const std::string& s) {
    std::string out = s;
    for (char& c : out) {
        if (c >= 'A' && c <= 'Z') {
            c = static_cast<char>(c - 'A' + 'a');
        }
    }
    return out;
}

// What the index holds after these additions into an empty collection: the
// first spelling of each value.
std::vector<std::string> first_of_each(const std::vector<std::string>& additions, bool case_sensitive) {
    std::vector<std::string> kept;
    std::set<std::string> seen;
    for (const std::string& s : additions) {
        if (seen.insert(case_sensitive ? s : fold(s)).second) {
            kept.push_back(s);
        }
    }
    return kept;
}

// Count, tree and index agree: the tree is strictly ordered under the
// comparison, holds `count` nodes, and the index holds each node once.
::testing::AssertionResult consistent(const Strings& strings, bool case_sensitive) {
    const std::vector<const StringNode*> nodes = strings.nodes_in_order();
    for (std::size_t i = 1; i < nodes.size(); ++i) {
        if (sorvel::CompareStrings(nodes[i - 1]->value, nodes[i]->value, case_sensitive) >= 0) {
            return ::testing::AssertionFailure() << "tree out of order at " << i;
        }
    }
    if (static_cast<std::size_t>(strings.count) != nodes.size()) {
        return ::testing::AssertionFailure() << "count " << strings.count << ", nodes " << nodes.size();
    }
    if (strings.index != nullptr) {
        if (strings.index->size() != nodes.size()) {
            return ::testing::AssertionFailure() << "index size " << strings.index->size() << ", nodes "
                                                 << nodes.size();
        }
        const std::set<const StringNode*> in_tree(nodes.begin(), nodes.end());
        std::set<const StringNode*> seen;
        for (std::uint32_t i = 0; i < strings.index->size(); ++i) {
            const StringNode* entry = strings.index->at(i);
            if (in_tree.count(entry) == 0 || !seen.insert(entry).second) {
                return ::testing::AssertionFailure() << "index entry " << i << " is not a distinct tree node";
            }
        }
    }
    return ::testing::AssertionSuccess();
}

struct SplitCase {
    const char* name;
    std::string bytes;
    bool case_sensitive;
    std::size_t lines;                  // lines emitted, duplicates included
    std::vector<std::string> expected;  // what the index gains, in file order
};

const std::vector<SplitCase>& split_cases() {
    static const std::vector<SplitCase> cases = {
        {"CR LF", "a\r\nb\r\n", true, 2, {"a", "b"}},
        {"LF CR", "a\n\rb\n\r", true, 2, {"a", "b"}},
        {"lone CR", "a\rb\rc", true, 3, {"a", "b", "c"}},
        {"lone LF", "a\nb\nc\n", true, 3, {"a", "b", "c"}},
        {"blank lines", "a\n\n\nb", true, 2, {"a", "b"}},
        {"leading terminators", "\r\n\r\nfirst\n", true, 1, {"first"}},
        {"no terminator", "abc", true, 1, {"abc"}},
        {"single byte", "x", true, 1, {"x"}},
        {"empty file", "", true, 0, {}},
        {"only CR and LF", "\r\n\n\r\r\n", true, 0, {}},
        {"single LF", "\n", true, 0, {}},
        {"spaces kept", "  a  \n\t b\t\n", true, 2, {"  a  ", "\t b\t"}},
        {"zero byte inside", "ab\0cd\nef"s, true, 2, {"ab", "ef"}},
        {"zero byte first", "\0xy\nz"s, true, 2, {"", "z"}},
        {"zero byte alone", "\0"s, true, 1, {""}},
        {"zero byte lines", "\0\n\0q\r\0"s, true, 3, {""}},
        {"zero byte last", "ab\0"s, true, 1, {"ab"}},
        {"byte-order mark", "\xEF\xBB\xBF" "first\nsecond", true, 2, {"\xEF\xBB\xBF" "first", "second"}},
        {"bytes above 127", "\xE9t\xE9\r\n\xFF\n\x80", true, 3, {"\xE9t\xE9", "\xFF", "\x80"}},
        {"duplicates", "a\na\n", true, 2, {"a"}},
        {"duplicates apart", "a\nb\na\nb\nc", true, 5, {"a", "b", "c"}},
        {"case-insensitive", "Abc\nabc", false, 2, {"Abc"}},
        {"case-sensitive", "Abc\nabc", true, 2, {"Abc", "abc"}},
        {"folding letters only", "\xC9\n\xE9\nA_\na_", false, 4, {"\xC9", "\xE9", "A_"}},
    };
    return cases;
}

TEST(LoadLinesSplitting, PlainOrderAddsEachLineInFileOrder) {
    for (const SplitCase& c : split_cases()) {
        SCOPED_TRACE(c.name);
        const std::size_t baseline = sorvel::memory::live_allocations();
        {
            Strings strings;
            ScriptedDraws draws;
            load(strings, c.bytes, c.case_sensitive, false, draws);
            EXPECT_EQ(strings.in_index_order(), c.expected);
            EXPECT_EQ(static_cast<std::size_t>(strings.count), c.expected.size());
            EXPECT_EQ(draws.calls, 0U);
            EXPECT_TRUE(consistent(strings, c.case_sensitive));
            EXPECT_EQ(split_lines(c.bytes).size(), c.lines);
        }
        EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
    }
}

TEST(LoadLinesSplitting, BalancedOrderWithZeroDrawsIsFileOrder) {
    for (const SplitCase& c : split_cases()) {
        SCOPED_TRACE(c.name);
        const std::size_t baseline = sorvel::memory::live_allocations();
        {
            Strings strings;
            ScriptedDraws draws;
            load(strings, c.bytes, c.case_sensitive, true, draws);
            EXPECT_EQ(strings.in_index_order(), c.expected);
            EXPECT_EQ(draws.calls, c.lines);
            EXPECT_TRUE(consistent(strings, c.case_sensitive));
        }
        EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
    }
}

TEST(LoadLinesSplitting, WorksWithoutAnIndex) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    for (const bool balanced : {false, true}) {
        Strings strings(false);
        ScriptedDraws draws;
        load(strings, "b\na\r\nc\nb", true, balanced, draws);
        EXPECT_EQ(strings.count, 3);
        EXPECT_EQ(strings.held(), (std::set<std::string>{"a", "b", "c"}));
        EXPECT_TRUE(consistent(strings, true));
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesPlain, SortedLinesBuildAChainThatFreesCleanly) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    {
        std::string bytes;
        std::vector<std::string> expected;
        for (int i = 0; i < 3000; ++i) {
            std::string line = std::to_string(100000 + i);
            bytes += line + "\n";
            expected.push_back(line);
        }
        Strings strings;
        ScriptedDraws draws;
        load(strings, bytes, true, false, draws);
        EXPECT_EQ(strings.in_index_order(), expected);
        EXPECT_TRUE(consistent(strings, true));
        std::size_t depth = 0;
        for (const StringNode* at = strings.root; at != nullptr; at = at->right) {
            ++depth;
        }
        EXPECT_EQ(depth, expected.size());
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesBalanced, ScriptedDrawsPickFromTheFront) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    {
        Strings strings;
        ScriptedDraws draws{{1, 1, 0}};
        load(strings, "a\nb\nc\n", true, true, draws);
        EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"b", "c", "a"}));
        EXPECT_EQ(draws.calls, 3U);
    }
    {
        Strings strings;
        ScriptedDraws draws{{0, 0, 0, 0}};
        load(strings, "a\nb\nc\nd", true, true, draws);
        EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"a", "b", "c", "d"}));
        EXPECT_EQ(draws.calls, 4U);
    }
    {
        // Always the last remaining line: reverse file order.
        Strings strings;
        ScriptedDraws draws{{3, 2, 1, 0}};
        load(strings, "a\nb\nc\nd", true, true, draws);
        EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"d", "c", "b", "a"}));
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesBalanced, OneLineDrawsOnce) {
    Strings strings;
    ScriptedDraws draws{{32767}};
    load(strings, "only\r\n", true, true, draws);
    EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"only"}));
    EXPECT_EQ(draws.calls, 1U);
}

TEST(LoadLinesBalanced, NoLinesNoDraws) {
    for (const char* bytes : {"", "\n", "\r\n\r\n\n"}) {
        Strings strings;
        ScriptedDraws draws{{5, 5, 5}};
        load(strings, bytes, true, true, draws);
        EXPECT_EQ(strings.count, 0);
        EXPECT_EQ(draws.calls, 0U);
    }
}

TEST(LoadLinesBalanced, EveryCopyOfALineDraws) {
    Strings strings;
    ScriptedDraws draws{{2, 0, 0, 0}};
    load(strings, "a\nb\na\nc", true, true, draws);
    // Picks: a (the second copy), a (duplicate, left out), b, c.
    EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"a", "b", "c"}));
    EXPECT_EQ(strings.count, 3);
    EXPECT_EQ(draws.calls, 4U);
}

TEST(LoadLinesBalanced, CaseDecidedByWhichSpellingIsAddedFirst) {
    Strings strings;
    ScriptedDraws draws{{1, 0}};
    load(strings, "Abc\nabc", false, true, draws);
    EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"abc"}));
}

TEST(LoadLinesBalanced, DrawsAreCutTo15Bits) {
    Strings strings;
    // 0x8001 -> 1, 0x10000 -> 0, -1 -> 32767.
    ScriptedDraws draws{{0x8001, 0x10000, -1}};
    load(strings, "a\nb\nc", true, true, draws);
    EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"b", "a", "c"}));
}

TEST(LoadLinesBalanced, SameSetAndCountAsPlain) {
    std::mt19937 random(7);
    std::string bytes;
    for (int i = 0; i < 500; ++i) {
        bytes += std::to_string(random() % 300) + (i % 3 == 0 ? "\r\n" : "\n");
    }
    Strings plain;
    Strings balanced;
    ScriptedDraws none;
    ScriptedDraws draws;
    for (int i = 0; i < 500; ++i) {
        draws.values.push_back(static_cast<int>(random() & 0x7FFF));
    }
    load(plain, bytes, true, false, none);
    load(balanced, bytes, true, true, draws);
    EXPECT_EQ(balanced.count, plain.count);
    EXPECT_EQ(balanced.held(), plain.held());
    EXPECT_EQ(draws.calls, 500U);
}

// Random bytes from a small alphabet, so that files hold blank lines, CR LF
// pairs, duplicates, zero bytes and letters in both cases.
std::string random_file(std::mt19937& random, std::size_t bytes) {
    static const char alphabet[] = {'a', 'b', 'A', 'B', '_', ' ', '\0', '\xE9', '\n', '\r', '\n'};
    std::string out;
    for (std::size_t i = 0; i < bytes; ++i) {
        out.push_back(alphabet[random() % sizeof(alphabet)]);
    }
    return out;
}

void expect_matches_list(const std::string& bytes, bool case_sensitive, std::mt19937& random) {
    const std::vector<std::string> lines = split_lines(bytes);
    std::vector<int> script;
    for (std::size_t i = 0; i < lines.size(); ++i) {
        script.push_back(static_cast<int>(random() & 0x7FFF));
    }
    const std::vector<std::string> expected = first_of_each(list_order(lines, script), case_sensitive);

    Strings strings;
    ScriptedDraws draws{script};
    load(strings, bytes, case_sensitive, true, draws);
    EXPECT_EQ(draws.calls, lines.size());
    EXPECT_EQ(static_cast<std::size_t>(strings.count), expected.size());
    EXPECT_TRUE(strings.in_index_order() == expected);
    EXPECT_TRUE(consistent(strings, case_sensitive));
}

TEST(LoadLinesBalanced, MatchesTheListOnRandomFiles) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    std::mt19937 random(2024);
    for (int round = 0; round < 300; ++round) {
        SCOPED_TRACE(round);
        const std::string bytes = random_file(random, random() % 400);
        expect_matches_list(bytes, round % 2 == 0, random);
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesBalanced, MatchesTheListForEveryLineCountUpTo300) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    std::mt19937 random(5);
    std::string bytes;
    for (int line_count = 1; line_count <= 300; ++line_count) {
        SCOPED_TRACE(line_count);
        bytes += std::to_string(line_count);
        bytes += '\n';
        expect_matches_list(bytes, true, random);
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesBalanced, MatchesTheListBeyond32768Lines) {
    const std::size_t baseline = sorvel::memory::live_allocations();
    std::mt19937 random(99);
    for (const std::size_t line_count : {32769U, 40000U}) {
        SCOPED_TRACE(line_count);
        std::string bytes;
        for (std::size_t i = 0; i < line_count; ++i) {
            // Mostly distinct, some repeated, ends alternating.
            bytes += 'L';
            bytes += std::to_string(random() % (line_count * 4));
            bytes += i % 2 == 0 ? "\n" : "\r\n";
        }
        expect_matches_list(bytes, true, random);
    }
    EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
}

TEST(LoadLinesBalanced, FirstPickIsAmongTheFirst32768Lines) {
    std::string bytes;
    for (int i = 0; i < 40000; ++i) {
        bytes += std::to_string(i) + "\n";
    }
    Strings strings;
    ScriptedDraws draws{{32767}};
    load(strings, bytes, true, true, draws);
    ASSERT_EQ(strings.count, 40000);
    EXPECT_EQ(std::string(strings.index->at(0)->value), "32767");
    EXPECT_EQ(std::string(strings.index->at(1)->value), "0");
    EXPECT_EQ(draws.calls, 40000U);
}

// Counts the allocations one load makes when none fails.
std::uint64_t allocations_of(const std::string& bytes, bool balanced) {
    Strings strings;
    ScriptedDraws draws;
    const std::uint64_t before = sorvel::memory::total_allocations();
    load(strings, bytes, false, balanced, draws);
    return sorvel::memory::total_allocations() - before;
}

// Sweeps a failure over every allocation the load makes (and one past them):
// whatever fails, the collection stays consistent and frees back to baseline.
void sweep_failures(bool balanced) {
    // Ten new lines grow the index twice; a duplicate and a folded duplicate too.
    const std::string bytes = "k\r\nc\nx\nA\r\nq\nb\nK\nz\nm\ne\ng\nc";
    const std::vector<std::string> lines = split_lines(bytes);
    const std::uint64_t total = allocations_of(bytes, balanced);
    ASSERT_GT(total, 10U);
    const std::size_t baseline = sorvel::memory::live_allocations();
    for (std::uint64_t n = 0; n <= total; ++n) {
        SCOPED_TRACE(n);
        {
            Strings strings;
            sorvel::StringCollection view = strings.view();
            ASSERT_TRUE(sorvel::AddStringValue(view, "held", false));
            ScriptedDraws draws{std::vector<int>(lines.size(), 3)};
            {
                FailingAllocation failing(static_cast<long>(n));
                load(strings, bytes, false, balanced, draws);
            }
            EXPECT_TRUE(consistent(strings, false));
            EXPECT_EQ(strings.in_index_order().at(0), "held");
            if (balanced && n == 0) {
                // The bookkeeping itself: nothing added, nothing drawn.
                EXPECT_EQ(strings.count, 1);
                EXPECT_EQ(draws.calls, 0U);
            } else {
                EXPECT_EQ(draws.calls, balanced ? lines.size() : 0U);
                EXPECT_GE(strings.count, n == total ? 11 : 1);
            }
            for (const std::string& s : strings.held()) {
                EXPECT_TRUE(s == "held" || bytes.find(s) != std::string::npos) << s;
            }
            // The collection still works after the failure.
            EXPECT_TRUE(sorvel::AddStringValue(view, "after", false));
            EXPECT_TRUE(consistent(strings, false));
        }
        EXPECT_EQ(sorvel::memory::live_allocations(), baseline);
    }
}

TEST(LoadLinesAllocationFailure, BalancedLoadStaysConsistent) { sweep_failures(true); }

TEST(LoadLinesAllocationFailure, PlainLoadStaysConsistent) { sweep_failures(false); }

TEST(LoadLinesAllocationFailure, LinesAfterAFailedOneAreStillAdded) {
    Strings strings;
    ScriptedDraws draws;
    {
        // The first allocation (the index's room for "d") fails; the three
        // later lines go in.
        FailingAllocation failing(0);
        load(strings, "d\nc\nb\na", true, false, draws);
    }
    EXPECT_EQ(strings.in_index_order(), (std::vector<std::string>{"c", "b", "a"}));
    EXPECT_TRUE(consistent(strings, true));
}

}  // namespace
