// sorvel-host: plays the host runtime for the built library and runs event
// scripts against it, from a file, standard input or an interactive prompt.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <string>

#include "runner.hpp"

#if defined(_WIN32)
#include <io.h>
#define SORVEL_ISATTY _isatty
#define SORVEL_FILENO _fileno
#else
#include <unistd.h>
#define SORVEL_ISATTY isatty
#define SORVEL_FILENO fileno
#endif

namespace {

const char kUsage[] =
    "usage: sorvel-host [options] [SCRIPT | -]\n"
    "\n"
    "Loads the library, creates instances and runs an event script: from the\n"
    "file SCRIPT, from standard input (-), or at a prompt when no script is\n"
    "given and standard input is a terminal.\n"
    "\n"
    "options:\n"
    "  --library PATH          the library to load (default: the one built beside this tool)\n"
    "  --case-sensitive N      the \"Case Sensitive Strings\" word of every instance (1 on, else off)\n"
    "  --use-indices N         the \"Use Indicies\" word of every instance (1 on, else off)\n"
    "  --instances N           how many instances to create (select one with: instance N)\n"
    "  --seed N                seed the C runtime's generator before the first event\n"
    "  --trace                 print every host routine call the library makes\n"
    "  --dot FILE              at the end, write every non-empty tree as one Graphviz picture\n"
    "  --version               the library version this tool was built with\n"
    "  --help                  this text\n"
    "\n"
    "Random picks and balanced loads draw from the C runtime's rand, which the\n"
    "library never seeds. The same --seed repeats them on the same platform;\n"
    "other runtimes (glibc, msvcrt) give other sequences for the same seed.\n"
    "The 32-bit Windows build runs the shipped sorvel.dll itself (on Windows,\n"
    "or under wine) with msvcrt's generator, so it draws what a host would.\n"
    "\n"
    "Script lines: an event by its display string with the values in place\n"
    "(Add Integer: 5) or by the words before its first value (Add Integer 5);\n"
    "expressions by name (IntegerElementAt(0)); strings in double quotes, or\n"
    "null for none; # starts a comment. Commands: instance N, tree integers|\n"
    "floats|strings [\"file.dot\"], seed N, events, help, quit.\n";

bool number_arg(const char* text, long long& out) {
    char* end = nullptr;
    out = std::strtoll(text, &end, 0);
    return end != text && *end == '\0';
}

}  // namespace

int main(int argc, char** argv) {
    sorvel::script::Options options;
    std::string library_path;
    std::string script;
    long long seed = -1;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        auto value = [&](long long& out) {
            if (i + 1 >= argc || !number_arg(argv[i + 1], out)) {
                std::cerr << "sorvel-host: " << arg << " needs a number\n" << kUsage;
                std::exit(2);
            }
            ++i;
        };
        long long n = 0;
        if (arg == "--help" || arg == "-h") {
            std::cout << kUsage;
            return 0;
        } else if (arg == "--version") {
            std::cout << "sorvel-host " SORVEL_VERSION "\n";
            return 0;
        } else if (arg == "--library" && i + 1 < argc) {
            library_path = argv[++i];
        } else if (arg == "--dot" && i + 1 < argc) {
            options.dot_file = argv[++i];
        } else if (arg == "--trace") {
            options.trace = true;
        } else if (arg == "--case-sensitive") {
            value(n);
            options.case_sensitive = static_cast<std::int32_t>(n);
        } else if (arg == "--use-indices") {
            value(n);
            options.use_indices = static_cast<std::int32_t>(n);
        } else if (arg == "--instances") {
            value(n);
            if (n < 1 || n > 1000) {
                std::cerr << "sorvel-host: --instances takes 1 to 1000\n";
                return 2;
            }
            options.instances = static_cast<std::size_t>(n);
        } else if (arg == "--seed") {
            value(seed);
        } else if (script.empty() && (arg == "-" || arg[0] != '-')) {
            script = arg;
        } else {
            std::cerr << "sorvel-host: unknown option " << arg << "\n" << kUsage;
            return 2;
        }
    }

    std::ifstream file;
    if (!script.empty() && script != "-") {
        file.open(script);
        if (!file) {
            std::cerr << "sorvel-host: cannot read script " << script << ": " << std::strerror(errno) << "\n";
            return 1;
        }
    }
    try {
        auto library =
            library_path.empty() ? sorvel::simulated::Library::built() : sorvel::simulated::Library::load(library_path);
        sorvel::simulated::Host host(library);
        if (seed >= 0) {
            library->seed_rand(static_cast<unsigned>(seed));
        }
        int status = 0;
        {
            sorvel::script::Runner runner(host, options, std::cout, std::cerr);
            const bool interactive = script.empty() && SORVEL_ISATTY(SORVEL_FILENO(stdin)) != 0;
            std::istream& in = file.is_open() ? static_cast<std::istream&>(file) : std::cin;
            status = runner.run(in, script.empty() || script == "-" ? "<stdin>" : script, interactive);
            if (!options.dot_file.empty() && !runner.write_dot(options.dot_file)) {
                std::cerr << "sorvel-host: cannot write " << options.dot_file << "\n";
                status = 1;
            }
        }
        return status;
    } catch (const std::exception& e) {
        std::cerr << "sorvel-host: " << e.what() << "\n";
        return 1;
    }
}
