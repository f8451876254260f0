#include "tests/support/naive_fold.h"

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/optree.h"

namespace vellis::testing {
namespace {

// Kinds, as in fileindex::FileIndexOP.
constexpr int kNone = 0, kDelete = 1, kUpsert = 2, kAttr = 3, kUpdateCfg = 4, kRename = 5,
              kReindex = 6, kCrash = 7;

// What a new operation does when it meets one pending operation e: nothing
// (kKeep), or it is cancelled after e is left as it is (kDrop), becomes the
// kind named, takes the new data as well (kUpdateCfg) or merges it (kMerge).
constexpr int kKeep = -1, kDrop = 0, kMerge = 8;
// Rows: the handler; columns: e's kind, delete (1) to reindex (6).
enum Row { kRowCreate, kRowModify, kRowDelete, kRowAttr, kRowUpdateCfg, kRowReindex };
constexpr int kTable[6][6] = {
    /* create  */ {kUpsert, kDrop, kUpsert, kDrop, kKeep, kDrop},
    /* modify  */ {kDrop, kDrop, kUpsert, kDrop, kKeep, kDrop},
    /* delete  */ {kDrop, kDelete, kDelete, kKeep, kKeep, kKeep},
    /* attr    */ {kDrop, kDrop, kDrop, kDrop, kKeep, kDrop},
    /* updcfg  */ {kDrop, kUpdateCfg, kUpdateCfg, kMerge, kKeep, kDrop},
    /* reindex */ {kDrop, kReindex, kReindex, kReindex, kKeep, kDrop},
};

struct Node {
  std::string name;
  int parent = -1;
  std::vector<int> children;  // node indices, in creation order
  std::vector<int> ops;       // op indices, in attachment order (repeats possible)
};

struct Op {
  int node = 0;
  int kind = kNone;
  std::string path_old;
  Json::Value data;
};

class Model {
 public:
  std::vector<std::string> Fold(const std::vector<std::string>& lines) {
    for (const std::string& line : lines) {
      try {
        if (line.size() < (1u << 20)) InsertEvent(fileindex::Event(line));
      } catch (const Error&) {  // logged and skipped by the tree
      }
      if (crashed_) return {OpText(kCrash, "", "", Json::Value()), "count=1"};
    }
    std::vector<std::string> out;
    for (int o : attached_) {
      const Op& op = ops_[o];
      if (op.kind != kNone) out.push_back(OpText(op.kind, PathOf(op.node), op.path_old, op.data));
    }
    out.push_back("count=" + std::to_string(attached_.size()));
    return out;
  }

 private:
  std::string PathOf(int n) const {
    std::string path;
    for (; nodes_[n].parent != -1; n = nodes_[n].parent) path = "/" + nodes_[n].name + path;
    return path;
  }

  // "/" and then parts split at every "/", none empty, "." or "..".
  int GetNodeByPath(const std::string& path) {
    std::vector<std::string> parts(1);
    for (size_t i = 1; i < path.size(); ++i) {
      if (path[i] == '/') parts.emplace_back();
      if (path[i] != '/') parts.back() += path[i];
    }
    bool good = !path.empty() && path.size() <= 4095 && path[0] == '/';
    for (const std::string& p : parts) good = good && !p.empty() && p != "." && p != "..";
    if (!good) throw Error(kErrNodeByPath, "GetNodeByPath failed, path=" + path);
    int node = 0;
    for (const std::string& name : parts) {
      int found = -1;
      for (int c : nodes_[node].children) found = nodes_[c].name == name ? c : found;
      if (found == -1) {
        found = static_cast<int>(nodes_.size());
        nodes_.push_back(Node{name, node, {}, {}});
        nodes_[node].children.push_back(found);
      }
      node = found;
    }
    return node;
  }

  // Post-order below `node` (the node itself left out); each children list
  // is copied before it is walked, as `fn` may create nodes.
  template <typename Fn>
  void Below(int node, Fn fn) {
    for (int c : std::vector<int>(nodes_[node].children)) {
      Below(c, fn);
      fn(c);
    }
  }

  void Attach(int o) {
    attached_.push_back(o);
    nodes_[ops_[o].node].ops.push_back(o);
  }

  static void MergeData(Json::Value& data, const Json::Value other) {  // a copy: may be `data`
    for (const char* key : {"document", "audio", "video", "photo"}) {
      bool other_flag = false;
      if (other.isObject()) vellis::GetJsonValue(other_flag, other, key, false);
      bool current = data.isObject() && data[key].isBool() && data[key].asBool();
      if (!data.isObject()) data = Json::Value(Json::objectValue);
      data[key] = other_flag || current;
    }
  }

