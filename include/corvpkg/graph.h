// A small directed graph over strings as a dense adjacency matrix, for the start and stop
// orders of packages. Its tie-breaks decide those orders, so they are part of its contract:
// topologicalSort places, among the vertices without successors at one moment, the one
// added first at the latest free place.
#pragma once

#include <string>
#include <vector>

#include "corvpkg/visibility.h"

namespace CORVPackageTool {

class CORVPKG_API Graph {
  public:
    explicit Graph(unsigned long long capacity);
    ~Graph();
    Graph(const Graph&) = delete;
    Graph& operator=(const Graph&) = delete;

    // The new vertex's index. The caller never adds more than the capacity.
    unsigned long long addVertex(const std::string& label);
    // An edge from `from` to `to`: `to` is a successor of `from`.
    void addEdge(unsigned long long from, unsigned long long to);
    // Orders all vertices so that every edge points forwards, consuming the graph. False on
    // a cycle (the partial result must not be used).
    bool topologicalSort();
    // The vertices reachable from `start` in post-order. Marks are not cleared between calls.
    void visit(unsigned long long start);
    std::vector<std::string>& getResult();

    unsigned long long noSuccessors();
    void moveRowUp(unsigned long long row, unsigned long long length);
    void moveColLeft(unsigned long long col, unsigned long long length);
    void deleteVertex(unsigned long long vertex);
    void DFS(unsigned long long vertex);

  private:
    unsigned long long maxVerts;
    unsigned long long nVerts = 0;
    std::vector<std::string> vertexList;
    std::vector<unsigned long long> adjMat;  // maxVerts rows of maxVerts
    std::vector<std::string> result;
    std::vector<unsigned char> visited;

    unsigned long long& edge(unsigned long long row, unsigned long long col) {
        return adjMat[row * maxVerts + col];
    }
};

}  // namespace CORVPackageTool
