#include <cstdlib>

#include "collections/random_path.hpp"

namespace sorvel {

int draw_from_runtime() noexcept {
    return std::rand() & kDrawMask;
}

DrawSource runtime_draws() noexcept {
    return {[](void*) noexcept { return draw_from_runtime(); }, nullptr};
}

}  // namespace sorvel
