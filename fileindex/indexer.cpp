#include "fileindex/indexer.h"

#include <sys/stat.h>
#include <unistr.h>

#include <cstdio>

#include "common/error.h"
#include "common/fs_util.h"
#include "common/log.h"
#include "fileindex/elastic/document_requests.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/tree_walk.h"
#include "fileindex/util.h"
#include "sdk/platform.h"
#include "sdk/share.h"

namespace vellis::fileindex {
namespace {

namespace el = elastic;

// Whether a file's category is indexed by the folder that governs it; a
// type outside the four categories always is.
bool CategoryIndexed(const Folder& folder, const std::string& path) {
  switch (GetFileTypeByFullPath(path)) {
    case kDocument:
      return folder.IsDocument();
    case kAudio:
      return folder.IsAudio();
    case kVideo:
      return folder.IsVideo();
    case kImage:
      return folder.IsPhoto();
    default:
      return true;
  }
}

// True when a component of `path` below `top` is a hidden or preserved
// name (the platform's metadata folders are never indexed, nor what they
// hold).
bool HasPreservedComponent(const std::string& path, const std::string& top) {
  size_t start = StringStartWith(path, top + "/") ? top.size() + 1 : 1;
  while (start < path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    if (IsSystemPreservedFileName(path.substr(start, end - start))) return true;
    start = end + 1;
  }
  return false;
}

// The search daemon takes UTF-8 JSON only: a request that holds another
// name is refused whole, with every other request of its batch.
bool IsUtf8(const std::string& path) {
  return u8_check(reinterpret_cast<const uint8_t*>(path.data()), path.size()) == nullptr;
}

// `path` for messages, each byte that is not UTF-8 written "\xNN".
std::string Printable(const std::string& path) {
  std::string out;
  const uint8_t* at = reinterpret_cast<const uint8_t*>(path.data());
  const uint8_t* end = at + path.size();
  while (at < end) {
    const uint8_t* bad = u8_check(at, end - at);
    if (bad == nullptr) bad = end;
    out.append(reinterpret_cast<const char*>(at), bad - at);
    if (bad == end) break;
    char hex[8];
    snprintf(hex, sizeof(hex), "\\x%02X", *bad);
    out += hex;
    at = bad + 1;
  }
  return out;
}

bool SameCategories(const Folder& a, const Folder& b) {
  return a.IsDocument() == b.IsDocument() && a.IsAudio() == b.IsAudio() &&
         a.IsVideo() == b.IsVideo() && a.IsPhoto() == b.IsPhoto();
}

}  // namespace

// Where a path stands in the folder list and the rules.
struct Indexer::Place {
  std::shared_ptr<Folder> folder;  // the governing folder, or null
  bool exists = false;
  bool is_dir = false;
  bool qualifies = false;  // the index should hold its document
};

Indexer::Indexer(const std::string& share, const FolderMgr& folders, IndexerOptions options)
    : share_(share),
      share_path_(sdk::SDKShare(share).GetPath()),
      folders_(folders),
      options_(options),
      batch_(Json::arrayValue),
      last_commit_(sdk::GetPlatform()->Time()) {}

Indexer::~Indexer() = default;

Indexer::Place Indexer::Judge(const std::string& path, bool check_rules) const {
  Place place;
  struct stat st;
  place.exists = lstat(path.c_str(), &st) == 0;
  if (!place.exists) return place;
  place.is_dir = S_ISDIR(st.st_mode);
  place.folder = folders_.GetMostSuitableCfg(path);
  if (!place.folder || (!place.is_dir && !S_ISREG(st.st_mode))) return place;
  if (HasPreservedComponent(path, share_path_)) return place;
  if (check_rules && CheckFullPathIndexable(path) != IndexRule::kIndexable) return place;
  place.qualifies = place.is_dir || CategoryIndexed(*place.folder, path);
  return place;
}

void Indexer::Failed(const std::string& path, const std::string& reason) {
  ++stats_.failed;
  stats_.errors.push_back(path + ": " + reason);
  while (stats_.errors.size() > options_.errors_kept) stats_.errors.pop_front();
}

void Indexer::Add(Json::Value request) {
  batch_.append(std::move(request));
  dirty_ = true;
  if (batch_.size() >= options_.batch_size) Flush();
}

void Indexer::Flush() {
  if (!batch_.empty()) {
    Json::Value compound(Json::objectValue);
    compound["compound"] = std::move(batch_);
    batch_ = Json::Value(Json::arrayValue);
    el::SendRequestDiscardResult(compound);
  }
  if (hook_) hook_();
}

void Indexer::MaybeCommit() {
  ++ops_since_commit_;
  const int64_t now = sdk::GetPlatform()->Time();
  if (ops_since_commit_ < options_.commit_every_ops &&
      now - last_commit_ < options_.commit_every_seconds) {
    return;
  }
  Finish();
}

void Indexer::Finish() {
  Flush();
  if (dirty_) el::IndexCommit(share_);
  dirty_ = false;
  ops_since_commit_ = 0;
  last_commit_ = sdk::GetPlatform()->Time();
}

void Indexer::Upsert(const std::string& path, bool is_dir) {
  // Directories carry no content; files get theirs, or at least their
  // file-system fields when the extraction fails.
  try {
    Add(el::UpsertRequest(share_, path, !is_dir));
    ++stats_.upserted;
    return;
  } catch (const Error& e) {
    if (e.GetCode() != kErrParseFailed) throw;
  }
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) {  // gone between the look and the read
    Remove(path);
    return;
  }
  try {
    Add(el::UpsertRequest(share_, path, false));
    ++stats_.upserted;
    Failed(path, "content could not be read; indexed by name and attributes");
  } catch (const Error& e) {
    if (e.GetCode() != kErrParseFailed) throw;
    Failed(path, e.what());
  }
}

