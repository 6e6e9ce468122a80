// Maps a PE32 DLL the way the Windows loader does, as far as a DLL built by
// mingw needs: headers and sections, base relocations, imports by name, the
// TLS directory and the entry point. Everything read from the file is
// checked before it is used, so a broken file fails with a message.
#include "pe_image.hpp"

#include <sys/mman.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <stdexcept>

namespace sorvel::testhost {
namespace {

using u32 = std::uint32_t;
using u16 = std::uint16_t;

constexpr u16 kMachineI386 = 0x14C;
constexpr u16 kMagicPe32 = 0x10B;
constexpr u32 kMaxImage = 64U << 20U;
constexpr std::size_t kSectionHeader = 40;
enum Directory { kExport = 0, kImport = 1, kRelocation = 5, kTls = 9 };

std::size_t g_images = 0;

std::string hex(u32 value) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%X", value);
    return text;
}

template <class T>
T read_file(const std::vector<unsigned char>& file, std::size_t offset, const char* what) {
    if (offset > file.size() || sizeof(T) > file.size() - offset) {
        throw std::runtime_error(std::string("truncated file: ") + what + " at offset " + std::to_string(offset) +
                                 " lies beyond its " + std::to_string(file.size()) + " bytes");
    }
    T value;
    std::memcpy(&value, file.data() + offset, sizeof value);
    return value;
}

using EntryFunction = word(__attribute__((stdcall)) *)(word, word, word);

}  // namespace

namespace runtime {
std::size_t images() {
    return g_images;
}
}  // namespace runtime

namespace {
// Reads of the mapped image, checked against its size.
struct View {
    unsigned char* base;
    u32 size;

    void check(u32 rva, u32 bytes, const std::string& what) const {
        if (rva > size || bytes > size - rva) {
            throw std::runtime_error(what + " at " + hex(rva) + " lies outside the image of " + hex(size) + " bytes");
        }
    }
    template <class T>
    T get(u32 rva, const char* what) const {
        check(rva, sizeof(T), what);
        T value;
        std::memcpy(&value, base + rva, sizeof value);
        return value;
    }
    template <class T>
    void put(u32 rva, T value, const char* what) const {
        check(rva, sizeof(T), what);
        std::memcpy(base + rva, &value, sizeof value);
    }
    std::string text(u32 rva, const char* what) const {
        check(rva, 1, what);
        const void* end = std::memchr(base + rva, 0, size - rva);
        if (end == nullptr) {
            throw std::runtime_error(std::string(what) + " at " + hex(rva) + " runs past the image");
        }
        return std::string(reinterpret_cast<const char*>(base + rva));
    }
};
}  // namespace

PeImage::PeImage(const std::string& path, std::vector<unsigned char> file) : path_(path) {
    try {
        map(file);
        relocate();
        link();
        read_exports();
        attach();
    } catch (const std::runtime_error& e) {
        if (base_ != nullptr) {
            ::munmap(base_, size_);
        }
        throw std::runtime_error("cannot load " + path + ": " + e.what());
    }
    ++g_images;
}

PeImage::~PeImage() {
    if (attached_) {
        run_tls_callbacks(0);
        reinterpret_cast<EntryFunction>(entry_point())(base(), 0, 0);
    }
    runtime::install_thread_block(nullptr);
    ::munmap(base_, size_);
    --g_images;
}

void* PeImage::entry_point() const {
    return entry_ == 0 ? nullptr : base_ + entry_;
}

