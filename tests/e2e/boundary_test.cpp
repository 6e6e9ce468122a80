// The host boundary end to end: the exports of the built library, the
// information block and handler tables, instance creation and destruction,
// how handlers fetch their parameters and how they hand results back.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <optional>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "e2e/e2e_fixture.hpp"
#include "host/platform.hpp"
#include "test_host.hpp"

namespace {

namespace draws = sorvel::testhost::draws;
using sorvel::e2e::HostTest;
using sorvel::testhost::Host;
using sorvel::testhost::HostCall;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;
using sorvel::testhost::RecordLayout;
using sorvel::testhost::word;
using Routine = HostCall::Routine;

constexpr bool kWide = sizeof(void*) == 8;
constexpr word kRecordSize = kWide ? 448 : 408;

// What the host sees of the library: every export with its ordinal and
// argument count; stubs with their fixed result (none when undefined).
struct ExportEntry {
    const char* name;
    int ordinal;
    int args;
    std::optional<word> result;
};

const std::vector<ExportEntry> kWorking = {
    {"GetInfos", 2, 1, {}},         {"GetRunObjectInfos", 59, 2, {}}, {"GetRunObjectDataSize", 80, 2, {}},
    {"CreateRunObject", 50, 3, {}}, {"DestroyRunObject", 51, 2, {}},  {"HandleRunObject", 52, 1, {}},
};

const std::vector<ExportEntry> kStubs = {
    {"UnloadObject", 7, 3, {}},
    {"PrepareToWriteObject", 22, 3, {}},
    {"CreateFromFile", 31, 3, {}},
    {"DuplicateObject", 32, 3, {}},
    {"SetTextAlignment", 39, 3, {}},
    {"SetTextClr", 43, 3, {}},
    {"InitParameter", 69, 3, {}},
    {"EditParameter", 70, 3, {}},
    {"StartFrame", 87, 3, {}},
    {"EndFrame", 88, 3, {}},
    {"ReleaseProperties", 101, 3, {}},
    {"GetDebugItem", 111, 3, {}},
    {"GetConditionMenu", 60, 3, 0},
    {"GetActionMenu", 61, 3, 0},
    {"GetExpressionMenu", 62, 3, 0},
    {"GetPropValue", 102, 3, 0},
    {"GetPropCheck", 105, 3, 0},
    {"GetPropCreateParam", 107, 3, 0},
    {"EditProp", 109, 3, 0},
    {"GetProperties", 100, 3, 1},
    {"IsPropEnabled", 104, 3, 1},
    {"CreateObject", 14, 3, -1},
    {"PutObject", 8, 4, {}},
    {"RemoveObject", 9, 4, {}},
    {"GetObjectRect", 19, 4, {}},
    {"UpdateFileNames", 23, 4, {}},
    {"GetConditionString", 66, 4, {}},
    {"GetActionString", 67, 4, {}},
    {"GetExpressionString", 68, 4, {}},
    {"GetExpressionTitle", 74, 4, {}},
    {"SetPropValue", 103, 4, {}},
    {"SetPropCheck", 106, 4, {}},
    {"ReleasePropCreateParam", 108, 4, {}},
    {"SetTextFont", 41, 4, 1},
    {"SetEditSize", 99, 4, 1},
    {"LoadObject", 6, 4, 0},
    {"EditObject", 18, 4, 0},
    {"GetFilters", 45, 4, 0},
    {"EditorDisplay", 20, 5, {}},
    {"GetParameterString", 71, 5, {}},
    {"GetConditionTitle", 72, 5, {}},
    {"GetActionTitle", 73, 5, {}},
    {"GetExpressionParam", 89, 5, {}},
    {"GetTextFont", 40, 5, 1},
    {"IsTransparent", 21, 5, 0},
    {"GetObjInfos", 36, 7, {}},
    {"GetConditionCodeFromMenu", 63, 2, -1},
    {"GetActionCodeFromMenu", 64, 2, -1},
    {"GetExpressionCodeFromMenu", 65, 2, -1},
    {"Initialize", 25, 2, 0},
    {"UsesFile", 30, 2, 0},
    {"GetTextCaps", 37, 2, 0},
    {"GetTextAlignment", 38, 2, 0},
    {"GetTextClr", 42, 2, 0},
    {"GetConditionInfos", 75, 2, 0},
    {"GetActionInfos", 76, 2, 0},
    {"GetExpressionInfos", 77, 2, 0},
    {"UpdateEditStructure", 78, 2, 0},
    {"StartApp", 85, 2, {}},
    {"EndApp", 86, 2, {}},
    {"EditDebugItem", 112, 2, {}},
    {"Free", 26, 1, 0},
    {"DisplayRunObject", 53, 1, 0},
    {"PauseRunObject", 57, 1, 0},
    {"ContinueRunObject", 58, 1, 0},
    {"GetDebugTree", 110, 1, 0},
    {"GetHelpFileName", 16, 0, 0},
    {"GetDependencies", 44, 0, 0},
};

std::vector<ExportEntry> all_exports() {
    std::vector<ExportEntry> all = kWorking;
    all.insert(all.end(), kStubs.begin(), kStubs.end());
    return all;
}

// Calls a function with the first `n` of up to seven words.
word call_with(const Library& library, void* function, int n, const std::array<word, 7>& w) {
    switch (n) {
        case 0: return library.call(function, {});
        case 1: return library.call(function, {w[0]});
        case 2: return library.call(function, {w[0], w[1]});
        case 3: return library.call(function, {w[0], w[1], w[2]});
        case 4: return library.call(function, {w[0], w[1], w[2], w[3]});
        case 5: return library.call(function, {w[0], w[1], w[2], w[3], w[4]});
        case 6: return library.call(function, {w[0], w[1], w[2], w[3], w[4], w[5]});
        default: return library.call(function, {w[0], w[1], w[2], w[3], w[4], w[5], w[6]});
    }
}

// Argument sets that no stub may read: any dereference of them would fault.
const std::vector<std::array<word, 7>> kAnyArguments = {
    {0, 0, 0, 0, 0, 0, 0},
    {-1, -1, -1, -1, -1, -1, -1},
    {1, 2, 3, 4, 5, 6, 7},
    {0x7FFFFFFF, -0x7FFFFFFF - 1, 0x10, 0x1000, 0xDEAD, 0xBEEF, 0x55555555},
};

std::int32_t i32_at(const std::vector<unsigned char>& bytes, std::size_t offset) {
    std::int32_t v;
    std::memcpy(&v, bytes.data() + offset, sizeof v);
    return v;
}

std::uint16_t u16_at(const std::vector<unsigned char>& bytes, std::size_t offset) {
    std::uint16_t v;
    std::memcpy(&v, bytes.data() + offset, sizeof v);
    return v;
}

word word_at(const std::vector<unsigned char>& bytes, std::size_t offset) {
    word v;
    std::memcpy(&v, bytes.data() + offset, sizeof v);
    return v;
}

word word_at_address(word address) {
    word v;
    std::memcpy(&v, reinterpret_cast<const void*>(address), sizeof v);
    return v;
}

// The n + 1 entries of a handler table at a given address.
std::vector<word> table_words(word table, std::size_t n) {
    std::vector<word> out;
    for (std::size_t i = 0; i <= n; ++i) {
        out.push_back(word_at_address(table + static_cast<word>(i * sizeof(word))));
    }
    return out;
}

std::vector<unsigned char> record_bytes(Instance& instance) {
    return {instance.record(), instance.record() + instance.size()};
}

std::vector<HostCall> calls_of(const Host& host, std::initializer_list<Routine> routines) {
    std::vector<HostCall> out;
    for (const HostCall& c : host.calls()) {
        for (Routine r : routines) {
            if (c.routine == r) {
                out.push_back(c);
            }
        }
    }
    return out;
}

std::vector<HostCall> param_calls(const Host& host) {
    return calls_of(host, {Routine::read_event_param, Routine::read_first_expr_param, Routine::read_next_expr_param});
}

// ------------------------------------------------------------ exports

TEST_F(HostTest, EveryExportIsPresent) {
    for (const ExportEntry& e : all_exports()) {
        EXPECT_NE(host.library().symbol(e.name), nullptr) << e.name;
    }
    EXPECT_EQ(host.library().symbol("NoSuchExport"), nullptr);
}

TEST_F(HostTest, GetInfosAnswersEachCode) {
    struct Case {
        word code;
        word answer;
    };
    const std::vector<Case> cases = {{0, 768},   {1, 0},       {2, 256}, {3, 0},          {4, 0},
                                     {5, 0},     {6, 2},       {7, 247}, {8, 0},          {-1, 0},
                                     {0x100, 0}, {0x10002, 0}, {9, 0},   {0x7FFFFFFF, 0}, {-0x7FFFFFFF - 1, 0}};
    for (const Case& c : cases) {
        EXPECT_EQ(host.library().call_export("GetInfos", {c.code}), c.answer) << "code " << c.code;
    }
}

TEST_F(HostTest, GetRunObjectDataSizeIgnoresItsArguments) {
    EXPECT_EQ(host.run_record_size(), kRecordSize);
    Instance& instance = host.create(0, 0);
    const std::vector<std::array<word, 2>> cases = {
        {0, 0}, {1, 2}, {-1, -1}, {instance.address(), 0x7FFFFFFF}, {0x12345678, instance.address()}};
    for (const auto& c : cases) {
        EXPECT_EQ(host.library().call_export("GetRunObjectDataSize", {c[0], c[1]}), kRecordSize);
    }
}

TEST_F(HostTest, HandleRunObjectGivesTwo) {
    Instance& instance = host.create(0, 0);
    for (word w : {word{0}, word{-1}, word{12345}, instance.address()}) {
        EXPECT_EQ(host.library().call_export("HandleRunObject", {w}), 2) << w;
    }
}

TEST_F(HostTest, StubsGiveTheirFixedResultsForAnyArguments) {
    ASSERT_EQ(kStubs.size() + kWorking.size(), 74U);
    for (const ExportEntry& e : kStubs) {
        void* function = host.library().symbol(e.name);
        ASSERT_NE(function, nullptr) << e.name;
        for (const auto& args : kAnyArguments) {
            const word result = call_with(host.library(), function, e.args, args);
            if (e.result) {
                EXPECT_EQ(result, *e.result) << e.name << " with first word " << args[0];
            }
        }
    }
    EXPECT_TRUE(host.calls().empty()) << "no stub calls the host";
}

TEST_F(HostTest, OrdinalsReachTheNamedExports) {
#if !defined(_WIN32)
    if (!host.library().loader_owned()) {
        GTEST_SKIP() << "ordinals exist in a Windows export table only";
    }
#endif
    for (const ExportEntry& e : all_exports()) {
        void* by_name = host.library().symbol(e.name);
        ASSERT_NE(by_name, nullptr) << e.name;
        EXPECT_EQ(host.library().symbol_by_ordinal(e.ordinal), by_name) << e.name << " @" << e.ordinal;
    }
    // Ordinals start at 2, and the gaps hold nothing.
    EXPECT_EQ(host.library().symbol_by_ordinal(1), nullptr);
    EXPECT_EQ(host.library().symbol_by_ordinal(3), nullptr);
    EXPECT_EQ(host.library().symbol_by_ordinal(113), nullptr);
}

// ------------------------------------------------------------ information block and tables

TEST_F(HostTest, GetRunObjectInfosFillsTheBlock) {
    for (unsigned char fill : {0x00, 0xAB, 0xFF, 0x5A}) {
        for (word first : {word{0}, word{-1}, word{0x1234}}) {
            SCOPED_TRACE(testing::Message() << "fill " << int{fill} << ", first word " << first);
            std::vector<unsigned char> block(RecordLayout::kInfoSize + 32, fill);
            EXPECT_EQ(host.library().call_export("GetRunObjectInfos", {first, reinterpret_cast<word>(block.data())}),
                      1);
            EXPECT_NE(word_at(block, RecordLayout::kInfoConditions), 0);
            EXPECT_NE(word_at(block, RecordLayout::kInfoActions), 0);
            EXPECT_NE(word_at(block, RecordLayout::kInfoExpressions), 0);
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoCounts), 3);
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoCounts + 2), 10);
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoCounts + 4), 12);
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoCounts + 6), 28);
            EXPECT_EQ(i32_at(block, RecordLayout::kInfoFlags), 2305);
            EXPECT_EQ(block[RecordLayout::kInfoLetter], 'd');
            EXPECT_EQ(block[RecordLayout::kInfoUntouched], fill) << "byte 25 is the host's";
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoZero), 0);
            EXPECT_EQ(static_cast<std::uint32_t>(i32_at(block, RecordLayout::kInfoIdentifier)), 0x5352564CU);
            // "SRVL" with 'S' most significant, stored little-endian.
            EXPECT_EQ(std::string(reinterpret_cast<const char*>(block.data()) + RecordLayout::kInfoIdentifier, 4),
                      "LVRS");
            EXPECT_EQ(u16_at(block, RecordLayout::kInfoVersion), 1);
            for (std::size_t i = RecordLayout::kInfoSize; i < block.size(); ++i) {
                EXPECT_EQ(block[i], fill) << "byte " << i << " lies beyond the block";
            }
        }
    }
}

