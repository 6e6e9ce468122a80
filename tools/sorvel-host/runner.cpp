#include "runner.hpp"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <tuple>
#include <utility>

namespace sorvel::script {
namespace {

using simulated::Host;
using simulated::HostCall;
using simulated::NodeView;
using simulated::Param;
using simulated::Set;

// Text trees stop here; deeper subtrees are summed up in one line.
constexpr std::size_t kTextDepth = 32;

Param to_param(const Value& v) {
    switch (v.kind) {
        case Value::Kind::integer: return Param::of(v.integer);
        case Value::Kind::floating: return Param::of(v.floating);
        case Value::Kind::string: return Param::of(v.text);
        case Value::Kind::null_string: return Param::null();
    }
    return Param::of(0);
}

std::string show_param(const Value& v) {
    switch (v.kind) {
        case Value::Kind::integer: return std::to_string(v.integer);
        case Value::Kind::floating: return show_float(v.floating);
        case Value::Kind::string: return quote(v.text);
        case Value::Kind::null_string: return "null";
    }
    return "?";
}

// The event as the host would show it, with the values in place.
std::string show_event(const Command& c) {
    std::string display(c.event->display);
    if (display.rfind("%o: ", 0) == 0) {
        display.erase(0, 4);
    }
    if (c.event->kind == catalogue::Kind::expression) {
        std::string out = display;
        for (std::size_t i = 0; i < c.values.size(); ++i) {
            out += (i == 0 ? "" : ", ") + show_param(c.values[i]);
        }
        return out + ")";
    }
    for (std::size_t i = 0; i < c.values.size(); ++i) {
        const std::string placeholder = "%" + std::to_string(i);
        const auto at = display.find(placeholder);
        if (at != std::string::npos) {
            display.replace(at, placeholder.size(), show_param(c.values[i]));
        }
    }
    return display;
}

const char* routine_name(HostCall::Routine r) {
    switch (r) {
        case HostCall::Routine::read_event_param: return "HostReadEventParam";
        case HostCall::Routine::read_first_expr_param: return "HostReadFirstExprParam";
        case HostCall::Routine::read_next_expr_param: return "HostReadNextExprParam";
        case HostCall::Routine::alloc_result_string: return "HostAllocResultString";
        case HostCall::Routine::open_file: return "HostOpenFile";
        case HostCall::Routine::close_file: return "HostCloseFile";
    }
    return "?";
}

std::string hex(simulated::word w) {
    char text[32];
    std::snprintf(text, sizeof text, "0x%llx", static_cast<unsigned long long>(static_cast<std::uintptr_t>(w)));
    return text;
}

void write_dot_tree(std::ostream& dot, NodeView root, Set set, const std::string& id) {
    std::vector<NodeView> pending{root};
    std::size_t hidden = 0;
    while (!pending.empty()) {
        const NodeView node = pending.back();
        pending.pop_back();
        const std::string name = id + "_" + hex(node.address);
        dot << "  \"" << name << "\" [label=" << quote(show_value(node, set)) << "];\n";
        const NodeView children[] = {node.left(), node.right()};
        for (const NodeView& child : children) {
            if (child) {
                dot << "  \"" << name << "\" -> \"" << id << "_" << hex(child.address) << "\";\n";
                pending.push_back(child);
            } else if (children[0] || children[1]) {
                // An invisible child keeps a lone child on its own side.
                const std::string gap = id + "_gap" + std::to_string(hidden++);
                dot << "  \"" << gap << "\" [style=invis, width=0.1];\n  \"" << name << "\" -> \"" << gap
                    << "\" [style=invis];\n";
            }
        }
    }
}

}  // namespace

std::string quote(const std::string& text) {
    std::string out = "\"";
    for (unsigned char c : text) {
        if (c == '"' || c == '\\') {
            out += '\\';
            out += static_cast<char>(c);
        } else if (c < 0x20 || c == 0x7F) {
            char code[8];
            std::snprintf(code, sizeof code, "\\x%02X", c);
            out += code;
        } else {
            out += static_cast<char>(c);
        }
    }
    return out + "\"";
}

std::string show_float(float v) {
    char text[48];
    std::snprintf(text, sizeof text, "%.9g", static_cast<double>(v));
    return text;
}

std::string show_value(NodeView node, Set set) {
    switch (set) {
        case Set::integers: return std::to_string(node.integer());
        case Set::floats: return show_float(node.floating());
        case Set::strings: return node.string();
    }
    return {};
}

TreeFacts tree_facts(NodeView root) {
    TreeFacts facts;
    std::vector<std::pair<NodeView, std::size_t>> pending;
    if (root) {
        pending.emplace_back(root, 1);
    }
    while (!pending.empty()) {
        const auto [node, level] = pending.back();
        pending.pop_back();
        ++facts.nodes;
        facts.depth = std::max(facts.depth, level);
        for (const NodeView& child : {node.left(), node.right()}) {
            if (child) {
                pending.emplace_back(child, level + 1);
            }
        }
    }
    return facts;
}

Runner::Runner(Host& host, const Options& options, std::ostream& out, std::ostream& err)
    : host_(host), options_(options), out_(out), err_(err) {
    for (std::size_t i = 0; i < std::max<std::size_t>(options.instances, 1); ++i) {
        instances_.push_back(&host_.create(options.case_sensitive, options.use_indices));
    }
}

Runner::~Runner() {
    for (simulated::Instance* instance : instances_) {
        host_.destroy(*instance);
    }
}

std::string Runner::prefix() const {
    return instances_.size() > 1 ? "[" + std::to_string(current_ + 1) + "] " : "";
}

int Runner::run(std::istream& in, const std::string& source, bool interactive) {
    std::string line;
    std::size_t number = 0;
    if (interactive) {
        out_ << "sorvel> " << std::flush;
    }
    while (!done_ && std::getline(in, line)) {
        ++number;
        const bool ok = execute(line, source + ":" + std::to_string(number));
        if (!ok && !interactive) {
            return 1;
        }
        if (interactive && !done_) {
            out_ << "sorvel> " << std::flush;
        }
    }
    if (interactive) {
        out_ << "\n";
    }
    return 0;
}

bool Runner::execute(const std::string& line, const std::string& where) {
    const Parsed parsed = parse_line(line);
    if (!parsed.command) {
        err_ << where << ": " << parsed.error << "\n";
        return false;
    }
    const Command& c = *parsed.command;
    switch (c.type) {
        case Command::Type::nothing: break;
        case Command::Type::event: run_event(c, where); break;
        case Command::Type::instance:
            if (static_cast<std::size_t>(c.number) > instances_.size()) {
                err_ << where << ": there are " << instances_.size() << " instances (see --instances)\n";
                return false;
            }
            current_ = static_cast<std::size_t>(c.number - 1);
            break;
        case Command::Type::tree: print_tree(c.set, c.dot_file); break;
        case Command::Type::seed: host_.library().seed_rand(static_cast<unsigned>(c.number)); break;
        case Command::Type::events:
            for (const catalogue::Event& e : catalogue::kEvents) {
                static const char* const kinds[] = {"condition", "action", "expression"};
                out_ << kinds[static_cast<int>(e.kind)] << " " << static_cast<int>(e.number) << ": " << e.display;
                for (std::size_t p = 0; p < e.param_count; ++p) {
                    out_ << (p == 0 ? "  (" : ", ") << e.params[p].title;
                }
                out_ << (e.param_count > 0 ? ")\n" : "\n");
            }
            break;
        case Command::Type::help:
            out_ << "Events by display string (\"Add Integer: 5\") or leading words (\"Add Integer 5\");\n"
                    "expressions by name (\"IntegerElementAt(0)\"). Strings in double quotes, null for none.\n"
                    "Commands: instance N, tree integers|floats|strings [\"file.dot\"], seed N, events, quit.\n";
            break;
        case Command::Type::quit: done_ = true; break;
    }
    return true;
}

void Runner::run_event(const Command& c, const std::string& where) {
    std::vector<Param> params;
    for (const Value& v : c.values) {
        params.push_back(to_param(v));
    }
    simulated::Instance& instance = *instances_[current_];
    instance.set_result_flags(0);
    host_.clear_calls();
    const simulated::word result = host_.event(instance, c.event->display, std::move(params));
    const std::string shown = prefix() + show_event(c);
    if (c.event->kind == catalogue::Kind::condition) {
        out_ << shown << " -> " << (result != 0 ? "true" : "false") << "\n";
    } else if (c.event->kind == catalogue::Kind::expression) {
        switch (c.event->info) {
            case catalogue::kFloatResult:
                out_ << shown << " -> " << show_float(Host::float_bits(result)) << " (float)\n";
                break;
            case catalogue::kStringResult:
                out_ << shown << " -> " << quote(Host::text_at(result)) << " (string)\n";
                break;
            default: out_ << shown << " -> " << static_cast<std::int32_t>(result) << " (integer)\n"; break;
        }
    } else if (options_.trace) {
        out_ << shown << "\n";
    }
    for (const HostCall& call : host_.calls()) {
        if (call.routine == HostCall::Routine::open_file && call.result == -1) {
            err_ << where << ": warning: cannot open " << quote(c.values.front().text)
                 << "; Load From File does nothing\n";
        }
    }
    if (options_.trace) {
        print_trace();
    }
}

void Runner::print_trace() {
    for (const HostCall& call : host_.calls()) {
        out_ << "    " << routine_name(call.routine) << "(";
        for (std::size_t i = 0; i < call.args.size(); ++i) {
            const simulated::word a = call.args[i];
            const bool small = a > -65536 && a < 65536;
            out_ << (i == 0 ? "" : ", ") << (small ? std::to_string(a) : hex(a));
        }
        const simulated::word r = call.result;
        out_ << ") -> " << (r > -65536 && r < 65536 ? std::to_string(r) : hex(r)) << "\n";
    }
}

void Runner::print_tree(Set set, const std::string& dot_file) {
    const NodeView root{instances_[current_]->root(set)};
    const TreeFacts facts = tree_facts(root);
    out_ << prefix() << simulated::name(set) << ": " << facts.nodes << " nodes, depth " << facts.depth << "\n";
    std::vector<std::tuple<NodeView, std::size_t, const char*>> pending;
    if (root) {
        pending.emplace_back(root, 0, "");
    }
    while (!pending.empty()) {
        const auto [node, level, side] = pending.back();
        pending.pop_back();
        const std::string indent(2 * level, ' ');
        if (level == kTextDepth) {
            out_ << indent << side << "... " << tree_facts(node).nodes << " more nodes below\n";
            continue;
        }
        const std::string value = show_value(node, set);
        out_ << indent << side << (set == Set::strings ? quote(value) : value) << "\n";
        if (node.right()) {
            pending.emplace_back(node.right(), level + 1, "R ");
        }
        if (node.left()) {
            pending.emplace_back(node.left(), level + 1, "L ");
        }
    }
    if (!dot_file.empty()) {
        std::ofstream dot(dot_file);
        dot << "digraph sorvel {\n  node [shape=box, fontname=\"Helvetica\"];\n";
        if (root) {
            write_dot_tree(dot, root, set, "t");
        }
        dot << "}\n";
        if (!dot) {
            err_ << "cannot write " << dot_file << "\n";
        }
    }
}

bool Runner::write_dot(const std::string& path) {
    std::ofstream dot(path);
    dot << "digraph sorvel {\n  node [shape=box, fontname=\"Helvetica\"];\n";
    for (std::size_t i = 0; i < instances_.size(); ++i) {
        for (const Set set : simulated::kSets) {
            const NodeView root{instances_[i]->root(set)};
            if (!root) {
                continue;
            }
            const TreeFacts facts = tree_facts(root);
            const std::string id = "i" + std::to_string(i + 1) + simulated::name(set);
            dot << " subgraph \"cluster_" << id << "\" {\n  label=\"instance " << i + 1 << ": " << simulated::name(set)
                << ", " << facts.nodes << " nodes, depth " << facts.depth << "\";\n";
            write_dot_tree(dot, root, set, id);
            dot << " }\n";
        }
    }
    dot << "}\n";
    return static_cast<bool>(dot);
}

}  // namespace sorvel::script
