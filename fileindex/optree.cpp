#include "fileindex/optree.h"

#include <cerrno>
#include <cstring>
#include <functional>

#include "common/arena.h"
#include "common/json_util.h"
#include "common/line_reader.h"
#include "common/log.h"
#include "fileindex/child_index.h"

namespace vellis::fileindex {
namespace {

constexpr const char* kCategoryKeys[] = {"document", "audio", "video", "photo"};

bool IsLive(const std::shared_ptr<OP>& e) {
  // Cancelled and crash operations are never touched by a merge rule.
  return e->op != FILE_INDEX_OP_NONE && e->op != FILE_INDEX_OP_CRASH;
}

// The textual equivalent of "rebuilding the node's path gives the path back":
// "/" followed by non-empty components separated by single slashes. "." and
// ".." components are refused as well, so that no event names a path that
// resolves elsewhere.
bool IsCanonicalPath(const std::string& path) {
  if (path.size() < 2 || path.size() > OPTree::kMaxPathBytes || path[0] != '/') return false;
  size_t start = 1;
  for (;;) {
    size_t end = path.find('/', start);
    size_t len = (end == std::string::npos ? path.size() : end) - start;
    if (len == 0) return false;
    if (path[start] == '.' && (len == 1 || (len == 2 && path[start + 1] == '.'))) return false;
    if (end == std::string::npos) return true;
    start = end + 1;
  }
}

// Visits the operations pending on `node` when the visit starts, in
// attachment order; a rule may attach to this very node meanwhile, and what
// it attaches is not visited.
template <typename Fn>
void ForEachPending(const OPNode& node, Fn fn) {
  for (size_t i = 0, n = node.ops.size(); i < n; ++i) fn(node.ops[i]);
}

bool IsCarriable(FileIndexOP kind) {
  return kind == FILE_INDEX_OP_UPSERT || kind == FILE_INDEX_OP_ATTR ||
         kind == FILE_INDEX_OP_REINDEX;
}

bool HasCarriableWork(const OPNode& node) {
  for (const auto& e : node.ops) {
    if (IsCarriable(e->op)) return true;
  }
  return false;
}

}  // namespace

Event::Event(const std::string& event_raw) { Assign(event_raw); }

namespace {

// The members of a queue line that an event reads, found in one walk over
// the object.
struct EventMembers {
  const Json::Value* event = nullptr;
  const Json::Value* is_dir = nullptr;
  const Json::Value* path = nullptr;
  const Json::Value* path_old = nullptr;
  const Json::Value* data = nullptr;
};

EventMembers FindEventMembers(const Json::Value& root) {
  EventMembers m;
  for (auto it = root.begin(); it != root.end(); ++it) {
    const char* end = nullptr;
    const char* name = it.memberName(&end);
    const std::string_view key(name, static_cast<size_t>(end - name));
    if (key == "path") {
      m.path = &*it;
    } else if (key == "event") {
      m.event = &*it;
    } else if (key == "is_dir") {
      m.is_dir = &*it;
    } else if (key == "path_old") {
      m.path_old = &*it;
    } else if (key == "data") {
      m.data = &*it;
    }
  }
  return m;
}

// Copies a string member into `out`'s existing storage; a member that the
// JSON helpers would convert (null, a number, a boolean) is converted as
// they do.
bool AssignString(std::string& out, const Json::Value* v) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (v == nullptr) return false;
  if (v->getString(&begin, &end)) {
    out.assign(begin, static_cast<size_t>(end - begin));
    return true;
  }
  if (!v->isConvertibleTo(Json::stringValue)) return false;
  out = v->asString();
  return true;
}

}  // namespace

