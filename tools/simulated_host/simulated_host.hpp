// The simulated host: plays the host runtime for the library, the way a real host
// calls it. It loads the built library, calls DllMain as a loader would,
// reads the handler tables from GetRunObjectInfos, hands out zero-filled run
// records, serves the host routines and records every call made to them.
//
// Records are addressed at their literal byte offsets (see RecordLayout), not
// through the library's own headers, so a layout mistake cannot hide on both
// sides.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace sorvel::simulated {

using word = std::intptr_t;

// The three ordered sets of an instance, in the run record's order.
enum class Set : std::uint8_t { integers, floats, strings };
inline constexpr std::array<Set, 3> kSets{Set::integers, Set::floats, Set::strings};
inline constexpr std::array<const char*, 3> kSetNames{"integers", "floats", "strings"};
constexpr const char* name(Set set) {
    return kSetNames[static_cast<std::size_t>(set)];
}

// Byte offsets of the host records on this target.
struct RecordLayout {
    static constexpr std::size_t kWord = sizeof(void*);
    static constexpr bool kWide = kWord == 8;
    static constexpr std::size_t kRunRecordSize = kWide ? 448 : 408;
    static constexpr std::size_t kHeaderPointer = 8;
    static constexpr std::size_t kCreationWordA = 76;
    static constexpr std::size_t kCreationWordB = 84;
    static constexpr std::size_t kResultFlags = 124;
    static constexpr std::size_t kReader = 360;
    static constexpr std::size_t kCaseSensitive = kWide ? 368 : 364;
    static constexpr std::size_t kUseIndices = kWide ? 372 : 368;
    static constexpr std::size_t kIntegerRoot = kWide ? 376 : 372;
    static constexpr std::size_t kIntegerCount = kWide ? 384 : 376;
    static constexpr std::size_t kFloatRoot = kWide ? 392 : 380;
    static constexpr std::size_t kFloatCount = kWide ? 400 : 384;
    static constexpr std::size_t kStringRoot = kWide ? 408 : 388;
    static constexpr std::size_t kStringCount = kWide ? 416 : 392;
    static constexpr std::size_t kIntegerIndex = kWide ? 424 : 396;
    static constexpr std::size_t kFloatIndex = kWide ? 432 : 400;
    static constexpr std::size_t kStringIndex = kWide ? 440 : 404;
    // ObjectInfoBlock
    static constexpr std::size_t kInfoConditions = 0;
    static constexpr std::size_t kInfoActions = kWord;
    static constexpr std::size_t kInfoExpressions = 2 * kWord;
    static constexpr std::size_t kInfoCounts = 3 * kWord;  // four 16-bit words
    static constexpr std::size_t kInfoFlags = kInfoCounts + 8;
    static constexpr std::size_t kInfoLetter = kInfoFlags + 4;
    static constexpr std::size_t kInfoUntouched = kInfoLetter + 1;
    static constexpr std::size_t kInfoZero = kInfoLetter + 2;
    static constexpr std::size_t kInfoIdentifier = kInfoLetter + 4;
    static constexpr std::size_t kInfoVersion = kInfoIdentifier + 4;
    static constexpr std::size_t kInfoSize = kInfoVersion + 2;
    // TreeNode: value, left, right, each a word apart.
    static constexpr std::size_t kNodeLeft = kWord;
    static constexpr std::size_t kNodeRight = 2 * kWord;
    // HostRunHeader words and HostServiceTable entries.
    static constexpr std::size_t kAllocResultString = 218;
    static constexpr std::size_t kReadFirstExprParam = 219;
    static constexpr std::size_t kReadNextExprParam = 220;
    static constexpr std::size_t kReadEventParam = 232;
    static constexpr std::size_t kServiceTable = 317;
    static constexpr std::size_t kOpenFile = 80;
    static constexpr std::size_t kCloseFile = 81;
};

// The loaded library and its exports.
class Library {
public:
    // Where a Windows DLL goes: where its headers ask, or anywhere else, so
    // that the loader has to apply its relocations.
    enum class Placement { preferred, away_from_preferred_base };
    // Loads by path: dlopen, or LoadLibrary on Windows. Throws
    // std::runtime_error when the library or an export cannot be found.
    static std::shared_ptr<Library> load(const std::string& path, Placement placement = Placement::preferred);
    // The library linked into this program (tests that need its allocator).
    static std::shared_ptr<Library> linked_in();
    // The library named by SORVEL_TEST_LIBRARY, else the one built next to
    // the test programs.
    static std::shared_ptr<Library> built();

