#include "daemons/monitord/event_router.h"

#include <json/json.h>
#include <unistr.h>

#include "common/json_util.h"
#include "fileindex/optree.h"

namespace vellis::monitord {
namespace {

using fileindex::kEventAttr;
using fileindex::kEventCrash;
using fileindex::kEventCreate;
using fileindex::kEventDelete;
using fileindex::kEventModify;
using fileindex::kEventReindex;
using fileindex::kEventRename;

bool Covers(const std::string& folder, const std::string& path) {
  return path.compare(0, folder.size(), folder) == 0 &&
         (path.size() == folder.size() || path[folder.size()] == '/' || folder == "/");
}

// `text` with every byte outside printable ASCII written \xNN.
std::string Escaped(const std::string& text) {
  std::string out;
  for (unsigned char c : text) {
    if (c >= 0x20 && c < 0x7F && c != '\\') {
      out += static_cast<char>(c);
    } else {
      static const char kHex[] = "0123456789abcdef";
      out += "\\x";
      out += kHex[c >> 4];
      out += kHex[c & 15];
    }
  }
  return out;
}

std::string Parent(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

}  // namespace

EventRouter::EventRouter(RouterOptions options) : options_(options) {}

void EventRouter::SetFolders(std::vector<WatchedFolder> folders) { folders_ = std::move(folders); }

const WatchedFolder* EventRouter::Route(const std::string& path) const {
  const WatchedFolder* best = nullptr;
  for (const WatchedFolder& f : folders_) {
    if (Covers(f.path, path) && (!best || f.path.size() > best->path.size())) best = &f;
  }
  if (!best || best->ignore.empty()) return best;
  // A component below the folder with an ignored name hides everything in it.
  size_t start = best->path.size() + 1;
  while (start < path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    const std::string part = path.substr(start, end - start);
    for (const std::string& name : best->ignore) {
      if (part == name) return nullptr;
    }
    start = end + 1;
  }
  return best;
}

bool EventRouter::Valid(const std::string& path) {
  if (u8_check(reinterpret_cast<const uint8_t*>(path.data()), path.size()) == nullptr) {
    return true;
  }
  ++stats_.skipped_names;
  const std::string dir = Parent(path);
  if (noticed_dirs_.insert(dir).second) {
    notices_.push_back("names that are not UTF-8 are not reported: first " + Escaped(path));
  }
  return false;
}

bool EventRouter::Emit(uint32_t bit, const std::string& path, bool is_dir,
                       const std::string& path_old, bool masked) {
  const WatchedFolder* folder = Route(path);
  if (!folder || (masked && (folder->mask & bit) == 0)) return false;
  if (!Valid(path) || (!path_old.empty() && !Valid(path_old))) return false;
  Json::Value line(Json::objectValue);
  line["event"] = bit;
  line["is_dir"] = is_dir;
  line["path"] = path;
  if (!path_old.empty()) line["path_old"] = path_old;
  lines_[folder->queue] += JsonToString(line) + "\n";
  ++stats_.lines;
  return true;
}

void EventRouter::Moved(const std::string& from, const std::string& to, bool is_dir) {
  const WatchedFolder* a = Route(from);
  const WatchedFolder* b = Route(to);
  if (!is_dir) {
    // A write not yet reported belongs to the new name now.
    auto it = written_.find(from);
    if (it != written_.end()) {
      const int64_t at = it->second;
      written_.erase(it);
      if (b) written_.emplace(to, at);
    }
  }
  const bool from_ok =
      a && u8_check(reinterpret_cast<const uint8_t*>(from.data()), from.size()) == nullptr;
  const bool to_ok =
      b && u8_check(reinterpret_cast<const uint8_t*>(to.data()), to.size()) == nullptr;
  if (from_ok && to_ok && a->queue == b->queue && (a->mask & kEventRename)) {
    Emit(kEventRename, to, is_dir, from);
    return;
  }
  // Either side alone, or two queues: what left and what arrived.
  if (a) from_ok ? Emit(kEventDelete, from, is_dir) : Valid(from);
  if (b) to_ok ? Emit(kEventCreate, to, is_dir) : Valid(to);
}

void EventRouter::SettleMovesAt(const std::string& path) {
  for (auto it = moves_.begin(); it != moves_.end();) {
    if (!Covers(it->path, path) && !Covers(path, it->path)) {
      ++it;
      continue;
    }
    const PendingMove m = *it;
    it = moves_.erase(it);
    Moved(m.path, "", m.is_dir);  // moved out of what is watched
  }
}

void EventRouter::Take(const FsEvent& e, int64_t now_ms) {
  ++stats_.events;
  if (e.kind != FsEventKind::kMovedTo && e.kind != FsEventKind::kOverflow) SettleMovesAt(e.path);
  switch (e.kind) {
    case FsEventKind::kCreate:
      Emit(kEventCreate, e.path, e.is_dir);
      break;
    case FsEventKind::kModify:
      if (!e.is_dir && Route(e.path)) written_.emplace(e.path, now_ms);
      break;
    case FsEventKind::kCloseWrite:
      written_.erase(e.path);
      Emit(kEventModify, e.path, false);
      break;
    case FsEventKind::kAttrib:
      Emit(kEventAttr, e.path, e.is_dir);
      break;
    case FsEventKind::kDelete:
      written_.erase(e.path);
      Emit(kEventDelete, e.path, e.is_dir);
      break;
    case FsEventKind::kMovedFrom:
      if (e.cookie == 0) {
        Moved(e.path, "", e.is_dir);
      } else {
        moves_.push_back({e.cookie, e.path, e.is_dir, now_ms});
      }
      break;
    case FsEventKind::kMovedTo: {
      for (auto it = moves_.begin(); e.cookie != 0 && it != moves_.end(); ++it) {
        if (it->cookie != e.cookie) continue;
        const std::string from = it->path;
        moves_.erase(it);
        SettleMovesAt(e.path);
        Moved(from, e.path, e.is_dir);
        return;
      }
      SettleMovesAt(e.path);
      Moved("", e.path, e.is_dir);  // from outside what is watched
      break;
    }
    case FsEventKind::kOverflow:
      ++stats_.overflows;
      CrashMarker(e.path);
      break;
  }
}

int64_t EventRouter::Flush(int64_t now_ms) {
  while (!moves_.empty() && now_ms - moves_.front().at_ms >= options_.move_grace_ms) {
    PendingMove m = moves_.front();
    moves_.pop_front();
    Moved(m.path, "", m.is_dir);  // moved out of what is watched
  }
  int64_t due = moves_.empty() ? -1 : moves_.front().at_ms + options_.move_grace_ms;
  for (auto it = written_.begin(); it != written_.end();) {
    if (now_ms - it->second >= options_.modify_flush_ms) {
      Emit(kEventModify, it->first, false);
      it = written_.erase(it);
      continue;
    }
    const int64_t at = it->second + options_.modify_flush_ms;
    if (due < 0 || at < due) due = at;
    ++it;
  }
  return due;
}

bool EventRouter::Reindex(const std::string& path) {
  // The monitor's own making good, like the crash marker: no mask holds it.
  return Emit(kEventReindex, path, true, "", false);
}

void EventRouter::CrashMarker(const std::string& root) {
  std::set<std::string> done;
  for (const WatchedFolder& f : folders_) {
    if (!root.empty() && !Covers(root, f.path) && !Covers(f.path, root)) continue;
    if (!done.insert(f.queue).second) continue;
    Json::Value line(Json::objectValue);
    line["event"] = kEventCrash;
    line["path"] = f.path;
    lines_[f.queue] += JsonToString(line) + "\n";
    ++stats_.lines;
  }
}

std::map<std::string, std::string> EventRouter::TakeLines() {
  std::map<std::string, std::string> out;
  out.swap(lines_);
  return out;
}

std::vector<std::string> EventRouter::TakeNotices() {
  std::vector<std::string> out;
  out.swap(notices_);
  return out;
}

}  // namespace vellis::monitord