void PeImage::map(const std::vector<unsigned char>& file) {
    if (file.size() < 2 || file[0] != 'M' || file[1] != 'Z') {
        throw std::runtime_error("no MZ signature");
    }
    const auto pe = read_file<u32>(file, 0x3C, "the PE header offset");
    if (read_file<u32>(file, pe, "the PE signature") != 0x4550) {
        throw std::runtime_error("bad header: no PE signature at offset " + std::to_string(pe));
    }
    const auto machine = read_file<u16>(file, pe + 4, "the machine type");
    if (machine != kMachineI386) {
        throw std::runtime_error("wrong machine type " + hex(machine) + ": not i386 (0x14C)");
    }
    const auto sections = read_file<u16>(file, pe + 6, "the section count");
    const auto optional_size = read_file<u16>(file, pe + 20, "the optional header size");
    const std::size_t optional = pe + 24;
    if (optional_size < 96) {
        throw std::runtime_error("bad header: an optional header of " + std::to_string(optional_size) + " bytes");
    }
    read_file<std::uint8_t>(file, optional + optional_size - 1, "the optional header");
    const auto magic = read_file<u16>(file, optional, "the optional header magic");
    if (magic != kMagicPe32) {
        throw std::runtime_error("bad header: optional header magic " + hex(magic) + ", not PE32 (0x10B)");
    }
    entry_ = read_file<u32>(file, optional + 16, "the entry point");
    image_base_ = read_file<u32>(file, optional + 28, "the image base");
    size_ = read_file<u32>(file, optional + 56, "the image size");
    const auto headers = read_file<u32>(file, optional + 60, "the header size");
    directories_ = static_cast<u32>(optional + 96);
    directory_count_ = std::min<u32>(read_file<u32>(file, optional + 92, "the directory count"),
                                     static_cast<u32>((optional_size - 96U) / 8U));
    const std::size_t table = optional + optional_size;
    if (size_ == 0 || size_ > kMaxImage) {
        throw std::runtime_error("bad header: an image size of " + hex(size_) + " bytes");
    }
    if (headers > size_ || headers > file.size() || table + sections * kSectionHeader > headers) {
        throw std::runtime_error("bad header: the headers (" + std::to_string(headers) +
                                 " bytes) do not fit the file, the image or the section table");
    }
    if (entry_ >= size_) {
        throw std::runtime_error("bad header: the entry point " + hex(entry_) + " lies outside the image");
    }

    void* mapped = ::mmap(nullptr, size_, PROT_READ | PROT_WRITE | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (mapped == MAP_FAILED) {
        throw std::runtime_error("cannot map " + std::to_string(size_) + " bytes");
    }
    base_ = static_cast<unsigned char*>(mapped);
    std::memcpy(base_, file.data(), headers);
    const View image{base_, size_};
    for (std::size_t s = 0; s < sections; ++s) {
        const std::size_t at = table + s * kSectionHeader;
        char name[9] = {};
        std::memcpy(name, file.data() + at, 8);
        const auto virtual_size = read_file<u32>(file, at + 8, "a section size");
        const auto address = read_file<u32>(file, at + 12, "a section address");
        const auto raw_size = read_file<u32>(file, at + 16, "a section's raw size");
        const auto raw_at = read_file<u32>(file, at + 20, "a section's raw offset");
        const u32 bytes = virtual_size == 0 ? raw_size : std::min(raw_size, virtual_size);
        image.check(address, std::max(bytes, virtual_size), std::string("section ") + name);
        if (raw_at > file.size() || bytes > file.size() - raw_at) {
            throw std::runtime_error(std::string("truncated file: section ") + name + " needs bytes up to offset " +
                                     std::to_string(std::size_t{raw_at} + bytes) + " of a file of " +
                                     std::to_string(file.size()));
        }
        std::memcpy(base_ + address, file.data() + raw_at, bytes);
    }
}

namespace {
struct Range {
    u32 rva = 0;
    u32 size = 0;
};
Range directory(const View& image, u32 table, u32 count, Directory which) {
    if (static_cast<u32>(which) >= count) {
        return {};
    }
    const Range r{image.get<u32>(table + 8 * which, "a data directory"),
                  image.get<u32>(table + 8 * which + 4, "a data directory")};
    if (r.size != 0) {
        image.check(r.rva, r.size, "data directory " + std::to_string(which));
    }
    return r;
}
}  // namespace

void PeImage::relocate() {
    const View image{base_, size_};
    const u32 delta = static_cast<u32>(reinterpret_cast<std::uintptr_t>(base_)) - image_base_;
    const Range r = directory(image, directories_, directory_count_, kRelocation);
    if (r.size == 0 && delta != 0) {
        throw std::runtime_error("no base relocations, and the image cannot sit at its preferred base");
    }
    for (u32 at = r.rva; at + 8 <= r.rva + r.size;) {
        const auto page = image.get<u32>(at, "a relocation block");
        const auto block = image.get<u32>(at + 4, "a relocation block");
        if (block < 8 || block > r.rva + r.size - at) {
            throw std::runtime_error("bad relocation block of " + std::to_string(block) + " bytes at " + hex(at));
        }
        for (u32 e = at + 8; e + 2 <= at + block; e += 2) {
            const auto entry = image.get<u16>(e, "a relocation");
            const u32 type = entry >> 12U;
            const u32 target = page + (entry & 0xFFFU);
            if (type == 3) {  // the whole 32-bit address
                image.put<u32>(target, image.get<u32>(target, "a relocated word") + delta, "a relocated word");
            } else if (type != 0) {  // 0 pads a block
                throw std::runtime_error("unsupported relocation type " + std::to_string(type) + " at " + hex(target));
            }
        }
        at += block;
    }
}

void PeImage::link() {
    const View image{base_, size_};
    const Range r = directory(image, directories_, directory_count_, kImport);
    for (u32 d = r.rva; r.size != 0; d += 20) {
        const auto lookup = image.get<u32>(d, "an import descriptor");
        const auto name_at = image.get<u32>(d + 12, "an import descriptor");
        const auto slots = image.get<u32>(d + 16, "an import descriptor");
        if (name_at == 0 && slots == 0) {
            break;
        }
        const std::string dll = image.text(name_at, "an imported DLL's name");
        for (u32 i = 0;; ++i) {
            const auto thunk = image.get<u32>((lookup != 0 ? lookup : slots) + 4 * i, "an import thunk");
            if (thunk == 0) {
                break;
            }
            if ((thunk & 0x80000000U) != 0) {
                throw std::runtime_error("imports ordinal " + std::to_string(thunk & 0xFFFFU) + " from " + dll +
                                         "; the test host provides imports by name only");
            }
            const std::string name = image.text(thunk + 2, "an imported name");
            void* address = runtime::import(dll, name);
            if (address == nullptr) {
                throw std::runtime_error("unknown import " + dll + "!" + name + ": the test host does not provide it");
            }
            image.put<u32>(slots + 4 * i, static_cast<u32>(reinterpret_cast<std::uintptr_t>(address)),
                           "an import address slot");
        }
    }
}

void PeImage::read_exports() {
    const View image{base_, size_};
    const Range r = directory(image, directories_, directory_count_, kExport);
    if (r.size == 0) {
        return;
    }
    exports_.ordinal_base = image.get<u32>(r.rva + 16, "the export directory");
    const auto count = image.get<u32>(r.rva + 20, "the export directory");
    const auto named = image.get<u32>(r.rva + 24, "the export directory");
    const auto functions = image.get<u32>(r.rva + 28, "the export directory");
    const auto names = image.get<u32>(r.rva + 32, "the export directory");
    const auto ordinals = image.get<u32>(r.rva + 36, "the export directory");
    image.check(functions, count * 4U, "the export address table");
    image.check(names, named * 4U, "the export name table");
    for (u32 i = 0; i < count; ++i) {
        const auto rva = image.get<u32>(functions + 4 * i, "an export");
        if (rva >= size_) {
            throw std::runtime_error("export ordinal " + std::to_string(exports_.ordinal_base + i) + " points to " +
                                     hex(rva) + ", outside the image");
        }
        exports_.functions.push_back(rva);
    }
    for (u32 i = 0; i < named; ++i) {
        std::string name = image.text(image.get<u32>(names + 4 * i, "an export name"), "an export name");
        const auto index = image.get<u16>(ordinals + 2 * i, "an export ordinal");
        if (index >= count) {
            throw std::runtime_error("export " + name + " has ordinal " +
                                     std::to_string(exports_.ordinal_base + index) + ", out of range of the " +
                                     std::to_string(count) + " exported functions");
        }
        exports_.names.emplace_back(std::move(name), index);
    }
}

void* PeImage::symbol(std::string_view name) const {
    for (const auto& [export_name, index] : exports_.names) {
        if (export_name == name) {
            return base_ + exports_.functions[index];
        }
    }
    return nullptr;
}

void* PeImage::symbol_by_ordinal(int ordinal) const {
    const long index = static_cast<long>(ordinal) - static_cast<long>(exports_.ordinal_base);
    if (ordinal <= 0 || index < 0 || static_cast<std::size_t>(index) >= exports_.functions.size() ||
        exports_.functions[static_cast<std::size_t>(index)] == 0) {
        return nullptr;
    }
    return base_ + exports_.functions[static_cast<std::size_t>(index)];
}

void PeImage::run_tls_callbacks(word reason) {
    for (void* callback : tls_callbacks_) {
        reinterpret_cast<EntryFunction>(callback)(base(), reason, 0);
    }
}

void PeImage::attach() {
    const View image{base_, size_};
    const Range r = directory(image, directories_, directory_count_, kTls);
    if (r.size != 0) {
        // The directory holds addresses: the data template, the index slot.
        const u32 base_va = static_cast<u32>(reinterpret_cast<std::uintptr_t>(base_));
        const u32 start = image.get<u32>(r.rva, "the TLS directory") - base_va;
        const u32 end = image.get<u32>(r.rva + 4, "the TLS directory") - base_va;
        const u32 index = image.get<u32>(r.rva + 8, "the TLS directory") - base_va;
        const u32 zero_fill = image.get<u32>(r.rva + 16, "the TLS directory");
        if (end < start || zero_fill > kMaxImage) {
            throw std::runtime_error("bad TLS directory");
        }
        image.check(start, end - start, "the TLS template");
        tls_block_.assign(base_ + start, base_ + end);
        tls_block_.resize(tls_block_.size() + zero_fill);
        image.put<u32>(index, 0, "the TLS index slot");
        for (u32 at = image.get<u32>(r.rva + 12, "the TLS directory"); at != 0; at += 4) {
            const auto callback = image.get<u32>(at - base_va, "a TLS callback");
            if (callback == 0) {
                break;
            }
            image.check(callback - base_va, 1, "a TLS callback");
            tls_callbacks_.push_back(base_ + (callback - base_va));
        }
    }
    runtime::install_thread_block(&tls_block_);
    run_tls_callbacks(1);
    if (entry_ != 0 && reinterpret_cast<EntryFunction>(entry_point())(base(), 1, 0) == 0) {
        run_tls_callbacks(0);
        throw std::runtime_error("the entry point refused process attach");
    }
    attached_ = true;
}

}  // namespace sorvel::testhost
