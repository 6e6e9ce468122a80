// The differential fuzzer's entry point. One input decodes into events for
// one to three object instances (decode.hpp, from the values of values.hpp);
// each runs against the library and the reference model, which must agree
// (session.hpp, checks.cpp); a difference is reported with the events that
// led to it (report.hpp). SORVEL_FUZZ_TRACE=1 prints the events of an input
// as they run.
#include <cstddef>
#include <cstdint>
#include <memory>

#include "driver.hpp"
#include "report.hpp"
#include "session.hpp"

namespace {

using sorvel::simulated::Library;

const std::shared_ptr<Library>& linked_in() {
    static const std::shared_ptr<Library> library = Library::linked_in();
    return library;
}

}  // namespace

std::shared_ptr<Library>& fuzzdriver::library() {
    static std::shared_ptr<Library> chosen = linked_in();
    return chosen;
}

bool fuzzdriver::inspectable() {
    return library() == linked_in();
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    {
        fuzzdriver::Session session(data, size);
        session.run();
    }
    fuzzdriver::forget_events();
    return 0;
}
