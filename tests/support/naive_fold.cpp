#include "tests/support/naive_fold.h"

#include <cstdio>
#include <memory>

#include "common/error.h"
#include "common/json_util.h"
#include "fileindex/optree.h"

namespace vellis::testing {
namespace {

using fileindex::Event;

// Kinds, as in fileindex::FileIndexOP.
constexpr int kNone = 0, kDelete = 1, kUpsert = 2, kAttr = 3, kUpdateCfg = 4, kRename = 5,
              kReindex = 6, kCrash = 7;

// What a new operation does when it meets one pending operation e.
enum Action {
  kKeep,            // nothing changes
  kDrop,            // the new operation is cancelled
  kEToUpsertDrop,   // e becomes an upsert, the new one is cancelled
  kEToDeleteDrop,   // e becomes a delete, the new one is cancelled
  kEToReindexDrop,  // e becomes a reindex, the new one is cancelled
  kEToCfgDrop,      // e becomes an update cfg carrying the new data, the new one is cancelled
  kEMergeDrop,      // e merges the new data, the new one is cancelled
};

// The merge table. Rows: the handler; columns: e's kind, delete (1) to
// reindex (6).
enum Row { kRowCreate, kRowModify, kRowDelete, kRowAttr, kRowUpdateCfg, kRowReindex };
constexpr Action kTable[6][6] = {
    /* create  */ {kEToUpsertDrop, kDrop, kEToUpsertDrop, kDrop, kKeep, kDrop},
    /* modify  */ {kDrop, kDrop, kEToUpsertDrop, kDrop, kKeep, kDrop},
    /* delete  */ {kDrop, kEToDeleteDrop, kEToDeleteDrop, kKeep, kKeep, kKeep},
    /* attr    */ {kDrop, kDrop, kDrop, kDrop, kKeep, kDrop},
    /* updcfg  */ {kDrop, kEToCfgDrop, kEToCfgDrop, kEMergeDrop, kKeep, kDrop},
    /* reindex */ {kDrop, kEToReindexDrop, kEToReindexDrop, kEToReindexDrop, kKeep, kDrop},
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
  Model() { nodes_.push_back(Node()); }  // the root: no parent, empty name

  void BuildTree(const std::vector<std::string>& lines) {
    for (const std::string& line : lines) {
      if (line.size() >= (1u << 20)) continue;
      try {
        InsertEvent(Event(line));
      } catch (const Error&) {
        // logged and skipped by the tree
      }
      if (crashed_) break;
    }
  }

  std::pair<std::vector<NaiveOp>, unsigned> ProcessOP() const {
    std::vector<NaiveOp> out;
    if (crashed_) {
      out.push_back(NaiveOp{"", kCrash, "", Json::Value()});
      return {out, 1};
    }
    for (int o : attached_) {
      if (ops_[o].kind != kNone) {
        out.push_back(NaiveOp{PathOf(ops_[o].node), ops_[o].kind, ops_[o].path_old, ops_[o].data});
      }
    }
    return {out, static_cast<unsigned>(attached_.size())};
  }

 private:
  std::string PathOf(int n) const {
    std::string path;
    while (nodes_[n].parent != -1) {
      path = "/" + nodes_[n].name + path;
      n = nodes_[n].parent;
    }
    return path;
  }

  static bool IsGoodPath(const std::string& path) {
    if (path.empty() || path.size() > 4095 || path[0] != '/') return false;
    std::vector<std::string> parts;
    std::string part;
    for (size_t i = 1; i < path.size(); ++i) {
      if (path[i] == '/') {
        parts.push_back(part);
        part.clear();
      } else {
        part += path[i];
      }
    }
    parts.push_back(part);
    for (const std::string& p : parts) {
      if (p.empty() || p == "." || p == "..") return false;
    }
    return true;
  }

  int GetNodeByPath(const std::string& path) {
    if (!IsGoodPath(path)) throw Error(kErrNodeByPath, "GetNodeByPath failed, path=" + path);
    int node = 0;
    size_t start = 1;
    while (start <= path.size()) {
      size_t end = path.find('/', start);
      if (end == std::string::npos) end = path.size();
      std::string name = path.substr(start, end - start);
      int found = -1;
      for (int c : nodes_[node].children) {
        if (nodes_[c].name == name) found = c;
      }
      if (found == -1) {
        Node child;
        child.name = name;
        child.parent = node;
        nodes_.push_back(child);
        found = static_cast<int>(nodes_.size()) - 1;
        nodes_[node].children.push_back(found);
      }
      node = found;
      start = end + 1;
    }
    return node;
  }

  // Post-order below `node` (the node itself left out); each children list
  // is copied before it is walked, as `fn` may create nodes.
  template <typename Fn>
  void Below(int node, Fn fn) {
    std::vector<int> children = nodes_[node].children;
    for (int c : children) {
      Below(c, fn);
      fn(c);
    }
  }

  void Attach(int o) {
    attached_.push_back(o);
    nodes_[ops_[o].node].ops.push_back(o);
  }

  static void MergeData(Json::Value& data, const Json::Value& other_in) {
    const Json::Value other = other_in;  // may be `data` itself
    for (const char* key : {"document", "audio", "video", "photo"}) {
      bool other_flag = false;
      if (other.isObject()) vellis::GetJsonValue(other_flag, other, key, false);
      bool current = data.isObject() && data[key].isBool() && data[key].asBool();
      if (!data.isObject()) data = Json::Value(Json::objectValue);
      data[key] = other_flag || current;
    }
  }

  // The common handler: set the kind, meet every pending operation present
  // now by the table, attach when not dropped.
  void Handle(int node, int o, int kind, Row row) {
    ops_[o].kind = kind;
    MeetPending(node, o, row);
    if (ops_[o].kind != kNone) Attach(o);
  }

  void MeetPending(int node, int o, Row row) {
    size_t n = nodes_[node].ops.size();
    for (size_t i = 0; i < n; ++i) {
      int e = nodes_[node].ops[i];
      if (ops_[e].kind == kNone || ops_[e].kind == kCrash) continue;
      switch (kTable[row][ops_[e].kind - 1]) {
        case kKeep:
          break;
        case kDrop:
          ops_[o].kind = kNone;
          break;
        case kEToUpsertDrop:
          ops_[e].kind = kUpsert;
          ops_[o].kind = kNone;
          break;
        case kEToDeleteDrop:
          ops_[e].kind = kDelete;
          ops_[o].kind = kNone;
          break;
        case kEToReindexDrop:
          ops_[e].kind = kReindex;
          ops_[o].kind = kNone;
          break;
        case kEToCfgDrop:
          ops_[e].kind = kUpdateCfg;
          ops_[e].data = ops_[o].data;
          ops_[o].kind = kNone;
          break;
        case kEMergeDrop:
          MergeData(ops_[e].data, ops_[o].data);
          ops_[o].kind = kNone;
          break;
      }
    }
  }

  void HandleReindex(int node, int o) {
    ops_[o].kind = kReindex;
    MeetPending(node, o, kRowReindex);
    Below(node, [this](int d) {
      for (int e : nodes_[d].ops) {
        if (ops_[e].kind != kRename) ops_[e].kind = kNone;
      }
    });
    if (ops_[o].kind != kNone) Attach(o);
  }

  static bool IsCarried(int kind) { return kind == kUpsert || kind == kAttr || kind == kReindex; }

  void CarryOver(int from, int to) {
    ops_.push_back(Op{to, kNone, "", Json::Value()});
    int follow_up = static_cast<int>(ops_.size()) - 1;
    bool pushed = false;
    size_t n = nodes_[from].ops.size();
    for (size_t i = 0; i < n; ++i) {
      int e = nodes_[from].ops[i];
      if (!IsCarried(ops_[e].kind)) continue;
      ops_[follow_up].kind = ops_[e].kind;
      ops_[e].kind = kNone;
      if (!pushed) {
        Attach(follow_up);
        pushed = true;
      }
    }
  }

  void HandleRename(int node, int o) {
    int old_node = GetNodeByPath(ops_[o].path_old);
    ops_[o].kind = kRename;
    for (int e : nodes_[node].ops) {
      int k = ops_[e].kind;
      if (k == kDelete || k == kUpsert || k == kAttr) ops_[e].kind = kNone;
    }
    Attach(o);
    CarryOver(old_node, node);
    const std::string old_path = PathOf(old_node);
    const std::string new_path = PathOf(node);
    Below(old_node, [&](int d) {
      bool has_work = false;
      for (int e : nodes_[d].ops) {
        if (IsCarried(ops_[e].kind)) has_work = true;
      }
      if (!has_work) return;
      int mirror = GetNodeByPath(new_path + PathOf(d).substr(old_path.size()));
      CarryOver(d, mirror);
    });
  }

  void InsertEvent(const Event& ev) {
    int node = GetNodeByPath(ev.path);
    ops_.push_back(Op{node, kNone, "", Json::Value()});
    int o = static_cast<int>(ops_.size()) - 1;
    uint32_t bits = ev.event;
    if (bits & 0x40) {
      if (ev.is_dir) {
        HandleReindex(node, o);
      } else {
        Handle(node, o, kUpsert, kRowCreate);
      }
    }
    if (bits & 0x4) Handle(node, o, kAttr, kRowAttr);
    if (bits & 0x2) Handle(node, o, kUpsert, kRowModify);
    if (bits & 0x80) {
      if (ev.is_dir) {
        HandleReindex(node, o);
      } else {
        Handle(node, o, kDelete, kRowDelete);
      }
    }
    if (bits & 0x100) {
      ops_[o].path_old = ev.path_old;
      HandleRename(node, o);
    }
    if (bits & 0x10000) HandleReindex(node, o);
    if (bits & 0x20000) {
      ops_[o].data = ev.data;
      Handle(node, o, kUpdateCfg, kRowUpdateCfg);
    }
    if (bits & 0x200) crashed_ = true;
  }

  std::vector<Node> nodes_;
  std::vector<Op> ops_;       // every operation object ever made
  std::vector<int> attached_;  // the tree's ops vector
  bool crashed_ = false;
};

}  // namespace

std::string ToString(const NaiveOp& op) {
  char kind[8];
  snprintf(kind, sizeof(kind), "[%02d] ", op.kind);
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  return kind + op.path_old + " -> " + op.path + ", data=" + Json::writeString(builder, op.data);
}

std::pair<std::vector<NaiveOp>, unsigned> NaiveFold(const std::vector<std::string>& lines) {
  Model model;
  model.BuildTree(lines);
  return model.ProcessOP();
}

}  // namespace vellis::testing