void Indexer::Remove(const std::string& path) {
  Add(el::DelRequest(share_, path));
  Add(el::DelDirRequest(share_, path));
  ++stats_.deleted;
}

void Indexer::UpsertOne(const std::string& path) {
  const Place place = Judge(path, true);
  if (place.qualifies) {
    Upsert(path, place.is_dir);
  } else {
    Remove(path);
  }
}

// Memory stays bounded in a round of many renames; beyond this the next
// crawl makes good what is missed.
constexpr size_t kLostRenamesKept = 10000;

void Indexer::Rename(const std::string& path, const std::string& old_path) {
  const Place now = Judge(path, true);
  std::shared_ptr<Folder> before = folders_.GetMostSuitableCfg(old_path);
  if (!now.exists) {
    // Gone again before this round: deleted, or renamed on. What is stored
    // goes (nothing stale stays); should a later rename of a folder above
    // it bring it back, that rename indexes it at its last place.
    Remove(old_path);
    if (lost_renames_.size() < kLostRenamesKept) lost_renames_.push_back(path);
    return;
  }
  if (now.qualifies && before && SameCategories(*before, *now.folder) &&
      CanFullPathBeIndexed(Dirname(old_path))) {
    // Both places index alike: the documents move with the item.
    Flush();
    try {
      el::IndexRename(share_, path, old_path);
      ++stats_.renamed;
      if (now.is_dir) FindLostRenames(path, old_path);
      return;
    } catch (const Error& e) {
      // Nothing stored at the old place: a rename carried out before (a
      // round repeated, or reported twice), or never indexed. Indexing the
      // new place makes it right either way.
      if (e.GetCode() != el::kErrNoSuchDocument) throw;
    }
  }
  Remove(old_path);
  if (!now.qualifies) {
    if (now.exists) Remove(path);
  } else if (now.is_dir) {
    Crawl(path);
  } else {
    Upsert(path, false);
  }
}

void Indexer::FindLostRenames(const std::string& path, const std::string& old_path) {
  for (auto it = lost_renames_.begin(); it != lost_renames_.end();) {
    if (!StringStartWith(*it, old_path + "/")) {
      ++it;
      continue;
    }
    *it = path + it->substr(old_path.size());
    struct stat st;
    if (lstat(it->c_str(), &st) != 0) {
      ++it;  // moved on again: a later rename may still find it
      continue;
    }
    const std::string found = *it;
    it = lost_renames_.erase(it);
    if (S_ISDIR(st.st_mode)) {
      Crawl(found);
    } else {
      UpsertOne(found);
    }
  }
}

void Indexer::Execute(const OP& op) {
  const std::string path = op.node->GetPath();
  switch (op.op) {
    case FILE_INDEX_OP_NONE:
      return;
    case FILE_INDEX_OP_DELETE:
      Remove(path);
      break;
    case FILE_INDEX_OP_UPSERT:
      UpsertOne(path);
      break;
    case FILE_INDEX_OP_ATTR: {
      const Place place = Judge(path, true);
      if (!place.qualifies) {
        Remove(path);
      } else {
        Add(el::AttrRequest(share_, path));
      }
      break;
    }
    case FILE_INDEX_OP_RENAME:
      Rename(path, op.path_old);
      break;
    case FILE_INDEX_OP_REINDEX:
    case FILE_INDEX_OP_UPDATE_CFG: {
      struct stat st;
      if (lstat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) {
        Crawl(path);
      } else {
        UpsertOne(path);
      }
      break;
    }
    case FILE_INDEX_OP_CRASH:
      Crawl(share_path_);
      break;
  }
  ++stats_.operations;
  MaybeCommit();
}