  // Sets the kind, meets every pending operation present now by the table,
  // attaches when not dropped; a reindex also cancels all but renames below.
  void Handle(int node, int o, int kind, Row row) {
    ops_[o].kind = kind;
    const size_t n = nodes_[node].ops.size();
    for (size_t i = 0; i < n; ++i) {
      Op& e = ops_[nodes_[node].ops[i]];
      const int action = e.kind == kNone || e.kind == kCrash ? kKeep : kTable[row][e.kind - 1];
      if (action == kKeep) continue;
      if (action == kMerge) MergeData(e.data, ops_[o].data);
      if (action != kDrop && action != kMerge) e.kind = action;
      if (action == kUpdateCfg) e.data = ops_[o].data;
      ops_[o].kind = kNone;
    }
    if (row == kRowReindex) {
      Below(node, [this](int d) {
        for (int e : nodes_[d].ops) ops_[e].kind = ops_[e].kind == kRename ? kRename : kNone;
      });
    }
    if (ops_[o].kind != kNone) Attach(o);
  }

  static bool IsCarried(int kind) { return kind == kUpsert || kind == kAttr || kind == kReindex; }

  void CarryOver(int from, int to) {
    ops_.push_back(Op{to, kNone, "", Json::Value()});
    const int follow_up = static_cast<int>(ops_.size()) - 1;
    const size_t n = nodes_[from].ops.size();
    for (size_t i = 0; i < n; ++i) {
      const int e = nodes_[from].ops[i];
      if (!IsCarried(ops_[e].kind)) continue;
      if (ops_[follow_up].kind == kNone) Attach(follow_up);
      ops_[follow_up].kind = ops_[e].kind;
      ops_[e].kind = kNone;
    }
  }

  void HandleRename(int node, int o) {
    const int old_node = GetNodeByPath(ops_[o].path_old);
    ops_[o].kind = kRename;
    for (int e : nodes_[node].ops) {
      const int k = ops_[e].kind;
      if (k == kDelete || k == kUpsert || k == kAttr) ops_[e].kind = kNone;
    }
    Attach(o);
    CarryOver(old_node, node);
    const std::string old_path = PathOf(old_node), new_path = PathOf(node);
    Below(old_node, [&](int d) {
      bool has_work = false;
      for (int e : nodes_[d].ops) has_work = has_work || IsCarried(ops_[e].kind);
      if (has_work) CarryOver(d, GetNodeByPath(new_path + PathOf(d).substr(old_path.size())));
    });
  }

  void InsertEvent(const fileindex::Event& ev) {
    const int node = GetNodeByPath(ev.path);
    const int o = static_cast<int>(ops_.size());
    ops_.push_back(Op{node, kNone, "", Json::Value()});
    const uint32_t bits = ev.event;
    if (bits & 0x40)
      Handle(node, o, ev.is_dir ? kReindex : kUpsert, ev.is_dir ? kRowReindex : kRowCreate);
    if (bits & 0x4) Handle(node, o, kAttr, kRowAttr);
    if (bits & 0x2) Handle(node, o, kUpsert, kRowModify);
    if (bits & 0x80)
      Handle(node, o, ev.is_dir ? kReindex : kDelete, ev.is_dir ? kRowReindex : kRowDelete);
    if (bits & 0x100) ops_[o].path_old = ev.path_old;
    if (bits & 0x100) HandleRename(node, o);
    if (bits & 0x10000) Handle(node, o, kReindex, kRowReindex);
    if (bits & 0x20000) ops_[o].data = ev.data;
    if (bits & 0x20000) Handle(node, o, kUpdateCfg, kRowUpdateCfg);
    crashed_ = bits & 0x200;
  }

  std::vector<Node> nodes_ = {Node()};  // the root: no parent, empty name
  std::vector<Op> ops_;                 // every operation object ever made
  std::vector<int> attached_;           // the tree's ops vector
  bool crashed_ = false;
};

}  // namespace

std::string OpText(int kind, const std::string& path, const std::string& path_old,
                   const Json::Value& data) {
  return "[" + std::to_string(kind) + "] " + path_old + " -> " + path +
         ", data=" + JsonToString(data);
}

std::vector<std::string> NaiveFold(const std::vector<std::string>& lines) {
  return Model().Fold(lines);
}

}  // namespace vellis::testing
