// Fetching parameters from the host and handing results back.
#pragma once

#include <bit>
#include <cstdint>

#include "host/abi.hpp"

namespace sorvel {

// The per-instance reader through which expressions fetch their parameters.
using ParamRoutine = word(SORVEL_CALL*)(word owner, word param, word type);

struct ParamReader {
    RunRecord* owner;
    ParamRoutine current;
};

// The one block the library allocates per instance: the reader first, so that
// the record's reader pointer also finds the side structures of the trees.
struct InstanceBlock {
    ParamReader reader;
    SideStructures side;
};

inline SideStructures* side_structures_of(const RunRecord* r) noexcept {
    return r->reader == nullptr ? nullptr : &reinterpret_cast<InstanceBlock*>(r->reader)->side;
}

// Host types for expression parameters, and selectors for event parameters.
inline constexpr word kTypeInteger = 0;
inline constexpr word kTypeString = 1;
inline constexpr word kTypeFloat = 2;
inline constexpr word kSelectInteger = 0;
inline constexpr word kSelectFloat = 2;
inline constexpr word kSelectString = -1;

word SORVEL_CALL read_first_param(word owner, word param, word type);
word SORVEL_CALL read_next_param(word owner, word param, word type);

inline HostRoutine host_routine(const RunRecord* record, std::size_t word_number) noexcept {
    return reinterpret_cast<HostRoutine>(record->host_header[word_number]);
}

// An entry of the host's service table, which the header points at.
inline word host_service(const RunRecord* record, std::size_t entry) noexcept {
    return reinterpret_cast<const word*>(record->host_header[host_words::kServiceTable])[entry];
}

// Condition and action parameters, in declaration order.
inline word event_param(RunRecord* record, word selector) noexcept {
    return host_routine(record, host_words::kReadEventParam)(reinterpret_cast<word>(record), selector, 0);
}
inline std::int32_t event_integer(RunRecord* record) noexcept {
    return low32(event_param(record, kSelectInteger));
}
inline float event_float(RunRecord* record) noexcept {
    return std::bit_cast<float>(static_cast<std::uint32_t>(event_param(record, kSelectFloat)));
}
inline const char* event_string(RunRecord* record) noexcept {
    return reinterpret_cast<const char*>(event_param(record, kSelectString));
}

// Expression parameters: every expression resets first, then fetches.
void reset_reader(RunRecord* record) noexcept;
word fetch_param(RunRecord* record, word param, word type) noexcept;

inline std::int32_t expr_integer(RunRecord* record, word param) noexcept {
    return low32(fetch_param(record, param, kTypeInteger));
}
inline float expr_float(RunRecord* record, word param) noexcept {
    return std::bit_cast<float>(static_cast<std::uint32_t>(fetch_param(record, param, kTypeFloat)));
}
inline const char* expr_string(RunRecord* record, word param) noexcept {
    return reinterpret_cast<const char*>(fetch_param(record, param, kTypeString));
}

// Results.
word float_result(RunRecord* record, float value) noexcept;
word string_result(RunRecord* record, const char* text) noexcept;

// Views of an instance's collections.
// An instance without its block gets plain descents.
inline IntegerCollection integers(RunRecord* r) noexcept {
    SideStructures* l = side_structures_of(r);
    return {r->integer_root, r->integer_count, r->integer_index, l == nullptr ? nullptr : &l->integers};
}
inline FloatCollection floats(RunRecord* r) noexcept {
    SideStructures* l = side_structures_of(r);
    return {r->float_root, r->float_count, r->float_index, l == nullptr ? nullptr : &l->floats};
}
inline StringCollection strings(RunRecord* r) noexcept {
    SideStructures* l = side_structures_of(r);
    return {r->string_root, r->string_count, r->string_index, l == nullptr ? nullptr : &l->strings};
}
inline bool case_sensitive(const RunRecord* r) noexcept {
    return r->case_sensitive == 1;
}

}  // namespace sorvel