    ~Library();
    Library(const Library&) = delete;
    Library& operator=(const Library&) = delete;

    void* symbol(const char* name) const;        // null when absent
    word module_handle() const;
    // Seeds the C runtime generator that the library shares with this program.
    void seed_rand(unsigned seed) const;

    // What the loader calls: DllMain itself where the simulated host plays the
    // loader (ELF, linked in), the module's entry point on Windows, where the
    // real loader has already made the process attach call.
    void* entry_point() const;
    bool loader_owned() const { return loader_owned_; }

    // Calls a function of the library with the given words. On 32-bit x86
    // the call checks that the callee removed exactly its arguments
    // (stdcall); every mismatch is counted in stack_errors().
    word call(void* function, std::initializer_list<word> args) const;
    word call_export(const char* name, std::initializer_list<word> args) const;
    static constexpr bool kChecksStack = sizeof(void*) == 4;
    static std::size_t stack_errors();
    // For the test that proves the check itself catches a wrong callee.
    static void reset_stack_errors();

    // The library's allocations where the host can reach them: the test
    // program's counting allocator stands behind the allocation seam of the
    // library linked in, and behind a Windows DLL's C runtime allocator
    // imports. Null where the program has no counter (sorvel-host, the
    // benchmarks) and for a shared object that dlopen loaded.
    struct Allocations {
        std::size_t (*live)();
        void (*fail_after)(long n);  // the n-th allocation from now fails; negative: none
        std::uint64_t (*total)();    // allocations made so far
    };
    const Allocations* allocations() const { return allocations_; }
    // A test program's counter announces itself as the program starts.
    // `reroute` points a loaded module's allocator imports at it and gives
    // whether it found any.
    struct Counter {
        Allocations allocations;
        bool (*reroute)(void* module);
    };
    static void use_counter(const Counter* counter);

private:
    struct Symbol {
        const char* name;
        void* address;
    };
    Library() = default;
    static const Counter* counter();
    void* handle_ = nullptr;
    bool owned_ = false;
    bool loader_owned_ = false;
    const Allocations* allocations_ = nullptr;
    std::vector<Symbol> symbols_;  // linked in: the program's own table
    void* reserved_ = nullptr;     // the preferred base, kept from a DLL loaded away from it
};

// A parameter value the host gives for the next parameter request.
struct Param {
    enum class Kind { integer, floating, string, null_string, raw };
    Kind kind = Kind::integer;
    std::int32_t integer = 0;
    float floating = 0;
    std::string text;
    word raw = 0;

    static Param of(std::int32_t v);
    static Param of(float v);
    static Param of(std::string v);
    static Param of(const char* v);
    static Param null();
    static Param raw_word(word w);
};

// One call of a host routine by the library.
struct HostCall {
    enum class Routine {
        read_event_param,
        read_first_expr_param,
        read_next_expr_param,
        alloc_result_string,
        open_file,
        close_file
    };
    // At most three words, held in place: a call is recorded for every
    // parameter, and recording must not allocate.
    struct Args {
        std::array<word, 3> words{};
        std::size_t count = 0;
        Args(std::initializer_list<word> list) : count(list.size()) {
            std::copy(list.begin(), list.end(), words.begin());
        }
        std::size_t size() const { return count; }
        word operator[](std::size_t i) const { return words[i]; }
    };
    Routine routine;
    Args args;
    word result = 0;  // what the host gave back
};

class Host;

// One object instance: a zero-filled run record handed to CreateRunObject.
class Instance {
public:
    unsigned char* record() { return record_.data(); }
    word address() { return reinterpret_cast<word>(record_.data()); }

    // Fields at their literal offsets.
    std::int32_t i32(std::size_t offset) const;
    std::uint16_t u16(std::size_t offset) const;
    word pointer(std::size_t offset) const;
    std::uint16_t result_flags() const { return u16(RecordLayout::kResultFlags); }
    void set_result_flags(std::uint16_t flags);

    std::int32_t count(Set set) const;
    word root(Set set) const;
    word index(Set set) const;

    // What CreateRunObject and DestroyRunObject gave.
    std::size_t size() const { return record_.size(); }

private:
    friend class Host;
    std::vector<unsigned char> record_;
    bool destroyed_ = false;
};

// Reads a tree read-only at its documented layout.
struct NodeView {
    word address = 0;
    std::int32_t integer() const;
    float floating() const;
    std::string string() const;
    NodeView left() const;
    NodeView right() const;
    explicit operator bool() const { return address != 0; }
};

