// Runs script lines against instances of the loaded library and prints what
// each event gives, the trees, and (with tracing) every host routine call.
#pragma once

#include <cstddef>
#include <iosfwd>
#include <string>
#include <vector>

#include "script.hpp"
#include "simulated_host.hpp"

namespace sorvel::script {

struct Options {
    std::int32_t case_sensitive = 0;  // the EditRecord words, as given
    std::int32_t use_indices = 0;
    std::size_t instances = 1;
    bool trace = false;
    std::string dot_file;  // all trees at the end, as one Graphviz picture
};

class Runner {
public:
    Runner(simulated::Host& host, const Options& options, std::ostream& out, std::ostream& err);
    ~Runner();
    Runner(const Runner&) = delete;
    Runner& operator=(const Runner&) = delete;

    // Runs every line. A script stops at its first faulty line and gives 1;
    // interactively, a faulty line is reported and the prompt goes on.
    int run(std::istream& in, const std::string& source, bool interactive);

    // Runs one line; false when it is faulty. Sets done() on quit.
    bool execute(const std::string& line, const std::string& where);
    bool done() const { return done_; }

    // Writes every non-empty tree of every instance as one DOT picture.
    bool write_dot(const std::string& path);

private:
    void run_event(const Command& command, const std::string& where);
    void print_tree(simulated::Set set, const std::string& dot_file);
    void print_trace();
    std::string prefix() const;

    simulated::Host& host_;
    Options options_;
    std::ostream& out_;
    std::ostream& err_;
    std::vector<simulated::Instance*> instances_;
    std::size_t current_ = 0;
    bool done_ = false;
};

// Shape facts of a tree read at its documented layout, without recursion:
// a sorted load makes chains as deep as the file is long.
struct TreeFacts {
    std::size_t nodes = 0;
    std::size_t depth = 0;
};
TreeFacts tree_facts(simulated::NodeView root);

// A value as the tool shows it: integers in decimal, floats as %g, strings
// quoted with escapes for bytes that would not print.
std::string show_value(simulated::NodeView node, simulated::Set set);
std::string quote(const std::string& text);
// A float in as many digits as tell it apart.
std::string show_float(float v);

}  // namespace sorvel::script
