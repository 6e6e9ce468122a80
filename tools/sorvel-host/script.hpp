// The event-script language of sorvel-host: one event or command per line.
//
//   # a comment
//   Add Integer: 5                     the display string with values in place
//   Add Integer 5                      or just the words before the first value
//   Load From File "words.txt" 1
//   IntegerElementAt(2)                expressions by name, with or without ()
//   instance 2 | tree strings | seed 7 | events | help | quit
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/catalogue.hpp"
#include "simulated_host.hpp"

namespace sorvel::script {

struct Value {
    enum class Kind { integer, floating, string, null_string };
    Kind kind = Kind::integer;
    std::int32_t integer = 0;
    float floating = 0;
    std::string text;
};

struct Command {
    enum class Type { nothing, event, instance, tree, seed, events, help, quit };
    Type type = Type::nothing;
    const catalogue::Event* event = nullptr;        // for events
    std::vector<Value> values;                      // event parameters, converted to their kinds
    std::int64_t number = 0;                        // instance, seed
    simulated::Set set = simulated::Set::integers;  // tree
    std::string dot_file;                           // tree: also write DOT here
};

struct Parsed {
    std::optional<Command> command;
    std::string error;  // set when command is empty
};

Parsed parse_line(std::string_view line);

// The event whose name is nearest to the given words, for suggestions.
const catalogue::Event& nearest_event(std::string_view words);

// "Add Integer: %0" -> "add integer", "IntegersSize(" -> "integerssize".
std::string name_key(std::string_view display, bool up_to_first_value);

}  // namespace sorvel::script