void Event::Assign(const std::string& event_raw) {
  Json::Value root;
  VELLIS_THROW_IF(!JsonFromString(root, event_raw), kErrMalformedEvent,
                  "Malformed event_raw: " + event_raw);
  // A queue round reads a million lines: the members are found in one walk
  // and read in place. Whatever the walk cannot take (not an object, a
  // missing or mistyped required member) goes to the JSON helper, which
  // throws its usual error.
  EventMembers m;
  if (root.isObject()) m = FindEventMembers(root);
  if (m.event != nullptr && m.event->isConvertibleTo(Json::uintValue)) {
    event = m.event->asUInt();
  } else {
    GetJsonValue(event, root, "event", true);
  }
  is_dir = m.is_dir != nullptr && m.is_dir->isConvertibleTo(Json::booleanValue) &&
           m.is_dir->asBool();
  if (!AssignString(path, m.path)) GetJsonValue(path, root, "path", true);
  if (!AssignString(path_old, m.path_old)) path_old.clear();
  if (m.data != nullptr) {
    data = *m.data;
  } else {
    data = Json::Value();
  }
}

OP::OP(std::shared_ptr<OPNode> node, FileIndexOP op, const std::string& path_old,
       const Json::Value& data)
    : node(std::move(node)), op(op), path_old(path_old), data(data) {}

void OP::MergeData(const Json::Value& other_in) {
  const Json::Value other = other_in;  // `other_in` may be this->data itself
  for (const char* key : kCategoryKeys) {
    // The incoming flag is read as the JSON helper reads a boolean, so a
    // number counts as the JSON library converts it (1 is true); the
    // pending flag counts only when it is a real true.
    bool other_flag = false;
    if (other.isObject()) GetJsonValue(other_flag, other, key, false);
    bool current = data.isObject() && data[key].isBool() && data[key].asBool();
    if (!data.isObject()) data = Json::Value(Json::objectValue);
    data[key] = other_flag || current;
  }
}

OPNode::OPNode(std::shared_ptr<OPNode> parent, const std::string& name)
    : name(name), parent(std::move(parent)) {}

std::string OPNode::GetPath() const {
  size_t len = 0;
  for (const OPNode* n = this; n->parent; n = n->parent.get()) len += n->name.size() + 1;
  std::string path(len, '/');
  for (const OPNode* n = this; n->parent; n = n->parent.get()) {
    len -= n->name.size();
    memcpy(&path[len], n->name.data(), n->name.size());
    --len;
  }
  return path;
}

OPNode::~OPNode() = default;

// Up to this many children, a scan beats an index: names are short and the
// children of a small folder sit close together.
constexpr size_t kScannedChildren = 8;

OPNode* OPNode::FindChild(std::string_view child_name) {
  if (!child_index_) {
    if (children.size() <= kScannedChildren) {
      for (const auto& c : children) {
        if (c->name == child_name) return c.get();
      }
      return nullptr;
    }
    child_index_ = std::make_unique<ChildIndex>();
  }
  // Children appended since the last lookup join the index; a repeated name
  // keeps its first child.
  for (; child_index_->indexed < children.size(); ++child_index_->indexed) {
    OPNode* c = children[child_index_->indexed].get();
    const uint32_t hash = ChildIndex::Hash(c->name);
    if (child_index_->Find(c->name, hash) == nullptr) child_index_->Insert(c, hash);
  }
  return child_index_->Find(child_name, ChildIndex::Hash(child_name));
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& child_name) {
  if (OPNode* c = FindChild(child_name)) return c->shared_from_this();
  children.push_back(std::make_shared<OPNode>(shared_from_this(), child_name));
  return children.back();
}

void OPNode::TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn) {
  // Index-based: a rule may attach to this very node while it is walked; the
  // operations attached meanwhile are not visited.
  for (size_t i = 0, n = ops.size(); i < n; ++i) fn(ops[i]);
}

OPTree::OPTree(const std::string& path)
    : queue_path(path),
      root(std::make_shared<OPNode>(nullptr, std::string())),
      arena_(Arena::New()) {
  try {
    BuildTree();
  } catch (...) {
    // No destructor runs for a tree whose constructor throws.
    Clear();
    arena_->Unref();
    throw;
  }
}

OPTree::~OPTree() {
  Clear();
  arena_->Unref();  // the memory goes once no caller holds an operation
}

