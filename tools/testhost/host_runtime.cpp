// The KERNEL32 and msvcrt that a mapped image imports, played by the test
// host for one thread. KERNEL32 functions use the standard calling
// convention, msvcrt's the C one. Windows code calls with the stack aligned
// to 4 bytes only, so every function realigns it for this program's code.
#include <asm/ldt.h>
#include <strings.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

#include "pe_image.hpp"

#define RUNTIME_WINAPI __attribute__((stdcall, force_align_arg_pointer))
#define RUNTIME_CDECL __attribute__((cdecl, force_align_arg_pointer))

namespace sorvel::testhost::runtime {

int (*draw_hook)() = nullptr;

namespace {

using u32 = std::uint32_t;

u32 g_last_error = 0;
constexpr u32 kModNotFound = 126;
constexpr u32 kProcNotFound = 127;
constexpr u32 kInvalidHandle = 6;
constexpr u32 kInvalidParameter = 87;
constexpr u32 kReadFault = 30;
constexpr u32 kExecuteReadWrite = 0x40;  // every mapped page is
constexpr u32 kPage = 0x1000;

// The counting allocator behind the malloc family.
std::size_t g_live = 0;
std::uint64_t g_total = 0;
long g_countdown = -1;
bool injected_failure() {
    return g_countdown >= 0 && g_countdown-- == 0;
}

// msvcrt's FILE array: 32 bytes each, the descriptor at byte 16.
constexpr std::size_t kFileSize = 32;
constexpr std::size_t kFiles = 20;
unsigned char* iob() {
    static unsigned char files[kFiles * kFileSize] = {};
    static const bool numbered = [] {
        for (std::size_t i = 0; i < kFiles; ++i) {
            const auto descriptor = static_cast<std::int32_t>(i);
            std::memcpy(files + i * kFileSize + 16, &descriptor, sizeof descriptor);
        }
        return true;
    }();
    (void)numbered;
    return files;
}

std::FILE* stream(void* file) {
    const auto at = static_cast<std::size_t>(static_cast<unsigned char*>(file) - iob());
    switch (at) {
        case 0: return stdin;
        case kFileSize: return stdout;
        case 2 * kFileSize: return stderr;
        default: return nullptr;
    }
}

}  // namespace

namespace kernel32 {
// CRITICAL_SECTION: debug info, lock count, recursion count, owner, ...
RUNTIME_WINAPI void InitializeCriticalSection(unsigned char* section) {
    std::memset(section, 0, 24);
}
RUNTIME_WINAPI void DeleteCriticalSection(unsigned char* section) {
    std::memset(section, 0, 24);
}
void adjust_recursion(unsigned char* section, std::int32_t by) {
    std::int32_t count = 0;
    std::memcpy(&count, section + 8, sizeof count);
    count += by;
    std::memcpy(section + 8, &count, sizeof count);
}
RUNTIME_WINAPI void EnterCriticalSection(unsigned char* section) {
    adjust_recursion(section, 1);
}
RUNTIME_WINAPI void LeaveCriticalSection(unsigned char* section) {
    adjust_recursion(section, -1);
}
RUNTIME_WINAPI u32 GetLastError() {
    return g_last_error;
}
// The C runtime probes for optional helper libraries; none is there.
RUNTIME_WINAPI void* GetModuleHandleA(const char*) {
    g_last_error = kModNotFound;
    return nullptr;
}
RUNTIME_WINAPI void* LoadLibraryA(const char*) {
    g_last_error = kModNotFound;
    return nullptr;
}
RUNTIME_WINAPI void* GetProcAddress(void*, const char*) {
    g_last_error = kProcNotFound;
    return nullptr;
}
RUNTIME_WINAPI u32 FreeLibrary(void*) {
    return 1;
}
RUNTIME_WINAPI void Sleep(u32) {}
// No TlsSetValue is imported, so every slot holds what TlsAlloc leaves: 0.
RUNTIME_WINAPI void* TlsGetValue(u32) {
    g_last_error = 0;
    return nullptr;
}
RUNTIME_WINAPI u32 VirtualProtect(void*, u32, u32, u32* old) {
    if (old == nullptr) {
        g_last_error = kInvalidParameter;
        return 0;
    }
    *old = kExecuteReadWrite;
    return 1;
}
// MEMORY_BASIC_INFORMATION: base, allocation base, allocation protection,
// region size, state (committed), protection, type (image).
RUNTIME_WINAPI u32 VirtualQuery(void* address, u32* info, u32 length) {
    constexpr u32 kInfoBytes = 28;
    if (info == nullptr || length < kInfoBytes) {
        g_last_error = kInvalidParameter;
        return 0;
    }
    const u32 page = static_cast<u32>(reinterpret_cast<std::uintptr_t>(address)) & ~(kPage - 1);
    const u32 fields[7] = {page, page, kExecuteReadWrite, kPage, 0x1000, kExecuteReadWrite, 0x1000000};
    std::memcpy(info, fields, sizeof fields);
    return kInfoBytes;
}
// The host's file handles are descriptors. The count is zeroed before
// anything else, as Windows does.
RUNTIME_WINAPI u32 ReadFile(word handle, unsigned char* buffer, u32 size, u32* read, void* overlapped) {
    if (read != nullptr) {
        *read = 0;
    }
    if (overlapped != nullptr) {
        g_last_error = kInvalidParameter;
        return 0;
    }
    u32 done = 0;
    while (done < size) {
        const ssize_t got = ::read(static_cast<int>(handle), buffer + done, size - done);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            g_last_error = errno == EBADF ? kInvalidHandle : kReadFault;
            return 0;
        }
        if (got == 0) {
            break;
        }
        done += static_cast<u32>(got);
        if (read != nullptr) {
            *read = done;
        }
    }
    return 1;
}
}  // namespace kernel32