TEST_F(HostTest, HandlerTablesHoldEveryHandlerThenOneNull) {
    const auto t = host.tables();
    const std::vector<std::pair<word, std::size_t>> tables = {{t.conditions, 3}, {t.actions, 10}, {t.expressions, 12}};
    std::vector<word> seen;
    for (const auto& [table, n] : tables) {
        ASSERT_NE(table, 0);
        const std::vector<word> entries = table_words(table, n);
        for (std::size_t i = 0; i < n; ++i) {
            EXPECT_NE(entries[i], 0) << "entry " << i << " of " << n;
            seen.push_back(entries[i]);
        }
        EXPECT_EQ(entries[n], 0) << "the table of " << n << " ends with a null";
    }
    // 25 distinct handlers.
    for (std::size_t i = 0; i < seen.size(); ++i) {
        for (std::size_t j = i + 1; j < seen.size(); ++j) {
            EXPECT_NE(seen[i], seen[j]) << "handlers " << i << " and " << j;
        }
    }
}

TEST_F(HostTest, LaterLoaderCallsGiveTablesOfEqualEntries) {
    const auto first = host.tables();
    const std::vector<word> conditions = table_words(first.conditions, 3);
    const std::vector<word> actions = table_words(first.actions, 10);
    const std::vector<word> expressions = table_words(first.expressions, 12);
    const auto same_entries = [&](const Host::Tables& t) {
        EXPECT_EQ(t.condition_count, 3);
        EXPECT_EQ(t.action_count, 10);
        EXPECT_EQ(t.expression_count, 12);
        EXPECT_EQ(table_words(t.conditions, 3), conditions);
        EXPECT_EQ(table_words(t.actions, 10), actions);
        EXPECT_EQ(table_words(t.expressions, 12), expressions);
        // The tables handed out before stay valid.
        EXPECT_EQ(table_words(first.conditions, 3), conditions);
        EXPECT_EQ(table_words(first.actions, 10), actions);
        EXPECT_EQ(table_words(first.expressions, 12), expressions);
    };
    // Thread attach and detach, then process attach and detach where the test
    // host plays the loader; on Windows the loader keeps those two to itself.
    std::vector<word> reasons = {2, 3};
    if (!host.library().loader_owned()) {
        reasons.push_back(1);
        reasons.push_back(0);
    }
    for (word reason : reasons) {
        SCOPED_TRACE(testing::Message() << "reason " << reason);
        EXPECT_EQ(host.dll_main(reason), 1);
        same_entries(host.tables());
    }
    // A real thread makes the loader call the entry point on Windows.
    std::thread([] {}).join();
    EXPECT_EQ(host.read_infos(), 1);
    same_entries(host.tables());

    // The handlers from the first tables still work.
    Instance& instance = host.create(0, 0);
    host.action(instance, 0, {Param::of(std::int32_t{42})});
    EXPECT_EQ(host.condition(instance, 0, {Param::of(std::int32_t{42})}), 1);
}

