// Queue events folded into a tree of pending operations.
//
// A queue file holds one JSON event per line. OPTree reads one whole queue
// file, folds each event into per-path operations by the merge rules, and
// hands the surviving operations to a caller in the order in which they were
// first attached.
//
// Trees, nodes and operations are held by shared pointers. A tree frees all
// its nodes when it is destroyed: it breaks the child and node-to-op links
// first; parent links stay, so an OP kept after its tree is gone still knows
// its node's path. Nothing here is thread-safe; a tree belongs to one thread
// for one round.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

namespace vellis {
class Arena;
}  // namespace vellis

namespace vellis::fileindex {

// Bits of a queue line's "event".
enum EventBit : uint32_t {
  kEventModify = 0x2,
  kEventAttr = 0x4,
  kEventCreate = 0x40,
  kEventDelete = 0x80,
  kEventRename = 0x100,
  kEventCrash = 0x200,
  kEventReindex = 0x10000,
  kEventUpdateCfg = 0x20000,
};

// One queue line.
struct Event {
  // Parses one line (without its newline). Throws Error 906 "Malformed
  // event_raw: <line>" (logged first) when the text is not JSON, and the
  // JSON helpers' Error 120 when "event" or "path" is missing or a key has
  // the wrong type. "is_dir" defaults to false, "path_old" to empty, "data"
  // to null.
  explicit Event(const std::string& event_raw);
  // An event with every field at its default (event 0, empty path).
  Event() = default;

  // Replaces every field with those of `event_raw`, as the constructor
  // would, reusing the strings' storage; throws what the constructor throws,
  // and then leaves the fields unspecified.
  void Assign(const std::string& event_raw);

  uint32_t event = 0;
  bool is_dir = false;
  std::string path;
  std::string path_old;
  Json::Value data;
};

enum FileIndexOP {
  FILE_INDEX_OP_NONE = 0,
  FILE_INDEX_OP_DELETE = 1,
  FILE_INDEX_OP_UPSERT = 2,
  FILE_INDEX_OP_ATTR = 3,
  FILE_INDEX_OP_UPDATE_CFG = 4,
  FILE_INDEX_OP_RENAME = 5,
  FILE_INDEX_OP_REINDEX = 6,
  FILE_INDEX_OP_CRASH = 7,
};

struct OPNode;
class ChildIndex;

// One pending operation on a node.
struct OP {
  OP(std::shared_ptr<OPNode> node, FileIndexOP op, const std::string& path_old,
     const Json::Value& data);

  // Merges another configuration update's category flags into data: for
  // each of "document", "audio", "video", "photo", data[key] becomes the
  // boolean (other's flag, default false) OR (data[key] is true). Other keys
  // are left as they are.
  void MergeData(const Json::Value& other);

  std::shared_ptr<OPNode> node;
  FileIndexOP op;
  std::string path_old;
  Json::Value data;
};

// One path component and the operations pending on it.
struct OPNode : public std::enable_shared_from_this<OPNode> {
  OPNode(std::shared_ptr<OPNode> parent, const std::string& name);
  ~OPNode();
  OPNode(const OPNode&) = delete;
  OPNode& operator=(const OPNode&) = delete;

  // The full path: the names from the root down joined with "/" ("/a/b";
  // the root's own path is empty).
  std::string GetPath() const;

  // The first child of that name, created and appended to `children` when
  // missing; children keep their creation order. A folder with more than a
  // few children keeps an index of them by name, so this is not a linear
  // scan; children appended to `children` directly are indexed at the next
  // lookup.
  std::shared_ptr<OPNode> GetChild(const std::string& name);

  // Calls fn for each operation in `ops`, in order, cancelled ones included.
  void TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn);

  std::string name;
  std::shared_ptr<OPNode> parent;
  // Children may be appended, but never removed or replaced while the tree
  // they belong to lives: the tree keeps plain pointers to its nodes.
  std::vector<std::shared_ptr<OPNode>> children;
  std::vector<std::shared_ptr<OP>> ops;

 private:
  friend class OPTree;
  // The first child named `name`, or null.
  OPNode* FindChild(std::string_view name);
  // Appends a child whose name FindChild has just missed; returns it.
  OPNode* AppendChild(std::shared_ptr<OPNode> child);
  // Adds the children appended since the last lookup to child_index_.
  void IndexAppendedChildren();
  // Made once the folder has more than a few children.
  std::unique_ptr<ChildIndex> child_index_;
};

