// sorvel-host: what a script prints, what a faulty line says, and how it
// ends a script but not an interactive session.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "runner.hpp"

namespace {

using sorvel::script::Options;
using sorvel::script::Runner;
using sorvel::simulated::Host;
using sorvel::simulated::Library;

struct Case {
    std::string script;
    int instances;
    bool interactive;
    int status;
    std::string out;  // the whole output, or a part of it when it starts with "..."
    std::string err;  // a part of the errors
};

TEST(SorvelHost, ScriptsPrintOutcomesResultsAndFaults) {
    // Its own name: other builds' tests may run at the same time.
    const auto dot = std::filesystem::temp_directory_path() /
                     ("sorvel-host-test-" + std::to_string(std::random_device{}()) + ".dot");
    std::string chain;
    for (int v = 0; v < 2000; ++v) {
        chain += "Add Integer " + std::to_string(v) + "\n";
    }
    const std::vector<Case> cases = {
        {"# comment\nAdd Integer 50\nAdd Integer: 30\nContains Integer 30\n%o: Contains Integer: 31\n"
         "IntegerElementAt(1)\nAdd Float 2.5\nFloatElementAt(0)\nAdd String \"tab\\there\"\nStringElementAt$(0)\n",
         1, false, 0,
         "Contains Integer: 30 -> true\nContains Integer: 31 -> false\nIntegerElementAt(1) -> 30 (integer)\n"
         "FloatElementAt(0) -> 2.5 (float)\nStringElementAt$(0) -> \"tab\\x09here\" (string)\n",
         ""},
        {"Add Integer 1\ninstance 2\nIntegersSize()\ninstance 1\nIntegersSize()\ninstance 3\n", 2, false, 1,
         "[2] IntegersSize() -> 0 (integer)\n[1] IntegersSize() -> 1 (integer)\n",
         "test.script:6: there are 2 instances"},
        {"Add Integer 1\nAdd Integr 2\nIntegersSize()\n", 1, false, 1, "",
         "test.script:2: unknown event \"add integr\"; did you mean \"Add Integer: %0\"?"},
        {"Add String \"open\nAdd Integer 1 2\nIntegersSize()\nquit\nIntegersSize()\n", 1, true, 0,
         "...IntegersSize() -> 0 (integer)\n", "test.script:2: \"Add Integer: %0\" takes 1 value, not 2"},
        {"Add String \"kept\"\nLoad From File \"/no/such/file.txt\" 1\nStringsSize()\n", 1, false, 0,
         "StringsSize() -> 1 (integer)\n", "test.script:2: warning: cannot open \"/no/such/file.txt\""},
        {"Add Integer 2\nAdd Integer 1\nAdd Integer 3\nAdd Integer 4\ntree integers \"" + dot.generic_string() +
             "\"\ntree strings\n",
         1, false, 0, "integers: 4 nodes, depth 3\n2\n  L 1\n  R 3\n    R 4\nstrings: 0 nodes, depth 0\n", ""},
        {chain + "tree integers\n", 1, false, 0, "...... 1968 more nodes below", ""},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.script.substr(0, 80));
        Host host(Library::built());
        std::ostringstream out, err;
        std::istringstream in(c.script);
        Options options;
        options.instances = c.instances;
        options.use_indices = 1;
        int status = 0;
        {
            Runner runner(host, options, out, err);
            status = runner.run(in, "test.script", c.interactive);
        }
        EXPECT_EQ(status, c.status) << err.str();
        if (c.out.rfind("...", 0) == 0) {
            EXPECT_NE(out.str().find(c.out.substr(3)), std::string::npos) << out.str();
        } else {
            EXPECT_EQ(out.str(), c.out);
        }
        EXPECT_NE(err.str().find(c.err), std::string::npos) << err.str();
    }
    std::ifstream in(dot);
    std::ostringstream text;
    text << in.rdbuf();
    in.close();  // Windows cannot remove a file that is open
    EXPECT_EQ(text.str().rfind("digraph sorvel {", 0), 0U) << text.str();
    std::filesystem::remove(dot);
}

}  // namespace
