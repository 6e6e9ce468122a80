// Static checks of the product: the 32-bit Windows DLL that the host loads,
// read with objdump, never run. The DLL ships stripped; its symbols come
// from sorvel.dll.debug beside it.
//  - the export table holds exactly the host's names and ordinals, undecorated,
//    each at its stdcall function;
//  - it imports only these functions of Windows system DLLs, so it loads on a
//    bare system;
//  - it has no symbols or debug sections, only a debug link to its symbols;
//  - its allocation seam keeps no data: no counter or countdown;
//  - its version resource names the product and the project version, and no
//    company or copyright.
// Usage: sorvel_dll_check [gtest flags] PATH/TO/sorvel.dll
// The objdump program can be chosen with SORVEL_OBJDUMP.
#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <string>

#include "exports_table.hpp"
#include "host/catalogue.hpp"

namespace {

std::string g_dll;
std::string g_debug;  // its symbols

std::string decorated(const std::string& name, int args) {
    return "_" + name + "@" + std::to_string(4 * args);
}

// The output of `objdump FLAG file`; empty with a failure when it cannot run.
std::string objdump(const std::string& flag, const std::string& file = g_dll) {
    const char* chosen = std::getenv("SORVEL_OBJDUMP");
    const std::string command =
        std::string(chosen != nullptr && *chosen != '\0' ? chosen : "i686-w64-mingw32-objdump") + " " + flag + " '" +
        file + "' 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    std::string out;
    char buffer[65536];
    for (std::size_t n = 0; pipe != nullptr && (n = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;) {
        out.append(buffer, n);
    }
    if (pipe == nullptr || pclose(pipe) != 0) {
        ADD_FAILURE() << command << " failed";
    }
    return out;
}

// What -p tells: the format, the base, the exports and the imports.
struct Headers {
    std::string format;
    unsigned long image_base = 0;
    int ordinal_base = -1;
    std::map<std::string, int> named;                      // name -> ordinal
    std::map<int, unsigned long> addresses;                // ordinal -> RVA
    std::map<std::string, std::set<std::string>> imports;  // DLL, lower case -> names
};

Headers parse_headers(const std::string& text) {
    static const std::regex format(R"(file format (\S+))"), base(R"(^ImageBase\s+([0-9a-f]+))"),
        ordinal_base(R"(^Ordinal Base\s+(\d+))"),
        address(R"(^\s+\[\s*\d+\] \+base\[\s*(\d+)\] ([0-9a-f]+) Export RVA)"), name(R"(^\s+\[\s*(\d+)\] (\S+)$)"),
        dll(R"(DLL Name: (\S+))"), member(R"(^\s+[0-9a-f]+\s+\d+\s+(\S+)$)");
    Headers h;
    enum { other, names, imports } section = other;
    std::string current;
    std::istringstream in(text);
    std::smatch m;
    for (std::string line; std::getline(in, line);) {
        if (line.find("[Ordinal/Name Pointer] Table") != std::string::npos) {
            section = names;
        } else if (std::regex_search(line, m, dll)) {
            section = imports;
            current.clear();
            for (char c : m[1].str()) {
                current += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            }
        } else if (line.empty() || line.find("Export Tables") != std::string::npos) {
            section = section == names ? other : section;
        } else if (h.format.empty() && std::regex_search(line, m, format)) {
            h.format = m[1];
        } else if (std::regex_search(line, m, base)) {
            h.image_base = std::stoul(m[1], nullptr, 16);
        } else if (std::regex_search(line, m, ordinal_base)) {
            h.ordinal_base = std::stoi(m[1]);
        } else if (std::regex_search(line, m, address)) {
            h.addresses[std::stoi(m[1])] = std::stoul(m[2], nullptr, 16);
        } else if (section == names && std::regex_search(line, m, name)) {
            h.named[m[2]] = std::stoi(m[1]);  // less the base, added below
        } else if (section == imports && std::regex_search(line, m, member)) {
            h.imports[current].insert(m[1]);
        }
    }
    for (auto& [exported, ordinal] : h.named) {
        ordinal += h.ordinal_base;
    }
    return h;
}

// The symbols' addresses and kinds, from -t of the DLL's symbols, and the
// sections' addresses, from -h.
struct Image {
    std::map<std::string, unsigned long> symbols;
    std::set<std::string> data;  // symbols that are not functions
};

Image parse_image(const std::string& sections, const std::string& symbols) {
    static const std::regex section(R"(^\s+(\d+) (\S+)\s+([0-9a-f]+)\s+([0-9a-f]+))"),
        symbol(R"(\(sec\s+(\d+)\)\(fl 0x[0-9a-f]+\)\(ty\s+(\d+)\).*0x([0-9a-f]+) (\S+)$)");
    Image image;
    std::map<int, unsigned long> vma;
    std::smatch m;
    std::istringstream in(sections + symbols);
    for (std::string text; std::getline(in, text);) {
        if (std::regex_search(text, m, section)) {
            vma[std::stoi(m[1]) + 1] = std::stoul(m[4], nullptr, 16);
        } else if (std::regex_search(text, m, symbol)) {
            const unsigned long address = vma[std::stoi(m[1])] + std::stoul(m[3], nullptr, 16);
            image.symbols[m[4]] = address;
            if (m[2] != "20") {  // not a function
                image.data.insert(m[4]);
            }
        }
    }
    return image;
}

class ProductDll : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        headers_ = new Headers(parse_headers(objdump("-p")));
        image_ = new Image(parse_image(objdump("-h"), objdump("-t", g_debug)));
    }
    static inline Headers* headers_ = nullptr;
    static inline Image* image_ = nullptr;
};

