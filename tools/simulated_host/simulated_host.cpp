// The simulated host: loading, calling, the host routines and the records.
#include "simulated_host.hpp"

#include <algorithm>
#include <bit>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <limits>
#include <stdexcept>
#include <utility>

#include "host/catalogue.hpp"
#include "host/platform.hpp"

#if defined(_WIN32)
#ifndef WIN32_LEAN_AND_MEAN
#define WIN32_LEAN_AND_MEAN
#endif
#ifndef NOMINMAX
#define NOMINMAX
#endif
#include <windows.h>
#else
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#endif

#if defined(__i386__)
// stdcall_check_i386.S: calls fn with count words pushed right to left and
// stores in *delta how far the stack pointer moved across the call (0 when
// the callee removed exactly its arguments). The stack is restored either way.
extern "C" sorvel::simulated::word sorvel_simulated_host_stdcall_call(void* fn, const sorvel::simulated::word* args,
                                                                      sorvel::simulated::word count,
                                                                      sorvel::simulated::word* delta);
#define SIMULATED_CHECKED_CALLS 1
#endif

namespace sorvel::simulated {
namespace {

std::size_t g_stack_errors = 0;
Host* g_active = nullptr;
const Library::Counter* g_counter = nullptr;

template <class T>
T read_at(const unsigned char* bytes, std::size_t offset) {
    T value;
    std::memcpy(&value, bytes + offset, sizeof value);
    return value;
}

template <class T>
T read_address(word address) {
    T value;
    std::memcpy(&value, reinterpret_cast<const void*>(address), sizeof value);
    return value;
}

// The way a host turns a float into an integer parameter: truncation, with
// out-of-range values held at the ends rather than left undefined.
std::int32_t truncate(float value) {
    if (std::isnan(value)) {
        return 0;
    }
    if (value >= 2147483648.0F) {
        return std::numeric_limits<std::int32_t>::max();
    }
    if (value < -2147483648.0F) {
        return std::numeric_limits<std::int32_t>::min();
    }
    return static_cast<std::int32_t>(value);
}

word float_word(float value) {
    return static_cast<word>(static_cast<std::uintptr_t>(std::bit_cast<std::uint32_t>(value)));
}

}  // namespace

// ---------------------------------------------------------------- Library

void Library::use_counter(const Counter* counter) {
    g_counter = counter;
}

const Library::Counter* Library::counter() {
    return g_counter;
}

#if defined(_WIN32)
namespace {
// The base and size a DLL's headers ask for.
std::pair<std::uintptr_t, std::size_t> preferred_range(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    IMAGE_DOS_HEADER dos{};
    IMAGE_NT_HEADERS nt{};
    if (!in.read(reinterpret_cast<char*>(&dos), sizeof dos) || dos.e_magic != IMAGE_DOS_SIGNATURE ||
        !in.seekg(dos.e_lfanew) || !in.read(reinterpret_cast<char*>(&nt), sizeof nt) ||
        nt.Signature != IMAGE_NT_SIGNATURE) {
        throw std::runtime_error("cannot load " + path + ": no PE headers");
    }
    return {static_cast<std::uintptr_t>(nt.OptionalHeader.ImageBase), nt.OptionalHeader.SizeOfImage};
}

std::string system_message(DWORD error, const std::string& path) {
    char text[256] = {};
    const DWORD n = FormatMessageA(FORMAT_MESSAGE_FROM_SYSTEM | FORMAT_MESSAGE_IGNORE_INSERTS, nullptr, error, 0, text,
                                   sizeof text, nullptr);
    std::string message(text, n);
    while (!message.empty() && std::isspace(static_cast<unsigned char>(message.back())) != 0) {
        message.pop_back();
    }
    if (const auto insert = message.find("%1"); insert != std::string::npos) {
        message.replace(insert, 2, path);
    }
    return "error " + std::to_string(error) + (message.empty() ? "" : " (" + message + ")");
}
}  // namespace
#endif

std::shared_ptr<Library> Library::load(const std::string& path, Placement placement) {
    std::shared_ptr<Library> library(new Library());
#if defined(_WIN32)
    std::uintptr_t preferred = 0;
    if (placement == Placement::away_from_preferred_base) {
        // Holding the preferred range leaves the loader one way: elsewhere,
        // with every relocation applied.
        const auto [base, size] = preferred_range(path);
        preferred = base;
        library->reserved_ = VirtualAlloc(reinterpret_cast<void*>(base), size, MEM_RESERVE, PAGE_NOACCESS);
    }
    HMODULE module = LoadLibraryA(path.c_str());
    if (module == nullptr) {
        throw std::runtime_error("cannot load " + path + ": " + system_message(GetLastError(), path));
    }
    library->handle_ = reinterpret_cast<void*>(module);
    library->loader_owned_ = true;
    library->owned_ = true;
    if (preferred != 0 && reinterpret_cast<std::uintptr_t>(module) == preferred) {
        throw std::runtime_error(path + " was loaded at its preferred base, which was to be taken");
    }
    if (g_counter != nullptr && g_counter->reroute(module)) {
        library->allocations_ = &g_counter->allocations;
    }
#else
    std::ifstream in(path, std::ios::binary);
    char signature[2] = {};
    if (in.read(signature, 2) && signature[0] == 'M' && signature[1] == 'Z') {
        throw std::runtime_error("cannot load " + path +
                                 ": a Windows DLL; the Windows build of this program loads it, under wine");
    }
    (void)placement;
    void* handle = dlopen(path.c_str(), RTLD_NOW | RTLD_GLOBAL);
    if (handle == nullptr) {
        const char* error = dlerror();
        throw std::runtime_error("cannot load " + path + ": " + (error != nullptr ? error : "unknown error"));
    }
    library->handle_ = handle;
    library->owned_ = true;
#endif
    if (library->symbol("GetRunObjectInfos") == nullptr) {
        throw std::runtime_error(path + " exports no GetRunObjectInfos");
    }
    return library;
}

std::shared_ptr<Library> Library::built() {
    // Loaded once and never unloaded: every test of a program talks to the
    // same library, as a host would during one run.
    static const auto* library = new std::shared_ptr<Library>([] {
        const char* chosen = std::getenv("SORVEL_TEST_LIBRARY");
#if defined(_WIN32)
        // By name through the loader's search: the DLL sits next to the program.
        return load(chosen != nullptr ? chosen : "sorvel.dll");
#else
        return load(chosen != nullptr ? chosen : SORVEL_LIBRARY_DIR "/" SORVEL_LIBRARY_FILE);
#endif
    }());
    return *library;
}

Library::~Library() {
    if (owned_ && handle_ != nullptr) {
#if defined(_WIN32)
        FreeLibrary(reinterpret_cast<HMODULE>(handle_));
#else
        dlclose(handle_);
#endif
    }
#if defined(_WIN32)
    if (reserved_ != nullptr) {
        VirtualFree(reserved_, 0, MEM_RELEASE);
    }
#endif
}

void* Library::symbol(const char* name) const {
    if (!symbols_.empty()) {
        for (const Symbol& s : symbols_) {
            if (std::strcmp(s.name, name) == 0) {
                return s.address;
            }
        }
        return nullptr;
    }
    if (handle_ == nullptr) {
        return nullptr;
    }
#if defined(_WIN32)
    return reinterpret_cast<void*>(GetProcAddress(reinterpret_cast<HMODULE>(handle_), name));
#else
    return dlsym(handle_, name);
#endif
}

word Library::module_handle() const {
    return reinterpret_cast<word>(handle_);
}

void Library::seed_rand(unsigned seed) const {
    std::srand(seed);
}

void* Library::entry_point() const {
#if defined(_WIN32)
    if (loader_owned_) {
        // The module's entry point from its PE headers: the runtime library's
        // start-up routine, which passes every call on to DllMain.
        const auto* base = static_cast<const unsigned char*>(handle_);
        const auto dos = read_at<IMAGE_DOS_HEADER>(base, 0);
        const auto nt = read_at<IMAGE_NT_HEADERS>(base, static_cast<std::size_t>(dos.e_lfanew));
        if (nt.OptionalHeader.AddressOfEntryPoint == 0) {
            return nullptr;
        }
        return const_cast<unsigned char*>(base + nt.OptionalHeader.AddressOfEntryPoint);
    }
#endif
    return symbol("DllMain");
}

word Library::call(void* function, std::initializer_list<word> args) const {
    if (function == nullptr) {
        throw std::invalid_argument("call of a null function");
    }
    if (args.size() > 7) {
        throw std::invalid_argument("at most 7 words");
    }
#if defined(SIMULATED_CHECKED_CALLS)
    word delta = 0;
    const word result =
        sorvel_simulated_host_stdcall_call(function, args.begin(), static_cast<word>(args.size()), &delta);
    if (delta != 0) {
        ++g_stack_errors;
    }
    return result;
#else
    const word* a = args.begin();
    switch (args.size()) {
        case 0: return reinterpret_cast<word(SORVEL_CALL*)()>(function)();
        case 1: return reinterpret_cast<word(SORVEL_CALL*)(word)>(function)(a[0]);
        case 2: return reinterpret_cast<word(SORVEL_CALL*)(word, word)>(function)(a[0], a[1]);
        case 3: return reinterpret_cast<word(SORVEL_CALL*)(word, word, word)>(function)(a[0], a[1], a[2]);
        case 4: return reinterpret_cast<word(SORVEL_CALL*)(word, word, word, word)>(function)(a[0], a[1], a[2], a[3]);
        case 5:
            return reinterpret_cast<word(SORVEL_CALL*)(word, word, word, word, word)>(function)(a[0], a[1], a[2], a[3],
                                                                                                a[4]);
        case 6:
            return reinterpret_cast<word(SORVEL_CALL*)(word, word, word, word, word, word)>(function)(a[0], a[1], a[2],
                                                                                                      a[3], a[4], a[5]);
        default:
            return reinterpret_cast<word(SORVEL_CALL*)(word, word, word, word, word, word, word)>(function)(
                a[0], a[1], a[2], a[3], a[4], a[5], a[6]);
    }
#endif
}

word Library::call_export(const char* name, std::initializer_list<word> args) const {
    void* function = symbol(name);
    if (function == nullptr) {
        throw std::runtime_error(std::string("no export ") + name);
    }
    return call(function, args);
}

std::size_t Library::stack_errors() {
    return g_stack_errors;
}
void Library::reset_stack_errors() {
    g_stack_errors = 0;
}

// ---------------------------------------------------------------- Param

Param Param::of(std::int32_t v) {
    Param p;
    p.kind = Kind::integer;
    p.integer = v;
    return p;
}

Param Param::of(float v) {
    Param p;
    p.kind = Kind::floating;
    p.floating = v;
    return p;
}

Param Param::of(std::string v) {
    Param p;
    p.kind = Kind::string;
    p.text = std::move(v);
    return p;
}

Param Param::of(const char* v) {
    return v == nullptr ? null() : of(std::string(v));
}

Param Param::null() {
    Param p;
    p.kind = Kind::null_string;
    return p;
}

Param Param::raw_word(word w) {
    Param p;
    p.kind = Kind::raw;
    p.raw = w;
    return p;
}

// ---------------------------------------------------------------- Instance

namespace {
void check_range(std::size_t offset, std::size_t width, std::size_t size) {
    if (offset > size || width > size - offset) {
        throw std::out_of_range("offset " + std::to_string(offset) + " beyond the run record");
    }
}

// Count, root and index of each set, in the order of Set.
constexpr std::array<std::size_t, 3> kCountAt{RecordLayout::kIntegerCount, RecordLayout::kFloatCount,
                                              RecordLayout::kStringCount};
constexpr std::array<std::size_t, 3> kRootAt{RecordLayout::kIntegerRoot, RecordLayout::kFloatRoot,
                                             RecordLayout::kStringRoot};
constexpr std::array<std::size_t, 3> kIndexAt{RecordLayout::kIntegerIndex, RecordLayout::kFloatIndex,
                                              RecordLayout::kStringIndex};
}  // namespace

std::int32_t Instance::i32(std::size_t offset) const {
    check_range(offset, 4, record_.size());
    return read_at<std::int32_t>(record_.data(), offset);
}

std::uint16_t Instance::u16(std::size_t offset) const {
    check_range(offset, 2, record_.size());
    return read_at<std::uint16_t>(record_.data(), offset);
}

word Instance::pointer(std::size_t offset) const {
    check_range(offset, sizeof(word), record_.size());
    return read_at<word>(record_.data(), offset);
}

void Instance::set_result_flags(std::uint16_t flags) {
    check_range(RecordLayout::kResultFlags, 2, record_.size());
    std::memcpy(record_.data() + RecordLayout::kResultFlags, &flags, sizeof flags);
}

std::int32_t Instance::count(Set set) const {
    return i32(kCountAt[static_cast<std::size_t>(set)]);
}
word Instance::root(Set set) const {
    return pointer(kRootAt[static_cast<std::size_t>(set)]);
}
word Instance::index(Set set) const {
    return pointer(kIndexAt[static_cast<std::size_t>(set)]);
}

// ---------------------------------------------------------------- NodeView

std::int32_t NodeView::integer() const {
    return read_address<std::int32_t>(address);
}
float NodeView::floating() const {
    return read_address<float>(address);
}

std::string NodeView::string() const {
    const auto* text = read_address<const char*>(address);
    return text == nullptr ? std::string() : std::string(text);
}

NodeView NodeView::left() const {
    return NodeView{read_address<word>(address + RecordLayout::kNodeLeft)};
}
NodeView NodeView::right() const {
    return NodeView{read_address<word>(address + RecordLayout::kNodeRight)};
}

// ---------------------------------------------------------------- host routines

struct Routines {
    static Host& host() {
        if (g_active == nullptr) {
            // A routine called with no host behind it: nothing sensible to
            // give, and no caller to throw to across the library.
            std::abort();
        }
        return *g_active;
    }

