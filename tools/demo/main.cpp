// A short tour of the library through the test host: the same calls a host
// runtime makes, with what each gives.
#include <algorithm>
#include <cstdio>
#include <string>

#include "test_host.hpp"

using sorvel::testhost::Host;
using sorvel::testhost::Instance;
using sorvel::testhost::Library;
using sorvel::testhost::NodeView;
using sorvel::testhost::Param;

namespace {

int depth(NodeView node) {
    return node ? 1 + std::max(depth(node.left()), depth(node.right())) : 0;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        Host host(Library::built());
        Instance& game = host.create(/*case_sensitive=*/0, /*use_indices=*/1);
        for (int v : {50, 30, 70, 20, 40, 60, 80}) {
            host.event(game, "Add Integer: %0", {Param::of(v)});
        }
        std::printf("IntegersSize( = %ld\n", static_cast<long>(host.event(game, "IntegersSize(")));
        std::printf("Contains Integer 40 = %ld\n",
                    static_cast<long>(host.event(game, "%o: Contains Integer: %0", {Param::of(40)})));
        host.event(game, "Remove Integer: %0", {Param::of(50)});
        std::printf("after Remove 50: root %d, IndexOfIntegerElement(70) = %ld, IntegerElementAt(0) = %ld\n",
                    NodeView{game.root(0)}.integer(),
                    static_cast<long>(host.event(game, "IndexOfIntegerElement(", {Param::of(70)})),
                    static_cast<long>(host.event(game, "IntegerElementAt(", {Param::of(0)})));
        host.event(game, "Add String: %0", {Param::of("Apple")});
        host.event(game, "Add String: %0", {Param::of("APPLE")});
        std::printf("case-insensitive Apple/APPLE: StringsSize( = %ld, StringElementAt$(0) = %s\n",
                    static_cast<long>(host.event(game, "StringsSize(")),
                    Host::text_at(host.event(game, "StringElementAt$(", {Param::of(0)})).c_str());
        if (argc > 1) {
            for (int balance : {0, 1}) {
                Instance& loaded = host.create(1, 0);
                host.event(loaded, "Load From File: %0 into Strings (Balance: %1)",
                           {Param::of(std::string(argv[1])), Param::of(balance)});
                std::printf("Load From File %s (Balance: %d): %ld lines, tree depth %d\n", argv[1], balance,
                            static_cast<long>(host.event(loaded, "StringsSize(")), depth(NodeView{loaded.root(2)}));
                host.destroy(loaded);
            }
        }
        host.destroy(game);
        return 0;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "sorvel-demo: %s\n", e.what());
        return 1;
    }
}