// ------------------------------------------------------------ instances

struct CreateCase {
    std::int32_t case_sensitive, use_indices, creation8, creation12;
};

const std::vector<CreateCase> kCreateCases = {
    {0, 0, 0, 0},
    {1, 0, 1, 2},
    {0, 1, -1, 0x7FFFFFFF},
    {1, 1, 0x12345678, -0x12345678},
    {2, 2, 76, 84},  // 2 stays 2 and counts as off
    {-1, -1, -0x7FFFFFFF - 1, 5},
    {0x10001, 0x10001, 0x10001, 0x10001},  // low bits 1, still off
    {0x7FFFFFFF, 0x100, 0, -1},
};

TEST_F(HostTest, CreateRunObjectCopiesOptionsAndCreationWords) {
    for (const CreateCase& c : kCreateCases) {
        SCOPED_TRACE(testing::Message() << "options " << c.case_sensitive << "/" << c.use_indices);
        Instance& instance = host.create(c.case_sensitive, c.use_indices, c.creation8, c.creation12);
        EXPECT_EQ(instance.create_result(), 0);
        EXPECT_EQ(instance.i32(RecordLayout::kCreationWordA), c.creation8);
        EXPECT_EQ(instance.i32(RecordLayout::kCreationWordB), c.creation12);
        EXPECT_EQ(instance.i32(RecordLayout::kCaseSensitive), c.case_sensitive);
        EXPECT_EQ(instance.i32(RecordLayout::kUseIndices), c.use_indices);

        // The reader exists and knows its record.
        const word reader = instance.pointer(RecordLayout::kReader);
        ASSERT_NE(reader, 0);
        EXPECT_EQ(word_at_address(reader), instance.address());

        // Indexes exactly when the option is 1, three distinct ones.
        for (int collection = 0; collection < 3; ++collection) {
            EXPECT_EQ(instance.index(collection) != 0, c.use_indices == 1) << "collection " << collection;
            EXPECT_EQ(instance.root(collection), 0);
            EXPECT_EQ(instance.count(collection), 0);
        }
        if (c.use_indices == 1) {
            EXPECT_NE(instance.index(0), instance.index(1));
            EXPECT_NE(instance.index(1), instance.index(2));
            EXPECT_NE(instance.index(0), instance.index(2));
        }

        // Of the host's header only bytes 76 and 84 are written.
        const std::vector<unsigned char> bytes = record_bytes(instance);
        for (std::size_t i = 0; i < RecordLayout::kReader; ++i) {
            const bool header_pointer =
                i >= RecordLayout::kHeaderPointer && i < RecordLayout::kHeaderPointer + sizeof(word);
            const bool written = (i >= 76 && i < 80) || (i >= 84 && i < 88);
            if (!header_pointer && !written) {
                ASSERT_EQ(bytes[i], 0) << "header byte " << i;
            }
        }
        EXPECT_EQ(instance.pointer(RecordLayout::kHeaderPointer), word_at(bytes, RecordLayout::kHeaderPointer));
        EXPECT_EQ(instance.result_flags(), 0);

        host.destroy(instance);
        EXPECT_EQ(instance.destroy_result(), 0);
        const std::vector<unsigned char> after = record_bytes(instance);
        EXPECT_TRUE(std::equal(after.begin(), after.begin() + RecordLayout::kReader, bytes.begin()))
            << "destruction leaves the host's header alone";
    }
}