void OPTree::Clear() {
  // Break every downward link first, collecting the nodes breadth first
  // (ancestors before descendants), then release them from the back, so
  // that no destructor recurses down or up a long chain. Parent links stay:
  // an operation kept by a caller still knows its path.
  spare_op_.reset();
  std::vector<std::shared_ptr<OPNode>> nodes;
  if (root) nodes.push_back(std::move(root));
  for (size_t i = 0; i < nodes.size(); ++i) {
    OPNode* n = nodes[i].get();
    for (auto& child : n->children) nodes.push_back(std::move(child));
    n->children.clear();
    n->ops.clear();
  }
  ops.clear();
  while (!nodes.empty()) nodes.pop_back();
  last_dir_ = nullptr;
}

void OPTree::BuildTree() {
  LineReader reader;
  VELLIS_THROW_IF(!reader.Open(queue_path), kErrInternal,
                  std::string("Failed to open queue, reason=") + strerror(errno));
  std::string_view line;
  std::string raw;  // reused: one line at a time, no allocation per line
  auto event = std::make_shared<Event>();  // likewise; InsertEvent keeps no reference
  for (;;) {
    LineReader::Status status = reader.Next(&line);
    if (status == LineReader::Status::kEnd) break;
    VELLIS_THROW_IF(status == LineReader::Status::kError, kErrInternal,
                    std::string("Failed to read queue, reason=") + strerror(errno));
    raw.assign(line.data(), line.size());
    if (status == LineReader::Status::kTooLong) {
      VELLIS_LOG_ERRNO("InsertEvent failed, event_raw=%s..., code=%d, reason=%s", raw.c_str(),
                       static_cast<int>(kErrMalformedEvent), "line of 1 MiB or more skipped");
      continue;
    }
    VELLIS_LOG_DEBUG("Got event: %s", raw.c_str());
    try {
      event->Assign(raw);
      InsertEvent(event);
    } catch (const Error& e) {
      VELLIS_LOG_ERRNO("InsertEvent failed, event_raw=%s, code=%d, reason=%s", raw.c_str(),
                       static_cast<int>(e.GetCode()), e.what());
    }
    if (crashed) break;
  }
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  VELLIS_THROW_IF(!IsCanonicalPath(path), kErrNodeByPath, "GetNodeByPath failed, path=" + path);
  const size_t cut = path.rfind('/');
  const std::string_view dir(path.data(), cut);
  OPNode* parent = last_dir_;
  if (parent == nullptr || dir != last_dir_path_) {
    parent = root.get();
    for (size_t start = 1; start < cut;) {
      const size_t end = path.find('/', start);
      parent = ChildOf(parent, std::string_view(path.data() + start, end - start));
      start = end + 1;
    }
    last_dir_ = parent;
    last_dir_path_.assign(dir);
  }
  return ChildOf(parent, std::string_view(path.data() + cut + 1, path.size() - cut - 1))
      ->shared_from_this();
}

OPNode* OPTree::ChildOf(OPNode* node, std::string_view name) {
  if (OPNode* child = node->FindChild(name)) return child;
  node->children.push_back(std::allocate_shared<OPNode>(
      ArenaAllocator<OPNode>(arena_), node->shared_from_this(), std::string(name)));
  return node->children.back().get();
}

void OPTree::TraverseNodeDescendant(std::shared_ptr<OPNode> node,
                                    const std::function<void(std::shared_ptr<OPNode>)>& fn,
                                    bool skip_self) {
  std::vector<std::shared_ptr<OPNode>> children = node->children;
  for (auto& child : children) TraverseNodeDescendant(child, fn, false);
  if (!skip_self) fn(node);
}

unsigned int OPTree::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& fn) {
  if (crashed) {
    VELLIS_LOG_ERR("Queue crashed: %s", queue_path.c_str());
    fn(std::make_shared<OP>(root, FILE_INDEX_OP_CRASH, "", Json::Value()));
    return 1;
  }
  for (size_t i = 0; i < ops.size(); ++i) {
    if (ops[i]->op != FILE_INDEX_OP_NONE) fn(ops[i]);
  }
  return static_cast<unsigned int>(ops.size());
}