namespace msvcrt {
RUNTIME_CDECL void* malloc(std::size_t bytes) {
    if (injected_failure()) {
        return nullptr;
    }
    void* block = std::malloc(bytes == 0 ? 1 : bytes);
    g_live += block != nullptr ? 1 : 0;
    g_total += block != nullptr ? 1 : 0;
    return block;
}
RUNTIME_CDECL void* calloc(std::size_t count, std::size_t bytes) {
    if (bytes != 0 && count > SIZE_MAX / bytes) {
        return nullptr;
    }
    void* block = malloc(count * bytes);
    if (block != nullptr) {
        std::memset(block, 0, count * bytes);
    }
    return block;
}
RUNTIME_CDECL void free(void* block) {
    if (block != nullptr) {
        --g_live;
        std::free(block);
    }
}
// msvcrt's realloc frees the block for size 0 and gives null.
RUNTIME_CDECL void* realloc(void* block, std::size_t bytes) {
    if (block == nullptr) {
        return malloc(bytes);
    }
    if (bytes == 0) {
        free(block);
        return nullptr;
    }
    if (injected_failure()) {
        return nullptr;
    }
    void* moved = std::realloc(block, bytes);
    g_total += moved != nullptr ? 1 : 0;
    return moved;
}
RUNTIME_CDECL void* memcpy(void* to, const void* from, std::size_t n) {
    return std::memcpy(to, from, n);
}
RUNTIME_CDECL void* memmove(void* to, const void* from, std::size_t n) {
    return std::memmove(to, from, n);
}
RUNTIME_CDECL void* memset(void* to, int byte, std::size_t n) {
    return std::memset(to, byte, n);
}
RUNTIME_CDECL std::size_t strlen(const char* text) {
    return std::strlen(text);
}
RUNTIME_CDECL int strncmp(const char* a, const char* b, std::size_t n) {
    return std::strncmp(a, b, n);
}
RUNTIME_CDECL int rand() {
    return draw_hook != nullptr ? draw_hook() : step(generator());
}
RUNTIME_CDECL void srand(unsigned seed) {
    generator() = seed;
}
RUNTIME_CDECL void _initterm(void (**begin)(), void (**end)()) {
    for (; begin < end; ++begin) {
        if (*begin != nullptr) {
            (*begin)();
        }
    }
}
RUNTIME_CDECL void _lock(int) {}
RUNTIME_CDECL void _unlock(int) {}
RUNTIME_CDECL void abort() {
    std::fputs("sorvel test host: the image called abort\n", stderr);
    std::abort();
}
// The C runtime gives up (a second process attach, for one).
RUNTIME_CDECL void _amsg_exit(int code) {
    std::fprintf(stderr, "sorvel test host: the image's C runtime failed: runtime error R60%02d\n", code);
    std::abort();
}
RUNTIME_CDECL std::size_t fwrite(const void* data, std::size_t size, std::size_t count, void* file) {
    std::FILE* out = stream(file);
    return out == nullptr ? 0 : std::fwrite(data, size, count, out);
}
// A va_list on i386 is a pointer to the arguments on the stack on both sides.
RUNTIME_CDECL int vfprintf(void* file, const char* format, std::va_list arguments) {
    std::FILE* out = stream(file);
    return out == nullptr ? -1 : std::vfprintf(out, format, arguments);
}
}  // namespace msvcrt