TEST_F(HostTest, IndexedInstanceWorksAndIsDestroyed) {
    Instance& instance = host.create(0, 1);
    host.action(instance, 0, {Param::of(std::int32_t{3})});
    host.action(instance, 3, {Param::of(0.5F)});
    host.action(instance, 6, {Param::of("s")});
    EXPECT_EQ(host.expression(instance, 7, {Param::of(std::int32_t{0})}), 3);
    host.destroy(instance);
    EXPECT_EQ(instance.destroy_result(), 0);
}

TEST_F(HostTest, DestroyRunObjectIgnoresItsSecondWord) {
    for (word second : {word{0}, word{-1}, word{0x5A5A5A5A}}) {
        Instance& instance = host.create(1, 1);
        host.action(instance, 0, {Param::of(std::int32_t{1})});
        host.action(instance, 6, {Param::of("s")});
        host.destroy(instance, second);
        EXPECT_EQ(instance.destroy_result(), 0) << second;
    }
}

TEST_F(HostTest, SecondInstanceLeavesTheFirstUntouched) {
    Instance& first = host.create(1, 1, 7, 8);
    host.action(first, 0, {Param::of(std::int32_t{1})});
    host.action(first, 6, {Param::of("first")});
    const std::vector<unsigned char> before = record_bytes(first);

    Instance& second = host.create(0, 0, 9, 10);
    host.action(second, 0, {Param::of(std::int32_t{2})});
    host.action(second, 3, {Param::of(2.0F)});
    host.action(second, 6, {Param::of("second")});
    EXPECT_EQ(record_bytes(first), before);
    host.destroy(second);
    EXPECT_EQ(record_bytes(first), before);

    EXPECT_EQ(first.count(0), 1);
    EXPECT_EQ(host.condition(first, 0, {Param::of(std::int32_t{1})}), 1);
    EXPECT_EQ(host.condition(first, 0, {Param::of(std::int32_t{2})}), 0);
    EXPECT_EQ(host.condition(first, 2, {Param::of("first")}), 1);
    EXPECT_EQ(host.condition(first, 2, {Param::of("second")}), 0);
}

