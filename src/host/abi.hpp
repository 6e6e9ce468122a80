// Records shared with the host. On 32-bit x86 they have the host's exact
// sizes and offsets; on 64-bit builds every pointer field becomes a word
// wide, every other field keeps its width, and the host's own header offsets
// stay where they are.
#pragma once

#include <cstddef>
#include <cstdint>

#include "collections/collections.hpp"
#include "host/platform.hpp"

namespace sorvel {

struct ParamReader;
struct RunRecord;

using ConditionHandler = word(SORVEL_CALL*)(RunRecord*, word, word);
using ActionHandler = word(SORVEL_CALL*)(RunRecord*, word, word);
using ExpressionHandler = word(SORVEL_CALL*)(RunRecord*, word);

// The host's routines: three words in, one word out, callee cleans up.
using HostRoutine = word(SORVEL_CALL*)(word, word, word);
using HostCloseRoutine = word(SORVEL_CALL*)(word);

// Word numbers in the HostRunHeader and the HostServiceTable, tables of words.
namespace host_words {
inline constexpr std::size_t kAllocResultString = 218;
inline constexpr std::size_t kReadFirstExprParam = 219;
inline constexpr std::size_t kReadNextExprParam = 220;
inline constexpr std::size_t kReadEventParam = 232;
inline constexpr std::size_t kServiceTable = 317;
inline constexpr std::size_t kOpenFile = 80;
inline constexpr std::size_t kCloseFile = 81;
}  // namespace host_words

// The fixed answers the host reads at start-up. Their meaning is the host's;
// the library only gives them.
namespace answers {
struct InfoAnswer {
    std::int32_t code;
    std::int32_t answer;
};
// GetInfos: the codes with an answer; every other code gives 0.
inline constexpr InfoAnswer kInfos[] = {{0, 768}, {2, 256}, {6, 2}, {7, 247}};
inline constexpr std::int32_t kHandleRunObject = 2;
// The ObjectInfoBlock's constant fields.
inline constexpr std::uint32_t kInfoFlags = 2305;
inline constexpr char kInfoLetter = 'd';
inline constexpr std::uint32_t kIdentifier = 0x5352564C;  // "SRVL", 'S' in the most significant byte
inline constexpr std::uint16_t kVersion = 1;
}  // namespace answers

// Result flags at byte 124 of the RunRecord.
inline constexpr std::uint16_t kFloatResultFlag = 0x4000;
inline constexpr std::uint16_t kStringResultFlag = 0x8000;

// The stored settings of one object.
struct EditRecord {
    std::uint8_t host_part[20];
    std::int32_t case_sensitive;  // "Case Sensitive Strings": 1 on, else off
    std::int32_t use_indices;     // "Use Indicies": 1 on, else off
};

// The third argument of CreateRunObject; only two of its words are read.
struct CreationRecord {
    std::uint8_t host_part[8];
    std::int32_t word_at_8;
    std::int32_t word_at_12;
};

struct RunRecord {
    // The host's header: only the fields named here are touched.
    std::uint8_t host_part0[8];
    const word* host_header;  // HostRunHeader, a table of words
    std::uint8_t host_part1[76 - 8 - sizeof(word*)];
    std::int32_t creation_word_a;  // byte 76
    std::uint8_t host_part2[4];
    std::int32_t creation_word_b;  // byte 84
    std::uint8_t host_part3[124 - 88];
    std::uint16_t result_flags;  // byte 124
    std::uint8_t host_part4[360 - 126];
    // The extension's twelve fields.
    ParamReader* reader;
    std::int32_t case_sensitive;
    std::int32_t use_indices;
    IntegerNode* integer_root;
    std::int32_t integer_count;
    FloatNode* float_root;
    std::int32_t float_count;
    StringNode* string_root;
    std::int32_t string_count;
    IntegerCollection::Index* integer_index;
    FloatCollection::Index* float_index;
    StringCollection::Index* string_index;
};

struct ObjectInfoBlock {
    const ConditionHandler* conditions;
    const ActionHandler* actions;
    const ExpressionHandler* expressions;
    std::uint16_t condition_count;
    std::uint16_t action_count;
    std::uint16_t expression_count;
    std::uint16_t edit_record_size;
    std::uint32_t flags;
    std::uint8_t letter;
    std::uint8_t untouched;
    std::uint16_t zero;
    std::uint32_t identifier;
    std::uint16_t version;
};

static_assert(sizeof(EditRecord) == 28);
static_assert(offsetof(EditRecord, case_sensitive) == 20 && offsetof(EditRecord, use_indices) == 24);
static_assert(offsetof(CreationRecord, word_at_8) == 8 && offsetof(CreationRecord, word_at_12) == 12);
static_assert(offsetof(RunRecord, host_header) == 8);
static_assert(offsetof(RunRecord, creation_word_a) == 76 && offsetof(RunRecord, creation_word_b) == 84);
static_assert(offsetof(RunRecord, result_flags) == 124);
static_assert(offsetof(RunRecord, reader) == 360);

#if defined(__i386__)
static_assert(sizeof(RunRecord) == 408);
static_assert(offsetof(RunRecord, case_sensitive) == 364 && offsetof(RunRecord, use_indices) == 368);
static_assert(offsetof(RunRecord, integer_root) == 372 && offsetof(RunRecord, integer_count) == 376);
static_assert(offsetof(RunRecord, float_root) == 380 && offsetof(RunRecord, float_count) == 384);
static_assert(offsetof(RunRecord, string_root) == 388 && offsetof(RunRecord, string_count) == 392);
static_assert(offsetof(RunRecord, integer_index) == 396 && offsetof(RunRecord, float_index) == 400);
static_assert(offsetof(RunRecord, string_index) == 404);
static_assert(offsetof(ObjectInfoBlock, actions) == 4 && offsetof(ObjectInfoBlock, expressions) == 8);
static_assert(offsetof(ObjectInfoBlock, condition_count) == 12 && offsetof(ObjectInfoBlock, action_count) == 14);
static_assert(offsetof(ObjectInfoBlock, expression_count) == 16 && offsetof(ObjectInfoBlock, edit_record_size) == 18);
static_assert(offsetof(ObjectInfoBlock, flags) == 20 && offsetof(ObjectInfoBlock, letter) == 24);
static_assert(offsetof(ObjectInfoBlock, untouched) == 25 && offsetof(ObjectInfoBlock, zero) == 26);
static_assert(offsetof(ObjectInfoBlock, identifier) == 28 && offsetof(ObjectInfoBlock, version) == 32);
// HostRunHeader words 218, 219, 220, 232, 317 and service entries 80, 81.
static_assert(host_words::kAllocResultString * sizeof(word) == 872);
static_assert(host_words::kReadFirstExprParam * sizeof(word) == 876);
static_assert(host_words::kReadNextExprParam * sizeof(word) == 880);
static_assert(host_words::kReadEventParam * sizeof(word) == 928);
static_assert(host_words::kServiceTable * sizeof(word) == 1268);
static_assert(host_words::kOpenFile * sizeof(word) == 320 && host_words::kCloseFile * sizeof(word) == 324);
static_assert(offsetof(IntegerNode, left) == 4 && offsetof(IntegerNode, right) == 8);
#elif defined(__x86_64__)
static_assert(sizeof(RunRecord) == 448);
static_assert(offsetof(RunRecord, integer_root) == 376 && offsetof(RunRecord, integer_count) == 384);
static_assert(offsetof(RunRecord, float_root) == 392 && offsetof(RunRecord, string_root) == 408);
static_assert(offsetof(RunRecord, integer_index) == 424 && offsetof(RunRecord, string_index) == 440);
static_assert(offsetof(ObjectInfoBlock, condition_count) == 24 && offsetof(ObjectInfoBlock, flags) == 32);
static_assert(offsetof(ObjectInfoBlock, letter) == 36 && offsetof(ObjectInfoBlock, zero) == 38);
static_assert(offsetof(ObjectInfoBlock, identifier) == 40 && offsetof(ObjectInfoBlock, version) == 44);
static_assert(offsetof(IntegerNode, left) == 8 && offsetof(IntegerNode, right) == 16 && sizeof(IntegerNode) == 24);
#endif

}  // namespace sorvel