    static word record(HostCall::Routine routine, std::initializer_list<word> args, word result) {
        host().calls_.push_back(HostCall{routine, HostCall::Args(args), result});
        return result;
    }

    static const char* hold(Host& h, const std::string& text) {
        auto copy = std::make_unique<char[]>(text.size() + 1);
        std::memcpy(copy.get(), text.c_str(), text.size() + 1);
        h.held_strings_.push_back(std::move(copy));
        return h.held_strings_.back().get();
    }

    // The next queued parameter, in the form asked for: 0 integer, 1 string,
    // 2 float bits. A kind given for another form is converted as a host
    // converts an expression's value; raw words pass as they are.
    static word serve(word form) {
        Host& h = host();
        if (h.next_param_ == h.params_.size()) {
            ++h.missing_params_;
            return 0;
        }
        const Param& p = h.params_[h.next_param_++];
        if (p.kind == Param::Kind::raw) {
            return p.raw;
        }
        switch (form) {
            case 1:
                switch (p.kind) {
                    case Param::Kind::string: return reinterpret_cast<word>(hold(h, p.text));
                    case Param::Kind::integer: return reinterpret_cast<word>(hold(h, std::to_string(p.integer)));
                    case Param::Kind::floating: return reinterpret_cast<word>(hold(h, std::to_string(p.floating)));
                    default: return 0;
                }
            case 2:
                switch (p.kind) {
                    case Param::Kind::floating: return float_word(p.floating);
                    case Param::Kind::integer: return float_word(static_cast<float>(p.integer));
                    case Param::Kind::string: return float_word(std::strtof(p.text.c_str(), nullptr));
                    default: return 0;
                }
            default:
                switch (p.kind) {
                    case Param::Kind::integer: return static_cast<word>(p.integer);
                    case Param::Kind::floating: return static_cast<word>(truncate(p.floating));
                    case Param::Kind::string:
                        return static_cast<word>(static_cast<std::int32_t>(std::strtol(p.text.c_str(), nullptr, 10)));
                    default: return 0;
                }
        }
    }

