// Handlers: fetch the parameters, call the collections, hand back the result.
// They have C names, which the catalogue lists, so that each can be found in
// the built library.
#include "host/handlers.hpp"

#include "collections/random_path.hpp"
#include "host/boundary.hpp"
#include "host/file_read.hpp"
#include "loading/load_lines.hpp"

namespace sorvel {
namespace {

template <class V>
const TreeNode<V>* random_pick(Collection<V> c) noexcept {
    return random_path_pick(static_cast<const TreeNode<V>*>(c.root), runtime_draws());
}

template <class V>
V value_or_zero(const TreeNode<V>* node) noexcept {
    return node == nullptr ? V{} : node->value;
}

const char* text_or_empty(const StringNode* node) noexcept {
    return node == nullptr ? "" : node->value;
}

void load_from_file(RunRecord* r, const char* name, std::int32_t balance) noexcept {
    if (name == nullptr) {
        return;
    }
    std::uint32_t size = 0;
    const auto open = reinterpret_cast<HostRoutine>(host_service(r, host_words::kOpenFile));
    const word handle = open(reinterpret_cast<word>(name), reinterpret_cast<word>(&size), 0);
    if (handle == -1) {
        return;
    }
    // One spare byte lets the last line be terminated in place.
    // Only a 32-bit size_t can lack room for it.
    const std::size_t bytes = size;
    char* buffer = bytes == SIZE_MAX ? nullptr : static_cast<char*>(memory::allocate(bytes + 1));
    if (buffer != nullptr) {
        const std::uint32_t read = read_once(handle, buffer, size);
        load_lines(strings(r), case_sensitive(r), buffer, read < size ? read : size, balance != 0, runtime_draws());
    }
    reinterpret_cast<HostCloseRoutine>(host_service(r, host_words::kCloseFile))(handle);
    memory::release(buffer);
}

}  // namespace

extern "C" {

// Conditions and actions: each reads its parameters first.
word SORVEL_CALL sorvel_contains_integer(RunRecord* r, word, word) {
    return contains(integers(r), event_integer(r));
}
word SORVEL_CALL sorvel_contains_float(RunRecord* r, word, word) {
    return contains(floats(r), event_float(r));
}
word SORVEL_CALL sorvel_contains_string(RunRecord* r, word, word) {
    return contains(strings(r), event_string(r), case_sensitive(r));
}

word SORVEL_CALL sorvel_add_integer(RunRecord* r, word, word) {
    add(integers(r), event_integer(r));
    return 0;
}
word SORVEL_CALL sorvel_remove_integer(RunRecord* r, word, word) {
    remove(integers(r), event_integer(r));
    return 0;
}
word SORVEL_CALL sorvel_clear_integers(RunRecord* r, word, word) {
    clear(integers(r));
    return 0;
}
word SORVEL_CALL sorvel_add_float(RunRecord* r, word, word) {
    add(floats(r), event_float(r));
    return 0;
}
word SORVEL_CALL sorvel_remove_float(RunRecord* r, word, word) {
    remove(floats(r), event_float(r));
    return 0;
}
word SORVEL_CALL sorvel_clear_floats(RunRecord* r, word, word) {
    clear(floats(r));
    return 0;
}
word SORVEL_CALL sorvel_add_string(RunRecord* r, word, word) {
    AddStringValue(strings(r), event_string(r), case_sensitive(r));
    return 0;
}
word SORVEL_CALL sorvel_remove_string(RunRecord* r, word, word) {
    remove(strings(r), event_string(r), case_sensitive(r));
    return 0;
}
word SORVEL_CALL sorvel_clear_strings(RunRecord* r, word, word) {
    clear(strings(r));
    return 0;
}
word SORVEL_CALL sorvel_load_from_file(RunRecord* r, word, word) {
    const char* name = event_string(r);  // the name before the flag
    load_from_file(r, name, event_integer(r));
    return 0;
}

// Expressions: each resets the reader, then fetches its parameter.
word SORVEL_CALL sorvel_integers_size(RunRecord* r, word) {
    reset_reader(r);
    return r->integer_count;
}
word SORVEL_CALL sorvel_integers_random_element(RunRecord* r, word) {
    reset_reader(r);
    return value_or_zero(random_pick(integers(r)));
}
word SORVEL_CALL sorvel_floats_size(RunRecord* r, word) {
    reset_reader(r);
    return r->float_count;
}
word SORVEL_CALL sorvel_floats_random_element(RunRecord* r, word) {
    reset_reader(r);
    return float_result(r, value_or_zero(random_pick(floats(r))));
}
word SORVEL_CALL sorvel_strings_size(RunRecord* r, word) {
    reset_reader(r);
    return r->string_count;
}
word SORVEL_CALL sorvel_strings_random_element(RunRecord* r, word) {
    reset_reader(r);
    return string_result(r, text_or_empty(random_pick(strings(r))));
}
word SORVEL_CALL sorvel_index_of_integer(RunRecord* r, word p) {
    reset_reader(r);
    return position_of(integers(r), expr_integer(r, p));
}
word SORVEL_CALL sorvel_integer_at(RunRecord* r, word p) {
    reset_reader(r);
    return value_or_zero(node_at(integers(r), expr_integer(r, p)));
}
word SORVEL_CALL sorvel_index_of_float(RunRecord* r, word p) {
    reset_reader(r);
    return position_of(floats(r), expr_float(r, p));
}
word SORVEL_CALL sorvel_float_at(RunRecord* r, word p) {
    reset_reader(r);
    return float_result(r, value_or_zero(node_at(floats(r), expr_integer(r, p))));
}
word SORVEL_CALL sorvel_index_of_string(RunRecord* r, word p) {
    reset_reader(r);
    return position_of(strings(r), expr_string(r, p), case_sensitive(r));
}
word SORVEL_CALL sorvel_string_at(RunRecord* r, word p) {
    reset_reader(r);
    return string_result(r, text_or_empty(node_at(strings(r), expr_integer(r, p))));
}

}  // extern "C"

// In the catalogue's order, which names each entry's handler.
const ConditionHandler kConditionTable[] = {sorvel_contains_integer, sorvel_contains_float, sorvel_contains_string,
                                            nullptr};

const ActionHandler kActionTable[] = {sorvel_add_integer,
                                      sorvel_remove_integer,
                                      sorvel_clear_integers,
                                      sorvel_add_float,
                                      sorvel_remove_float,
                                      sorvel_clear_floats,
                                      sorvel_add_string,
                                      sorvel_remove_string,
                                      sorvel_clear_strings,
                                      sorvel_load_from_file,
                                      nullptr};

const ExpressionHandler kExpressionTable[] = {sorvel_integers_size,
                                              sorvel_integers_random_element,
                                              sorvel_floats_size,
                                              sorvel_floats_random_element,
                                              sorvel_strings_size,
                                              sorvel_strings_random_element,
                                              sorvel_index_of_integer,
                                              sorvel_integer_at,
                                              sorvel_index_of_float,
                                              sorvel_float_at,
                                              sorvel_index_of_string,
                                              sorvel_string_at,
                                              nullptr};

}  // namespace sorvel