std::shared_ptr<OP> OPTree::NewOp(const std::shared_ptr<OPNode>& node) {
  // Most lines of a busy queue merge into work already pending, and their
  // operation is never attached: the next line reuses it rather than leave
  // it unused in the arena.
  if (spare_op_ && spare_op_.use_count() == 1) {
    spare_op_->node = node;
    spare_op_->op = FILE_INDEX_OP_NONE;
    spare_op_->path_old.clear();
    spare_op_->data = Json::Value();
  } else {
    spare_op_ =
        std::allocate_shared<OP>(ArenaAllocator<OP>(arena_), node, FILE_INDEX_OP_NONE, "", Json::Value());
  }
  return spare_op_;
}

void OPTree::Attach(const std::shared_ptr<OP>& op) {
  ops.push_back(op);
  op->node->ops.push_back(op);
}

void OPTree::InsertEvent(std::shared_ptr<Event> event) {
  std::shared_ptr<OPNode> node = GetNodeByPath(event->path);
  // One operation object serves every bit of the line; a later bit's rule
  // may meet it among the node's pending operations and rewrite or cancel it.
  std::shared_ptr<OP> op = NewOp(node);
  const uint32_t bits = event->event;
  if (bits & kEventCreate) {
    if (event->is_dir) {
      HandleReindex(node, op);
    } else {
      HandleCreate(node, op);
    }
  }
  if (bits & kEventAttr) HandleAttr(node, op);
  if (bits & kEventModify) HandleModify(node, op);
  if (bits & kEventDelete) {
    if (event->is_dir) {
      HandleReindex(node, op);
    } else {
      HandleDelete(node, op);
    }
  }
  if (bits & kEventRename) {
    op->path_old = event->path_old;
    HandleRename(node, op);
  }
  if (bits & kEventReindex) HandleReindex(node, op);
  if (bits & kEventUpdateCfg) {
    op->data = event->data;
    HandleUpdateCfg(node, op);
  }
  if (bits & kEventCrash) crashed = true;
}

// In every handler: `op` takes the handler's kind, meets each pending
// operation `e` of the node in attachment order (all of them: a traversal
// does not stop at a match), and is attached when still not cancelled.

