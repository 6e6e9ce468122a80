// The counter, the library's allocation seam for programs that link it in,
// and the rerouting of a loaded DLL's imports of malloc, calloc, realloc and
// free. The blocks it made are known by address, so a block that the library
// allocated before its imports were rerouted, and frees after, passes to the
// C runtime uncounted. One thread at a time calls the library.
#include "counting_allocator.hpp"

#include <cstdlib>
#include <unordered_set>

#include "collections/memory.hpp"
#include "test_host.hpp"

#if defined(_WIN32)
#ifndef WIN32_LEAN_AND_MEAN
#define WIN32_LEAN_AND_MEAN
#endif
#include <windows.h>

#include <cstring>
#include <stdexcept>
#endif

namespace sorvel::testhost::counting {
namespace {

// The C runtime that the counted blocks come from and go back to.
struct Heap {
    void* (*malloc)(std::size_t);
    void* (*calloc)(std::size_t, std::size_t);
    void* (*realloc)(void*, std::size_t);
    void (*free)(void*);
};

struct Counter {
    std::unordered_set<void*> blocks;
    std::uint64_t total = 0;
    long countdown = -1;

    bool fails() { return countdown >= 0 && countdown-- == 0; }
    void* counted(void* block) {
        if (block != nullptr) {
            blocks.insert(block);
            ++total;
        }
        return block;
    }
};

// Never destroyed: a DLL may free its blocks after the program's own
// static objects are gone.
Counter& counter() {
    static auto* c = new Counter();
    return *c;
}

void* allocate(const Heap& heap, std::size_t bytes) {
    return counter().fails() ? nullptr : counter().counted(heap.malloc(bytes));
}

void release(const Heap& heap, void* block) {
    counter().blocks.erase(block);
    heap.free(block);
}

const Heap kProgramHeap{[](std::size_t bytes) { return std::malloc(bytes); },
                        [](std::size_t count, std::size_t bytes) { return std::calloc(count, bytes); },
                        [](void* block, std::size_t bytes) { return std::realloc(block, bytes); },
                        [](void* block) { std::free(block); }};

}  // namespace

std::size_t live() {
    return counter().blocks.size();
}
std::uint64_t total() {
    return counter().total;
}
void fail_after(long n) {
    counter().countdown = n < 0 ? -1 : n;
}

namespace {

#if defined(_WIN32)
void* allocate_zeroed(const Heap& heap, std::size_t count, std::size_t bytes) {
    return counter().fails() ? nullptr : counter().counted(heap.calloc(count, bytes));
}

// msvcrt's realloc: null allocates, size 0 frees. A block allocated before
// the rerouting stays uncounted when it moves.
void* reallocate(const Heap& heap, void* block, std::size_t bytes) {
    if (block == nullptr) {
        return allocate(heap, bytes);
    }
    if (bytes == 0) {
        release(heap, block);
        return nullptr;
    }
    Counter& c = counter();
    if (c.fails()) {
        return nullptr;
    }
    void* moved = heap.realloc(block, bytes);
    if (moved != nullptr && c.blocks.erase(block) == 1) {
        c.counted(moved);
    }
    return moved;
}

// The rerouted imports call the functions they replaced. Every DLL imports
// the same msvcrt, so one set of them serves every rerouted module.
Heap g_module_heap{};

void* counted_malloc(std::size_t bytes) {
    return allocate(g_module_heap, bytes);
}
void* counted_calloc(std::size_t count, std::size_t bytes) {
    return allocate_zeroed(g_module_heap, count, bytes);
}
void* counted_realloc(void* block, std::size_t bytes) {
    return reallocate(g_module_heap, block, bytes);
}
void counted_free(void* block) {
    release(g_module_heap, block);
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

// Tells the test host about the counter as the program starts.
const Library::Counter kCounter{{&live, &fail_after, &total}, &reroute};
[[maybe_unused]] const bool g_installed = (Library::use_counter(&kCounter), true);

}  // namespace
}  // namespace sorvel::testhost::counting

// The library's allocation seam, in place of the product's: the archive's
// memory object is never linked into a program that links this one.
namespace sorvel::memory {

void* allocate(std::size_t bytes) noexcept {
    return testhost::counting::allocate(testhost::counting::kProgramHeap, bytes == 0 ? 1 : bytes);
}

void release(void* block) noexcept {
    if (block != nullptr) {
        testhost::counting::release(testhost::counting::kProgramHeap, block);
    }
}

}  // namespace sorvel::memory