    // Selectors: 0 integer, 2 float, -1 string.
    static word SORVEL_CALL read_event_param(word record_word, word selector, word zero) {
        const word form = selector == -1 ? 1 : selector == 2 ? 2 : 0;
        const word result = serve(form);
        return record(HostCall::Routine::read_event_param, {record_word, selector, zero}, result);
    }

    static word SORVEL_CALL read_first_expr_param(word record_word, word type, word param) {
        const word result = serve(type);
        return record(HostCall::Routine::read_first_expr_param, {record_word, type, param}, result);
    }

    static word SORVEL_CALL read_next_expr_param(word record_word, word type, word param) {
        const word result = serve(type);
        return record(HostCall::Routine::read_next_expr_param, {record_word, type, param}, result);
    }

    static word SORVEL_CALL alloc_result_string(word record_word, word zero, word size) {
        Host& h = host();
        word result = 0;
        if (!h.no_buffer_) {
            // Exactly the size asked for, so a write past it is caught.
            h.result_buffers_.push_back(std::make_unique<char[]>(static_cast<std::size_t>(size)));
            result = reinterpret_cast<word>(h.result_buffers_.back().get());
        }
        return record(HostCall::Routine::alloc_result_string, {record_word, zero, size}, result);
    }

    static word SORVEL_CALL open_file(word name_word, word size_word, word zero) {
        Host& h = host();
        const auto* name = reinterpret_cast<const char*>(name_word);
        word handle = -1;
        std::uint64_t size = 0;
        if (name != nullptr) {
#if defined(_WIN32)
            // A directory cannot be opened without backup semantics, so it fails.
            HANDLE file = CreateFileA(name, GENERIC_READ, FILE_SHARE_READ, nullptr, OPEN_EXISTING,
                                      FILE_ATTRIBUTE_NORMAL, nullptr);
            if (file != INVALID_HANDLE_VALUE) {
                LARGE_INTEGER length{};
                if (GetFileType(file) == FILE_TYPE_DISK && GetFileSizeEx(file, &length) != 0) {
                    size = static_cast<std::uint64_t>(length.QuadPart);
                    handle = reinterpret_cast<word>(file);
                } else {
                    CloseHandle(file);
                }
            }
#else
            const int fd = ::open(name, O_RDONLY | O_CLOEXEC);
            if (fd >= 0) {
                struct stat info {};
                if (::fstat(fd, &info) == 0 && S_ISREG(info.st_mode)) {
                    size = static_cast<std::uint64_t>(info.st_size);
                    handle = fd;
                } else {
                    ::close(fd);
                }
            }
#endif
        }
        if (handle != -1) {
            const auto size32 = static_cast<std::uint32_t>(size) + h.overstated_by_;
            std::memcpy(reinterpret_cast<void*>(size_word), &size32, sizeof size32);
            ++h.opens_;
            h.open_files_.insert(handle);
        }
        return record(HostCall::Routine::open_file, {name_word, size_word, zero}, handle);
    }

