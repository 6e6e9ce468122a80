// sorvel-host's runner: what a script prints, and how faulty lines end a
// script but not an interactive session.
#include <gtest/gtest.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "runner.hpp"

namespace {

using sorvel::script::Options;
using sorvel::script::Runner;
using sorvel::testhost::Host;
using sorvel::testhost::Library;

struct Outcome {
    int status;
    std::string out;
    std::string err;
};

Outcome run(const std::string& script, Options options = {}, bool interactive = false) {
    Host host(Library::built());
    std::ostringstream out;
    std::ostringstream err;
    std::istringstream in(script);
    int status = 0;
    {
        Runner runner(host, options, out, err);
        status = runner.run(in, "test.script", interactive);
    }
    return {status, out.str(), err.str()};
}

TEST(SorvelHost, PrintsOutcomesAndResultsWithTheirTypes) {
    Options options;
    options.use_indices = 1;
    const Outcome r = run(
        "# integers\n"
        "Add Integer 50\nAdd Integer: 30\n"
        "Contains Integer 30\n%o: Contains Integer: 31\n"
        "IntegersSize()\nIntegerElementAt(1)\n"
        "Add Float 2.5\nFloatElementAt(0)\n"
        "Add String \"tab\\there\"\nStringElementAt$(0)\nStringElementAt$(5)\n",
        options);
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out,
              "Contains Integer: 30 -> true\n"
              "Contains Integer: 31 -> false\n"
              "IntegersSize() -> 2 (integer)\n"
              "IntegerElementAt(1) -> 30 (integer)\n"
              "FloatElementAt(0) -> 2.5 (float)\n"
              "StringElementAt$(0) -> \"tab\\x09here\" (string)\n"
              "StringElementAt$(5) -> \"\" (string)\n");
}

TEST(SorvelHost, InstancesAreSelectedByNumber) {
    Options options;
    options.instances = 2;
    const Outcome r = run("Add Integer 1\ninstance 2\nIntegersSize()\ninstance 1\nIntegersSize()\ninstance 3\n", options);
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.out, "[2] IntegersSize() -> 0 (integer)\n[1] IntegersSize() -> 1 (integer)\n");
    EXPECT_NE(r.err.find("test.script:6: there are 2 instances"), std::string::npos) << r.err;
}

TEST(SorvelHost, AScriptStopsAtItsFirstFaultyLine) {
    const Outcome r = run("Add Integer 1\nAdd Integr 2\nIntegersSize()\n");
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(r.out, "");
    EXPECT_EQ(r.err, "test.script:2: unknown event \"add integr\"; did you mean \"Add Integer: %0\"?\n");
}

TEST(SorvelHost, APromptReportsAndGoesOn) {
    const Outcome r = run("Add String \"open\nAdd Integer 1 2\nIntegersSize()\nquit\nIntegersSize()\n", {}, true);
    EXPECT_EQ(r.status, 0);
    EXPECT_NE(r.err.find("test.script:1: unterminated string"), std::string::npos) << r.err;
    EXPECT_NE(r.err.find("test.script:2: \"Add Integer: %0\" takes 1 value, not 2"), std::string::npos) << r.err;
    EXPECT_NE(r.out.find("IntegersSize() -> 0 (integer)"), std::string::npos) << r.out;
    EXPECT_EQ(r.out.find("IntegersSize() -> 0 (integer)", r.out.find("IntegersSize()") + 1), std::string::npos)
        << "nothing runs after quit";
}

TEST(SorvelHost, WarnsWhenAFileDoesNotOpen) {
    const Outcome r = run("Add String \"kept\"\nLoad From File \"/no/such/file.txt\" 1\nStringsSize()\n");
    EXPECT_EQ(r.status, 0);
    EXPECT_NE(r.err.find("test.script:2: warning: cannot open \"/no/such/file.txt\""), std::string::npos) << r.err;
    EXPECT_EQ(r.out, "StringsSize() -> 1 (integer)\n");
}

TEST(SorvelHost, TracePrintsEveryHostRoutineCall) {
    Options options;
    options.trace = true;
    const Outcome r = run("Add Integer 5\nIntegerElementAt(65537)\n", options);
    EXPECT_NE(r.out.find("Add Integer: 5\n    HostReadEventParam("), std::string::npos) << r.out;
    EXPECT_NE(r.out.find(", 0, 0) -> 5\n"), std::string::npos) << r.out;
    EXPECT_NE(r.out.find("    HostReadFirstExprParam("), std::string::npos) << r.out;
}

TEST(SorvelHost, TreesAsTextAndDot) {
    const auto dot = std::filesystem::temp_directory_path() / "sorvel-host-test.dot";
    const Outcome r = run("Add Integer 2\nAdd Integer 1\nAdd Integer 3\nAdd Integer 4\ntree integers \"" +
                      dot.generic_string() + "\"\ntree strings\n");
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out,
              "integers: 4 nodes, depth 3\n"
              "2\n"
              "  L 1\n"
              "  R 3\n"
              "    R 4\n"
              "strings: 0 nodes, depth 0\n");
    std::ifstream in(dot);
    std::ostringstream read;
    read << in.rdbuf();  // g++ 12 -O3 warns of a null dereference in istreambuf_iterator
    const std::string text = read.str();
    in.close();  // Windows cannot remove a file that is open
    EXPECT_EQ(text.rfind("digraph sorvel {", 0), 0U) << text;
    EXPECT_NE(text.find("[label=\"4\"]"), std::string::npos) << text;
    std::filesystem::remove(dot);
}

TEST(SorvelHost, DeepChainsPrintWithoutRecursing) {
    std::string script;
    for (int v = 0; v < 2000; ++v) {
        script += "Add Integer " + std::to_string(v) + "\n";
    }
    const Outcome r = run(script + "tree integers\n");
    EXPECT_EQ(r.out.rfind("integers: 2000 nodes, depth 2000\n", 0), 0U);
    EXPECT_NE(r.out.find("... 1968 more nodes below"), std::string::npos);
}

}  // namespace
