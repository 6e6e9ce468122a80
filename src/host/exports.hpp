// The exported entry points: name, ordinal, argument count and answer of
// each stub, in one list that both the definitions and their declarations use.
#pragma once

#include "host/platform.hpp"

// Argument lists by count: every argument is a host word.
#define SORVEL_ARGS0 ()
#define SORVEL_ARGS1 (sorvel::word)
#define SORVEL_ARGS2 (sorvel::word, sorvel::word)
#define SORVEL_ARGS3 (sorvel::word, sorvel::word, sorvel::word)
#define SORVEL_ARGS4 (sorvel::word, sorvel::word, sorvel::word, sorvel::word)
#define SORVEL_ARGS5 (sorvel::word, sorvel::word, sorvel::word, sorvel::word, sorvel::word)
#define SORVEL_ARGS7 (sorvel::word, sorvel::word, sorvel::word, sorvel::word, sorvel::word, sorvel::word, sorvel::word)

// The entry points with behaviour, defined in exports.cpp:
// X(name, ordinal, argument count)
#define SORVEL_EXPORT_LIST(X)          \
    X(GetInfos, 2, 1)                  \
    X(GetRunObjectInfos, 59, 2)        \
    X(GetRunObjectDataSize, 80, 2)     \
    X(CreateRunObject, 50, 3)          \
    X(DestroyRunObject, 51, 2)         \
    X(HandleRunObject, 52, 1)

// The stubs: X(name, ordinal, argument list, result)
#define SORVEL_STUB_LIST(X)                                  \
    X(UnloadObject, 7, SORVEL_ARGS3, 0)                      \
    X(PrepareToWriteObject, 22, SORVEL_ARGS3, 0)             \
    X(CreateFromFile, 31, SORVEL_ARGS3, 0)                   \
    X(DuplicateObject, 32, SORVEL_ARGS3, 0)                  \
    X(SetTextAlignment, 39, SORVEL_ARGS3, 0)                 \
    X(SetTextClr, 43, SORVEL_ARGS3, 0)                       \
    X(InitParameter, 69, SORVEL_ARGS3, 0)                    \
    X(EditParameter, 70, SORVEL_ARGS3, 0)                    \
    X(StartFrame, 87, SORVEL_ARGS3, 0)                       \
    X(EndFrame, 88, SORVEL_ARGS3, 0)                         \
    X(ReleaseProperties, 101, SORVEL_ARGS3, 0)               \
    X(GetDebugItem, 111, SORVEL_ARGS3, 0)                    \
    X(GetConditionMenu, 60, SORVEL_ARGS3, 0)                 \
    X(GetActionMenu, 61, SORVEL_ARGS3, 0)                    \
    X(GetExpressionMenu, 62, SORVEL_ARGS3, 0)                \
    X(GetPropValue, 102, SORVEL_ARGS3, 0)                    \
    X(GetPropCheck, 105, SORVEL_ARGS3, 0)                    \
    X(GetPropCreateParam, 107, SORVEL_ARGS3, 0)              \
    X(EditProp, 109, SORVEL_ARGS3, 0)                        \
    X(GetProperties, 100, SORVEL_ARGS3, 1)                   \
    X(IsPropEnabled, 104, SORVEL_ARGS3, 1)                   \
    X(CreateObject, 14, SORVEL_ARGS3, -1)                    \
    X(PutObject, 8, SORVEL_ARGS4, 0)                         \
    X(RemoveObject, 9, SORVEL_ARGS4, 0)                      \
    X(GetObjectRect, 19, SORVEL_ARGS4, 0)                    \
    X(UpdateFileNames, 23, SORVEL_ARGS4, 0)                  \
    X(GetConditionString, 66, SORVEL_ARGS4, 0)               \
    X(GetActionString, 67, SORVEL_ARGS4, 0)                  \
    X(GetExpressionString, 68, SORVEL_ARGS4, 0)              \
    X(GetExpressionTitle, 74, SORVEL_ARGS4, 0)               \
    X(SetPropValue, 103, SORVEL_ARGS4, 0)                    \
    X(SetPropCheck, 106, SORVEL_ARGS4, 0)                    \
    X(ReleasePropCreateParam, 108, SORVEL_ARGS4, 0)          \
    X(SetTextFont, 41, SORVEL_ARGS4, 1)                      \
    X(SetEditSize, 99, SORVEL_ARGS4, 1)                      \
    X(LoadObject, 6, SORVEL_ARGS4, 0)                        \
    X(EditObject, 18, SORVEL_ARGS4, 0)                       \
    X(GetFilters, 45, SORVEL_ARGS4, 0)                       \
    X(EditorDisplay, 20, SORVEL_ARGS5, 0)                    \
    X(GetParameterString, 71, SORVEL_ARGS5, 0)               \
    X(GetConditionTitle, 72, SORVEL_ARGS5, 0)                \
    X(GetActionTitle, 73, SORVEL_ARGS5, 0)                   \
    X(GetExpressionParam, 89, SORVEL_ARGS5, 0)               \
    X(GetTextFont, 40, SORVEL_ARGS5, 1)                      \
    X(IsTransparent, 21, SORVEL_ARGS5, 0)                    \
    X(GetObjInfos, 36, SORVEL_ARGS7, 0)                      \
    X(GetConditionCodeFromMenu, 63, SORVEL_ARGS2, -1)        \
    X(GetActionCodeFromMenu, 64, SORVEL_ARGS2, -1)           \
    X(GetExpressionCodeFromMenu, 65, SORVEL_ARGS2, -1)       \
    X(Initialize, 25, SORVEL_ARGS2, 0)                       \
    X(UsesFile, 30, SORVEL_ARGS2, 0)                         \
    X(GetTextCaps, 37, SORVEL_ARGS2, 0)                      \
    X(GetTextAlignment, 38, SORVEL_ARGS2, 0)                 \
    X(GetTextClr, 42, SORVEL_ARGS2, 0)                       \
    X(GetConditionInfos, 75, SORVEL_ARGS2, 0)                \
    X(GetActionInfos, 76, SORVEL_ARGS2, 0)                   \
    X(GetExpressionInfos, 77, SORVEL_ARGS2, 0)               \
    X(UpdateEditStructure, 78, SORVEL_ARGS2, 0)              \
    X(StartApp, 85, SORVEL_ARGS2, 0)                         \
    X(EndApp, 86, SORVEL_ARGS2, 0)                           \
    X(EditDebugItem, 112, SORVEL_ARGS2, 0)                   \
    X(Free, 26, SORVEL_ARGS1, 0)                             \
    X(DisplayRunObject, 53, SORVEL_ARGS1, 0)                 \
    X(PauseRunObject, 57, SORVEL_ARGS1, 0)                   \
    X(ContinueRunObject, 58, SORVEL_ARGS1, 0)                \
    X(GetDebugTree, 110, SORVEL_ARGS1, 0)                    \
    X(GetHelpFileName, 16, SORVEL_ARGS0, 0)                  \
    X(GetDependencies, 44, SORVEL_ARGS0, 0)
