// What the hand-written tests share: holders that own a collection's fields,
// a shape renderer, scripted draws, chains linked directly in the node
// layout, and a caller for exports of any argument count.
#pragma once

#include <array>
#include <cstdint>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <type_traits>
#include <vector>

#include "collections/collections.hpp"
#include "collections/random_path.hpp"
#include "holder.hpp"
#include "simulated_host.hpp"
#include "small_stack.hpp"

namespace sorvel::test {

// Preorder with "-" for every empty link, without recursion: equal texts
// mean equal trees. `children(n)` gives {left, right}, `text(n)` a value.
template <class Ref, class Children, class Text>
std::string preorder(Ref root, Ref none, Children children, Text text) {
    std::string out;
    std::vector<Ref> pending{root};
    while (!pending.empty()) {
        const Ref at = pending.back();
        pending.pop_back();
        if (at == none) {
            out += "- ";
            continue;
        }
        out += text(at) + ' ';
        const auto [left, right] = children(at);
        pending.push_back(right);
        pending.push_back(left);
    }
    return out;
}

template <class V>
std::string shape(const TreeNode<V>* root) {
    return preorder(
        root, static_cast<const TreeNode<V>*>(nullptr),
        [](auto* n) {
            return std::pair{n->left, n->right};
        },
        [](auto* n) {
            if constexpr (std::is_same_v<V, char*>) {
                return std::string(n->value);
            } else {
                return std::to_string(n->value);
            }
        });
}

// Draws given in advance, as the core takes them.
struct ScriptedDraws {
    std::vector<int> values;
    std::size_t used = 0;
    DrawSource source() {
        return {[](void* self) noexcept {
                    auto* d = static_cast<ScriptedDraws*>(self);
                    return d->used < d->values.size() ? d->values[d->used++] : 0;
                },
                this};
    }
};

// A chain linked directly, in linear time: directions[i] says whether node
// i + 1 hangs right (1) or left (0) of node i. A node with a right child takes
// the smallest value left, one with a left child the largest, so the search
// order holds for any directions. Strings are zero-padded numbers.
template <class V>
void link_chain(Holder<V>& h, const std::vector<int>& directions) {
    using Node = TreeNode<V>;
    std::int32_t low = 0;
    auto high = static_cast<std::int32_t>(directions.size() + 2);
    Node* deepest = nullptr;
    for (std::size_t i = 0; i <= directions.size(); ++i) {
        const std::int32_t value = i < directions.size() && directions[i] == 0 ? --high : ++low;
        Node* node;
        if constexpr (std::is_same_v<V, char*>) {
            const std::string digits = std::to_string(value);
            const std::string text = std::string(10 - digits.size(), '0') + digits;
            node = new (memory::allocate(sizeof(Node) + text.size() + 1)) Node{};
            node->value = std::strcpy(reinterpret_cast<char*>(node + 1), text.c_str());
        } else {
            node = new (memory::allocate(sizeof(Node))) Node{};
            node->value = static_cast<V>(value);
        }
        (deepest == nullptr ? h.root : (directions[i - 1] != 0 ? deepest->right : deepest->left)) = node;
        deepest = node;
        ++h.count;
    }
}

// The built library where its allocations can be counted (a Windows DLL,
// through its rerouted imports), else the library linked in.
inline std::shared_ptr<simulated::Library> counted_library() {
    const auto built = simulated::Library::built();
    return built->allocations() != nullptr ? built : simulated::Library::linked_in();
}

// Calls an export with the first `n` of seven words.
inline simulated::word call_with(const simulated::Library& library, void* function, int n,
                                 const std::array<simulated::word, 7>& w) {
    switch (n) {
        case 0: return library.call(function, {});
        case 1: return library.call(function, {w[0]});
        case 2: return library.call(function, {w[0], w[1]});
        case 3: return library.call(function, {w[0], w[1], w[2]});
        case 4: return library.call(function, {w[0], w[1], w[2], w[3]});
        case 5: return library.call(function, {w[0], w[1], w[2], w[3], w[4]});
        default: return library.call(function, {w[0], w[1], w[2], w[3], w[4], w[5], w[6]});
    }
}

}  // namespace sorvel::test