// ------------------------------------------------------------ parameters

// Every event with the parameter fetches the host must see, in order.
struct Fetch {
    Routine routine;
    word form;  // selector for event parameters, type for expression ones
};

struct EventCase {
    int kind;  // 0 condition, 1 action, 2 expression
    std::size_t number;
    const char* name;
    std::vector<Param> params;
    std::vector<Fetch> fetches;
};

constexpr Routine kEvent = Routine::read_event_param;
constexpr Routine kFirst = Routine::read_first_expr_param;
const char* const kMissingFile = "sorvel-no-such-directory/no-such-file.txt";

std::vector<EventCase> event_cases() {
    const auto i = [](std::int32_t v) { return Param::of(v); };
    const auto f = [](float v) { return Param::of(v); };
    const auto s = [](const char* v) { return Param::of(v); };
    return {
        {0, 0, "Contains Integer", {i(1)}, {{kEvent, 0}}},
        {0, 1, "Contains Float", {f(1.5F)}, {{kEvent, 2}}},
        {0, 2, "Contains String", {s("a")}, {{kEvent, -1}}},
        {1, 0, "Add Integer", {i(1)}, {{kEvent, 0}}},
        {1, 1, "Remove Integer", {i(1)}, {{kEvent, 0}}},
        {1, 2, "Clear Integers", {}, {}},
        {1, 3, "Add Float", {f(1.5F)}, {{kEvent, 2}}},
        {1, 4, "Remove Float", {f(1.5F)}, {{kEvent, 2}}},
        {1, 5, "Clear Floats", {}, {}},
        {1, 6, "Add String", {s("a")}, {{kEvent, -1}}},
        {1, 7, "Remove String", {s("a")}, {{kEvent, -1}}},
        {1, 8, "Clear Strings", {}, {}},
        {1, 9, "Load From File", {s(kMissingFile), i(0)}, {{kEvent, -1}, {kEvent, 0}}},
        {2, 0, "IntegersSize(", {}, {}},
        {2, 1, "IntegersRandomElement(", {}, {}},
        {2, 2, "FloatsSize(", {}, {}},
        {2, 3, "FloatsRandomElement(", {}, {}},
        {2, 4, "StringsSize(", {}, {}},
        {2, 5, "StringsRandomElement$(", {}, {}},
        {2, 6, "IndexOfIntegerElement(", {i(1)}, {{kFirst, 0}}},
        {2, 7, "IntegerElementAt(", {i(0)}, {{kFirst, 0}}},
        {2, 8, "IndexOfFloatElement(", {f(1.5F)}, {{kFirst, 2}}},
        {2, 9, "FloatElementAt(", {i(0)}, {{kFirst, 0}}},
        {2, 10, "IndexOfStringElement(", {s("a")}, {{kFirst, 1}}},
        {2, 11, "StringElementAt$(", {i(0)}, {{kFirst, 0}}},
    };
}

word run(Host& host, Instance& instance, const EventCase& e, word param_word = 0) {
    switch (e.kind) {
        case 0: return host.condition(instance, e.number, e.params);
        case 1: return host.action(instance, e.number, e.params);
        default: return host.expression(instance, e.number, e.params, param_word);
    }
}

TEST_F(HostTest, EachHandlerFetchesItsParametersInOrder) {
    for (const EventCase& e : event_cases()) {
        SCOPED_TRACE(e.name);
        // With something in every collection, so no handler stops early.
        Instance& instance = host.create(0, 1);
        host.action(instance, 0, {Param::of(std::int32_t{1})});
        host.action(instance, 3, {Param::of(1.5F)});
        host.action(instance, 6, {Param::of("a")});
        host.clear_calls();
        const std::size_t missing = host.missing_params();

        const word result = run(host, instance, e);
        const std::vector<HostCall> fetches = param_calls(host);
        ASSERT_EQ(fetches.size(), e.fetches.size());
        for (std::size_t k = 0; k < fetches.size(); ++k) {
            EXPECT_EQ(fetches[k].routine, e.fetches[k].routine) << "fetch " << k;
            ASSERT_EQ(fetches[k].args.size(), 3U);
            EXPECT_EQ(fetches[k].args[0], instance.address());
            EXPECT_EQ(fetches[k].args[1], e.fetches[k].form) << "fetch " << k;
            EXPECT_EQ(fetches[k].args[2], 0) << "fetch " << k;
        }
        EXPECT_EQ(host.unconsumed_params(), 0U);
        EXPECT_EQ(host.missing_params(), missing);
        if (e.kind == 0) {
            EXPECT_EQ(result, 1) << "every condition holds here";
        } else if (e.kind == 1) {
            EXPECT_EQ(result, 0) << "actions give 0";
        }
        host.destroy(instance);
    }
}

TEST_F(HostTest, ExpressionsStartFromTheFirstParameterOnEveryCall) {
    for (const EventCase& e : event_cases()) {
        if (e.kind != 2 || e.fetches.empty()) {
            continue;
        }
        SCOPED_TRACE(e.name);
        Instance& instance = host.create(0, 1);
        host.clear_calls();
        run(host, instance, e);
        run(host, instance, e);
        EXPECT_EQ(host.calls_to(Routine::read_first_expr_param), 2U);
        EXPECT_EQ(host.calls_to(Routine::read_next_expr_param), 0U);
        EXPECT_EQ(host.calls_to(Routine::read_event_param), 0U);
        host.destroy(instance);
    }
}

