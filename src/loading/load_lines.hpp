// Adding the lines of a text file's bytes to a string collection, in file
// order or in balanced (drawn) order. CR and LF end lines, empty lines are
// skipped, and a last line needs no terminator.
#pragma once

#include <cstddef>

#include "collections/collections.hpp"
#include "collections/random_path.hpp"

namespace sorvel {

// `data` holds `length` bytes and has one more writable byte after them: the
// lines are terminated in place, so no line is copied before it is stored.
// Balanced order draws once per line, duplicates included; it adds nothing
// and draws nothing when its bookkeeping cannot be allocated.
void load_lines(StringCollection strings, bool case_sensitive, char* data, std::size_t length, bool balanced,
                DrawSource draw) noexcept;

}  // namespace sorvel
