// A fixture for end-to-end tests: one host over the built library, and the
// checks every test must pass at its end whatever it did.
#pragma once

#include <gtest/gtest.h>

#include "simulated_host.hpp"

namespace sorvel::e2e {

class HostTest : public ::testing::Test {
protected:
    void TearDown() override {
        // On i386 every call into the library is checked for the stdcall
        // contract: the callee must have removed exactly its arguments.
        EXPECT_EQ(simulated::Library::stack_errors(), 0U) << "a callee removed the wrong number of argument bytes";
        EXPECT_EQ(host.open_handles(), 0U) << "every opened file is closed";
        EXPECT_EQ(host.bad_closes(), 0U) << "only opened handles are closed";
    }

    simulated::Host host{simulated::Library::built()};
};

}  // namespace sorvel::e2e
