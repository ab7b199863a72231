// The dependency graph: quadratic and cubic methods on purpose, for tens of packages.
#include "corvpkg/graph.h"

namespace CORVPackageTool {

namespace {
constexpr unsigned long long kNone = ~0ULL;
}

Graph::Graph(unsigned long long capacity)
    : maxVerts(capacity),
      vertexList(capacity),
      adjMat(capacity * capacity, 0),
      visited(capacity, 0) {}

Graph::~Graph() = default;

unsigned long long Graph::addVertex(const std::string& label) {
    vertexList[nVerts] = label;
    return nVerts++;
}

void Graph::addEdge(unsigned long long from, unsigned long long to) {
    edge(from, to) = 1;
}

std::vector<std::string>& Graph::getResult() {
    return result;
}

unsigned long long Graph::noSuccessors() {
    for (unsigned long long row = 0; row < nVerts; ++row) {
        bool none = true;
        for (unsigned long long col = 0; col < nVerts; ++col) {
            if (edge(row, col) != 0) {
                none = false;
                break;
            }
        }
        if (none) {
            return row;
        }
    }
    return kNone;
}

void Graph::moveRowUp(unsigned long long row, unsigned long long length) {
    for (unsigned long long col = 0; col < length; ++col) {
        edge(row, col) = edge(row + 1, col);
    }
}

void Graph::moveColLeft(unsigned long long col, unsigned long long length) {
    for (unsigned long long row = 0; row < length; ++row) {
        edge(row, col) = edge(row, col + 1);
    }
}

void Graph::deleteVertex(unsigned long long vertex) {
    if (vertex < nVerts - 1) {
        for (unsigned long long j = vertex; j < nVerts - 1; ++j) {
            vertexList[j] = vertexList[j + 1];
        }
        for (unsigned long long row = vertex; row < nVerts - 1; ++row) {
            moveRowUp(row, nVerts);
        }
        for (unsigned long long col = vertex; col < nVerts - 1; ++col) {
            moveColLeft(col, nVerts - 1);
        }
    }
    --nVerts;
}

bool Graph::topologicalSort() {
    result.clear();
    result.resize(nVerts);
    while (nVerts != 0) {
        unsigned long long v = noSuccessors();
        if (v == kNone) {
            return false;
        }
        result[nVerts - 1] = vertexList[v];
        deleteVertex(v);
    }
    return true;
}

void Graph::DFS(unsigned long long vertex) {
    if (visited[vertex]) {
        return;
    }
    visited[vertex] = 1;
    for (unsigned long long i = 0; i < maxVerts; ++i) {
        if (edge(vertex, i) != 0) {
            DFS(i);
        }
    }
    result.push_back(vertexList[vertex]);
}

void Graph::visit(unsigned long long start) {
    result.clear();
    DFS(start);
}

}  // namespace CORVPackageTool