class Host {
public:
    explicit Host(std::shared_ptr<Library> library);
    ~Host();
    Host(const Host&) = delete;
    Host& operator=(const Host&) = delete;

    Library& library() { return *library_; }

    // Loader and information calls. dll_main calls the library's entry point
    // with this reason and then reads the tables again. On Windows the real
    // loader owns process attach and detach (0 and 1): asking for them there
    // throws std::logic_error.
    word dll_main(word reason);
    // Calls GetRunObjectInfos with a fresh block of `fill` bytes and takes the
    // tables from it; gives its result.
    word read_infos(unsigned char fill = 0xAB);
    const std::vector<unsigned char>& info_block() const { return info_block_; }
    struct Tables {
        word conditions = 0, actions = 0, expressions = 0;
        std::uint16_t condition_count = 0, action_count = 0, expression_count = 0, edit_size = 0;
    };
    Tables tables() const { return tables_; }
    word table_entry(int kind, std::size_t n) const;  // kind 0 conditions, 1 actions, 2 expressions

    // Instances. The options are the EditRecord words at 20 and 24.
    Instance& create(std::int32_t case_sensitive, std::int32_t use_indices, std::int32_t creation8 = 0,
                     std::int32_t creation12 = 0);
    // DestroyRunObject with the record and `second`, a word it does not read.
    void destroy(Instance& instance, word second = 0);

    // Handlers, by kind and number. The parameters are queued and handed out
    // by the host routines in order; every queued value must be consumed.
    word condition(Instance& instance, std::size_t number, const std::vector<Param>& params = {});
    word action(Instance& instance, std::size_t number, const std::vector<Param>& params = {});
    word expression(Instance& instance, std::size_t number, const std::vector<Param>& params = {}, word param_word = 0);

    // Handlers by display string ("Add Integer: %0", "IntegersSize(", ...).
    word event(Instance& instance, std::string_view display, const std::vector<Param>& params = {},
               word param_word = 0);

    // Results.
    static std::string text_at(word result);
    static float float_bits(word result);

    // Recorded host routine calls since the last clear.
    const std::vector<HostCall>& calls() const { return calls_; }
    void clear_calls() { calls_.clear(); }
    // Left from the last handler call; each handler call starts a new queue.
    std::size_t unconsumed_params() const { return params_.size() - next_param_; }
    // Parameter requests the queue could not serve (they got 0).
    std::size_t missing_params() const { return missing_params_; }

    // Result-string space: owned by the host; a test can make it give none.
    void give_no_result_buffer(bool none) { no_buffer_ = none; }

    // Files: HostOpenFile opens real files on disk.
    std::size_t opens() const { return opens_; }
    std::size_t closes() const { return closes_; }
    std::size_t open_handles() const { return opens_ - closes_; }
    // HostCloseFile calls with a handle that is not open.
    std::size_t bad_closes() const { return bad_closes_; }
    // HostOpenFile reports this many bytes more than the file holds, as a
    // host whose size is stale would (0: the true size).
    void overstate_file_size(std::uint32_t extra) { overstated_by_ = extra; }

    // Host routine entry points call back into the active host.
    static Host* active();

private:
    friend struct Routines;
    word next_param();
    word call_handler(word handler, Instance& instance, std::initializer_list<word> args);

    std::shared_ptr<Library> library_;
    Tables tables_;
    std::vector<word> header_;    // HostRunHeader: a table of words
    std::vector<word> services_;  // HostServiceTable
    std::vector<std::unique_ptr<Instance>> instances_;
    // The queue of one handler call; kept between calls so that a host
    // driving millions of events allocates for none of them.
    std::vector<Param> params_;
    std::size_t next_param_ = 0;
    std::vector<HostCall> calls_;
    // Parameter strings: exact-size copies, freed when the handler returns,
    // so a library that keeps a pointer instead of a copy reads freed memory.
    std::vector<std::unique_ptr<char[]>> held_strings_;
    std::vector<std::unique_ptr<char[]>> result_buffers_;
    std::vector<unsigned char> info_block_;
    word record_size_ = 0;
    bool no_buffer_ = false;
    std::size_t missing_params_ = 0;
    std::size_t opens_ = 0;
    std::size_t closes_ = 0;
    std::size_t bad_closes_ = 0;
    std::uint32_t overstated_by_ = 0;
    std::set<word> open_files_;
};

}  // namespace sorvel::simulated