    static word SORVEL_CALL close_file(word handle) {
        Host& h = host();
        if (h.open_files_.erase(handle) == 1) {
            ++h.closes_;
#if defined(_WIN32)
            CloseHandle(reinterpret_cast<HANDLE>(handle));
#else
            ::close(static_cast<int>(handle));
#endif
        } else {
            ++h.bad_closes_;
        }
        return record(HostCall::Routine::close_file, {handle}, 0);
    }
};

// ---------------------------------------------------------------- Host

namespace {
template <class F>
word routine_word(F f) {
    return reinterpret_cast<word>(f);
}

// The host header is a table of words; the library reads five of them.
constexpr std::size_t kHeaderWords = 320;
constexpr std::size_t kServiceWords = 96;
}  // namespace

Host* Host::active() {
    return g_active;
}

Host::Host(std::shared_ptr<Library> library) : library_(std::move(library)) {
    if (!library_) {
        throw std::invalid_argument("no library");
    }
    header_.assign(kHeaderWords, 0);
    services_.assign(kServiceWords, 0);
    header_[RecordLayout::kAllocResultString] = routine_word(&Routines::alloc_result_string);
    header_[RecordLayout::kReadFirstExprParam] = routine_word(&Routines::read_first_expr_param);
    header_[RecordLayout::kReadNextExprParam] = routine_word(&Routines::read_next_expr_param);
    header_[RecordLayout::kReadEventParam] = routine_word(&Routines::read_event_param);
    header_[RecordLayout::kServiceTable] = reinterpret_cast<word>(services_.data());
    services_[RecordLayout::kOpenFile] = routine_word(&Routines::open_file);
    services_[RecordLayout::kCloseFile] = routine_word(&Routines::close_file);

    g_active = this;
    if (library_->loader_owned()) {
        read_infos();  // the loader made the process attach call at load
    } else {
        dll_main(1);
    }
    record_size_ = library_->call_export("GetRunObjectDataSize", {0, 0});
}

Host::~Host() {
    for (auto& instance : instances_) {
        if (!instance->destroyed_) {
            destroy(*instance);
        }
    }
    // Every call into the library makes its host the active one, so a host
    // that goes only has to stop being found.
    if (g_active == this) {
        g_active = nullptr;
    }
}

word Host::dll_main(word reason) {
    if (library_->loader_owned() && (reason == 0 || reason == 1)) {
        throw std::logic_error("the loader owns process attach and detach");
    }
    void* entry = library_->entry_point();
    if (entry == nullptr) {
        throw std::runtime_error("the library has no entry point");
    }
    const word result = library_->call(entry, {library_->module_handle(), reason, 0});
    read_infos();
    return result;
}

word Host::read_infos(unsigned char fill) {
    info_block_.assign(RecordLayout::kInfoSize + 32, fill);
    const word result = library_->call_export("GetRunObjectInfos", {0, reinterpret_cast<word>(info_block_.data())});
    const unsigned char* b = info_block_.data();
    tables_.conditions = read_at<word>(b, RecordLayout::kInfoConditions);
    tables_.actions = read_at<word>(b, RecordLayout::kInfoActions);
    tables_.expressions = read_at<word>(b, RecordLayout::kInfoExpressions);
    tables_.condition_count = read_at<std::uint16_t>(b, RecordLayout::kInfoCounts);
    tables_.action_count = read_at<std::uint16_t>(b, RecordLayout::kInfoCounts + 2);
    tables_.expression_count = read_at<std::uint16_t>(b, RecordLayout::kInfoCounts + 4);
    tables_.edit_size = read_at<std::uint16_t>(b, RecordLayout::kInfoCounts + 6);
    return result;
}

word Host::table_entry(int kind, std::size_t n) const {
    word table = 0;
    std::size_t count = 0;
    switch (kind) {
        case 0: table = tables_.conditions, count = tables_.condition_count; break;
        case 1: table = tables_.actions, count = tables_.action_count; break;
        case 2: table = tables_.expressions, count = tables_.expression_count; break;
        default: throw std::invalid_argument("kind 0, 1 or 2");
    }
    if (table == 0) {
        throw std::runtime_error("no handler table");
    }
    if (n > count) {  // entry `count` is the terminating null
        throw std::out_of_range("handler " + std::to_string(n) + " beyond the table");
    }
    return read_address<word>(table + static_cast<word>(n * sizeof(word)));
}

Instance& Host::create(std::int32_t case_sensitive, std::int32_t use_indices, std::int32_t creation8,
                       std::int32_t creation12) {
    if (record_size_ <= 0 || static_cast<std::size_t>(record_size_) < RecordLayout::kHeaderPointer + sizeof(word)) {
        throw std::runtime_error("unusable run record size " + std::to_string(record_size_));
    }
    auto instance = std::unique_ptr<Instance>(new Instance());
    instance->record_.assign(static_cast<std::size_t>(record_size_), 0);
    const word header = reinterpret_cast<word>(header_.data());
    std::memcpy(instance->record_.data() + RecordLayout::kHeaderPointer, &header, sizeof header);

    // Bytes the library must not read are filled with a pattern.
    unsigned char edit[28];
    std::memset(edit, 0xCD, sizeof edit);
    std::memcpy(edit + 20, &case_sensitive, 4);
    std::memcpy(edit + 24, &use_indices, 4);
    unsigned char creation[32];
    std::memset(creation, 0xCD, sizeof creation);
    std::memcpy(creation + 8, &creation8, 4);
    std::memcpy(creation + 12, &creation12, 4);

    instances_.push_back(std::move(instance));
    Instance& created = *instances_.back();
    g_active = this;
    library_->call_export("CreateRunObject",
                          {created.address(), reinterpret_cast<word>(edit), reinterpret_cast<word>(creation)});
    return created;
}

void Host::destroy(Instance& instance, word second) {
    if (instance.destroyed_) {
        throw std::logic_error("instance destroyed twice");
    }
    g_active = this;
    library_->call_export("DestroyRunObject", {instance.address(), second});
    instance.destroyed_ = true;
}

word Host::call_handler(word handler, Instance& instance, std::initializer_list<word> args) {
    if (handler == 0) {
        throw std::runtime_error("null handler");
    }
    if (instance.destroyed_) {
        throw std::logic_error("handler called on a destroyed instance");
    }
    g_active = this;
    const word result = library_->call(reinterpret_cast<void*>(handler), args);
    held_strings_.clear();  // parameter strings live only while the handler runs
    return result;
}

word Host::condition(Instance& instance, std::size_t number, const std::vector<Param>& params) {
    const word handler = table_entry(0, number);
    params_.assign(params.begin(), params.end());
    next_param_ = 0;
    return call_handler(handler, instance, {instance.address(), 0, 0});
}

word Host::action(Instance& instance, std::size_t number, const std::vector<Param>& params) {
    const word handler = table_entry(1, number);
    params_.assign(params.begin(), params.end());
    next_param_ = 0;
    return call_handler(handler, instance, {instance.address(), 0, 0});
}

word Host::expression(Instance& instance, std::size_t number, const std::vector<Param>& params, word param_word) {
    const word handler = table_entry(2, number);
    params_.assign(params.begin(), params.end());
    next_param_ = 0;
    return call_handler(handler, instance, {instance.address(), param_word});
}

word Host::event(Instance& instance, std::string_view display, const std::vector<Param>& params, word param_word) {
    for (const catalogue::Event& e : catalogue::kEvents) {
        if (e.display != display) {
            continue;
        }
        switch (e.kind) {
            case catalogue::Kind::condition: return condition(instance, e.number, params);
            case catalogue::Kind::action: return action(instance, e.number, params);
            case catalogue::Kind::expression: return expression(instance, e.number, params, param_word);
        }
    }
    throw std::invalid_argument("no event \"" + std::string(display) + "\"");
}

std::string Host::text_at(word result) {
    return result == 0 ? std::string() : std::string(reinterpret_cast<const char*>(result));
}

float Host::float_bits(word result) {
    return std::bit_cast<float>(static_cast<std::uint32_t>(static_cast<std::uintptr_t>(result)));
}

}  // namespace sorvel::simulated
