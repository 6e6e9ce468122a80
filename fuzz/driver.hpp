// The differential driver: one fuzz input runs as events against the library
// and the reference model. libFuzzer calls it, and so does the plain replay.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "simulated_host.hpp"

namespace fuzzdriver {
// The library the inputs run against: the one linked in, unless a caller
// chose another before the first input.
std::shared_ptr<sorvel::simulated::Library>& library();
// Whether that library is the one linked in, whose side structures the
// driver can inspect: a library the simulated host loaded may lay them out
// otherwise, and is held against the model alone.
bool inspectable();
}  // namespace fuzzdriver

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);