TEST_F(ProductDll, IsA32BitWindowsImage) {
    EXPECT_EQ(headers_->format, "pei-i386");
}

TEST_F(ProductDll, ExportsExactlyTheHostsNamesAndOrdinalsAtTheirFunctions) {
    EXPECT_EQ(headers_->ordinal_base, 2) << "ordinals are numbered from 2";
    std::map<std::string, int> expected;
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        expected[e.name] = e.ordinal;
        const auto function = image_->symbols.find(decorated(e.name, e.args));
        ASSERT_NE(function, image_->symbols.end()) << "no stdcall function " << decorated(e.name, e.args);
        EXPECT_EQ(headers_->image_base + headers_->addresses[e.ordinal], function->second)
            << e.name << " exports another address";
    }
    EXPECT_EQ(headers_->named, expected) << "exactly these names, undecorated";
    for (const auto& [ordinal, rva] : headers_->addresses) {
        EXPECT_TRUE(rva == 0 || std::any_of(expected.begin(), expected.end(),
                                            [ordinal = ordinal](const auto& e) { return e.second == ordinal; }))
            << "ordinal " << ordinal << " is reachable by ordinal alone";
    }
}

TEST_F(ProductDll, ImportsOnlyTheseSystemFunctions) {
    // No runtime DLL of the compiler (libstdc++, libgcc, winpthread) may be
    // needed, nor any function beyond these. Files are read with ReadFile;
    // draws come from the C runtime's rand that the host shares; blocks from
    // the C runtime's allocator, which tests reroute. The rest serves the
    // start-up code of the C runtime and libgcc, and the compiler's own calls.
    const std::map<std::string, std::set<std::string>> allowed = {
        {"kernel32.dll",
         {"DeleteCriticalSection", "EnterCriticalSection", "FreeLibrary", "GetLastError", "GetModuleHandleA",
          "GetProcAddress", "InitializeCriticalSection", "LeaveCriticalSection", "LoadLibraryA", "ReadFile", "Sleep",
          "TlsGetValue", "VirtualProtect", "VirtualQuery"}},
        {"msvcrt.dll",
         {"_amsg_exit", "_initterm", "_iob", "_lock", "_unlock", "abort", "calloc", "free", "fwrite", "malloc",
          "memcpy", "memmove", "memset", "rand", "realloc", "strlen", "strncmp", "vfprintf"}},
    };
    ASSERT_FALSE(headers_->imports.empty()) << "no import table";
    for (const auto& [dll, functions] : headers_->imports) {
        const auto listed = allowed.find(dll);
        for (const std::string& f : functions) {
            EXPECT_TRUE(listed != allowed.end() && listed->second.count(f) == 1) << "imports " << dll << "!" << f;
        }
    }
    for (const char* needed : {"malloc", "free", "rand"}) {
        EXPECT_EQ(headers_->imports["msvcrt.dll"].count(needed), 1U) << needed;
    }
    EXPECT_EQ(headers_->imports["kernel32.dll"].count("ReadFile"), 1U);
}