TEST_F(HostTest, IndexOfFloatElementAsksForAFloat) {
    Instance& instance = host.create(0, 1);
    host.action(instance, 3, {Param::of(0.25F)});
    host.action(instance, 3, {Param::of(-3.5F)});
    host.clear_calls();
    EXPECT_EQ(host.expression(instance, 8, {Param::of(-3.5F)}), 1);
    const std::vector<HostCall> fetches = param_calls(host);
    ASSERT_EQ(fetches.size(), 1U);
    EXPECT_EQ(fetches[0].routine, kFirst);
    EXPECT_EQ(fetches[0].args[1], 2);
    // The float's bits arrive unchanged.
    EXPECT_EQ(static_cast<std::uint32_t>(fetches[0].result), std::bit_cast<std::uint32_t>(-3.5F));
}

TEST_F(HostTest, OnlyTheLowSixteenBitsOfTheParameterWordReachTheHost) {
    struct Case {
        word given;
        word arrives;
    };
    std::vector<Case> cases = {
        {0, 0},
        {1, 1},
        {0x7FFF, 0x7FFF},
        {0x8000, -0x8000},
        {0xFFFF, -1},  // 2^16 - 1
        {0x10000, 0},
        {0x10001, 1},  // 2^16 + 1
        {-1, -1},
        {-2, -2},
        {0x12345678, 0x5678},
        {0x7FFF8000, -0x8000},
        {-0x7FFFFFFF - 1, 0},
        {-0x10000 + 5, 5},
    };
    if constexpr (kWide) {
        cases.push_back({static_cast<word>(0x123456789ABCDEF0LL), -0x2110});
        cases.push_back({static_cast<word>(0x100000001LL), 1});
        cases.push_back({static_cast<word>(-0x7FFFFFFFFFFFFFFFLL - 1), 0});
    }
    for (const EventCase& e : event_cases()) {
        if (e.kind != 2 || e.fetches.empty()) {
            continue;
        }
        Instance& instance = host.create(0, 1);
        for (const Case& c : cases) {
            SCOPED_TRACE(testing::Message() << e.name << " word " << c.given);
            host.clear_calls();
            run(host, instance, e, c.given);
            const std::vector<HostCall> fetches = param_calls(host);
            ASSERT_EQ(fetches.size(), 1U);
            EXPECT_EQ(fetches[0].args[2], c.arrives);
        }
        host.destroy(instance);
    }
}

TEST_F(HostTest, LoadFromFileReadsNameThenFlagBeforeOpening) {
    Instance& instance = host.create(0, 1);
    host.action(instance, 6, {Param::of("kept")});
    draws::reseed(3, 0);
    host.clear_calls();
    EXPECT_EQ(host.action(instance, 9, {Param::of(kMissingFile), Param::of(std::int32_t{1})}), 0);
    const std::vector<HostCall>& calls = host.calls();
    ASSERT_EQ(calls.size(), 3U);
    EXPECT_EQ(calls[0].routine, kEvent);
    EXPECT_EQ(calls[0].args[1], -1);
    EXPECT_EQ(calls[1].routine, kEvent);
    EXPECT_EQ(calls[1].args[1], 0);
    EXPECT_EQ(calls[2].routine, Routine::open_file);
    EXPECT_EQ(calls[2].args[0], calls[0].result) << "the name exactly as the host gave it";
    EXPECT_NE(calls[2].args[1], 0);
    EXPECT_EQ(calls[2].args[2], 0);
    EXPECT_EQ(calls[2].result, -1);
    EXPECT_EQ(host.opens(), 0U);
    EXPECT_EQ(instance.count(2), 1);
    EXPECT_EQ(draws::made(), 0U) << "a file that cannot be opened draws nothing";
}

class FileTest : public HostTest {
protected:
    void SetUp() override {
        // A fresh directory of its own, also when other builds run these tests.
        std::random_device entropy;
        do {
            dir_ = std::filesystem::temp_directory_path() / ("sorvel-boundary-" + std::to_string(entropy()));
        } while (!std::filesystem::create_directories(dir_));
    }
    void TearDown() override {
        HostTest::TearDown();
        std::error_code ignored;
        std::filesystem::remove_all(dir_, ignored);
    }
    std::string file(const std::string& name, const std::string& bytes) {
        const std::filesystem::path path = dir_ / name;
        std::ofstream(path, std::ios::binary) << bytes;
        return path.string();
    }
    std::filesystem::path dir_;
};

TEST_F(FileTest, LoadFromFileOpensReadsAndClosesOnce) {
    const std::string path = file("lines.txt", "one\r\ntwo\n");
    for (std::int32_t balance : {0, 1}) {
        SCOPED_TRACE(testing::Message() << "balance " << balance);
        Instance& instance = host.create(1, 1);
        host.clear_calls();
        draws::reseed(5, 2);
        host.action(instance, 9, {Param::of(path), Param::of(balance)});
        EXPECT_EQ(host.opens(), host.closes());
        const std::vector<HostCall> files = calls_of(host, {Routine::open_file, Routine::close_file});
        ASSERT_EQ(files.size(), 2U);
        EXPECT_EQ(files[0].routine, Routine::open_file);
        EXPECT_EQ(files[1].routine, Routine::close_file);
        ASSERT_EQ(files[1].args.size(), 1U);
        EXPECT_EQ(files[1].args[0], files[0].result);
        EXPECT_EQ(instance.count(2), 2);
        EXPECT_EQ(draws::made(), balance == 0 ? 0U : 2U) << "one draw per line when balanced";
        host.destroy(instance);
    }
    EXPECT_EQ(host.opens(), 2U);
}