void* import(std::string_view dll, std::string_view name) {
    struct Entry {
        const char* dll;
        const char* name;
        void* address;
    };
#define RUNTIME_ENTRY(dll, name)                                  \
    Entry {                                                       \
#dll ".dll", #name, reinterpret_cast < void*>(&dll::name) \
    }
    static const Entry kEntries[] = {
        RUNTIME_ENTRY(kernel32, DeleteCriticalSection),
        RUNTIME_ENTRY(kernel32, EnterCriticalSection),
        RUNTIME_ENTRY(kernel32, FreeLibrary),
        RUNTIME_ENTRY(kernel32, GetLastError),
        RUNTIME_ENTRY(kernel32, GetModuleHandleA),
        RUNTIME_ENTRY(kernel32, GetProcAddress),
        RUNTIME_ENTRY(kernel32, InitializeCriticalSection),
        RUNTIME_ENTRY(kernel32, LeaveCriticalSection),
        RUNTIME_ENTRY(kernel32, LoadLibraryA),
        RUNTIME_ENTRY(kernel32, ReadFile),
        RUNTIME_ENTRY(kernel32, Sleep),
        RUNTIME_ENTRY(kernel32, TlsGetValue),
        RUNTIME_ENTRY(kernel32, VirtualProtect),
        RUNTIME_ENTRY(kernel32, VirtualQuery),
        RUNTIME_ENTRY(msvcrt, _amsg_exit),
        RUNTIME_ENTRY(msvcrt, _initterm),
        RUNTIME_ENTRY(msvcrt, _lock),
        RUNTIME_ENTRY(msvcrt, _unlock),
        RUNTIME_ENTRY(msvcrt, abort),
        RUNTIME_ENTRY(msvcrt, calloc),
        RUNTIME_ENTRY(msvcrt, free),
        RUNTIME_ENTRY(msvcrt, fwrite),
        RUNTIME_ENTRY(msvcrt, malloc),
        RUNTIME_ENTRY(msvcrt, memcpy),
        RUNTIME_ENTRY(msvcrt, memmove),
        RUNTIME_ENTRY(msvcrt, memset),
        RUNTIME_ENTRY(msvcrt, rand),
        RUNTIME_ENTRY(msvcrt, srand),
        RUNTIME_ENTRY(msvcrt, realloc),
        RUNTIME_ENTRY(msvcrt, strlen),
        RUNTIME_ENTRY(msvcrt, strncmp),
        RUNTIME_ENTRY(msvcrt, vfprintf),
        Entry{"msvcrt.dll", "_iob", iob()},
    };
#undef RUNTIME_ENTRY
    for (const Entry& e : kEntries) {
        if (name == e.name && dll.size() == std::strlen(e.dll) && ::strncasecmp(dll.data(), e.dll, dll.size()) == 0) {
            return e.address;
        }
    }
    return nullptr;
}

const Library::Allocations& allocations() {
    static constexpr Library::Allocations kCounter{[] { return g_live; }, [](long n) { g_countdown = n < 0 ? -1 : n; },
                                                   [] { return g_total; }};
    return kCounter;
}

std::uint32_t& generator() {
    static std::uint32_t state = 1;
    return state;
}

// The thread block the image reads through %fs: the end of the exception
// handler chain at 0, the stack base at 4, itself at 0x18, the TLS slots at
// 0x2C and a process block at 0x30. glibc on i386 uses %gs, so %fs is free.
void install_thread_block(const std::vector<unsigned char>* tls_block) {
    alignas(16) static unsigned char teb[kPage] = {};
    alignas(16) static unsigned char peb[kPage] = {};
    static void* tls_slots[64] = {};
    static bool installed = false;
    tls_slots[0] = tls_block != nullptr ? const_cast<unsigned char*>(tls_block->data()) : nullptr;
    if (installed) {
        return;
    }
    const auto put = [](std::size_t offset, const void* value) {
        const auto bits = static_cast<u32>(reinterpret_cast<std::uintptr_t>(value));
        std::memcpy(teb + offset, &bits, sizeof bits);
    };
    put(0x00, reinterpret_cast<void*>(~std::uintptr_t{0}));
    put(0x04, teb + kPage);
    put(0x08, teb);
    put(0x18, teb);
    put(0x2C, tls_slots);
    put(0x30, peb);
    user_desc segment{};
    segment.entry_number = ~0U;  // any free entry
    segment.base_addr = static_cast<unsigned>(reinterpret_cast<std::uintptr_t>(teb));
    segment.limit = kPage - 1;
    segment.seg_32bit = 1;
    segment.useable = 1;
    if (::syscall(SYS_set_thread_area, &segment) != 0) {
        throw std::runtime_error(std::string("cannot give the image a thread block: set_thread_area: ") +
                                 std::strerror(errno));
    }
    const auto selector = static_cast<std::uint16_t>(segment.entry_number * 8 + 3);
    __asm__ volatile("movw %0, %%fs" : : "r"(selector));
    installed = true;
}

}  // namespace sorvel::testhost::runtime
