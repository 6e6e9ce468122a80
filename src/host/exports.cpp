// The library's exported entry points. Only the run-time ones do real work;
// those that serve the host's editor, drawing or debugger give constants.
#include "host/exports.hpp"

#include <new>

#include "host/boundary.hpp"
#include "host/handlers.hpp"

using sorvel::word;

SORVEL_EXPORT word SORVEL_CALL DllMain(word, word, word) {
    // The handler tables are constant, so every loader call finds them ready
    // and nothing is built, or leaked, per thread attach or detach.
    return 1;
}

SORVEL_EXPORT word SORVEL_CALL GetInfos(word code) {
    for (const auto& info : sorvel::answers::kInfos) {
        if (code == info.code) {
            return info.answer;
        }
    }
    return 0;
}

SORVEL_EXPORT word SORVEL_CALL GetRunObjectInfos(word, word block_word) {
    namespace cat = sorvel::catalogue;
    auto* block = reinterpret_cast<sorvel::ObjectInfoBlock*>(block_word);
    if (block == nullptr) {
        return 1;
    }
    block->conditions = sorvel::kConditionTable;
    block->actions = sorvel::kActionTable;
    block->expressions = sorvel::kExpressionTable;
    block->condition_count = static_cast<std::uint16_t>(cat::kConditionCount);
    block->action_count = static_cast<std::uint16_t>(cat::kActionCount);
    block->expression_count = static_cast<std::uint16_t>(cat::kExpressionCount);
    block->edit_record_size = sizeof(sorvel::EditRecord);
    block->flags = sorvel::answers::kInfoFlags;
    block->letter = sorvel::answers::kInfoLetter;
    block->zero = 0;
    block->identifier = sorvel::answers::kIdentifier;
    block->version = sorvel::answers::kVersion;
    return 1;
}

SORVEL_EXPORT word SORVEL_CALL GetRunObjectDataSize(word, word) {
    return sizeof(sorvel::RunRecord);
}

SORVEL_EXPORT word SORVEL_CALL CreateRunObject(word record_word, word edit_word, word creation_word) {
    using namespace sorvel;
    auto* r = reinterpret_cast<RunRecord*>(record_word);
    const auto* edit = reinterpret_cast<const EditRecord*>(edit_word);
    const auto* creation = reinterpret_cast<const CreationRecord*>(creation_word);
    if (r == nullptr) {
        return 0;
    }
    void* block = memory::allocate(sizeof(InstanceBlock));
    r->reader = block == nullptr ? nullptr : &(new (block) InstanceBlock{{r, read_first_param}, {}})->reader;
    if (creation != nullptr) {
        r->creation_word_a = creation->word_at_8;
        r->creation_word_b = creation->word_at_12;
    }
    if (edit != nullptr) {
        r->case_sensitive = edit->case_sensitive;
        r->use_indices = edit->use_indices;
    }
    if (r->use_indices == 1) {
        r->integer_index = create_index<IntegerNode>();
        r->float_index = create_index<FloatNode>();
        r->string_index = create_index<StringNode>();
        // Either all three indexes exist or none: without them the instance
        // behaves as with "Use Indicies" off.
        if (r->integer_index == nullptr || r->float_index == nullptr || r->string_index == nullptr) {
            destroy_index(r->integer_index);
            destroy_index(r->float_index);
            destroy_index(r->string_index);
            r->integer_index = nullptr;
            r->float_index = nullptr;
            r->string_index = nullptr;
        }
    }
    return 0;
}

SORVEL_EXPORT word SORVEL_CALL DestroyRunObject(word record_word, word) {
    using namespace sorvel;
    auto* r = reinterpret_cast<RunRecord*>(record_word);
    if (r == nullptr) {
        return 0;
    }
    destroy_index(r->integer_index);
    destroy_index(r->float_index);
    destroy_index(r->string_index);
    free_tree(r->integer_root);
    free_tree(r->float_root);
    FreeStringTree(r->string_root);
    if (r->reader != nullptr) {
        InstanceBlock* block = reinterpret_cast<InstanceBlock*>(r->reader);
        block->~InstanceBlock();
        memory::release(block);
    }
    // Nothing dangles: a second destroy frees nothing twice.
    r->integer_index = nullptr;
    r->float_index = nullptr;
    r->string_index = nullptr;
    r->integer_root = nullptr;
    r->float_root = nullptr;
    r->string_root = nullptr;
    r->reader = nullptr;
    return 0;
}

SORVEL_EXPORT word SORVEL_CALL HandleRunObject(word) {
    return sorvel::answers::kHandleRunObject;
}

// Stubs: each reads none of its arguments. Those whose answer the host leaves
// undefined give 0.
#define SORVEL_STUB(name, ordinal, params, result) \
    SORVEL_EXPORT word SORVEL_CALL name params {   \
        return result;                             \
    }
SORVEL_STUB_LIST(SORVEL_STUB)