TEST_F(FileTest, ADirectoryDoesNotOpen) {
    Instance& instance = host.create(1, 1);
    host.clear_calls();
    host.action(instance, 9, {Param::of(dir_.string()), Param::of(std::int32_t{0})});
    const std::vector<HostCall> files = calls_of(host, {Routine::open_file, Routine::close_file});
    ASSERT_EQ(files.size(), 1U);
    EXPECT_EQ(files[0].result, -1);
    EXPECT_EQ(instance.count(2), 0);
}

// ------------------------------------------------------------ results

TEST_F(HostTest, FloatExpressionsMarkTheirResultEvenForZero) {
    for (std::uint16_t preset :
         {std::uint16_t{0}, std::uint16_t{1}, std::uint16_t{0x8000}, std::uint16_t{0x4000}, std::uint16_t{0x3FFF}}) {
        for (std::size_t number : {std::size_t{3}, std::size_t{9}}) {
            SCOPED_TRACE(testing::Message() << "expression " << number << ", flags " << preset);
            Instance& instance = host.create(0, 1);
            instance.set_result_flags(preset);
            const word result = host.expression(
                instance, number, number == 9 ? std::vector{Param::of(std::int32_t{0})} : std::vector<Param>{});
            EXPECT_EQ(result, 0) << "the bits of +0.0";
            EXPECT_EQ(instance.result_flags(), preset | 0x4000);
            host.destroy(instance);
        }
    }
}

TEST_F(HostTest, FloatExpressionsGiveTheFloatsBits) {
    Instance& instance = host.create(0, 1);
    host.action(instance, 3, {Param::of(-1.25F)});
    EXPECT_EQ(Host::float_bits(host.expression(instance, 9, {Param::of(std::int32_t{0})})), -1.25F);
    EXPECT_EQ(Host::float_bits(host.expression(instance, 3)), -1.25F);
    EXPECT_EQ(instance.result_flags(), 0x4000);
}

TEST_F(HostTest, IntegerExpressionsLeaveTheFlags) {
    for (std::uint16_t preset : {std::uint16_t{0}, std::uint16_t{0x1234}, std::uint16_t{0xC000}}) {
        for (const EventCase& e : event_cases()) {
            if (e.kind != 2 || e.number == 3 || e.number == 5 || e.number == 9 || e.number == 11) {
                continue;
            }
            SCOPED_TRACE(testing::Message() << e.name << ", flags " << preset);
            Instance& instance = host.create(0, 1);
            host.action(instance, 0, {Param::of(std::int32_t{1})});
            instance.set_result_flags(preset);
            run(host, instance, e);
            EXPECT_EQ(instance.result_flags(), preset);
            host.destroy(instance);
        }
    }
}

TEST_F(HostTest, EmptyStringResultTakesAOneByteBuffer) {
    for (std::uint16_t preset : {std::uint16_t{0}, std::uint16_t{0x4000}, std::uint16_t{0x0101}}) {
        for (std::size_t number : {std::size_t{5}, std::size_t{11}}) {
            SCOPED_TRACE(testing::Message() << "expression " << number << ", flags " << preset);
            Instance& instance = host.create(0, 1);
            instance.set_result_flags(preset);
            host.clear_calls();
            const word result = host.expression(
                instance, number, number == 11 ? std::vector{Param::of(std::int32_t{0})} : std::vector<Param>{});
            const std::vector<HostCall> allocs = calls_of(host, {Routine::alloc_result_string});
            ASSERT_EQ(allocs.size(), 1U);
            EXPECT_EQ(allocs[0].args, (std::vector<word>{instance.address(), 0, 1}));
            EXPECT_EQ(result, allocs[0].result);
            ASSERT_NE(result, 0);
            EXPECT_EQ(*reinterpret_cast<const char*>(result), '\0');
            EXPECT_EQ(instance.result_flags(), preset | 0x8000);
            host.destroy(instance);
        }
    }
}

TEST_F(HostTest, StringResultIsCopiedIntoHostSpace) {
    Instance& instance = host.create(1, 1);
    host.action(instance, 6, {Param::of("hello")});
    for (std::size_t number : {std::size_t{5}, std::size_t{11}}) {
        host.clear_calls();
        const word result = host.expression(
            instance, number, number == 11 ? std::vector{Param::of(std::int32_t{0})} : std::vector<Param>{});
        const std::vector<HostCall> allocs = calls_of(host, {Routine::alloc_result_string});
        ASSERT_EQ(allocs.size(), 1U);
        EXPECT_EQ(allocs[0].args[2], 6);
        EXPECT_EQ(result, allocs[0].result);
        EXPECT_EQ(Host::text_at(result), "hello");
        EXPECT_NE(result, NodeView{instance.root(2)}.address) << "a copy, not the stored string";
    }
}

