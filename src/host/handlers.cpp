// Handlers: fetch the parameters, call the collections, hand back the result.
// They have C names so that they can be found in the built library.
#include "host/handlers.hpp"

#include "collections/random_path.hpp"
#include "host/boundary.hpp"
#include "host/file_read.hpp"
#include "loading/load_lines.hpp"

using sorvel::RunRecord;
using sorvel::word;

namespace {

template <class V>
auto random_pick(sorvel::TreeNode<V>* root) noexcept {
    return sorvel::random_path_pick(static_cast<const sorvel::TreeNode<V>*>(root), sorvel::runtime_draws());
}

void load_from_file(RunRecord* r, const char* name, std::int32_t balance) noexcept {
    using namespace sorvel;
    if (name == nullptr) {
        return;
    }
    const auto* services = reinterpret_cast<const word*>(r->host_header[host_words::kServiceTable]);
    const auto open = reinterpret_cast<HostRoutine>(services[host_words::kOpenFile]);
    const auto close = reinterpret_cast<HostCloseRoutine>(services[host_words::kCloseFile]);
    std::uint32_t size = 0;
    const word handle = open(reinterpret_cast<word>(name), reinterpret_cast<word>(&size), 0);
    if (handle == -1) {
        return;
    }
    // One spare byte lets the last line be terminated in place.
    // Only a 32-bit size_t can lack room for it.
    char* buffer = nullptr;
    const std::size_t bytes = size;
    if (bytes != SIZE_MAX) {
        buffer = static_cast<char*>(memory::allocate(bytes + 1));
    }
    if (buffer != nullptr) {
        const std::uint32_t read = read_once(handle, buffer, size);
        StringCollection view = strings(r);
        load_lines(view, case_sensitive(r), buffer, read < size ? read : size, balance != 0, runtime_draws());
    }
    close(handle);
    memory::release(buffer);
}

}  // namespace

