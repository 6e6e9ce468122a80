#include "host/boundary.hpp"

#include <cstring>

namespace sorvel {
namespace {

// Only the low 16 bits of the parameter word reach the host, sign-extended.
word param_word(word param) noexcept {
    return static_cast<word>(static_cast<std::int16_t>(static_cast<std::uint16_t>(param & 0xFFFF)));
}

RunRecord* owner_of(word owner) noexcept { return reinterpret_cast<RunRecord*>(owner); }

}  // namespace

word SORVEL_CALL read_first_param(word owner, word param, word type) {
    RunRecord* record = owner_of(owner);
    if (record->reader != nullptr) {
        record->reader->current = read_next_param;
    }
    return host_routine(record, host_words::kReadFirstExprParam)(owner, type, param_word(param));
}

word SORVEL_CALL read_next_param(word owner, word param, word type) {
    return host_routine(owner_of(owner), host_words::kReadNextExprParam)(owner, type, param_word(param));
}

void reset_reader(RunRecord* record) noexcept {
    if (record->reader != nullptr) {
        record->reader->current = read_first_param;
    }
}

word fetch_param(RunRecord* record, word param, word type) noexcept {
    // An instance whose reader could not be allocated still reads its one
    // parameter: every expression has at most one, so it is always the first.
    const ParamRoutine routine = record->reader != nullptr ? record->reader->current : read_first_param;
    return routine(reinterpret_cast<word>(record), param, type);
}

word float_result(RunRecord* record, float value) noexcept {
    record->result_flags = static_cast<std::uint16_t>(record->result_flags | kFloatResultFlag);
    return from_bits(std::bit_cast<std::uint32_t>(value));
}

word string_result(RunRecord* record, const char* text) noexcept {
    // A host that gives no buffer gets this empty string rather than a write
    // through a null pointer.
    static const char kNoBuffer[] = "";
    const std::size_t length = std::strlen(text);
    const word buffer = host_routine(record, host_words::kAllocResultString)(reinterpret_cast<word>(record), 0,
                                                                              static_cast<word>(length + 1));
    record->result_flags = static_cast<std::uint16_t>(record->result_flags | kStringResultFlag);
    if (buffer == 0) {
        return reinterpret_cast<word>(kNoBuffer);
    }
    std::memcpy(reinterpret_cast<char*>(buffer), text, length + 1);
    return buffer;
}

}  // namespace sorvel
