// Static checks of the product: the 32-bit Windows DLL that the host loads,
// read with objdump, never run:
//  - the export table holds exactly the host's names and ordinals, undecorated,
//    each at its stdcall function;
//  - the three handler tables hold the handlers the catalogue names, in its
//    order, then a null;
//  - every export, DllMain and every handler removes its own arguments: each
//    of its returns is `ret 4*n`, following tail jumps;
//  - it imports only from Windows system DLLs, so it loads on a bare system;
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
#include <vector>

#include "exports_table.hpp"
#include "host/catalogue.hpp"

namespace {

std::string g_dll;

std::string decorated(const std::string& name, int args) {
    return "_" + name + "@" + std::to_string(4 * args);
}

// The output of `objdump FLAG dll`; empty with a failure when it cannot run.
std::string objdump(const std::string& flag) {
    const char* chosen = std::getenv("SORVEL_OBJDUMP");
    const std::string command =
        std::string(chosen != nullptr && *chosen != '\0' ? chosen : "i686-w64-mingw32-objdump") + " " + flag + " '" +
        g_dll + "' 2>/dev/null";
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

// What -d tells: each label's address and instructions ("ret $0x8",
// "jmp 6db82960 <_Other@8>").
struct Function {
    unsigned long address = 0;
    std::vector<std::string> instructions;
};

std::map<std::string, Function> parse_disassembly(const std::string& text) {
    static const std::regex label(R"(^([0-9a-f]+) <(.+)>:$)"),
        instruction(R"(^\s*[0-9a-f]+:\t[0-9a-f ]+\t(?:(?:repz|rep|bnd|notrack) )?(\S.*)$)");
    std::map<std::string, Function> functions;
    Function* at = nullptr;
    std::istringstream in(text);
    std::smatch m;
    for (std::string line; std::getline(in, line);) {
        if (std::regex_match(line, m, label)) {
            at = &functions[m[2]];
            at->address = std::stoul(m[1], nullptr, 16);
        } else if (at != nullptr && std::regex_match(line, m, instruction)) {
            at->instructions.push_back(m[1]);
        }
    }
    return functions;
}

// Every path out of `symbol` returns with `ret 4*args`: each ret of its body
// carries that immediate, and a body without a ret ends in tail jumps to
// other functions, checked the same way.
void expect_callee_cleanup(const std::map<std::string, Function>& functions, const std::string& symbol, int args,
                           std::set<std::string>& seen) {
    static const std::regex ret(R"(^retl?\s*(\S*))"), jump(R"(^jmp\s+[0-9a-f]+ <([^+>]+)>)");
    const auto found = functions.find(symbol);
    if (!seen.insert(symbol).second || found == functions.end()) {
        EXPECT_NE(found, functions.end()) << "no function " << symbol;
        return;
    }
    std::ostringstream immediate;  // "$0x8" for two words, nothing for none
    if (args != 0) {
        immediate << "$0x" << std::hex << 4 * args;
    }
    std::vector<std::string> tails;
    std::size_t rets = 0;
    std::smatch m;
    for (const std::string& ins : found->second.instructions) {
        if (std::regex_search(ins, m, ret)) {
            ++rets;
            EXPECT_EQ(m[1].str(), immediate.str()) << symbol << ": " << ins;
        } else if (std::regex_search(ins, m, jump) && m[1] != symbol) {
            tails.push_back(m[1]);
        }
    }
    EXPECT_TRUE(rets != 0 || !tails.empty()) << symbol << " neither returns nor jumps to another function";
    for (const std::string& tail : rets == 0 ? tails : std::vector<std::string>{}) {
        expect_callee_cleanup(functions, tail, args, seen);
    }
}

// A word of the image at an address, read from -s; a symbol's address from -t
// and the sections' addresses from -h.
struct Image {
    std::map<unsigned long, unsigned char> bytes;
    std::map<std::string, unsigned long> symbols;
    unsigned long word_at(unsigned long address) const {
        unsigned long w = 0;
        for (unsigned long i = 4; i-- > 0;) {
            const auto b = bytes.find(address + i);
            w = w << 8U | (b == bytes.end() ? 0U : b->second);
        }
        return w;
    }
};

Image parse_image(const std::string& sections, const std::string& symbols, const std::string& contents) {
    static const std::regex section(R"(^\s+(\d+) \S+\s+[0-9a-f]+\s+([0-9a-f]+))"),
        symbol(R"(\(sec\s+(\d+)\).*0x([0-9a-f]+) (\S+)$)"), line(R"(^ ([0-9a-f]+) ((?:[0-9a-f]+ ?){1,4}))");
    Image image;
    std::map<int, unsigned long> vma;
    std::smatch m;
    std::istringstream in(sections + symbols + contents);
    for (std::string text; std::getline(in, text);) {
        if (std::regex_search(text, m, section)) {
            vma[std::stoi(m[1]) + 1] = std::stoul(m[2], nullptr, 16);
        } else if (std::regex_search(text, m, symbol)) {
            image.symbols[m[3]] = vma[std::stoi(m[1])] + std::stoul(m[2], nullptr, 16);
        } else if (std::regex_search(text, m, line)) {
            unsigned long at = std::stoul(m[1], nullptr, 16);
            std::string hex = m[2];
            hex.erase(std::remove(hex.begin(), hex.end(), ' '), hex.end());
            for (std::size_t i = 0; i + 1 < hex.size(); i += 2) {
                image.bytes[at++] = static_cast<unsigned char>(std::stoul(hex.substr(i, 2), nullptr, 16));
            }
        }
    }
    return image;
}

// Conditions and actions take three words, expressions two.
int handler_args(const sorvel::catalogue::Event& e) {
    return e.kind == sorvel::catalogue::Kind::expression ? 2 : 3;
}

class ProductDll : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        headers_ = new Headers(parse_headers(objdump("-p")));
        functions_ = new std::map<std::string, Function>(parse_disassembly(objdump("-d")));
        image_ = new Image(parse_image(objdump("-h"), objdump("-t"), objdump("-s")));
    }
    static inline Headers* headers_ = nullptr;
    static inline Image* image_ = nullptr;
    static inline std::map<std::string, Function>* functions_ = nullptr;
};

