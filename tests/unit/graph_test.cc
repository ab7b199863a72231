// The graph's orders, whose tie-breaks decide how packages start and stop.
#include "corvpkg/graph.h"

#include <gtest/gtest.h>

#include <memory>

#include <string>
#include <utility>
#include <vector>

using namespace CORVPackageTool;
using Strings = std::vector<std::string>;
using Edges = std::vector<std::pair<int, int>>;

namespace {

std::unique_ptr<Graph> build(const Strings& vertices, const Edges& edges) {
    auto g = std::make_unique<Graph>(vertices.size() + 1);
    for (const std::string& v : vertices) {
        g->addVertex(v);
    }
    for (const auto& [from, to] : edges) {
        g->addEdge(from, to);
    }
    return g;
}

}  // namespace

TEST(Graph, TopologicalSort) {
    const struct {
        const char* what;
        Strings vertices;
        Edges edges;
        bool ok;
        Strings order;
    } cases[] = {
        {"empty", {}, {}, true, {}},
        {"unrelated come out reversed", {"A", "B", "C"}, {}, true, {"C", "B", "A"}},
        {"chain", {"A", "B", "C"}, {{0, 1}, {1, 2}}, true, {"A", "B", "C"}},
        {"chain added backwards", {"C", "B", "A"}, {{2, 1}, {1, 0}}, true, {"A", "B", "C"}},
        {"diamond",
         {"A", "B", "C", "D"},
         {{0, 1}, {0, 2}, {1, 3}, {2, 3}},
         true,
         {"A", "C", "B", "D"}},
        {"two cycle", {"A", "B"}, {{0, 1}, {1, 0}}, false, {}},
        {"self edge", {"A", "B"}, {{1, 1}}, false, {}},
        {"cycle behind a chain", {"A", "B", "C", "D"}, {{0, 1}, {1, 2}, {2, 1}, {3, 0}}, false, {}},
        {"one free vertex among others", {"A", "B", "C"}, {{2, 0}}, true, {"C", "B", "A"}},
    };
    for (const auto& c : cases) {
        auto g = build(c.vertices, c.edges);
        EXPECT_EQ(g->topologicalSort(), c.ok) << c.what;
        if (c.ok) {
            EXPECT_EQ(g->getResult(), c.order) << c.what;
        }
    }
    Graph empty(1);
    EXPECT_EQ(empty.noSuccessors(), ~0ULL);
}

TEST(Graph, VisitIsPostOrder) {
    auto fan = build({"0", "1", "2"}, {{0, 1}, {0, 2}});
    fan->visit(0);
    EXPECT_EQ(fan->getResult(), (Strings{"1", "2", "0"}));

    auto diamond = build({"0", "1", "2", "3"}, {{0, 1}, {0, 2}, {1, 3}, {2, 3}});
    diamond->visit(0);
    EXPECT_EQ(diamond->getResult(), (Strings{"3", "1", "2", "0"}));
    // Marks stay: a second walk skips what the first saw.
    diamond->visit(2);
    EXPECT_EQ(diamond->getResult(), Strings{});

    auto cycle = build({"a", "b"}, {{0, 1}, {1, 0}});
    cycle->visit(0);
    EXPECT_EQ(cycle->getResult(), (Strings{"b", "a"}));
}

TEST(Graph, DeleteKeepsTheOrderOfTheRest) {
    auto g = build({"A", "B", "C", "D"}, {{0, 3}, {2, 3}});
    g->deleteVertex(1);                // B goes; A, C, D keep their order and edges
    EXPECT_EQ(g->noSuccessors(), 2u);  // D, now at index 2
    g->deleteVertex(2);                // the last vertex: only the count drops
    EXPECT_EQ(g->noSuccessors(), 0u);  // A's edge pointed at D, which is gone from view
}
