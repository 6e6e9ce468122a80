// The handler tables the host receives, one per kind, in catalogue order and
// null-terminated. They are constant: built once, valid for the library's life.
#pragma once

#include "host/abi.hpp"
#include "host/catalogue.hpp"

namespace sorvel {

extern const ConditionHandler kConditionTable[catalogue::kConditionCount + 1];
extern const ActionHandler kActionTable[catalogue::kActionCount + 1];
extern const ExpressionHandler kExpressionTable[catalogue::kExpressionCount + 1];

}  // namespace sorvel