TEST_F(HostTest, NoResultBufferGivesAnEmptyString) {
    Instance& instance = host.create(1, 1);
    for (bool filled : {false, true}) {
        if (filled) {
            host.action(instance, 6, {Param::of("text")});
        }
        host.give_no_result_buffer(true);
        for (std::size_t number : {std::size_t{5}, std::size_t{11}}) {
            SCOPED_TRACE(testing::Message() << "expression " << number << (filled ? ", filled" : ", empty"));
            host.clear_calls();
            const word result = host.expression(
                instance, number, number == 11 ? std::vector{Param::of(std::int32_t{0})} : std::vector<Param>{});
            EXPECT_EQ(host.calls_to(Routine::alloc_result_string), 1U);
            ASSERT_NE(result, 0);
            EXPECT_EQ(Host::text_at(result), "");
        }
        host.give_no_result_buffer(false);
    }
}

// ------------------------------------------------------------ collections through the tables

TEST_F(HostTest, AddAndContainThroughTheTables) {
    Instance& instance = host.create(0, 0);
    host.action(instance, 0, {Param::of(std::int32_t{5})});
    host.action(instance, 0, {Param::of(std::int32_t{-7})});
    host.action(instance, 0, {Param::of(std::int32_t{5})});
    EXPECT_EQ(instance.count(0), 2);
    EXPECT_EQ(host.condition(instance, 0, {Param::of(std::int32_t{-7})}), 1);
    EXPECT_EQ(host.condition(instance, 0, {Param::of(std::int32_t{6})}), 0);
    const NodeView root{instance.root(0)};
    ASSERT_TRUE(root);
    EXPECT_EQ(root.integer(), 5);
    ASSERT_TRUE(root.left());
    EXPECT_EQ(root.left().integer(), -7);
    EXPECT_FALSE(root.right());

    host.action(instance, 3, {Param::of(2.5F)});
    EXPECT_EQ(instance.count(1), 1);
    EXPECT_EQ(host.condition(instance, 1, {Param::of(2.5F)}), 1);
    EXPECT_EQ(host.condition(instance, 1, {Param::of(2.0F)}), 0);
    EXPECT_EQ(NodeView{instance.root(1)}.floating(), 2.5F);

    // The host's parameter string is freed when the handler returns: what is
    // stored is the library's own copy.
    host.action(instance, 6, {Param::of("Abc")});
    EXPECT_EQ(instance.count(2), 1);
    EXPECT_EQ(NodeView{instance.root(2)}.string(), "Abc");
    EXPECT_EQ(host.condition(instance, 2, {Param::of("aBC")}), 1) << "case folded when the option is off";

    Instance& sensitive = host.create(1, 0);
    host.action(sensitive, 6, {Param::of("Abc")});
    EXPECT_EQ(host.condition(sensitive, 2, {Param::of("aBC")}), 0);
    EXPECT_EQ(host.condition(sensitive, 2, {Param::of("Abc")}), 1);
}

TEST_F(HostTest, EventsByDisplayStringReachTheirHandlers) {
    Instance& instance = host.create(0, 1);
    host.event(instance, "Add Integer: %0", {Param::of(std::int32_t{9})});
    EXPECT_EQ(host.event(instance, "%o: Contains Integer: %0", {Param::of(std::int32_t{9})}), 1);
    EXPECT_EQ(host.event(instance, "IntegersSize("), 1);
    EXPECT_EQ(host.event(instance, "IndexOfIntegerElement(", {Param::of(std::int32_t{9})}), 0);
    EXPECT_THROW(host.event(instance, "No Such Event"), std::invalid_argument);
}

// ------------------------------------------------------------ the test host's own checks

TEST(StackCheck, CatchesACalleeThatRemovesTheWrongBytes) {
#if defined(__i386__) && !defined(_WIN32)
    struct Callees {
        static word SORVEL_CALL two(word a, word b) { return a + b; }
        static word __attribute__((cdecl)) two_cdecl(word a, word b) { return a - b; }
    };
    const std::shared_ptr<Library> library = Library::built();
    const std::size_t before = Library::stack_errors();
    EXPECT_EQ(library->call(reinterpret_cast<void*>(&Callees::two), {3, 4}), 7);
    EXPECT_EQ(Library::stack_errors(), before);
    library->call(reinterpret_cast<void*>(&Callees::two), {3, 4, 5});
    EXPECT_EQ(Library::stack_errors(), before + 1) << "one argument too many stays on the stack";
    EXPECT_EQ(library->call(reinterpret_cast<void*>(&Callees::two_cdecl), {3, 4}), -1);
    EXPECT_EQ(Library::stack_errors(), before + 2) << "a cdecl callee leaves its arguments";
    Library::reset_stack_errors();
#else
    GTEST_SKIP() << "the stdcall check runs on 32-bit x86 ELF";
#endif
}

TEST(TestHost, ALibraryThatIsNotThereDoesNotLoad) {
    EXPECT_THROW(Library::load("sorvel-no-such-library"), std::runtime_error);
}

TEST_F(HostTest, DrawsAreCountedThroughTheRuntimeGenerator) {
    Instance& instance = host.create(0, 0);
    draws::reseed(17, 8);
    host.expression(instance, 1);  // empty: nothing to draw
    EXPECT_EQ(draws::made(), 0U);
    host.action(instance, 0, {Param::of(std::int32_t{4})});
    host.expression(instance, 1);
    const std::size_t one = draws::made();
    EXPECT_GE(one, 1U);
    host.expression(instance, 1);
    EXPECT_EQ(draws::made(), 2 * one) << "made() counts from the reseed and disturbs nothing";
}

}  // namespace
