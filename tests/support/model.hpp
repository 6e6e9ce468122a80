// A reference model of one object instance, written for plainness rather
// than speed: every step is done the long way, exactly as the behaviour is
// described (removal re-inserts the detached subtrees by walking down from
// the root, the insertion index is a vector scanned from the front, balanced
// loading erases from a vector counted from the front). It shares no code
// with the library, so the fuzzer can hold one against the other.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "simulated_host.hpp"

namespace sorvel::test::model {

// Scripted draws of the runtime generator, in the order they are used.
class Draws {
public:
    explicit Draws(std::vector<int> values) : values_(std::move(values)) {}
    int next();  // aborts when the script is too short: a bug of the caller
    std::size_t used() const { return used_; }

private:
    std::vector<int> values_;
    std::size_t used_ = 0;
};

// Nodes live in a vector and are named by their slot; a removed node's slot
// is never handed out again until the collection is cleared, so a slot is a
// node's identity for the insertion index.
inline constexpr int kNone = -1;

template <class V>
struct Node {
    V value{};
    int left = kNone;
    int right = kNone;
};

// Sign of comparing a with b, for each value type.
int compare_integers(std::int32_t a, std::int32_t b);
int compare_floats(float a, float b);  // neither is a NaN
int compare_strings(const std::string& a, const std::string& b, bool case_sensitive);

template <class V>
struct Collection {
    std::vector<Node<V>> nodes;
    int root = kNone;
    std::int32_t count = 0;
    std::vector<int> index;  // slots, in the order of successful adds

    const Node<V>& at(int slot) const { return nodes[static_cast<std::size_t>(slot)]; }
    Node<V>& at(int slot) { return nodes[static_cast<std::size_t>(slot)]; }
};

class Instance {
public:
    Instance(std::int32_t case_word, std::int32_t index_word);

    std::int32_t case_word() const { return case_word_; }
    std::int32_t index_word() const { return index_word_; }
    bool case_sensitive() const { return case_word_ == 1; }
    bool indexed() const { return index_word_ == 1; }
    // The string collection's order under the case option.
    auto string_order() const {
        return
            [cs = case_sensitive()](const std::string& a, const std::string& b) { return compare_strings(a, b, cs); };
    }

    // A string parameter as the host gives it: nullopt for a null pointer;
    // otherwise the characters before the first zero byte count.
    using Text = std::optional<std::string>;

    // Conditions.
    bool contains_integer(std::int32_t v) const;
    bool contains_float(float v) const;
    bool contains_string(const Text& v) const;

    // Actions.
    void add_integer(std::int32_t v);
    void remove_integer(std::int32_t v);
    void add_float(float v);
    void remove_float(float v);
    void add_string(const Text& v);
    void remove_string(const Text& v);
    void clear(sorvel::simulated::Set set);
    // `file` is the file's bytes, or nullopt when it cannot be opened.
    // `left_out`: the number (from 0) of a line whose add is left out, as
    // when memory runs out for that one line.
    void load(const std::optional<std::string>& file, std::int32_t balance, Draws& draws,
              std::optional<std::size_t> left_out = std::nullopt);

    // Expressions.
    std::int32_t integers_size() const { return integers_.count; }
    std::int32_t floats_size() const { return floats_.count; }
    std::int32_t strings_size() const { return strings_.count; }
    std::int32_t integers_random(Draws& draws) const;
    float floats_random(Draws& draws) const;
    std::string strings_random(Draws& draws) const;
    std::int32_t index_of_integer(std::int32_t v) const;
    std::int32_t integer_at(std::int32_t position) const;
    std::int32_t index_of_float(float v) const;
    float float_at(std::int32_t position) const;
    std::int32_t index_of_string(const Text& v) const;
    std::string string_at(std::int32_t position) const;

    // The trees and indexes, for comparing shapes.
    const Collection<std::int32_t>& integers() const { return integers_; }
    const Collection<float>& floats() const { return floats_; }
    const Collection<std::string>& strings() const { return strings_; }

    // Number of nodes on the longest root-to-leaf path (0 when empty), so a
    // caller knows how many draws a random element can need.
    std::size_t height(sorvel::simulated::Set set) const;

private:
    std::int32_t case_word_;
    std::int32_t index_word_;
    Collection<std::int32_t> integers_;
    Collection<float> floats_;
    Collection<std::string> strings_;
};

// Line splitting of Load From File: CR and LF end lines, empty lines vanish,
// a last line needs no terminator. Lines keep any zero bytes they hold.
std::vector<std::string> split_lines(const std::string& bytes);

}  // namespace sorvel::test::model
