#include "fileindex/optree.h"

#include <cerrno>
#include <cstring>
#include <functional>

#include "common/json_util.h"
#include "common/line_reader.h"
#include "common/log.h"

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

Event::Event(const std::string& event_raw) {
  Json::Value root;
  VELLIS_THROW_IF(!JsonFromString(root, event_raw), kErrMalformedEvent,
                  "Malformed event_raw: " + event_raw);
  GetJsonValue(event, root, "event", true);
  GetJsonValue(is_dir, root, "is_dir", false);
  GetJsonValue(path, root, "path", true);
  GetJsonValue(path_old, root, "path_old", false);
  GetJsonValue(data, root, "data", false);
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

std::shared_ptr<OPNode> OPNode::GetChild(const std::string& child_name) {
  for (const auto& c : children) {
    if (c->name == child_name) return c;
  }
  children.push_back(std::make_shared<OPNode>(shared_from_this(), child_name));
  return children.back();
}

void OPNode::TraverseOP(const std::function<void(std::shared_ptr<OP>)>& fn) {
  // Index-based: a rule may attach to this very node while it is walked; the
  // operations attached meanwhile are not visited.
  for (size_t i = 0, n = ops.size(); i < n; ++i) fn(ops[i]);
}

namespace {

// Slots tag the unused top 16 bits of a user-space pointer.
static_assert(sizeof(uintptr_t) == 8, "the path index tags 64-bit pointers");
constexpr int kTagShift = 48;
constexpr uintptr_t kPointerMask = (uintptr_t{1} << kTagShift) - 1;

// Whether the node's full path is `path`, compared component by component
// up the parent chain.
bool PathEquals(const OPNode* n, std::string_view path) {
  size_t end = path.size();
  for (; n->parent; n = n->parent.get()) {
    const size_t len = n->name.size();
    if (end < len + 1 || path[end - len - 1] != '/' ||
        memcmp(path.data() + end - len, n->name.data(), len) != 0) {
      return false;
    }
    end -= len + 1;
  }
  return end == 0;
}

}  // namespace

uint32_t OPTree::PathIndex::Hash(std::string_view path) {
  uint64_t h = std::hash<std::string_view>()(path);
  h ^= h >> 33;
  h *= 0xff51afd7ed558ccdULL;
  h ^= h >> 33;
  return static_cast<uint32_t>(h);
}

// The slot tag: 16 bits of the hash, mixed apart from the low bits that pick
// the slot.
uintptr_t OPTree::PathIndex::Tag(uint32_t hash) {
  return static_cast<uintptr_t>((hash * 0x9E3779B1u) >> 16) << kTagShift;
}

OPNode* OPTree::PathIndex::Find(std::string_view path, uint32_t hash) const {
  if (slots_.empty()) return nullptr;
  const size_t mask = slots_.size() - 1;
  const uintptr_t tag = Tag(hash);
  for (size_t i = hash & mask;; i = (i + 1) & mask) {
    const uintptr_t slot = slots_[i];
    if (slot == 0) return nullptr;
    if ((slot & ~kPointerMask) == tag) {
      OPNode* n = reinterpret_cast<OPNode*>(slot & kPointerMask);
      if (PathEquals(n, path)) return n;
    }
  }
}

void OPTree::PathIndex::Insert(OPNode* node, uint32_t hash) {
  // Linear probing stays short below three quarters full, and the tags
  // spare most probes a visit to the node.
  if ((used_ + 1) * 4 > slots_.size() * 3) {
    std::vector<uintptr_t> old;
    old.swap(slots_);
    slots_.assign(old.empty() ? 1024 : old.size() * 2, 0);
    used_ = 0;
    for (uintptr_t slot : old) {
      if (slot != 0) {
        OPNode* n = reinterpret_cast<OPNode*>(slot & kPointerMask);
        Insert(n, n->path_hash_);
      }
    }
  }
  node->path_hash_ = hash;
  const size_t mask = slots_.size() - 1;
  size_t i = hash & mask;
  while (slots_[i] != 0) i = (i + 1) & mask;
  slots_[i] = Tag(hash) | (reinterpret_cast<uintptr_t>(node) & kPointerMask);
  ++used_;
}

OPTree::OPTree(const std::string& path)
    : queue_path(path), root(std::make_shared<OPNode>(nullptr, std::string())) {
  try {
    BuildTree();
  } catch (...) {
    Clear();  // no destructor runs for a tree whose constructor throws
    throw;
  }
}

OPTree::~OPTree() { Clear(); }

void OPTree::Clear() {
  // Break every downward link first, collecting the nodes breadth first
  // (ancestors before descendants), then release them from the back, so
  // that no destructor recurses down or up a long chain. Parent links stay:
  // an operation kept by a caller still knows its path.
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
}

void OPTree::BuildTree() {
  LineReader reader;
  VELLIS_THROW_IF(!reader.Open(queue_path), kErrInternal,
                  std::string("Failed to open queue, reason=") + strerror(errno));
  std::string_view line;
  std::string raw;  // reused: one line at a time, no allocation per line
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
      InsertEvent(std::make_shared<Event>(raw));
    } catch (const Error& e) {
      VELLIS_LOG_ERRNO("InsertEvent failed, event_raw=%s, code=%d, reason=%s", raw.c_str(),
                       static_cast<int>(e.GetCode()), e.what());
    }
    if (crashed) break;
  }
}

