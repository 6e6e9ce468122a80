#include "script.hpp"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <limits>

namespace sorvel::script {
namespace {

struct Token {
    enum class Kind { word, number, string, placeholder };
    Kind kind;
    std::string text;
};

std::string lower(std::string_view s) {
    std::string out(s);
    for (char& c : out) {
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    }
    return out;
}

bool word_char(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '_' || c == '$' || c == '.';
}

bool number_start(std::string_view s, std::size_t at) {
    auto digit = [&](std::size_t i) { return i < s.size() && std::isdigit(static_cast<unsigned char>(s[i])) != 0; };
    if (digit(at)) {
        return true;
    }
    if (s[at] == '.' && digit(at + 1)) {
        return true;
    }
    if ((s[at] == '-' || s[at] == '+') && at + 1 < s.size()) {
        return digit(at + 1) || (s[at + 1] == '.' && digit(at + 2)) ||
               std::isalpha(static_cast<unsigned char>(s[at + 1])) != 0;
    }
    return false;
}

int hex_value(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

// Splits a line into words, numbers, quoted strings and placeholders.
// Punctuation between them ("(", ")", ":", ",") only separates.
bool tokenize(std::string_view line, std::vector<Token>& tokens, std::string& error) {
    std::size_t i = 0;
    while (i < line.size()) {
        const char c = line[i];
        if (c == '#') {
            break;
        }
        if (c == '"') {
            std::string text;
            ++i;
            bool closed = false;
            while (i < line.size()) {
                char d = line[i++];
                if (d == '"') {
                    closed = true;
                    break;
                }
                if (d == '\\' && i < line.size()) {
                    const char e = line[i++];
                    switch (e) {
                        case 'n': d = '\n'; break;
                        case 'r': d = '\r'; break;
                        case 't': d = '\t'; break;
                        case '0': d = '\0'; break;
                        case 'x': {
                            const int hi = i < line.size() ? hex_value(line[i]) : -1;
                            const int lo = i + 1 < line.size() ? hex_value(line[i + 1]) : -1;
                            if (hi < 0 || lo < 0) {
                                error = "\\x needs two hex digits";
                                return false;
                            }
                            d = static_cast<char>(hi * 16 + lo);
                            i += 2;
                            break;
                        }
                        default: d = e; break;
                    }
                }
                text.push_back(d);
            }
            if (!closed) {
                error = "unterminated string";
                return false;
            }
            tokens.push_back({Token::Kind::string, std::move(text)});
            continue;
        }
        if (c == '%' && i + 1 < line.size()) {
            tokens.push_back({Token::Kind::placeholder, std::string(line.substr(i, 2))});
            i += 2;
            continue;
        }
        if (number_start(line, i)) {
            const std::size_t start = i++;
            while (i < line.size() && (word_char(line[i]) || ((line[i] == '-' || line[i] == '+') &&
                                                              (line[i - 1] == 'e' || line[i - 1] == 'E')))) {
                ++i;
            }
            tokens.push_back({Token::Kind::number, std::string(line.substr(start, i - start))});
            continue;
        }
        if (word_char(c)) {
            const std::size_t start = i;
            while (i < line.size() && word_char(line[i])) {
                ++i;
            }
            std::string w(line.substr(start, i - start));
            const std::string l = lower(w);
            const bool float_word = l == "inf" || l == "infinity" || l == "nan";
            tokens.push_back({float_word ? Token::Kind::number : Token::Kind::word, std::move(w)});
            continue;
        }
        if (c == ' ' || c == '\t' || c == '\r' || c == '\n' || c == '(' || c == ')' || c == ':' || c == ',') {
            ++i;
            continue;
        }
        error = std::string("unexpected character '") + c + "'";
        return false;
    }
    return true;
}

bool parse_integer(const std::string& text, std::int32_t& out) {
    errno = 0;
    char* end = nullptr;
    const long long v = std::strtoll(text.c_str(), &end, 0);
    if (errno != 0 || end == text.c_str() || *end != '\0') {
        return false;
    }
    // Hex words name bit patterns, so 0xFFFFFFFF is -1.
    const bool hex = text.find("0x") != std::string::npos || text.find("0X") != std::string::npos;
    if (hex && v >= 0 && v <= 0xFFFFFFFFLL) {
        out = static_cast<std::int32_t>(static_cast<std::uint32_t>(v));
        return true;
    }
    if (v < std::numeric_limits<std::int32_t>::min() || v > std::numeric_limits<std::int32_t>::max()) {
        return false;
    }
    out = static_cast<std::int32_t>(v);
    return true;
}

bool parse_float(const std::string& text, float& out) {
    const std::string l = lower(text);
    const bool negative = !l.empty() && l[0] == '-';
    const std::string body = (negative || (!l.empty() && l[0] == '+')) ? l.substr(1) : l;
    if (body == "inf" || body == "infinity") {
        out = negative ? -std::numeric_limits<float>::infinity() : std::numeric_limits<float>::infinity();
        return true;
    }
    if (body == "nan") {
        out = std::numeric_limits<float>::quiet_NaN();
        return true;
    }
    char* end = nullptr;
    out = std::strtof(text.c_str(), &end);
    return end != text.c_str() && *end == '\0';
}

std::string describe(const catalogue::Event& e) {
    return "\"" + std::string(e.display) + "\"";
}

std::size_t distance(std::string_view a, std::string_view b) {
    std::vector<std::size_t> row(b.size() + 1);
    for (std::size_t j = 0; j <= b.size(); ++j) {
        row[j] = j;
    }
    for (std::size_t i = 1; i <= a.size(); ++i) {
        std::size_t diagonal = row[0];
        row[0] = i;
        for (std::size_t j = 1; j <= b.size(); ++j) {
            const std::size_t above = row[j];
            row[j] = std::min({row[j] + 1, row[j - 1] + 1, diagonal + (a[i - 1] == b[j - 1] ? 0U : 1U)});
            diagonal = above;
        }
    }
    return row[b.size()];
}

const char* kind_name(catalogue::Value v) {
    switch (v) {
        case catalogue::Value::integer: return "an integer";
        case catalogue::Value::floating: return "a number";
        case catalogue::Value::string: return "a quoted string";
    }
    return "a value";
}

Parsed fail(std::string message) {
    return Parsed{std::nullopt, std::move(message)};
}

Parsed tool_command(const std::string& first, const std::vector<Token>& tokens) {
    Command c;
    const auto count = tokens.size();
    auto number_arg = [&](std::int64_t& out) {
        if (count != 2 || tokens[1].kind != Token::Kind::number) {
            return false;
        }
        char* end = nullptr;
        out = std::strtoll(tokens[1].text.c_str(), &end, 0);
        return *end == '\0';
    };
    if (first == "instance" || first == "use") {
        c.type = Command::Type::instance;
        if (!number_arg(c.number) || c.number < 1) {
            return fail("instance takes one number, counted from 1");
        }
        return {c, {}};
    }
    if (first == "seed") {
        c.type = Command::Type::seed;
        if (!number_arg(c.number) || c.number < 0 || c.number > 0xFFFFFFFFLL) {
            return fail("seed takes one number from 0 to 4294967295");
        }
        return {c, {}};
    }
    if (first == "tree") {
        c.type = Command::Type::tree;
        const auto& kinds = simulated::kSetNames;
        const std::string kind = count >= 2 ? lower(tokens[1].text) : "";
        const auto found = std::find_if(kinds.begin(), kinds.end(), [&](const char* k) { return kind == k; });
        if (count < 2 || tokens[1].kind != Token::Kind::word || found == kinds.end()) {
            return fail("tree takes integers, floats or strings, then optionally a quoted DOT file name");
        }
        c.set = simulated::kSets[static_cast<std::size_t>(found - kinds.begin())];
        if (count == 3 && tokens[2].kind == Token::Kind::string) {
            c.dot_file = tokens[2].text;
        } else if (count != 2) {
            return fail("tree takes integers, floats or strings, then optionally a quoted DOT file name");
        }
        return {c, {}};
    }
    if (count == 1 && (first == "events" || first == "help" || first == "quit" || first == "exit")) {
        c.type = first == "events" ? Command::Type::events
                 : first == "help" ? Command::Type::help
                                   : Command::Type::quit;
        return {c, {}};
    }
    return fail("");
}

}  // namespace

std::string name_key(std::string_view display, bool up_to_first_value) {
    std::vector<Token> tokens;
    std::string ignored;
    tokenize(display, tokens, ignored);
    std::string key;
    for (const Token& t : tokens) {
        if (t.kind == Token::Kind::placeholder) {
            if (t.text == "%o") {
                continue;
            }
            if (up_to_first_value) {
                break;
            }
            continue;
        }
        if (!key.empty()) {
            key += ' ';
        }
        key += lower(t.text);
    }
    return key;
}

const catalogue::Event& nearest_event(std::string_view words) {
    const std::string key = lower(words);
    const catalogue::Event* best = &catalogue::kEvents[0];
    std::size_t best_distance = std::numeric_limits<std::size_t>::max();
    for (const catalogue::Event& e : catalogue::kEvents) {
        for (bool short_form : {true, false}) {
            const std::size_t d = distance(key, name_key(e.display, short_form));
            if (d < best_distance) {
                best_distance = d;
                best = &e;
            }
        }
    }
    return *best;
}

Parsed parse_line(std::string_view line) {
    std::vector<Token> tokens;
    std::string error;
    if (!tokenize(line, tokens, error)) {
        return fail(error);
    }
    // The object's name placeholder may stand first, as in the display string.
    if (!tokens.empty() && tokens[0].kind == Token::Kind::placeholder && tokens[0].text == "%o") {
        tokens.erase(tokens.begin());
    }
    if (tokens.empty()) {
        return {Command{}, {}};
    }
    if (tokens[0].kind != Token::Kind::word) {
        return fail("a line starts with an event or a command, not \"" + tokens[0].text + "\"");
    }
    const std::string first = lower(tokens[0].text);
    Parsed tool = tool_command(first, tokens);
    if (tool.command || !tool.error.empty()) {
        return tool;
    }

    // The words name the event; the values, in order, are its parameters.
    std::string key;
    std::vector<const Token*> values;
    for (const Token& t : tokens) {
        if (t.kind == Token::Kind::word && lower(t.text) != "null") {
            if (!values.empty() && key.rfind("load from file", 0) != 0) {
                return fail("unexpected word \"" + t.text + "\" after the values");
            }
            key += (key.empty() ? "" : " ") + lower(t.text);
        } else if (t.kind == Token::Kind::placeholder) {
            if (t.text != "%o") {  // the object's name, which a script need not give
                return fail("replace " + t.text + " with a value");
            }
        } else {
            values.push_back(&t);
        }
    }
    const catalogue::Event* event = nullptr;
    for (const catalogue::Event& e : catalogue::kEvents) {
        if (key == name_key(e.display, true) || key == name_key(e.display, false)) {
            event = &e;
            break;
        }
    }
    if (event == nullptr) {
        return fail("unknown event \"" + key + "\"; did you mean " + describe(nearest_event(key)) + "?");
    }
    if (values.size() != event->param_count) {
        return fail(describe(*event) + " takes " + std::to_string(event->param_count) + " value" +
                    (event->param_count == 1 ? "" : "s") + ", not " + std::to_string(values.size()));
    }
    Command c;
    c.type = Command::Type::event;
    c.event = event;
    for (std::size_t p = 0; p < values.size(); ++p) {
        const catalogue::Param& param = event->params[p];
        const Token& t = *values[p];
        Value v;
        bool ok = false;
        if (param.value == catalogue::Value::string) {
            if (t.kind == Token::Kind::string) {
                v.kind = Value::Kind::string;
                v.text = t.text;
                ok = true;
            } else if (t.kind == Token::Kind::word) {  // null: the host gives no string
                v.kind = Value::Kind::null_string;
                ok = true;
            }
        } else if (t.kind == Token::Kind::number) {
            if (param.value == catalogue::Value::integer) {
                v.kind = Value::Kind::integer;
                ok = parse_integer(t.text, v.integer);
            } else {
                v.kind = Value::Kind::floating;
                ok = parse_float(t.text, v.floating);
            }
        }
        if (!ok) {
            return fail(describe(*event) + ": value " + std::to_string(p + 1) + " (\"" + std::string(param.title) +
                        "\") must be " + kind_name(param.value) + ", not " +
                        (t.kind == Token::Kind::string ? "\"" + t.text + "\"" : t.text));
        }
        c.values.push_back(std::move(v));
    }
    return {c, {}};
}

}  // namespace sorvel::script
