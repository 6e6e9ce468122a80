// Runs every input of the fuzzer's corpus once through the differential
// driver: the corpus is the regression suite on every target, sanitizers,
// emulators and valgrind included.
//
//   fuzz_replay [--library PATH [--relocate]] FILE_OR_FOLDER...
//
// --library drives a library the simulated host loads instead of the one linked in;
// --relocate keeps a Windows DLL off its preferred base, so that the loader
// applies its relocations.
#include <algorithm>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "driver.hpp"

int main(int argc, char** argv) {
    namespace fs = std::filesystem;
    using sorvel::simulated::Library;
    std::vector<fs::path> inputs;
    std::string library;
    Library::Placement placement = Library::Placement::preferred;
    try {
        for (int i = 1; i < argc; ++i) {
            const std::string arg = argv[i];
            if (arg == "--library" && i + 1 < argc) {
                library = argv[++i];
            } else if (arg == "--relocate") {
                placement = Library::Placement::away_from_preferred_base;
            } else if (fs::is_directory(arg)) {
                for (const fs::directory_entry& e : fs::directory_iterator(arg)) {
                    inputs.push_back(e.path());
                }
            } else {
                inputs.emplace_back(arg);
            }
        }
        if (!library.empty()) {
            fuzzdriver::library() = Library::load(library, placement);
        }
    } catch (const std::exception& e) {
        std::fprintf(stderr, "fuzz_replay: %s\n", e.what());
        return 2;
    }
    if (inputs.empty()) {
        std::fprintf(stderr, "usage: fuzz_replay [--library PATH [--relocate]] FILE_OR_FOLDER...\n");
        return 2;
    }
    if (fuzzdriver::library()->allocations() == nullptr) {
        std::printf(
            "fuzz_replay: the library's allocations are out of the host's reach: "
            "injected allocation failures and the final leak check are skipped\n");
    }
    std::sort(inputs.begin(), inputs.end());
    for (const fs::path& path : inputs) {
        std::ifstream in(path, std::ios::binary);
        const std::vector<char> bytes{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
        if (!in.good() && !in.eof()) {
            std::fprintf(stderr, "fuzz_replay: cannot read %s\n", path.string().c_str());
            return 2;
        }
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
    }
    std::printf("fuzz_replay: %zu inputs, no difference\n", inputs.size());
    return 0;
}
