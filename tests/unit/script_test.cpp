// The sorvel-host script language: what each line means, and the message a
// faulty line gets.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "script.hpp"

namespace {

using sorvel::script::Command;
using sorvel::script::parse_line;
using sorvel::script::Value;

struct EventLine {
    const char* line;
    const char* display;
    std::vector<std::string> values;  // rendered: i:5 f:1.5 s:text null
};

std::string render(const Value& v) {
    switch (v.kind) {
        case Value::Kind::integer: return "i:" + std::to_string(v.integer);
        case Value::Kind::floating: {
            char text[32];
            std::snprintf(text, sizeof text, "f:%g", static_cast<double>(v.floating));
            return text;
        }
        case Value::Kind::string: return "s:" + v.text;
        case Value::Kind::null_string: return "null";
    }
    return "?";
}

TEST(ScriptLanguage, NamesEventsByDisplayStringOrLeadingWords) {
    const std::vector<EventLine> cases = {
        {"Add Integer: 5", "Add Integer: %0", {"i:5"}},
        {"add integer -7", "Add Integer: %0", {"i:-7"}},
        {"Add Integer 0xFFFFFFFF", "Add Integer: %0", {"i:-1"}},
        {"%o: Contains Float: 1.5", "%o: Contains Float: %0", {"f:1.5"}},
        {"Contains Float -inf", "%o: Contains Float: %0", {"f:-inf"}},
        {"Add Float 3", "Add Float: %0", {"f:3"}},
        {"Add Float nan", "Add Float: %0", {"f:nan"}},
        {"Add String \"a \\\"b\\\" \\x41\"", "Add String: %0", {"s:a \"b\" A"}},
        {"Add String null", "Add String: %0", {"null"}},
        {"Clear Strings   # trailing comment", "Clear Strings", {}},
        {"Load From File: \"w.txt\" into Strings (Balance: 1)", "Load From File: %0 into Strings (Balance: %1)",
         {"s:w.txt", "i:1"}},
        {"Load From File \"w.txt\" 0", "Load From File: %0 into Strings (Balance: %1)", {"s:w.txt", "i:0"}},
        {"IntegersSize()", "IntegersSize(", {}},
        {"integerssize", "IntegersSize(", {}},
        {"IntegerElementAt(2)", "IntegerElementAt(", {"i:2"}},
        {"IndexOfFloatElement(-0.0)", "IndexOfFloatElement(", {"f:-0"}},
        {"StringElementAt$(0)", "StringElementAt$(", {"i:0"}},
        {"IndexOfStringElement(\"\")", "IndexOfStringElement(", {"s:"}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.line);
        const auto parsed = parse_line(c.line);
        ASSERT_TRUE(parsed.command) << parsed.error;
        ASSERT_EQ(parsed.command->type, Command::Type::event);
        EXPECT_EQ(parsed.command->event->display, c.display);
        std::vector<std::string> got;
        for (const Value& v : parsed.command->values) {
            got.push_back(render(v));
        }
        EXPECT_EQ(got, c.values);
    }
}

TEST(ScriptLanguage, ToolCommands) {
    struct Case {
        const char* line;
        Command::Type type;
        std::int64_t number;
        int collection;
        const char* dot;
    };
    const std::vector<Case> cases = {
        {"", Command::Type::nothing, 0, 0, ""},
        {"   # only a comment", Command::Type::nothing, 0, 0, ""},
        {"instance 2", Command::Type::instance, 2, 0, ""},
        {"seed 12345", Command::Type::seed, 12345, 0, ""},
        {"tree strings", Command::Type::tree, 0, 2, ""},
        {"tree floats \"f.dot\"", Command::Type::tree, 0, 1, "f.dot"},
        {"events", Command::Type::events, 0, 0, ""},
        {"quit", Command::Type::quit, 0, 0, ""},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.line);
        const auto parsed = parse_line(c.line);
        ASSERT_TRUE(parsed.command) << parsed.error;
        EXPECT_EQ(parsed.command->type, c.type);
        EXPECT_EQ(parsed.command->number, c.number);
        EXPECT_EQ(parsed.command->collection, c.collection);
        EXPECT_EQ(parsed.command->dot_file, c.dot);
    }
}

TEST(ScriptLanguage, FaultyLinesSayWhatIsWrong) {
    const std::vector<std::pair<const char*, const char*>> cases = {
        {"Add Integr 5", "did you mean \"Add Integer: %0\""},
        {"IntegerSize()", "did you mean \"IntegersSize(\""},
        {"Add Integer", "takes 1 value, not 0"},
        {"Add Integer 1 2", "takes 1 value, not 2"},
        {"Clear Integers 3", "takes 0 values, not 1"},
        {"Add Integer 1.5", "must be an integer"},
        {"Add Integer 99999999999", "must be an integer"},
        {"Add String 5", "must be a quoted string"},
        {"Add Float \"x\"", "must be a number"},
        {"Add String \"open", "unterminated string"},
        {"Add Integer %0", "replace %0 with a value"},
        {"Add Integer 5 more", "unexpected word"},
        {"5", "starts with an event"},
        {"instance 0", "counted from 1"},
        {"tree bushes", "integers, floats or strings"},
        {"Add String \"\\x4\"", "two hex digits"},
        {"Add Integer ;", "unexpected character"},
    };
    for (const auto& [line, message] : cases) {
        SCOPED_TRACE(line);
        const auto parsed = parse_line(line);
        EXPECT_FALSE(parsed.command);
        EXPECT_NE(parsed.error.find(message), std::string::npos) << parsed.error;
    }
}

}  // namespace
