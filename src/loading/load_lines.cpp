#include "loading/load_lines.hpp"

namespace sorvel {

void load_lines(StringCollection&, bool, char*, std::size_t, bool, DrawSource) noexcept {}

}  // namespace sorvel
