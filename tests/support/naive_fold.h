// A naive reference model of the operation tree's folding of queue lines:
// nodes in one flat vector with a parent index, children found by a linear
// scan, the merge rules written out as a table and applied step by step.
// Line parsing is shared (fileindex::Event).
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace vellis::testing {

// One delivered operation: "[<kind>] <path_old> -> <path>, data=<json>".
std::string OpText(int kind, const std::string& path, const std::string& path_old,
                   const Json::Value& data);

// What OPTree(lines).ProcessOP delivers, in order, then "count=<what it returns>".
std::vector<std::string> NaiveFold(const std::vector<std::string>& lines);

}  // namespace vellis::testing
