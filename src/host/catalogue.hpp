// The event catalogue as the host numbers it: per kind, in registration
// order. Pure data, so that tools can compile it in; the library's handler
// tables follow the same order.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace sorvel::catalogue {

enum class Kind : std::uint8_t { condition, action, expression };

// Parameter type codes as the host declares them.
inline constexpr std::uint16_t kNumberParam = 22;     // number of a condition or action
inline constexpr std::uint16_t kStringParam = 45;     // string of a condition or action
inline constexpr std::uint16_t kFileParam = 63;       // file name
inline constexpr std::uint16_t kExprNumberParam = 1;  // number of an expression
inline constexpr std::uint16_t kExprStringParam = 3;  // string of an expression

// Info words.
inline constexpr std::uint16_t kConditionInfo = 544;
inline constexpr std::uint16_t kIntegerResult = 0;
inline constexpr std::uint16_t kStringResult = 1;
inline constexpr std::uint16_t kFloatResult = 2;

// How a handler reads each parameter, which a declaration alone does not tell.
enum class Value : std::uint8_t { integer, floating, string };

struct Param {
    std::uint16_t type;
    std::string_view title;
    Value value;
};

struct Event {
    Kind kind;
    std::uint8_t number;       // position in its kind's handler table
    std::string_view handler;  // the handler's symbol in the built library
    std::string_view display;
    std::uint16_t info;
    std::uint8_t param_count;
    std::array<Param, 2> params;
};

inline constexpr std::array<Event, 25> kEvents{{
    {Kind::condition,
     0,
     "sorvel_contains_integer",
     "%o: Contains Integer: %0",
     kConditionInfo,
     1,
     {{{kNumberParam, "Enter Integer", Value::integer}}}},
    {Kind::condition,
     1,
     "sorvel_contains_float",
     "%o: Contains Float: %0",
     kConditionInfo,
     1,
     {{{kNumberParam, "Enter Float", Value::floating}}}},
    {Kind::condition,
     2,
     "sorvel_contains_string",
     "%o: Contains String: %0",
     kConditionInfo,
     1,
     {{{kStringParam, "Enter String", Value::string}}}},
    {Kind::action,
     0,
     "sorvel_add_integer",
     "Add Integer: %0",
     0,
     1,
     {{{kNumberParam, "Enter Integer", Value::integer}}}},
    {Kind::action,
     1,
     "sorvel_remove_integer",
     "Remove Integer: %0",
     0,
     1,
     {{{kNumberParam, "Enter Integer", Value::integer}}}},
    {Kind::action, 2, "sorvel_clear_integers", "Clear Integers", 0, 0, {}},
    {Kind::action, 3, "sorvel_add_float", "Add Float: %0", 0, 1, {{{kNumberParam, "Enter Float", Value::floating}}}},
    {Kind::action,
     4,
     "sorvel_remove_float",
     "Remove Float: %0",
     0,
     1,
     {{{kNumberParam, "Enter Float", Value::floating}}}},
    {Kind::action, 5, "sorvel_clear_floats", "Clear Floats", 0, 0, {}},
    {Kind::action, 6, "sorvel_add_string", "Add String: %0", 0, 1, {{{kStringParam, "Enter String", Value::string}}}},
    {Kind::action,
     7,
     "sorvel_remove_string",
     "Remove String: %0",
     0,
     1,
     {{{kStringParam, "Enter String", Value::string}}}},
    {Kind::action, 8, "sorvel_clear_strings", "Clear Strings", 0, 0, {}},
    {Kind::action,
     9,
     "sorvel_load_from_file",
     "Load From File: %0 into Strings (Balance: %1)",
     0,
     2,
     {{{kFileParam, "Enter Text File", Value::string}, {kNumberParam, "Balance? (1 = Yes, 0 = No)", Value::integer}}}},
    {Kind::expression, 0, "sorvel_integers_size", "IntegersSize(", kIntegerResult, 0, {}},
    {Kind::expression, 1, "sorvel_integers_random_element", "IntegersRandomElement(", kIntegerResult, 0, {}},
    {Kind::expression, 2, "sorvel_floats_size", "FloatsSize(", kIntegerResult, 0, {}},
    {Kind::expression, 3, "sorvel_floats_random_element", "FloatsRandomElement(", kFloatResult, 0, {}},
    {Kind::expression, 4, "sorvel_strings_size", "StringsSize(", kIntegerResult, 0, {}},
    {Kind::expression, 5, "sorvel_strings_random_element", "StringsRandomElement$(", kStringResult, 0, {}},
    {Kind::expression,
     6,
     "sorvel_index_of_integer",
     "IndexOfIntegerElement(",
     kIntegerResult,
     1,
     {{{kExprNumberParam, "Enter Integer Element", Value::integer}}}},
    {Kind::expression,
     7,
     "sorvel_integer_at",
     "IntegerElementAt(",
     kIntegerResult,
     1,
     {{{kExprNumberParam, "Enter Index of Integer", Value::integer}}}},
    {Kind::expression,
     8,
     "sorvel_index_of_float",
     "IndexOfFloatElement(",
     kIntegerResult,
     1,
     {{{kExprNumberParam, "Enter Float Element", Value::floating}}}},
    {Kind::expression,
     9,
     "sorvel_float_at",
     "FloatElementAt(",
     kFloatResult,
     1,
     {{{kExprNumberParam, "Enter Index of Float", Value::integer}}}},
    {Kind::expression,
     10,
     "sorvel_index_of_string",
     "IndexOfStringElement(",
     kIntegerResult,
     1,
     {{{kExprStringParam, "Enter String Element", Value::string}}}},
    {Kind::expression,
     11,
     "sorvel_string_at",
     "StringElementAt$(",
     kStringResult,
     1,
     {{{kExprNumberParam, "Enter Index of String", Value::integer}}}},
}};

constexpr std::size_t count_of(Kind kind) {
    std::size_t n = 0;
    for (const Event& e : kEvents) {
        n += e.kind == kind ? 1U : 0U;
    }
    return n;
}

inline constexpr std::size_t kConditionCount = count_of(Kind::condition);
inline constexpr std::size_t kActionCount = count_of(Kind::action);
inline constexpr std::size_t kExpressionCount = count_of(Kind::expression);
static_assert(kConditionCount == 3 && kActionCount == 10 && kExpressionCount == 12);

// The two stored options, as the host's editor declares them. No entry point
// hands this table out; it documents the EditRecord words at 20 and 24.
struct OptionDeclaration {
    std::uint32_t identifier;
    const char* name;
    const char* help;
    std::uint32_t type_code;
    std::uint32_t option_flags;
    std::uint32_t last;
};

inline constexpr OptionDeclaration kOptions[] = {
    {0x80001, "Case Sensitive Strings", "Case Sensitive Strings.", 10, 1, 0},
    {0x80002, "Use Indicies", "Use indicies when storing and retreiving data. Uses more RAM.", 10, 1, 0},
    {0, nullptr, nullptr, 0, 0, 0},
};

}  // namespace sorvel::catalogue
