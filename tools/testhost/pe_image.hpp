// A 32-bit Windows DLL mapped and run by the test host itself, on 32-bit x86
// Linux, where neither the kernel nor wine can run it: the product DLL runs
// under qemu-i386 with the host's own KERNEL32 and msvcrt behind its imports.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "test_host.hpp"

namespace sorvel::testhost {

class PeImage {
public:
    // Maps, relocates and links the image, runs its TLS callbacks and its
    // entry point for process attach. Throws std::runtime_error naming the
    // problem for anything it cannot run; nothing of the image has run then.
    PeImage(const std::string& path, std::vector<unsigned char> file);
    // Process detach, as at unload, then unmaps.
    ~PeImage();
    PeImage(const PeImage&) = delete;
    PeImage& operator=(const PeImage&) = delete;

    word base() const { return reinterpret_cast<word>(base_); }
    void* entry_point() const;
    void* symbol(std::string_view name) const;  // null when absent
    void* symbol_by_ordinal(int ordinal) const;

private:
    struct Exports {
        std::uint32_t ordinal_base = 0;
        std::vector<std::uint32_t> functions;                      // RVAs by ordinal - base; 0: none
        std::vector<std::pair<std::string, std::uint32_t>> names;  // name, index into functions
    };
    void map(const std::vector<unsigned char>& file);
    void relocate();
    void link();
    void read_exports();
    void attach();
    void run_tls_callbacks(word reason);

    std::string path_;
    unsigned char* base_ = nullptr;
    std::uint32_t size_ = 0;
    std::uint32_t entry_ = 0;
    std::uint32_t image_base_ = 0;
    std::uint32_t directories_ = 0;  // header offset of the data directories
    std::uint32_t directory_count_ = 0;
    std::vector<unsigned char> tls_block_;
    std::vector<void*> tls_callbacks_;
    bool attached_ = false;
    Exports exports_;
};

// The C runtime and system functions a mapped image imports, played by the
// test host (host_runtime.cpp).
namespace runtime {
// The host's function or data for dll!name; null for one it does not provide.
void* import(std::string_view dll, std::string_view name);
// Blocks the image allocated through the malloc family, and failure injection.
const Library::Allocations& allocations();
// Gives the image a thread block through %fs, as Windows does.
void install_thread_block(const std::vector<unsigned char>* tls_block);

// msvcrt's generator: the state is 1 until seeded; each draw steps it and
// gives bits 16 to 30 of the new state.
inline int step(std::uint32_t& state) {
    state = state * 214013U + 2531011U;
    return static_cast<int>((state >> 16U) & 0x7FFFU);
}
std::uint32_t& generator();
std::size_t images();  // images mapped now
// Set by the draws module when a program uses it, so that tests script and
// count an image's draws as they do a linked library's.
extern int (*draw_hook)();
}  // namespace runtime

}  // namespace sorvel::testhost
