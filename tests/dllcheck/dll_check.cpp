// Static checks of the product: the 32-bit Windows DLL that the host loads.
// It is read with objdump, never run:
//  - the export table holds exactly the host's names and ordinals, undecorated;
//  - every export, DllMain and every handler removes its own arguments
//    (stdcall): each of its returns is `ret 4*n`;
//  - it imports only from Windows system DLLs, so it loads on a bare system.
// Usage: sorvel_dll_check [gtest flags] PATH/TO/sorvel.dll
// The objdump program can be chosen with SORVEL_OBJDUMP.
#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <optional>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "exports_table.hpp"

namespace {

std::string g_dll;

// ------------------------------------------------------------ the expected product

// The handlers the tables hand out, by their symbols in the DLL: conditions
// and actions take three words, expressions two.
struct Handler {
    const char* symbol;
    int args;
};

const std::vector<Handler> kHandlers = {
    {"sorvel_contains_integer", 3},
    {"sorvel_contains_float", 3},
    {"sorvel_contains_string", 3},
    {"sorvel_add_integer", 3},
    {"sorvel_remove_integer", 3},
    {"sorvel_clear_integers", 3},
    {"sorvel_add_float", 3},
    {"sorvel_remove_float", 3},
    {"sorvel_clear_floats", 3},
    {"sorvel_add_string", 3},
    {"sorvel_remove_string", 3},
    {"sorvel_clear_strings", 3},
    {"sorvel_load_from_file", 3},
    {"sorvel_integers_size", 2},
    {"sorvel_integers_random_element", 2},
    {"sorvel_floats_size", 2},
    {"sorvel_floats_random_element", 2},
    {"sorvel_strings_size", 2},
    {"sorvel_strings_random_element", 2},
    {"sorvel_index_of_integer", 2},
    {"sorvel_integer_at", 2},
    {"sorvel_index_of_float", 2},
    {"sorvel_float_at", 2},
    {"sorvel_index_of_string", 2},
    {"sorvel_string_at", 2},
};

// System DLLs present on every Windows the host runs on. No runtime DLL of
// the compiler (libstdc++, libgcc, winpthread) may be needed.
const std::set<std::string> kAllowedImports = {"kernel32.dll", "msvcrt.dll", "ntdll.dll", "advapi32.dll", "user32.dll"};

std::string decorated(const std::string& name, int args) {
    return "_" + name + "@" + std::to_string(4 * args);
}

std::string lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(), [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return s;
}

// ------------------------------------------------------------ running objdump

std::string objdump_program() {
    const char* chosen = std::getenv("SORVEL_OBJDUMP");
    return chosen != nullptr && *chosen != '\0' ? chosen : "i686-w64-mingw32-objdump";
}

std::string shell_quoted(const std::string& s) {
    std::string out = "'";
    for (char c : s) {
        if (c == '\'') {
            out += "'\\''";
        } else {
            out += c;
        }
    }
    return out + "'";
}

// The output of `objdump FLAG dll`; empty with a failure when it cannot run.
std::string objdump(const std::string& flag) {
    const std::string command = objdump_program() + " " + flag + " " + shell_quoted(g_dll) + " 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) {
        ADD_FAILURE() << "cannot run " << command;
        return {};
    }
    std::string out;
    char buffer[65536];
    std::size_t n = 0;
    while ((n = std::fread(buffer, 1, sizeof buffer, pipe)) > 0) {
        out.append(buffer, n);
    }
    const int status = pclose(pipe);
    if (status != 0) {
        ADD_FAILURE() << command << " failed with status " << status;
    }
    return out;
}

std::vector<std::string> lines_of(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) {
        lines.push_back(line);
    }
    return lines;
}

// ------------------------------------------------------------ the private headers (-p)

struct Headers {
    std::string format;
    unsigned long image_base = 0;
    std::optional<int> ordinal_base;
    std::map<std::string, int> named;                      // name -> ordinal
    std::map<int, unsigned long> address_table;            // ordinal -> RVA
    std::map<std::string, std::set<std::string>> imports;  // DLL (lower case) -> members
};

std::vector<std::string> tokens_of(const std::string& line) {
    std::vector<std::string> tokens;
    std::istringstream in(line);
    for (std::string t; in >> t;) {
        tokens.push_back(t);
    }
    return tokens;
}

bool starts_with(const std::string& s, const std::string& prefix) {
    return s.rfind(prefix, 0) == 0;
}

bool all_of_class(const std::string& s, int (*klass)(int)) {
    return !s.empty() && std::all_of(s.begin(), s.end(), [klass](unsigned char c) { return klass(c) != 0; });
}

