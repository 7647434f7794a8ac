#pragma once

#include <cstddef>
#include <functional>
#include <string>

#include "daemon/SyncPlan.h"

namespace kx::cli {

// Gives a plan's actions one after the other, each as one line for people: "+" new, "-" gone,
// "*" changed, ">" renamed. At most `limit` lines (0: all), divided among the kinds of action so
// that none is hidden by another; a kind that is cut ends with a line that counts the rest.
void describeActions(const SyncPlan& plan, std::size_t limit,
                     const std::function<void(const std::string&)>& line);

// Whether the sync would find nothing to do.
bool changesNothing(const SyncPlan& plan);

// The totals of assets, containers and files.
void describeTotals(const SyncPlan& plan, const std::function<void(const std::string&)>& line);

// Gives the plan as one line of JSON, piece by piece: it may be too long to be held twice.
// `hostProblems` is the JSON of that key.
void writePlanJson(const SyncPlan& plan, const std::string& hostProblems,
                   const std::function<void(const std::string&)>& write);

}  // namespace kx::cli
