// The three ordered sets of an instance, as views over the fields that hold
// them: a root, a count and, when "Use Indicies" is on, an insertion index.
// Every change is all or nothing: when memory runs out, count, tree and index
// stay exactly as they were.
#pragma once

#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>

#include "collections/insertion_index.hpp"
#include "collections/memory.hpp"
#include "collections/side_structure.hpp"
#include "collections/tree.hpp"

namespace sorvel {

using IntegerNode = TreeNode<std::int32_t>;
using FloatNode = TreeNode<float>;
using StringNode = TreeNode<char*>;

template <class V>
struct Collection {
    using Node = TreeNode<V>;
    using Index = InsertionIndex<Node>;
    using Side = SideStructure<Node>;
    Node*& root;
    std::int32_t& count;
    Index* index;          // null when the collection keeps no index
    Side* side = nullptr;  // null: plain descents whatever the depth
};

using IntegerCollection = Collection<std::int32_t>;
using FloatCollection = Collection<float>;
using StringCollection = Collection<char*>;

// Orders: the sign of key compared with a held value.
struct IntegerOrder {
    int operator()(std::int32_t key, std::int32_t held) const noexcept { return (key > held) - (key < held); }
};

// IEEE 754 order; +0.0 and -0.0 are one value. NaN is never stored or looked up.
struct FloatOrder {
    int operator()(float key, float held) const noexcept { return (key > held) - (key < held); }
};

// Case-sensitive: bytes compared unsigned (strcmp). Otherwise 'A'..'Z' are
// first folded to 'a'..'z' and nothing else changes (_stricmp, C locale).
int CompareStrings(const char* a, const char* b, bool case_sensitive) noexcept;

struct StringOrder {
    bool case_sensitive;
    int operator()(const char* key, const char* held) const noexcept {
        return CompareStrings(key, held, case_sensitive);
    }
};

// Conditions and actions.
bool contains(IntegerCollection c, std::int32_t value) noexcept;
bool contains(FloatCollection c, float value) noexcept;
bool contains(StringCollection c, const char* value, bool case_sensitive) noexcept;

// Add gives true when the value was stored: false for a duplicate, a NaN, a
// null string, or when memory ran out.
bool add(IntegerCollection c, std::int32_t value) noexcept;
bool add(FloatCollection c, float value) noexcept;
bool AddStringValue(StringCollection c, const char* value, bool case_sensitive) noexcept;

bool remove(IntegerCollection c, std::int32_t value) noexcept;
bool remove(FloatCollection c, float value) noexcept;
bool remove(StringCollection c, const char* value, bool case_sensitive) noexcept;

void clear(IntegerCollection c) noexcept;
void clear(FloatCollection c) noexcept;
void clear(StringCollection c) noexcept;

void free_tree(IntegerNode* root) noexcept;
void free_tree(FloatNode* root) noexcept;
void FreeStringTree(StringNode* root) noexcept;

// Index objects, created and destroyed through the library's allocator.
template <class Node>
InsertionIndex<Node>* create_index() noexcept {
    void* block = memory::allocate(sizeof(InsertionIndex<Node>));
    return block == nullptr ? nullptr : new (block) InsertionIndex<Node>();
}

template <class Node>
void destroy_index(InsertionIndex<Node>* index) noexcept {
    if (index != nullptr) {
        index->~InsertionIndex<Node>();
        memory::release(index);
    }
}

// Queries. Positions count successful Adds from 0, in insertion order.
std::int32_t position_of(IntegerCollection c, std::int32_t value) noexcept;
std::int32_t position_of(FloatCollection c, float value) noexcept;
std::int32_t position_of(StringCollection c, const char* value, bool case_sensitive) noexcept;

template <class V>
const TreeNode<V>* node_at(Collection<V> c, std::int32_t position) noexcept {
    if (c.index == nullptr || position < 0 || static_cast<std::uint32_t>(position) >= c.index->size()) {
        return nullptr;
    }
    return c.index->at(static_cast<std::uint32_t>(position));
}

// Instance storage for the side structures of the three collections.
struct SideStructures {
    SideStructure<IntegerNode> integers;
    SideStructure<FloatNode> floats;
    SideStructure<StringNode> strings;
};

}  // namespace sorvel