Headers parse_headers(const std::string& text) {
    Headers h;
    enum class Section { none, names, imports } section = Section::none;
    std::string dll;
    std::vector<std::pair<int, std::string>> relative_names;
    for (const std::string& line : lines_of(text)) {
        const std::vector<std::string> t = tokens_of(line);
        const std::string first = t.empty() ? "" : t.front();
        int a = 0;
        int b = 0;
        unsigned long rva = 0;
        char name[512];
        if (t.empty()) {
            if (section == Section::names) {
                section = Section::none;
            }
        } else if (const auto at = line.find("file format "); at != std::string::npos && h.format.empty()) {
            h.format = tokens_of(line.substr(at + 12)).at(0);
        } else if (starts_with(line, "ImageBase") && t.size() == 2) {
            h.image_base = std::stoul(t[1], nullptr, 16);
        } else if (starts_with(line, "Ordinal Base") && t.size() == 3) {
            h.ordinal_base = std::stoi(t[2]);
        } else if (line.find("Export RVA") != std::string::npos &&
                   std::sscanf(line.c_str(), " [%d] +base[%d] %lx", &a, &b, &rva) == 3) {
            h.address_table[b] = rva;
        } else if (line.find("[Ordinal/Name Pointer] Table") != std::string::npos) {
            section = Section::names;
        } else if (line.find("DLL Name:") != std::string::npos && t.size() == 3) {
            section = Section::imports;
            dll = lower(t[2]);
            h.imports[dll];
        } else if (section == Section::names && std::sscanf(line.c_str(), " [%d] %511s", &a, name) == 2) {
            relative_names.emplace_back(a, name);
        } else if (section == Section::imports && line.front() == '\t' && t.size() == 3 &&
                   all_of_class(t[0], std::isxdigit) && all_of_class(t[1], std::isdigit)) {
            h.imports[dll].insert(t[2]);
        } else if (line.find("Export Tables") != std::string::npos) {
            section = Section::none;
        }
    }
    // The name table lists each name with its ordinal less the base.
    for (const auto& [relative, exported] : relative_names) {
        h.named[exported] = relative + h.ordinal_base.value_or(0);
    }
    return h;
}

// ------------------------------------------------------------ the disassembly (-d)

struct Instruction {
    unsigned long address;
    std::string mnemonic;
    std::string operands;
};

struct Disassembly {
    std::map<std::string, std::vector<Instruction>> bodies;  // label -> its instructions
    std::map<std::string, unsigned long> addresses;          // label -> address
};

// "<symbol>" in a jump's operands, or empty; "<symbol+0x12>" is inside one.
std::string target_of(const std::string& operands) {
    const auto open = operands.find('<');
    const auto close = operands.find('>', open);
    if (open == std::string::npos || close == std::string::npos) {
        return {};
    }
    const std::string inside = operands.substr(open + 1, close - open - 1);
    return inside.find('+') == std::string::npos ? inside : std::string();
}

Disassembly parse_disassembly(const std::string& text) {
    Disassembly d;
    std::vector<Instruction>* body = nullptr;
    for (const std::string& line : lines_of(text)) {
        // A label: "6db82960 <_DllMain@12>:"
        const auto open = line.find(" <");
        if (!line.empty() && !std::isspace(static_cast<unsigned char>(line.front())) && open != std::string::npos &&
            line.size() > 2 && line.compare(line.size() - 2, 2, ">:") == 0 &&
            all_of_class(line.substr(0, open), std::isxdigit)) {
            const std::string label = line.substr(open + 2, line.size() - open - 4);
            body = &d.bodies[label];
            d.addresses[label] = std::stoul(line.substr(0, open), nullptr, 16);
            continue;
        }
        // An instruction: "6db82960:\tb8 01 00 00 00       \tmov    $0x1,%eax"
        const auto tab1 = line.find('\t');
        const auto tab2 = tab1 == std::string::npos ? tab1 : line.find('\t', tab1 + 1);
        if (body == nullptr || tab2 == std::string::npos || tab1 == 0 || line[tab1 - 1] != ':') {
            continue;
        }
        std::string address = line.substr(0, tab1 - 1);
        address.erase(0, address.find_first_not_of(' '));
        if (!all_of_class(address, std::isxdigit)) {
            continue;
        }
        std::string text_part = line.substr(tab2 + 1);
        // Prefixes such as "repz ret" belong to the instruction after them.
        for (const char* prefix : {"repz ", "rep ", "bnd ", "notrack "}) {
            if (starts_with(text_part, prefix)) {
                text_part = text_part.substr(std::string(prefix).size());
            }
        }
        std::istringstream in(text_part);
        Instruction ins{std::stoul(address, nullptr, 16), {}, {}};
        in >> ins.mnemonic;
        std::getline(in, ins.operands);
        ins.operands.erase(0, ins.operands.find_first_not_of(" \t"));
        body->push_back(ins);
    }
    return d;
}