extern "C" {

word SORVEL_CALL sorvel_contains_integer(RunRecord* r, word, word) {
    const std::int32_t value = sorvel::event_integer(r);
    return sorvel::contains(sorvel::integers(r), value) ? 1 : 0;
}

word SORVEL_CALL sorvel_contains_float(RunRecord* r, word, word) {
    const float value = sorvel::event_float(r);
    return sorvel::contains(sorvel::floats(r), value) ? 1 : 0;
}

word SORVEL_CALL sorvel_contains_string(RunRecord* r, word, word) {
    const char* value = sorvel::event_string(r);
    return sorvel::contains(sorvel::strings(r), value, sorvel::case_sensitive(r)) ? 1 : 0;
}

word SORVEL_CALL sorvel_add_integer(RunRecord* r, word, word) {
    const std::int32_t value = sorvel::event_integer(r);
    sorvel::IntegerCollection view = sorvel::integers(r);
    sorvel::add(view, value);
    return 0;
}

word SORVEL_CALL sorvel_remove_integer(RunRecord* r, word, word) {
    const std::int32_t value = sorvel::event_integer(r);
    sorvel::IntegerCollection view = sorvel::integers(r);
    sorvel::remove(view, value);
    return 0;
}

word SORVEL_CALL sorvel_clear_integers(RunRecord* r, word, word) {
    sorvel::IntegerCollection view = sorvel::integers(r);
    sorvel::clear(view);
    return 0;
}

word SORVEL_CALL sorvel_add_float(RunRecord* r, word, word) {
    const float value = sorvel::event_float(r);
    sorvel::FloatCollection view = sorvel::floats(r);
    sorvel::add(view, value);
    return 0;
}

word SORVEL_CALL sorvel_remove_float(RunRecord* r, word, word) {
    const float value = sorvel::event_float(r);
    sorvel::FloatCollection view = sorvel::floats(r);
    sorvel::remove(view, value);
    return 0;
}

word SORVEL_CALL sorvel_clear_floats(RunRecord* r, word, word) {
    sorvel::FloatCollection view = sorvel::floats(r);
    sorvel::clear(view);
    return 0;
}

word SORVEL_CALL sorvel_add_string(RunRecord* r, word, word) {
    const char* value = sorvel::event_string(r);
    sorvel::StringCollection view = sorvel::strings(r);
    sorvel::AddStringValue(view, value, sorvel::case_sensitive(r));
    return 0;
}

word SORVEL_CALL sorvel_remove_string(RunRecord* r, word, word) {
    const char* value = sorvel::event_string(r);
    sorvel::StringCollection view = sorvel::strings(r);
    sorvel::remove(view, value, sorvel::case_sensitive(r));
    return 0;
}

word SORVEL_CALL sorvel_clear_strings(RunRecord* r, word, word) {
    sorvel::StringCollection view = sorvel::strings(r);
    sorvel::clear(view);
    return 0;
}

word SORVEL_CALL sorvel_load_from_file(RunRecord* r, word, word) {
    const char* name = sorvel::event_string(r);
    const std::int32_t balance = sorvel::event_integer(r);
    load_from_file(r, name, balance);
    return 0;
}

word SORVEL_CALL sorvel_integers_size(RunRecord* r, word) {
    sorvel::reset_reader(r);
    return r->integer_count;
}

word SORVEL_CALL sorvel_integers_random_element(RunRecord* r, word) {
    sorvel::reset_reader(r);
    const sorvel::IntegerNode* node = random_pick(r->integer_root);
    return node == nullptr ? 0 : node->value;
}

word SORVEL_CALL sorvel_floats_size(RunRecord* r, word) {
    sorvel::reset_reader(r);
    return r->float_count;
}

word SORVEL_CALL sorvel_floats_random_element(RunRecord* r, word) {
    sorvel::reset_reader(r);
    const sorvel::FloatNode* node = random_pick(r->float_root);
    return sorvel::float_result(r, node == nullptr ? 0.0F : node->value);
}

word SORVEL_CALL sorvel_strings_size(RunRecord* r, word) {
    sorvel::reset_reader(r);
    return r->string_count;
}

word SORVEL_CALL sorvel_strings_random_element(RunRecord* r, word) {
    sorvel::reset_reader(r);
    const sorvel::StringNode* node = random_pick(r->string_root);
    return sorvel::string_result(r, node == nullptr ? "" : node->value);
}

word SORVEL_CALL sorvel_index_of_integer(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const std::int32_t value = sorvel::expr_integer(r, param);
    return sorvel::position_of(sorvel::integers(r), value);
}

word SORVEL_CALL sorvel_integer_at(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const std::int32_t position = sorvel::expr_integer(r, param);
    const sorvel::IntegerNode* node = sorvel::node_at(sorvel::integers(r), position);
    return node == nullptr ? 0 : node->value;
}

word SORVEL_CALL sorvel_index_of_float(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const float value = sorvel::expr_float(r, param);
    return sorvel::position_of(sorvel::floats(r), value);
}

word SORVEL_CALL sorvel_float_at(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const std::int32_t position = sorvel::expr_integer(r, param);
    const sorvel::FloatNode* node = sorvel::node_at(sorvel::floats(r), position);
    return sorvel::float_result(r, node == nullptr ? 0.0F : node->value);
}

word SORVEL_CALL sorvel_index_of_string(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const char* value = sorvel::expr_string(r, param);
    return sorvel::position_of(sorvel::strings(r), value, sorvel::case_sensitive(r));
}

word SORVEL_CALL sorvel_string_at(RunRecord* r, word param) {
    sorvel::reset_reader(r);
    const std::int32_t position = sorvel::expr_integer(r, param);
    const sorvel::StringNode* node = sorvel::node_at(sorvel::strings(r), position);
    return sorvel::string_result(r, node == nullptr ? "" : node->value);
}

}  // extern "C"

namespace sorvel {

const ConditionHandler kConditionTable[] = {sorvel_contains_integer, sorvel_contains_float, sorvel_contains_string,
                                            nullptr};

const ActionHandler kActionTable[] = {
    sorvel_add_integer, sorvel_remove_integer, sorvel_clear_integers, sorvel_add_float,  sorvel_remove_float,
    sorvel_clear_floats, sorvel_add_string,    sorvel_remove_string,  sorvel_clear_strings, sorvel_load_from_file,
    nullptr};

const ExpressionHandler kExpressionTable[] = {
    sorvel_integers_size,    sorvel_integers_random_element, sorvel_floats_size, sorvel_floats_random_element,
    sorvel_strings_size,     sorvel_strings_random_element,  sorvel_index_of_integer, sorvel_integer_at,
    sorvel_index_of_float,   sorvel_float_at,                sorvel_index_of_string,  sorvel_string_at,
    nullptr};

}  // namespace sorvel