std::shared_ptr<OPNode> OPTree::GetNodeByPath(const std::string& path) {
  VELLIS_THROW_IF(!IsCanonicalPath(path), kErrNodeByPath, "GetNodeByPath failed, path=" + path);
  const uint32_t hash = PathIndex::Hash(path);
  if (OPNode* n = index_.Find(path, hash)) return n->shared_from_this();
  // Find the deepest ancestor that exists, then create the rest below it.
  OPNode* node = root.get();
  size_t start = 1;
  for (size_t cut = path.rfind('/'); cut > 0; cut = path.rfind('/', cut - 1)) {
    std::string_view prefix(path.data(), cut);
    if (OPNode* n = index_.Find(prefix, PathIndex::Hash(prefix))) {
      node = n;
      start = cut + 1;
      break;
    }
  }
  bool found_unindexed = false;
  while (start <= path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    const std::string_view prefix(path.data(), end);
    const uint32_t prefix_hash = end == path.size() ? hash : PathIndex::Hash(prefix);
    // A child made with OPNode::GetChild is not in the index yet; it must be
    // found, not made a second time. Once such children were indexed, the
    // rest of the path may exist below them.
    if (IndexNewChildren(node)) found_unindexed = true;
    OPNode* child = found_unindexed ? index_.Find(prefix, prefix_hash) : nullptr;
    if (child == nullptr) {
      node->children.push_back(std::make_shared<OPNode>(
          node->shared_from_this(), std::string(path.data() + start, end - start)));
      child = node->children.back().get();
      index_.Insert(child, prefix_hash);
      node->indexed_children_ = node->children.size();
    }
    node = child;
    start = end + 1;
  }
  return node->shared_from_this();
}

bool OPTree::IndexNewChildren(OPNode* node) {
  bool added = false;
  for (; node->indexed_children_ < node->children.size(); ++node->indexed_children_) {
    OPNode* child = node->children[node->indexed_children_].get();
    index_.Insert(child, PathIndex::Hash(child->GetPath()));
    IndexNewChildren(child);
    added = true;
  }
  return added;
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

void OPTree::Attach(const std::shared_ptr<OP>& op) {
  ops.push_back(op);
  op->node->ops.push_back(op);
}

void OPTree::InsertEvent(std::shared_ptr<Event> event) {
  std::shared_ptr<OPNode> node = GetNodeByPath(event->path);
  // One operation object serves every bit of the line; a later bit's rule
  // may meet it among the node's pending operations and rewrite or cancel it.
  auto op = std::make_shared<OP>(node, FILE_INDEX_OP_NONE, "", Json::Value());
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
  auto follow_up = std::make_shared<OP>(to, FILE_INDEX_OP_NONE, "", Json::Value());
  bool attached = false;
  ForEachPending(*from, [&](const std::shared_ptr<OP>& e) {
    if (!IsCarriable(e->op)) return;
    follow_up->op = e->op;
    e->op = FILE_INDEX_OP_NONE;
    if (!attached) {
      Attach(follow_up);
      attached = true;
    }
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
