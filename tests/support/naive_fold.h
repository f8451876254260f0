// A naive reference model of the operation tree's folding of queue lines.
//
// It is meant to be as unclever as possible: nodes in one flat vector with
// a parent index, children found by a linear scan, the merge rules written
// out as a table and applied step by step, no shortcuts. Tests fold the same
// lines with the real OPTree and with this model and compare what each
// delivers. Line parsing is shared: the model uses fileindex::Event itself.
#pragma once

#include <json/json.h>

#include <string>
#include <utility>
#include <vector>

namespace vellis::testing {

// One delivered operation: the node's full path, the kind (a
// fileindex::FileIndexOP value), and the operation's path_old and data.
struct NaiveOp {
  std::string path;
  int kind = 0;
  std::string path_old;
  Json::Value data;

  bool operator==(const NaiveOp& o) const {
    return path == o.path && kind == o.kind && path_old == o.path_old && data == o.data;
  }
};

// "[02] /a", "[05] /old -> /new", "[04] /a, data={...}" (path_old and data
// are always shown, so that a difference in them is visible).
std::string ToString(const NaiveOp& op);

// Folds the lines of one queue file (each without its newline) as the tree
// does: a line of 1 MiB or more, or one that cannot be parsed or inserted,
// is skipped; reading stops after a line with the crash bit. Returns the
// delivered operations in delivery order and the count that the tree's
// ProcessOP would return.
std::pair<std::vector<NaiveOp>, unsigned> NaiveFold(const std::vector<std::string>& lines);

}  // namespace vellis::testing