class OPTree {
 public:
  // Paths longer than this cannot name a file and are refused (9999).
  static constexpr size_t kMaxPathBytes = 4095;
  // How many lines of the queue are read and parsed ahead of folding them.
  static constexpr size_t kLinesReadAhead = 32;

  // Makes the tree (not crashed, empty root) and reads `queue_path` at once
  // (BuildTree); throws what BuildTree throws.
  explicit OPTree(const std::string& queue_path);
  ~OPTree();
  OPTree(const OPTree&) = delete;
  OPTree& operator=(const OPTree&) = delete;

  // Reads the queue file line by line and inserts each event. A line that
  // cannot be parsed or inserted (not JSON, 1 MiB or longer, a bad path...)
  // is logged and skipped; reading stops after a line with the crash bit.
  // Throws Error 502 "Failed to open queue, reason=..." when the file cannot
  // be opened (a symbolic link, FIFO or directory included).
  void BuildTree();

  // Folds one event into the tree by the merge rules.
  void InsertEvent(std::shared_ptr<Event> event);

  // The node of a full path, creating missing nodes. Throws Error 9999
  // "GetNodeByPath failed, path=<path>" for a path that is empty, relative,
  // has a doubled or trailing "/", a "." or ".." component, or is longer
  // than kMaxPathBytes.
  std::shared_ptr<OPNode> GetNodeByPath(const std::string& path);

  // Depth first, post-order over `node`'s subtree, children in creation
  // order, each list copied before it is walked; `node` itself is visited
  // last unless `skip_self`.
  void TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                              const std::function<void(std::shared_ptr<OPNode>)>& fn,
                              bool skip_self);

  // Delivers the surviving operations in order of first attachment and
  // returns the number of attached operations, cancelled ones included. A
  // crashed tree delivers one FILE_INDEX_OP_CRASH on the root and returns 1.
  // Exceptions from fn propagate; later operations are then not delivered.
  unsigned int ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn);

  bool crashed = false;
  std::string queue_path;
  std::shared_ptr<OPNode> root;
  std::vector<std::shared_ptr<OP>> ops;

 private:
  // Unlinks and frees every node and operation of the tree.
  void Clear();
  // The child of `node` named `name`, created when missing.
  OPNode* ChildOf(OPNode* node, std::string_view name);
  // GetNodeByPath without taking a reference.
  OPNode* NodeByPath(const std::string& path);
  // InsertEvent without taking a reference.
  void Insert(const Event& event);
  // An operation of kind none on `node`: the spare one when no one else
  // holds it, else a new one allocated in the arena.
  std::shared_ptr<OP> NewOp(OPNode* node);
  // Keeps `op` as the spare when it was not attached.
  void Recycle(std::shared_ptr<OP> op);
  void Attach(const std::shared_ptr<OP>& op);
  void HandleCreate(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleModify(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleDelete(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleAttr(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleUpdateCfg(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleReindex(OPNode* node, const std::shared_ptr<OP>& op);
  void HandleRename(OPNode* node, const std::shared_ptr<OP>& op);
  // Moves pending upsert/attr/reindex work of `from` onto `to`.
  void CarryOver(OPNode* from, OPNode* to);

  // Nodes and operations made by the tree are allocated here. The tree holds
  // one reference and each object another, so the memory goes when the tree
  // and the last operation a caller kept are gone.
  Arena* arena_;
  std::shared_ptr<OP> spare_op_;  // an operation no line attached; see NewOp
  // Every node the tree made, in order of creation, which is their order in
  // the arena: Clear frees them newest first, walking memory in order rather
  // than hopping through the tree. Not owning.
  std::deque<OPNode*> created_;
  // The node of the last path looked up, and that path: events come in
  // bursts on one file or in one folder, and this spares the walk down to
  // them. Nodes are not removed before Clear, which forgets it.
  OPNode* last_node_ = nullptr;
  OPNode* last_folder_ = nullptr;  // the node it was looked up in
  std::string last_path_;
  size_t last_cut_ = 0;  // where the folder part of last_path_ ends
};

// "[05] /old -> /new", "[04] /a, data={...}", "[02] /a".
std::ostream& operator<<(std::ostream& os, const std::shared_ptr<OP>& op);
// "Node[/a]: " followed by its operations separated by ", ".
std::ostream& operator<<(std::ostream& os, const std::shared_ptr<OPNode>& node);

}  // namespace vellis::fileindex