void Indexer::Crawl(const std::string& root) {
  stats_.crawling = root;
  // The root itself: a root that does not qualify takes its subtree along,
  // but for the share's own folder, which may only lead to indexed ones.
  const Place top = Judge(root, true);
  if (!top.exists || !top.is_dir || (!top.qualifies && root != share_path_)) {
    UpsertOne(root);
    stats_.crawling.clear();
    return;
  }
  if (top.qualifies) Upsert(root, true);

  // Paths below the root that may hold documents: under an indexed folder,
  // or on the way to one.
  std::vector<std::string> folder_roots;
  for (const std::shared_ptr<Folder>& f : folders_.GetFolders()) {
    if (StringStartWith(f->GetFullPath() + "/", root + "/"))
      folder_roots.push_back(f->GetFullPath());
  }
  auto choose = [&](const std::string& dir) {
    TreeWalk::DirChoice choice{false, false};
    if (IsSystemPreservedFileName(Basename(dir))) return choice;
    bool on_the_way = false;
    for (const std::string& f : folder_roots) on_the_way |= StringStartWith(f, dir + "/");
    const bool indexed = folders_.IsFullPathIndexed(dir);
    if (!indexed && !on_the_way) return choice;
    if (CheckFullPathIndexable(dir) != IndexRule::kIndexable) return choice;
    return TreeWalk::DirChoice{indexed, IsUtf8(dir)};
  };

  // Merge the walk with the stored documents, both in path byte order.
  TreeWalk walker(root, choose);
  const std::vector<std::string> fields = {elastic::kQORUMDFSSize,
                                           elastic::kQORUMDFSContentChangeDate};
  Json::Value page(Json::arrayValue);
  Json::ArrayIndex at = 0;
  std::string after;
  bool stored_done = false;
  // The stored document at the head of the list, or null at its end.
  auto head = [&]() -> const Json::Value* {
    while (!stored_done && at == page.size()) {
      page = el::IndexGetPage(share_, root, after, options_.page_size, fields);
      at = 0;
      stored_done = page.empty();
      if (!page.empty()) after = page[page.size() - 1][elastic::kQORUMDPath].asString();
    }
    return stored_done ? nullptr : &page[at];
  };
  auto head_path = [&](const Json::Value* doc) { return (*doc)[elastic::kQORUMDPath].asString(); };

  WalkEntry entry;
  bool more = walker.Next(&entry);
  for (;;) {
    const Json::Value* doc = head();
    if (!more && doc == nullptr) break;
    if (doc != nullptr && (!more || head_path(doc) < entry.path)) {
      Remove(head_path(doc));  // stored, but no longer there
      ++at;
      continue;
    }
    if (!IsUtf8(entry.path)) {  // nor what lies below: it is not walked
      Failed(Printable(entry.path), "name is not UTF-8; not indexed");
      more = walker.Next(&entry);
      continue;
    }
    if (entry.kind == WalkEntry::Kind::kUnreadable) {
      // Unknown, not gone: what is stored at and below it stays.
      Failed(entry.path, "directory could not be read; its documents are kept");
      const std::string below = entry.path + "/";
      while ((doc = head()) != nullptr &&
             (head_path(doc) == entry.path || StringStartWith(head_path(doc), below))) {
        ++at;
      }
      more = walker.Next(&entry);
      continue;
    }
    ++stats_.crawled;
    bool wanted = entry.kind == WalkEntry::Kind::kDir;
    if (entry.kind == WalkEntry::Kind::kFile && !IsSystemPreservedFileName(Basename(entry.path))) {
      std::shared_ptr<Folder> folder = folders_.GetMostSuitableCfg(entry.path);
      wanted = folder && CategoryIndexed(*folder, entry.path);
    }
    const bool stored = doc != nullptr && head_path(doc) == entry.path;
    if (stored) ++at;
    if (!wanted) {
      if (stored) Remove(entry.path);
    } else if (stored && (*doc)[elastic::kQORUMDFSSize].asInt64() == entry.size &&
               (*doc)[elastic::kQORUMDFSContentChangeDate].asInt64() == entry.mtime) {
      ++stats_.unchanged;
    } else {
      Upsert(entry.path, entry.kind == WalkEntry::Kind::kDir);
    }
    more = walker.Next(&entry);
  }
  stats_.crawling.clear();
}

}  // namespace vellis::fileindex
