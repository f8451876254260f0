// A naive reference model of the operation tree's folding of queue lines:
// nodes in one flat vector with a parent index, children found by a linear
// scan, the merge rules written out as a table and applied step by step.
// Line parsing is shared (fileindex::Event).
#pragma once

#include <json/json.h>

#include <string>
#include <utility>
#include <vector>

namespace vellis::testing {

// One delivered operation: its node's path, kind (FileIndexOP) and fields.
struct NaiveOp {
  std::string path;
  int kind = 0;
  std::string path_old;
  Json::Value data;

  bool operator==(const NaiveOp& o) const {
    return path == o.path && kind == o.kind && path_old == o.path_old && data == o.data;
  }
};

// What OPTree(lines).ProcessOP delivers, in order, and returns.
std::pair<std::vector<NaiveOp>, unsigned> NaiveFold(const std::vector<std::string>& lines);

}  // namespace vellis::testing