TEST_F(ProductDll, ShipsWithoutSymbolsAndLinksToThem) {
    const std::string sections = objdump("-h");
    EXPECT_EQ(sections.find(".debug_"), std::string::npos) << "debug sections in the DLL";
    EXPECT_NE(objdump("-t").find("no symbols"), std::string::npos) << "a symbol table in the DLL";
    const std::string link = objdump("-s -j .gnu_debuglink");
    EXPECT_NE(link.find("sorvel.dll.debu"), std::string::npos) << "no debug link to sorvel.dll.debug:\n" << link;
    EXPECT_GT(image_->symbols.size(), 100U) << "too few symbols in " << g_debug;
}

// The seam hands every block straight to the C runtime and keeps nothing of
// its own: no variable of the memory namespace, nor one inside its two
// functions, and none named for counting.
TEST_F(ProductDll, AllocationSeamKeepsNoCounter) {
    ASSERT_EQ(image_->symbols.count("__ZN6sorvel6memory8allocateEj"), 1U) << "no seam in " << g_debug;
    for (const std::string& symbol : image_->data) {
        EXPECT_EQ(symbol.find("6sorvel6memory"), std::string::npos) << symbol;
        for (const char* name : {"live_allocations", "total_allocations", "fail_allocation_after", "countdown"}) {
            EXPECT_EQ(symbol.find(name), std::string::npos) << symbol;
        }
    }
}

// The .rsrc section's bytes, from objdump's hex dump: an address, then up to
// four groups of eight hex digits, then the same bytes as text.
std::string resource_bytes() {
    std::istringstream dump(objdump("-s -j .rsrc"));
    std::string bytes;
    for (std::string line; std::getline(dump, line);) {
        static const std::regex row(R"(^ [0-9a-f]+ ((?:[0-9a-f]{2,8} ?){1,4}) )");
        std::smatch m;
        std::string hex = std::regex_search(line, m, row) ? m[1].str() : "";
        std::erase(hex, ' ');
        for (std::size_t i = 0; i + 1 < hex.size(); i += 2) {
            bytes += static_cast<char>(std::stoi(hex.substr(i, 2), nullptr, 16));
        }
    }
    return bytes;
}

// The value that follows a key of the version resource. Keys and values are
// UTF-16, so the text kept is every low byte whose high byte is zero; the
// padding between a key and its value reads as further NULs.
std::string version_value(const std::string& narrow, const std::string& key) {
    std::size_t at = narrow.find(key + '\0');
    if (at == std::string::npos) {
        return "";
    }
    at = narrow.find_first_not_of('\0', at + key.size());
    return at == std::string::npos ? "" : narrow.substr(at, narrow.find('\0', at) - at);
}

TEST(ProductVersion, ResourceNamesTheProductAndVersionOnly) {
    const std::string bytes = resource_bytes();
    std::string narrow;
    for (std::size_t i = 0; i + 1 < bytes.size(); i += 2) {
        narrow += bytes[i + 1] == '\0' ? bytes[i] : '?';
    }
    ASSERT_NE(narrow.find("VS_VERSION_INFO"), std::string::npos) << "no version resource";
    EXPECT_EQ(version_value(narrow, "ProductName"), "Sorvel");
    EXPECT_EQ(version_value(narrow, "ProductVersion"), SORVEL_VERSION);
    EXPECT_EQ(version_value(narrow, "FileVersion"), SORVEL_VERSION);
    EXPECT_EQ(version_value(narrow, "OriginalFilename"), "sorvel.dll");
    EXPECT_EQ(narrow.find("CompanyName"), std::string::npos);
    EXPECT_EQ(narrow.find("LegalCopyright"), std::string::npos);
}

}  // namespace

int main(int argc, char** argv) {
    ::testing::InitGoogleTest(&argc, argv);
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s [gtest flags] PATH/TO/sorvel.dll\n", argv[0]);
        return 2;
    }
    g_dll = argv[1];
    g_debug = g_dll + ".debug";
    for (const std::string& file : {g_dll, g_debug}) {
        if (FILE* f = std::fopen(file.c_str(), "rb")) {
            std::fclose(f);
        } else {
            std::fprintf(stderr, "%s: cannot read %s (build the windows-x86 preset first)\n", argv[0], file.c_str());
            return 2;
        }
    }
    return RUN_ALL_TESTS();
}
