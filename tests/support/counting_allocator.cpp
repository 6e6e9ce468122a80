// The counter, the library's allocation seam for programs that link it in,
// and the rerouting of a loaded DLL's imports of malloc, calloc, realloc and
// free. Every block of the seam comes through the counter, so a count does
// for them, as cheap as the benchmarks need. A DLL's blocks are known by
// address: one that its C runtime allocated before the imports were
// rerouted, and frees after, passes to the C runtime uncounted. One thread at
// a time calls the library.
#include "counting_allocator.hpp"

#include <cstdlib>

#include "collections/memory.hpp"
#include "simulated_host.hpp"

#if defined(_WIN32)
#ifndef WIN32_LEAN_AND_MEAN
#define WIN32_LEAN_AND_MEAN
#endif
#include <windows.h>

#include <cstring>
#include <stdexcept>
#include <unordered_set>
#endif

namespace sorvel::test::counting {
namespace {

std::size_t g_live = 0;  // the seam's blocks
std::uint64_t g_total = 0;
long g_countdown = -1;

bool fails() {
    return g_countdown >= 0 && g_countdown-- == 0;
}

void* counted(void* block) {
    g_total += block != nullptr ? 1 : 0;
    return block;
}

#if defined(_WIN32)
// Never destroyed: a DLL frees its blocks after the program's own static
// objects are gone.
std::unordered_set<void*>& module_blocks() {
    static auto* blocks = new std::unordered_set<void*>();
    return *blocks;
}
#endif

}  // namespace

std::size_t live() {
#if defined(_WIN32)
    return g_live + module_blocks().size();
#else
    return g_live;
#endif
}
std::uint64_t total() {
    return g_total;
}
void fail_after(long n) {
    g_countdown = n < 0 ? -1 : n;
}

namespace {

#if defined(_WIN32)
// The C runtime functions that the rerouted imports replaced. Every DLL
// imports the same msvcrt, so one set of them serves every rerouted module.
struct Heap {
    void* (*malloc)(std::size_t);
    void* (*calloc)(std::size_t, std::size_t);
    void* (*realloc)(void*, std::size_t);
    void (*free)(void*);
};
Heap g_module_heap{};

void* module_block(void* block) {
    if (counted(block) != nullptr) {
        module_blocks().insert(block);
    }
    return block;
}

void* counted_malloc(std::size_t bytes) {
    return fails() ? nullptr : module_block(g_module_heap.malloc(bytes));
}
void* counted_calloc(std::size_t count, std::size_t bytes) {
    return fails() ? nullptr : module_block(g_module_heap.calloc(count, bytes));
}
void counted_free(void* block) {
    module_blocks().erase(block);
    g_module_heap.free(block);
}
// msvcrt's realloc: null allocates, size 0 frees. A block from before the
// rerouting stays uncounted when it moves.
void* counted_realloc(void* block, std::size_t bytes) {
    if (block == nullptr) {
        return counted_malloc(bytes);
    }
    if (bytes == 0) {
        counted_free(block);
        return nullptr;
    }
    if (fails()) {
        return nullptr;
    }
    void* moved = g_module_heap.realloc(block, bytes);
    if (moved != nullptr && module_blocks().erase(block) == 1) {
        module_block(moved);
    }
    return moved;
}

template <class T>
T* at(HMODULE module, DWORD rva) {
    return reinterpret_cast<T*>(reinterpret_cast<unsigned char*>(module) + rva);
}

// Points the module's msvcrt imports of the four allocator functions at the
// counter; false when it imports none of them.
bool reroute(void* handle) {
    const auto module = static_cast<HMODULE>(handle);
    const auto* nt = at<const IMAGE_NT_HEADERS>(module, static_cast<DWORD>(at<IMAGE_DOS_HEADER>(module, 0)->e_lfanew));
    const IMAGE_DATA_DIRECTORY& imports = nt->OptionalHeader.DataDirectory[IMAGE_DIRECTORY_ENTRY_IMPORT];
    struct Slot {
        const char* name;
        void** original;
        void* counted;
    };
    const Slot slots[] = {
        {"malloc", reinterpret_cast<void**>(&g_module_heap.malloc), reinterpret_cast<void*>(&counted_malloc)},
        {"calloc", reinterpret_cast<void**>(&g_module_heap.calloc), reinterpret_cast<void*>(&counted_calloc)},
        {"realloc", reinterpret_cast<void**>(&g_module_heap.realloc), reinterpret_cast<void*>(&counted_realloc)},
        {"free", reinterpret_cast<void**>(&g_module_heap.free), reinterpret_cast<void*>(&counted_free)},
    };
    int rerouted = 0;
    for (auto* d = at<IMAGE_IMPORT_DESCRIPTOR>(module, imports.VirtualAddress);
         imports.VirtualAddress != 0 && d->Name != 0; ++d) {
        if (_stricmp(at<const char>(module, d->Name), "msvcrt.dll") != 0 || d->OriginalFirstThunk == 0) {
            continue;
        }
        auto* name = at<IMAGE_THUNK_DATA>(module, d->OriginalFirstThunk);
        auto* bound = at<IMAGE_THUNK_DATA>(module, d->FirstThunk);
        for (; name->u1.AddressOfData != 0; ++name, ++bound) {
            if (IMAGE_SNAP_BY_ORDINAL(name->u1.Ordinal)) {
                continue;
            }
            const char* imported = at<IMAGE_IMPORT_BY_NAME>(module, static_cast<DWORD>(name->u1.AddressOfData))->Name;
            for (const Slot& s : slots) {
                if (std::strcmp(imported, s.name) != 0) {
                    continue;
                }
                auto* target = reinterpret_cast<void**>(&bound->u1.Function);
                if (*s.original != nullptr && *s.original != *target && *target != s.counted) {
                    throw std::runtime_error(std::string("a second C runtime behind ") + s.name);
                }
                if (*target == s.counted) {
                    break;  // rerouted already
                }
                *s.original = *target;
                DWORD protection = 0;
                if (VirtualProtect(target, sizeof *target, PAGE_READWRITE, &protection) == 0) {
                    throw std::runtime_error("cannot write the import table: error " + std::to_string(GetLastError()));
                }
                *target = s.counted;
                VirtualProtect(target, sizeof *target, protection, &protection);
                ++rerouted;
            }
        }
    }
    return rerouted != 0;
}
#else
bool reroute(void*) {
    return false;
}  // a shared object's allocations stay out of reach
#endif

// Tells the simulated host about the counter as the program starts.
const simulated::Library::Counter kCounter{{&live, &fail_after, &total}, &reroute};
[[maybe_unused]] const bool g_installed = (simulated::Library::use_counter(&kCounter), true);

}  // namespace
}  // namespace sorvel::test::counting

// The library's allocation seam, in place of the product's: the archive's
// memory object is never linked into a program that links this one.
namespace sorvel::memory {

void* allocate(std::size_t bytes) noexcept {
    using namespace test::counting;
    if (fails()) {
        return nullptr;
    }
    void* block = counted(std::malloc(bytes == 0 ? 1 : bytes));
    g_live += block != nullptr ? 1 : 0;
    return block;
}

void release(void* block) noexcept {
    if (block != nullptr) {
        --test::counting::g_live;
        std::free(block);
    }
}

}  // namespace sorvel::memory
