// A road is an operation written as a list of named steps. Each step is a function of the
// road's context that does one thing, handles its own failure (result, log, undo) and says
// whether the road goes on. The names are what the logs and the fault tests speak of.
#pragma once

#include <cstddef>

#include "corv/fault.h"

namespace CORVPackageTool {

template <class Context>
struct RoadStep {
    const char* name;
    bool (*run)(Context&);
};

// Runs `steps` in order and stops at the first that fails. False when one failed.
template <class Context, size_t N>
bool PMSRunRoad(const char* road, Context& ctx, const RoadStep<Context> (&steps)[N]) {
    for (const RoadStep<Context>& step : steps) {
        if (CORVFaultAt(road, step.name) || !step.run(ctx)) {
            return false;
        }
    }
    return true;
}

// Runs every one of `steps`, whatever each gives: the closing steps that every road ends
// with, on success and failure alike.
template <class Context, size_t N>
void PMSRunClosingSteps(const char* road, Context& ctx, const RoadStep<Context> (&steps)[N]) {
    for (const RoadStep<Context>& step : steps) {
        if (!CORVFaultAt(road, step.name)) {
            step.run(ctx);
        }
    }
}

}  // namespace CORVPackageTool
