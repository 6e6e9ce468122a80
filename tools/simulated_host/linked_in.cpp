// The library linked into the program itself. The exports are found through
// a table of the program's own functions rather than the dynamic loader:
// a statically linked Windows program has no export table to search. This
// object is pulled in only by programs that call Library::linked_in, which
// are the ones that link the library.
#include "host/exports.hpp"
#include "simulated_host.hpp"

using sorvel::simulated::word;

// Declarations with the library's argument counts and calling convention,
// so that on 32-bit Windows the decorated names match the definitions.
#define SIMULATED_DECLARE_EXPORT(name, ordinal, count) extern "C" word SORVEL_CALL name SORVEL_ARGS##count;
#define SIMULATED_DECLARE_STUB(name, ordinal, params, result) extern "C" word SORVEL_CALL name params;
SORVEL_EXPORT_LIST(SIMULATED_DECLARE_EXPORT)
SORVEL_STUB_LIST(SIMULATED_DECLARE_STUB)
extern "C" word SORVEL_CALL DllMain(word, word, word);

namespace sorvel::simulated {

std::shared_ptr<Library> Library::linked_in() {
    std::shared_ptr<Library> library(new Library());
    library->allocations_ = counter() != nullptr ? &counter()->allocations : nullptr;
#define SIMULATED_ENTRY(name, ordinal, ...) library->symbols_.push_back(Symbol{#name, reinterpret_cast<void*>(&name)});
    SORVEL_EXPORT_LIST(SIMULATED_ENTRY)
    SORVEL_STUB_LIST(SIMULATED_ENTRY)
#undef SIMULATED_ENTRY
    library->symbols_.push_back(Symbol{"DllMain", reinterpret_cast<void*>(&DllMain)});
    return library;
}

}  // namespace sorvel::simulated