void OPTree::HandleCreate(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_UPSERT;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (!IsLive(e)) return;
    switch (e->op) {
      case FILE_INDEX_OP_DELETE:  // a create revives a deleted path
      case FILE_INDEX_OP_ATTR:
        e->op = FILE_INDEX_OP_UPSERT;
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_RENAME:
        break;
      default:
        op->op = FILE_INDEX_OP_NONE;
    }
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleModify(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_UPSERT;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (!IsLive(e)) return;
    switch (e->op) {
      case FILE_INDEX_OP_ATTR:
        e->op = FILE_INDEX_OP_UPSERT;
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_RENAME:
        break;
      default:  // a modify never revives a pending delete
        op->op = FILE_INDEX_OP_NONE;
    }
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleDelete(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_DELETE;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (!IsLive(e)) return;
    switch (e->op) {
      case FILE_INDEX_OP_DELETE:
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_UPSERT:
      case FILE_INDEX_OP_ATTR:
        e->op = FILE_INDEX_OP_DELETE;
        op->op = FILE_INDEX_OP_NONE;
        break;
      default:  // a pending update cfg, rename or reindex stands beside it
        break;
    }
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleAttr(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_ATTR;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (IsLive(e) && e->op != FILE_INDEX_OP_RENAME) op->op = FILE_INDEX_OP_NONE;
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleUpdateCfg(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_UPDATE_CFG;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (!IsLive(e)) return;
    switch (e->op) {
      case FILE_INDEX_OP_UPSERT:
      case FILE_INDEX_OP_ATTR:
        e->op = FILE_INDEX_OP_UPDATE_CFG;
        e->data = op->data;
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_UPDATE_CFG:
        e->MergeData(op->data);
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_RENAME:
        break;
      default:
        op->op = FILE_INDEX_OP_NONE;
    }
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleReindex(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_REINDEX;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (!IsLive(e)) return;
    switch (e->op) {
      case FILE_INDEX_OP_UPSERT:
      case FILE_INDEX_OP_ATTR:
      case FILE_INDEX_OP_UPDATE_CFG:
        e->op = FILE_INDEX_OP_REINDEX;
        op->op = FILE_INDEX_OP_NONE;
        break;
      case FILE_INDEX_OP_RENAME:
        break;
      default:
        op->op = FILE_INDEX_OP_NONE;
    }
  });
  // A reindex swallows the work below it, except renames, which must still
  // move documents.
  TraverseNodeDescendant(
      node,
      [](std::shared_ptr<OPNode> n) {
        for (auto& e : n->ops) {
          if (e->op != FILE_INDEX_OP_RENAME) e->op = FILE_INDEX_OP_NONE;
        }
      },
      true);
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::CarryOver(const std::shared_ptr<OPNode>& from, const std::shared_ptr<OPNode>& to) {
  std::shared_ptr<OP> follow_up;
  ForEachPending(*from, [&](const std::shared_ptr<OP>& e) {
    if (!IsCarriable(e->op)) return;
    const FileIndexOP kind = e->op;
    e->op = FILE_INDEX_OP_NONE;
    // Attaching may grow `from`'s own list (a rename onto itself), which
    // leaves `e` dangling: it is not touched afterwards.
    if (!follow_up) {
      follow_up = NewOp(to);
      Attach(follow_up);
    }
    follow_up->op = kind;
  });
}

void OPTree::HandleRename(const std::shared_ptr<OPNode>& node, const std::shared_ptr<OP>& op) {
  // Resolve the old path first: a bad one refuses the line before anything
  // changes, also the kind of `op` when an earlier bit of the line attached it.
  std::shared_ptr<OPNode> old_node = GetNodeByPath(op->path_old);
  op->op = FILE_INDEX_OP_RENAME;
  // Whatever was pending at the destination is superseded by the moved item.
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (e->op == FILE_INDEX_OP_DELETE || e->op == FILE_INDEX_OP_UPSERT ||
        e->op == FILE_INDEX_OP_ATTR) {
      e->op = FILE_INDEX_OP_NONE;
    }
  });
  // The rename goes first, so that the consumer has moved the documents
  // before it meets any work carried over to paths under the new name.
  Attach(op);
  CarryOver(old_node, node);
  const std::string old_prefix = old_node->GetPath();
  const std::string new_prefix = node->GetPath();
  TraverseNodeDescendant(
      old_node,
      [&](std::shared_ptr<OPNode> d) {
        // The mirror node is made only where there is work to move, so a
        // renamed folder does not copy its whole subtree.
        if (!HasCarriableWork(*d)) return;
        CarryOver(d, GetNodeByPath(new_prefix + d->GetPath().substr(old_prefix.size())));
      },
      true);
}

std::ostream& operator<<(std::ostream& os, const std::shared_ptr<OP>& op) {
  char kind[8];
  snprintf(kind, sizeof(kind), "[%02d] ", static_cast<int>(op->op));
  os << kind;
  if (op->op == FILE_INDEX_OP_RENAME) os << op->path_old << " -> ";
  os << (op->node ? op->node->GetPath() : std::string());
  if (op->op == FILE_INDEX_OP_UPDATE_CFG) os << ", data=" << JsonToString(op->data);
  return os;
}

std::ostream& operator<<(std::ostream& os, const std::shared_ptr<OPNode>& node) {
  os << "Node[" << node->GetPath() << "]: ";
  for (size_t i = 0; i < node->ops.size(); ++i) {
    if (i > 0) os << ", ";
    os << node->ops[i];
  }
  return os;
}

}  // namespace vellis::fileindex
