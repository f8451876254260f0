#include "fileindex/optree.h"

#include <algorithm>
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

constexpr size_t kReadAheadBytes = 64 * 1024;

constexpr const char* kCategoryKeys[] = {"document", "audio", "video", "photo"};

bool IsLive(const std::shared_ptr<OP>& e) {
  // Cancelled and crash operations are never touched by a merge rule.
  return e->op != FILE_INDEX_OP_NONE && e->op != FILE_INDEX_OP_CRASH;
}

// A path component that names no entry of its own folder.
bool IsRefusedName(std::string_view name) {
  return name.empty() || name == "." || name == "..";
}

// The textual equivalent of "rebuilding the node's path gives the path back":
// "/" followed by non-empty components separated by single slashes. "." and
// ".." components are refused as well, so that no event names a path that
// resolves elsewhere.
bool IsCanonicalPath(std::string_view path) {
  if (path.size() < 2 || path.size() > OPTree::kMaxPathBytes || path[0] != '/') return false;
  for (size_t start = 1;;) {
    const size_t end = std::min(path.find('/', start), path.size());
    if (IsRefusedName(path.substr(start, end - start))) return false;
    if (end == path.size()) return true;
    start = end + 1;
  }
}

// Visits the operations pending on `node` when the visit starts, in
// attachment order; a rule may attach to this very node meanwhile, and what
// it attaches is not visited.
template <typename Fn>
void ForEachPending(const OPNode& node, const Fn& fn) {
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

// The members of a queue line that an event reads.
struct EventMembers {
  const Json::Value* event = nullptr;
  const Json::Value* is_dir = nullptr;
  const Json::Value* path = nullptr;
  const Json::Value* path_old = nullptr;
  Json::Value* data = nullptr;
};

// Finds them in one walk over the object: a line has three to five members,
// and a walk costs less than five map lookups.
EventMembers FindEventMembers(Json::Value& root) {
  EventMembers m;
  const auto end = root.end();
  for (auto it = root.begin(); it != end; ++it) {
    const char* name_end = nullptr;
    const char* name = it.memberName(&name_end);
    const std::string_view key(name, static_cast<size_t>(name_end - name));
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

// Copies a string member into `out`'s existing storage; false when `v` is
// missing or not a string.
bool AssignString(std::string& out, const Json::Value* v) {
  const char* begin = nullptr;
  const char* end = nullptr;
  if (v == nullptr || !v->getString(&begin, &end)) return false;
  out.assign(begin, static_cast<size_t>(end - begin));
  return true;
}

// Fills `e` from `root`, the line `event_raw` as JsonFromChars left it
// (`line_is_json` is what it returned); takes the line's data out of `root`.
void ReadEvent(Event& e, bool line_is_json, Json::Value& root, std::string_view event_raw) {
  VELLIS_THROW_IF(!line_is_json, kErrMalformedEvent,
                  "Malformed event_raw: " + std::string(event_raw));
  // A member of its usual type is read in place; anything else (not an
  // object, a missing member, another type) goes to the JSON helper, which
  // converts, keeps the default or throws as it always does.
  EventMembers m;
  if (root.type() == Json::objectValue) m = FindEventMembers(root);
  if (m.event != nullptr && m.event->isUInt()) {
    e.event = m.event->asUInt();
  } else {
    GetJsonValue(e.event, root, "event", true);
  }
  e.is_dir = false;
  if (m.is_dir != nullptr && m.is_dir->type() == Json::booleanValue) {
    e.is_dir = m.is_dir->asBool();
  } else if (m.is_dir != nullptr) {
    GetJsonValue(e.is_dir, root, "is_dir", false);
  }
  if (!AssignString(e.path, m.path)) GetJsonValue(e.path, root, "path", true);
  e.path_old.clear();
  if (m.path_old != nullptr && !AssignString(e.path_old, m.path_old)) {
    GetJsonValue(e.path_old, root, "path_old", false);
  }
  // The parsed line is ours: its data moves rather than being copied.
  if (m.data != nullptr) {
    e.data.swap(*m.data);
  } else if (e.data.type() != Json::nullValue) {
    e.data = Json::Value();
  }
}

}  // namespace

void Event::Assign(const std::string& event_raw) {
  Json::Value root;
  const bool parsed = JsonFromChars(root, event_raw);
  ReadEvent(*this, parsed, root, event_raw);
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

OPNode::~OPNode() {
  // Dropping the last reference to a deep node (an operation a caller kept
  // after the tree is gone) frees its chain of parents: one at a time here,
  // rather than each from the destructor of the one below.
  std::shared_ptr<OPNode> up = std::move(parent);
  while (up && up.use_count() == 1) up = std::move(up->parent);
}

// Up to this many children, a scan beats an index. Each child scanned is
// likely a cache miss of its own, so the index takes over early.
constexpr size_t kScannedChildren = 4;

OPNode* OPNode::FindChild(std::string_view child_name) {
  if (!child_index_) {
    if (children.size() <= kScannedChildren) {
      for (const auto& c : children) {
        if (c->name == child_name) return c.get();
      }
      return nullptr;
    }
    child_index_ = ChildIndex::Make();
  }
  IndexAppendedChildren();
  return child_index_->Find(child_name, ChildIndex::Hash(child_name));
}

void OPNode::IndexAppendedChildren() {
  // A repeated name keeps its first child.
  for (; child_index_->indexed < children.size(); ++child_index_->indexed) {
    OPNode* c = children[child_index_->indexed].get();
    const uint32_t hash = ChildIndex::Hash(c->name);
    if (child_index_->Find(c->name, hash) == nullptr) ChildIndex::Insert(child_index_, c, hash);
  }
}

OPNode* OPNode::AppendChild(std::shared_ptr<OPNode> child) {
  children.push_back(std::move(child));
  // A new child joins the index at once, while its name is at hand.
  if (child_index_) IndexAppendedChildren();
  return children.back().get();
}

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& child_name) {
  if (OPNode* c = FindChild(child_name)) return c->shared_from_this();
  AppendChild(std::make_shared<OPNode>(shared_from_this(), child_name));
  return children.back();
}

void OPNode::TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn) {
  ForEachPending(*this, fn);
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
  spare_op_.reset();
  ops.clear();
  last_node_ = nullptr;
  last_folder_ = nullptr;
  if (!root) return;
  // Newest node first. Its own children are newer, so they are gone by now
  // and it is the last child of its parent: dropping it there frees it while
  // it is in the cache, and only drops a reference to its parent, so no
  // destructor recurses down or up a long chain. A node that a caller still
  // holds lives on with its parent link, so an operation kept by a caller
  // still knows its path.
  for (size_t i = created_.size(); i-- > 0;) {
    // What the coming nodes will touch is fetched in two steps, each once
    // the step before has had time to arrive: their parents and operation
    // lists, then their slots in the parents' lists and their operations.
    if (i >= 4) {
      if (const OPNode* parent = created_[i - 4]->parent.get()) {
        __builtin_prefetch(&parent->children);
      }
      __builtin_prefetch(created_[i - 4]->ops.data());
    }
    if (i >= 2) {
      const OPNode* next = created_[i - 2];
      if (next->parent && !next->parent->children.empty()) {
        __builtin_prefetch(&next->parent->children.back());
      }
      if (!next->ops.empty()) __builtin_prefetch(next->ops.front().get());
    }
    OPNode* node = created_[i];
    node->ops.clear();
    // A parent link a caller cleared leaves the node to the pass below.
    if (node->parent == nullptr) continue;
    auto& siblings = node->parent->children;
    if (node->children.empty() && !siblings.empty() && siblings.back().get() == node) {
      siblings.pop_back();
    }
  }
  created_.clear();
  // Nodes made outside the tree (OPNode::GetChild), and the nodes above and
  // before them, are still linked: depth first, with an explicit stack, for
  // the same reason. Each node's children are dropped, so that no parent
  // and child keep each other alive.
  struct Frame {
    OPNode* node;
    size_t next;  // the next child to descend into
  };
  std::vector<Frame> stack;
  root->ops.clear();
  stack.push_back({root.get(), 0});
  while (!stack.empty()) {
    Frame& top = stack.back();
    const auto& children = top.node->children;
    if (top.next < children.size()) {
      OPNode* child = children[top.next++].get();
      child->ops.clear();
      stack.push_back({child, 0});
    } else {
      top.node->children.clear();
      stack.pop_back();
    }
  }
  root.reset();
}

void OPTree::BuildTree() {
  LineReader reader;
  VELLIS_THROW_IF(!reader.Open(queue_path), kErrInternal,
                  std::string("Failed to open queue, reason=") + strerror(errno));
  // Lines are read and parsed a batch at a time, and then folded in order.
  // The parser and the tree each stay in the instruction cache for a whole
  // batch, where one line at a time they evict each other. Everything that
  // logs or throws happens while folding, with errno as reading and parsing
  // that line left it, so the log (and its "[err: ...]") reads as if each
  // line were read, parsed and folded in turn; nothing after a crash marker
  // is folded or logged.
  struct LineAhead {
    size_t offset, size;  // the line's text in `text`
    LineReader::Status status;
    bool parsed;  // whether `root` holds the parsed line
    int read_errno;  // errno that reading and parsing the line set, or 0
    Json::Value root;
  };
  std::vector<LineAhead> ahead(kLinesReadAhead);
  std::string text;  // the batch's lines, one after the other
  Event event;       // reused: one line at a time
  for (;;) {
    text.clear();
    size_t n = 0;
    LineReader::Status status = LineReader::Status::kLine;
    int read_errno = 0;
    const int fold_errno = errno;
    // A batch also ends after 64 KiB, so that lines near the length limit
    // are held one or two at a time, not 32.
    while (n < ahead.size() && text.size() < kReadAheadBytes) {
      std::string_view line;
      errno = 0;
      status = reader.Next(&line);
      if (status == LineReader::Status::kEnd) break;
      if (status == LineReader::Status::kError) {
        read_errno = errno;
        break;
      }
      LineAhead& l = ahead[n++];
      l.offset = text.size();
      l.size = line.size();
      l.status = status;
      text.append(line);
      l.parsed = status == LineReader::Status::kLine &&
                 JsonFromChars(l.root, std::string_view(text.data() + l.offset, l.size));
      l.read_errno = errno;
    }
    errno = fold_errno;
    for (size_t i = 0; i < n; ++i) {
      LineAhead& l = ahead[i];
      const std::string_view raw(text.data() + l.offset, l.size);
      if (l.read_errno != 0) errno = l.read_errno;
      if (l.status == LineReader::Status::kTooLong) {
        VELLIS_LOG_ERRNO("InsertEvent failed, event_raw=%s..., code=%d, reason=%s",
                         std::string(raw).c_str(), static_cast<int>(kErrMalformedEvent),
                         "line of 1 MiB or more skipped");
        continue;
      }
      VELLIS_LOG_DEBUG("Got event: %s", std::string(raw).c_str());
      try {
        ReadEvent(event, l.parsed, l.root, raw);
        Insert(event);
      } catch (const Error& e) {
        VELLIS_LOG_ERRNO("InsertEvent failed, event_raw=%s, code=%d, reason=%s",
                         std::string(raw).c_str(), static_cast<int>(e.GetCode()), e.what());
      }
      if (crashed) return;
    }
    if (status == LineReader::Status::kError) errno = read_errno;
    VELLIS_THROW_IF(status == LineReader::Status::kError, kErrInternal,
                    std::string("Failed to read queue, reason=") + strerror(errno));
    if (status == LineReader::Status::kEnd) return;
  }
}

OPNode* OPTree::NodeByPath(const std::string& path) {
  // Half the lines of a busy queue name the path of the line before (a new
  // file is created, written and has its times set), and most of the rest
  // name another file of its folder. Those parts were checked when the path
  // before was looked up.
  if (last_node_ != nullptr && path == last_path_) return last_node_;
  const size_t cut = path.rfind('/');
  OPNode* parent = last_folder_;
  if (last_node_ != nullptr && cut == last_cut_ && path.size() <= kMaxPathBytes &&
      path.compare(0, cut, last_path_, 0, cut) == 0) {
    // Only the name, what follows the last slash, is new.
    VELLIS_THROW_IF(IsRefusedName(std::string_view(path).substr(cut + 1)), kErrNodeByPath,
                    "GetNodeByPath failed, path=" + path);
  } else {
    VELLIS_THROW_IF(!IsCanonicalPath(path), kErrNodeByPath, "GetNodeByPath failed, path=" + path);
    parent = root.get();
    for (size_t start = 1; start < cut;) {
      const size_t end = path.find('/', start);
      parent = ChildOf(parent, std::string_view(path.data() + start, end - start));
      start = end + 1;
    }
  }
  last_node_ = ChildOf(parent, std::string_view(path.data() + cut + 1, path.size() - cut - 1));
  last_folder_ = parent;
  last_path_ = path;
  last_cut_ = cut;
  return last_node_;
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  return NodeByPath(path)->shared_from_this();
}

OPNode* OPTree::ChildOf(OPNode* node, std::string_view name) {
  if (OPNode* child = node->FindChild(name)) return child;
  OPNode* child = node->AppendChild(std::allocate_shared<OPNode>(
      ArenaAllocator<OPNode>(arena_), node->shared_from_this(), std::string(name)));
  created_.push_back(child);
  return child;
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

std::shared_ptr<OP> OPTree::NewOp(OPNode* node) {
  // Most lines of a busy queue merge into work already pending, and their
  // operation is never attached: the next line reuses it (see Recycle),
  // rather than leave it unused in the arena. The spare is moved, not
  // copied, and keeps its node when the line names the same path, so that
  // such a line touches no reference count.
  std::shared_ptr<OP> op = std::move(spare_op_);
  if (op && op.use_count() == 1) {
    if (op->node.get() != node) op->node = node->shared_from_this();
    op->op = FILE_INDEX_OP_NONE;
    op->path_old.clear();
    if (op->data.type() != Json::nullValue) op->data = Json::Value();
  } else {
    static const std::string kNoPath;
    static const Json::Value kNoData;
    op = std::allocate_shared<OP>(ArenaAllocator<OP>(arena_), node->shared_from_this(),
                                  FILE_INDEX_OP_NONE, kNoPath, kNoData);
  }
  return op;
}

void OPTree::Recycle(std::shared_ptr<OP> op) {
  if (op.use_count() == 1) spare_op_ = std::move(op);
}

void OPTree::Attach(const std::shared_ptr<OP>& op) {
  ops.push_back(op);
  op->node->ops.push_back(op);
}

void OPTree::InsertEvent(std::shared_ptr<Event> event) { Insert(*event); }

void OPTree::Insert(const Event& event) {
  OPNode* node = NodeByPath(event.path);
  // One operation object serves every bit of the line; a later bit's rule
  // may meet it among the node's pending operations and rewrite or cancel it.
  std::shared_ptr<OP> op = NewOp(node);
  const uint32_t bits = event.event;
  if (bits & kEventCreate) {
    if (event.is_dir) {
      HandleReindex(node, op);
    } else {
      HandleCreate(node, op);
    }
  }
  if (bits & kEventAttr) HandleAttr(node, op);
  if (bits & kEventModify) HandleModify(node, op);
  if (bits & kEventDelete) {
    if (event.is_dir) {
      HandleReindex(node, op);
    } else {
      HandleDelete(node, op);
    }
  }
  if (bits & kEventRename) {
    op->path_old = event.path_old;
    HandleRename(node, op);
  }
  if (bits & kEventReindex) HandleReindex(node, op);
  if (bits & kEventUpdateCfg) {
    op->data = event.data;
    HandleUpdateCfg(node, op);
  }
  if (bits & kEventCrash) crashed = true;
  Recycle(std::move(op));
}

// In every handler: `op` takes the handler's kind, meets each pending
// operation `e` of the node in attachment order (all of them: a traversal
// does not stop at a match), and is attached when still not cancelled.

void OPTree::HandleCreate(OPNode* node, const std::shared_ptr<OP>& op) {
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

void OPTree::HandleModify(OPNode* node, const std::shared_ptr<OP>& op) {
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

void OPTree::HandleDelete(OPNode* node, const std::shared_ptr<OP>& op) {
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

void OPTree::HandleAttr(OPNode* node, const std::shared_ptr<OP>& op) {
  op->op = FILE_INDEX_OP_ATTR;
  ForEachPending(*node, [&](const std::shared_ptr<OP>& e) {
    if (IsLive(e) && e->op != FILE_INDEX_OP_RENAME) op->op = FILE_INDEX_OP_NONE;
  });
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::HandleUpdateCfg(OPNode* node, const std::shared_ptr<OP>& op) {
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

void OPTree::HandleReindex(OPNode* node, const std::shared_ptr<OP>& op) {
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
      node->shared_from_this(),
      [](std::shared_ptr<OPNode> n) {
        for (auto& e : n->ops) {
          if (e->op != FILE_INDEX_OP_RENAME) e->op = FILE_INDEX_OP_NONE;
        }
      },
      true);
  if (op->op != FILE_INDEX_OP_NONE) Attach(op);
}

void OPTree::CarryOver(OPNode* from, OPNode* to) {
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

void OPTree::HandleRename(OPNode* node, const std::shared_ptr<OP>& op) {
  // Resolve the old path first: a bad one refuses the line before anything
  // changes, also the kind of `op` when an earlier bit of the line attached it.
  OPNode* old_node = NodeByPath(op->path_old);
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
  if (old_node->children.empty()) return;  // a file: nothing below it to carry
  const std::string old_prefix = old_node->GetPath();
  const std::string new_prefix = node->GetPath();
  TraverseNodeDescendant(
      old_node->shared_from_this(),
      [&](std::shared_ptr<OPNode> d) {
        // The mirror node is made only where there is work to move, so a
        // renamed folder does not copy its whole subtree.
        if (!HasCarriableWork(*d)) return;
        CarryOver(d.get(), NodeByPath(new_prefix + d->GetPath().substr(old_prefix.size())));
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
