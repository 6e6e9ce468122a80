#include "report.hpp"

#include <array>
#include <bit>
#include <cstdio>
#include <cstdlib>
#include <utility>

#include "runner.hpp"

namespace fuzzdriver {
namespace {

constexpr std::size_t kHistory = 40;

std::array<Described, kHistory> g_history;
std::size_t g_events = 0;  // recorded so far in this input
const bool g_trace = std::getenv("SORVEL_FUZZ_TRACE") != nullptr;

std::string hex32(std::uint32_t v) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08X", v);
    return text;
}

}  // namespace

std::string show(const Text& text) {
    return text ? sorvel::script::quote(*text) : "(null)";
}

std::string show_float(std::uint32_t bits) {
    return sorvel::script::show_float(std::bit_cast<float>(bits)) + "[" + hex32(bits) + "]";
}

// The display string with its placeholders filled in: "%o" is the object,
// "%0" and "%1" the parameters in order; an expression's parameter goes
// between its parentheses.
std::string Described::line() const {
    std::string values[2];
    std::size_t given = 0;
    const auto value = [&](std::string v) {
        if (given < 2) {
            values[given++] = std::move(v);
        }
    };
    if (text) {
        value(show(*text));
    }
    if (bits) {
        value(show_float(*bits));
    }
    if (integer) {
        value(std::to_string(*integer));
    }
    std::string event;
    std::size_t used = 0;
    for (std::size_t i = 0; i < name.size(); ++i) {
        if (name[i] == '%' && i + 1 < name.size() && (name[i + 1] == 'o' || name[i + 1] == '0' || name[i + 1] == '1')) {
            event += name[i + 1] == 'o' ? "object" : values[name[i + 1] - '0'];
            used = name[i + 1] == 'o' ? used : used + 1;
            ++i;
        } else {
            event += name[i];
        }
    }
    if (!event.empty() && event.back() == '(') {
        event += (given > 0 ? values[0] : "") + ")";
        used = given;
    }
    for (; used < given; ++used) {
        event += " " + values[used];
    }
    std::string out = "#" + std::to_string(number) + " instance " + std::to_string(instance) + " (case " +
                      std::to_string(case_word) + ", index " + std::to_string(index_word) + "): " + event;
    out += detail.empty() ? "" : " " + detail;
    out += param_word ? ", word " + hex32(static_cast<std::uint32_t>(*param_word)) : "";
    return out + (failing >= 0 ? ", allocation " + std::to_string(failing) + " failing" : "");
}

void record(Described what) {
    Described& d = g_history[g_events++ % kHistory];
    d = std::move(what);
    if (g_trace) {
        std::fprintf(stderr, "%s\n", d.line().c_str());
    }
}

void forget_events() {
    g_events = 0;
    // Nothing of an input may stay allocated, or libFuzzer runs it again
    // to look for a leak.
    for (Described& d : g_history) {
        d = {};
    }
}

void mismatch(const std::string& what) {
    std::fprintf(stderr, "\n=== sorvel differential fuzzer: MISMATCH\n");
    if (g_events > 0) {
        std::fprintf(stderr, "event: %s\n", g_history[(g_events - 1) % kHistory].line().c_str());
    }
    std::fprintf(stderr, "what:  %s\n", what.c_str());
    std::fprintf(stderr, "recent events (oldest first):\n");
    for (std::size_t i = g_events > kHistory ? g_events - kHistory : 0; i < g_events; ++i) {
        std::fprintf(stderr, "  %s\n", g_history[i % kHistory].line().c_str());
    }
    std::fflush(stderr);
    std::abort();
}

}  // namespace fuzzdriver
