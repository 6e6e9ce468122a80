// What a host expects of the library's exports, written out once for the
// tests: name, ordinal, argument count and, for a stub, its fixed answer.
// The end-to-end tests, the DLL check and the fuzzer's driver all read it.
#pragma once

#include <array>
#include <cstdint>

namespace sorvel::test {

struct ExportEntry {
    const char* name;
    int ordinal;
    int args;
    std::int32_t answer;  // a stub's fixed result
    bool stub;
};

constexpr ExportEntry working(const char* name, int ordinal, int args) {
    return {name, ordinal, args, 0, false};
}
constexpr ExportEntry stub(const char* name, int ordinal, int args, std::int32_t answer = 0) {
    return {name, ordinal, args, answer, true};
}

inline constexpr std::array<ExportEntry, 74> kExports{{
    working("GetInfos", 2, 1),
    working("GetRunObjectInfos", 59, 2),
    working("GetRunObjectDataSize", 80, 2),
    working("CreateRunObject", 50, 3),
    working("DestroyRunObject", 51, 2),
    working("HandleRunObject", 52, 1),
    stub("UnloadObject", 7, 3),
    stub("PrepareToWriteObject", 22, 3),
    stub("CreateFromFile", 31, 3),
    stub("DuplicateObject", 32, 3),
    stub("SetTextAlignment", 39, 3),
    stub("SetTextClr", 43, 3),
    stub("InitParameter", 69, 3),
    stub("EditParameter", 70, 3),
    stub("StartFrame", 87, 3),
    stub("EndFrame", 88, 3),
    stub("ReleaseProperties", 101, 3),
    stub("GetDebugItem", 111, 3),
    stub("GetConditionMenu", 60, 3),
    stub("GetActionMenu", 61, 3),
    stub("GetExpressionMenu", 62, 3),
    stub("GetPropValue", 102, 3),
    stub("GetPropCheck", 105, 3),
    stub("GetPropCreateParam", 107, 3),
    stub("EditProp", 109, 3),
    stub("GetProperties", 100, 3, 1),
    stub("IsPropEnabled", 104, 3, 1),
    stub("CreateObject", 14, 3, -1),
    stub("PutObject", 8, 4),
    stub("RemoveObject", 9, 4),
    stub("GetObjectRect", 19, 4),
    stub("UpdateFileNames", 23, 4),
    stub("GetConditionString", 66, 4),
    stub("GetActionString", 67, 4),
    stub("GetExpressionString", 68, 4),
    stub("GetExpressionTitle", 74, 4),
    stub("SetPropValue", 103, 4),
    stub("SetPropCheck", 106, 4),
    stub("ReleasePropCreateParam", 108, 4),
    stub("SetTextFont", 41, 4, 1),
    stub("SetEditSize", 99, 4, 1),
    stub("LoadObject", 6, 4),
    stub("EditObject", 18, 4),
    stub("GetFilters", 45, 4),
    stub("EditorDisplay", 20, 5),
    stub("GetParameterString", 71, 5),
    stub("GetConditionTitle", 72, 5),
    stub("GetActionTitle", 73, 5),
    stub("GetExpressionParam", 89, 5),
    stub("GetTextFont", 40, 5, 1),
    stub("IsTransparent", 21, 5),
    stub("GetObjInfos", 36, 7),
    stub("GetConditionCodeFromMenu", 63, 2, -1),
    stub("GetActionCodeFromMenu", 64, 2, -1),
    stub("GetExpressionCodeFromMenu", 65, 2, -1),
    stub("Initialize", 25, 2),
    stub("UsesFile", 30, 2),
    stub("GetTextCaps", 37, 2),
    stub("GetTextAlignment", 38, 2),
    stub("GetTextClr", 42, 2),
    stub("GetConditionInfos", 75, 2),
    stub("GetActionInfos", 76, 2),
    stub("GetExpressionInfos", 77, 2),
    stub("UpdateEditStructure", 78, 2),
    stub("StartApp", 85, 2),
    stub("EndApp", 86, 2),
    stub("EditDebugItem", 112, 2),
    stub("Free", 26, 1),
    stub("DisplayRunObject", 53, 1),
    stub("PauseRunObject", 57, 1),
    stub("ContinueRunObject", 58, 1),
    stub("GetDebugTree", 110, 1),
    stub("GetHelpFileName", 16, 0),
    stub("GetDependencies", 44, 0),
}};

// The fixed answers a host expects, written out here rather than taken from
// the library's own constants (host/abi.hpp), so that a wrong constant shows.
namespace expected {
struct InfoAnswer {
    std::int32_t code;
    std::int32_t answer;
};
// GetInfos: the codes with an answer; every other code gives 0.
inline constexpr std::array<InfoAnswer, 4> kInfos{{{0, 768}, {2, 256}, {6, 2}, {7, 247}}};
inline constexpr std::int32_t kHandleRunObject = 2;
// The ObjectInfoBlock's constant fields.
inline constexpr std::uint32_t kInfoFlags = 2305;
inline constexpr char kInfoLetter = 'd';
inline constexpr std::uint16_t kVersion = 1;
}  // namespace expected

}  // namespace sorvel::test