// Checks that every path out of `symbol` returns with `ret 4*args`: each
// ret of its body carries that immediate, and a body without a ret ends in
// tail jumps to other symbols, which are checked the same way.
void expect_callee_cleanup(const Disassembly& d, const std::string& symbol, int args, std::set<std::string>& seen,
                           const std::string& via) {
    if (!seen.insert(symbol).second) {
        return;
    }
    const auto found = d.bodies.find(symbol);
    if (found == d.bodies.end()) {
        ADD_FAILURE() << "no symbol " << symbol << via;
        return;
    }
    const std::string expected = args == 0 ? "" : "$0x" + [](int bytes) {
        std::ostringstream s;
        s << std::hex << bytes;
        return s.str();
    }(4 * args);
    std::size_t rets = 0;
    std::vector<std::string> tail_targets;
    for (const Instruction& ins : found->second) {
        if (ins.mnemonic == "ret" || ins.mnemonic == "retl") {
            ++rets;
            EXPECT_EQ(ins.operands, expected) << symbol << via << ": the return at " << std::hex << ins.address
                                              << " must remove " << std::dec << 4 * args << " bytes";
        } else if (ins.mnemonic == "jmp") {
            const std::string target = target_of(ins.operands);
            if (!target.empty() && target != symbol) {
                tail_targets.push_back(target);
            }
        }
    }
    if (rets != 0) {
        return;
    }
    if (tail_targets.empty()) {
        ADD_FAILURE() << symbol << via << " neither returns nor jumps to another function";
        return;
    }
    for (const std::string& target : tail_targets) {
        expect_callee_cleanup(d, target, args, seen, " (reached from " + symbol + ")" + via);
    }
}

// ------------------------------------------------------------ tests

class ProductDll : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        headers_ = new Headers(parse_headers(objdump("-p")));
        disassembly_ = new Disassembly(parse_disassembly(objdump("-d")));
    }
    static void TearDownTestSuite() {
        delete headers_;
        delete disassembly_;
        headers_ = nullptr;
        disassembly_ = nullptr;
    }
    static Headers* headers_;
    static Disassembly* disassembly_;
};

Headers* ProductDll::headers_ = nullptr;
Disassembly* ProductDll::disassembly_ = nullptr;

TEST_F(ProductDll, IsA32BitWindowsImage) {
    EXPECT_EQ(headers_->format, "pei-i386");
}

TEST_F(ProductDll, ExportsExactlyTheHostsNamesAndOrdinals) {
    const Headers& h = *headers_;
    ASSERT_TRUE(h.ordinal_base.has_value()) << "no export table";
    EXPECT_EQ(*h.ordinal_base, 2) << "ordinals are numbered from 2";
    std::map<std::string, int> expected;
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        expected[e.name] = e.ordinal;
    }
    EXPECT_EQ(h.named, expected);
    for (const auto& [name, ordinal] : h.named) {
        EXPECT_EQ(name.find('@'), std::string::npos) << name << " is decorated";
        EXPECT_NE(name.front(), '_') << name << " is decorated";
    }
    // No export is reachable by ordinal alone.
    std::set<int> named_ordinals;
    for (const auto& [name, ordinal] : h.named) {
        named_ordinals.insert(ordinal);
    }
    std::set<int> all_ordinals;
    for (const auto& [ordinal, rva] : h.address_table) {
        if (rva != 0) {
            all_ordinals.insert(ordinal);
        }
    }
    EXPECT_EQ(all_ordinals, named_ordinals);
}

TEST_F(ProductDll, EachExportIsItsStdcallFunction) {
    const Headers& h = *headers_;
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        const auto label = disassembly_->addresses.find(decorated(e.name, e.args));
        ASSERT_NE(label, disassembly_->addresses.end()) << "no function " << decorated(e.name, e.args);
        const auto rva = h.address_table.find(e.ordinal);
        ASSERT_NE(rva, h.address_table.end()) << e.name;
        EXPECT_EQ(h.image_base + rva->second, label->second) << e.name << " exports another address";
    }
}

TEST_F(ProductDll, ExportsRemoveTheirArguments) {
    for (const sorvel::test::ExportEntry& e : sorvel::test::kExports) {
        std::set<std::string> seen;
        expect_callee_cleanup(*disassembly_, decorated(e.name, e.args), e.args, seen, "");
    }
    std::set<std::string> seen;
    expect_callee_cleanup(*disassembly_, decorated("DllMain", 3), 3, seen, "");
}

TEST_F(ProductDll, HandlersRemoveTheirArguments) {
    ASSERT_EQ(kHandlers.size(), 25U);
    for (const Handler& handler : kHandlers) {
        std::set<std::string> seen;
        expect_callee_cleanup(*disassembly_, decorated(handler.symbol, handler.args), handler.args, seen, "");
    }
}

TEST_F(ProductDll, ImportsOnlySystemLibraries) {
    const Headers& h = *headers_;
    ASSERT_FALSE(h.imports.empty()) << "no import table";
    for (const auto& [dll, members] : h.imports) {
        EXPECT_TRUE(kAllowedImports.count(dll) == 1) << "imports from " << dll;
    }
    // Files are read with ReadFile, and draws come from the C runtime's rand
    // that the host shares.
    ASSERT_TRUE(h.imports.count("kernel32.dll") == 1);
    EXPECT_TRUE(h.imports.at("kernel32.dll").count("ReadFile") == 1);
    ASSERT_TRUE(h.imports.count("msvcrt.dll") == 1);
    EXPECT_TRUE(h.imports.at("msvcrt.dll").count("rand") == 1);
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