TEST_F(ProductDll, IsA32BitWindowsImage) {
    EXPECT_EQ(headers_->format, "pei-i386");
}

TEST_F(ProductDll, ExportsExactlyTheHostsNamesAndOrdinalsAtTheirFunctions) {
    EXPECT_EQ(headers_->ordinal_base, 2) << "ordinals are numbered from 2";
    std::map<std::string, int> expected;
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        expected[e.name] = e.ordinal;
        const auto function = functions_->find(decorated(e.name, e.args));
        ASSERT_NE(function, functions_->end()) << "no stdcall function " << decorated(e.name, e.args);
        EXPECT_EQ(headers_->image_base + headers_->addresses[e.ordinal], function->second.address)
            << e.name << " exports another address";
    }
    EXPECT_EQ(headers_->named, expected) << "exactly these names, undecorated";
    for (const auto& [ordinal, rva] : headers_->addresses) {
        EXPECT_TRUE(rva == 0 || std::any_of(expected.begin(), expected.end(),
                                            [ordinal = ordinal](const auto& e) { return e.second == ordinal; }))
            << "ordinal " << ordinal << " is reachable by ordinal alone";
    }
}

TEST_F(ProductDll, ExportsAndHandlersRemoveTheirArguments) {
    std::vector<std::pair<std::string, int>> callees{{"DllMain", 3}};
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        callees.emplace_back(e.name, e.args);
    }
    for (const sorvel::catalogue::Event& e : sorvel::catalogue::kEvents) {
        callees.emplace_back(e.handler, handler_args(e));
    }
    for (const auto& [name, args] : callees) {
        std::set<std::string> seen;
        expect_callee_cleanup(*functions_, decorated(name, args), args, seen);
    }
}

TEST_F(ProductDll, HandlerTablesHoldTheCataloguesHandlersInItsOrder) {
    std::map<unsigned long, std::string> named;
    for (const auto& [name, function] : *functions_) {
        named[function.address] = name;
    }
    const std::pair<sorvel::catalogue::Kind, const char*> tables[] = {
        {sorvel::catalogue::Kind::condition, "__ZN6sorvel15kConditionTableE"},
        {sorvel::catalogue::Kind::action, "__ZN6sorvel12kActionTableE"},
        {sorvel::catalogue::Kind::expression, "__ZN6sorvel16kExpressionTableE"}};
    for (const auto& [kind, symbol] : tables) {
        ASSERT_EQ(image_->symbols.count(symbol), 1U) << "no table " << symbol;
        unsigned long at = image_->symbols[symbol];
        for (const sorvel::catalogue::Event& e : sorvel::catalogue::kEvents) {
            if (e.kind == kind) {
                EXPECT_EQ(named[image_->word_at(at)], decorated(std::string(e.handler), handler_args(e))) << e.display;
                at += 4;
            }
        }
        EXPECT_EQ(image_->word_at(at), 0UL) << symbol << " ends with a null";
    }
}

TEST_F(ProductDll, ImportsOnlySystemLibraries) {
    // No runtime DLL of the compiler (libstdc++, libgcc, winpthread) may be needed.
    const std::set<std::string> allowed = {"kernel32.dll", "msvcrt.dll", "ntdll.dll", "advapi32.dll", "user32.dll"};
    ASSERT_FALSE(headers_->imports.empty()) << "no import table";
    for (const auto& [dll, members] : headers_->imports) {
        EXPECT_EQ(allowed.count(dll), 1U) << "imports from " << dll;
    }
    // Files are read with ReadFile, and draws come from the C runtime's rand that the host shares.
    EXPECT_EQ(headers_->imports["kernel32.dll"].count("ReadFile"), 1U);
    EXPECT_EQ(headers_->imports["msvcrt.dll"].count("rand"), 1U);
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
    if (FILE* f = std::fopen(g_dll.c_str(), "rb")) {
        std::fclose(f);
    } else {
        std::fprintf(stderr, "%s: cannot read %s (build the windows-x86 preset first)\n", argv[0], g_dll.c_str());
        return 2;
    }
    return RUN_ALL_TESTS();
}
