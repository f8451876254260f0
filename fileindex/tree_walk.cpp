#include "fileindex/tree_walk.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace vellis::fileindex {

// One entry of a listed directory: its own path, or (key ending in "/") the
// subtree below it.
struct TreeWalk::Item {
  std::string key;
  bool subtree = false;
  WalkEntry entry;
};

struct TreeWalk::Frame {
  std::vector<Item> items;
  size_t next = 0;
};

TreeWalk::TreeWalk(const std::string& root, ChooseDir choose) : choose_(std::move(choose)) {
  Push(root);
}

TreeWalk::~TreeWalk() = default;

void TreeWalk::Push(const std::string& dir) {
  Frame frame;
  int fd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  DIR* d = fd >= 0 ? fdopendir(fd) : nullptr;
  if (d == nullptr) {
    if (fd >= 0) close(fd);
    if (errno != ENOENT) {
      Item unreadable;
      unreadable.entry.path = dir;
      unreadable.entry.kind = WalkEntry::Kind::kUnreadable;
      frame.items.push_back(std::move(unreadable));
    }
    stack_.push_back(std::move(frame));
    return;
  }
  while (dirent* de = readdir(d)) {
    const char* name = de->d_name;
    if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0) continue;
    struct stat st;
    if (fstatat(dirfd(d), name, &st, AT_SYMLINK_NOFOLLOW) != 0) continue;  // gone meanwhile
    Item self;
    self.key = name;
    self.entry.path = dir + "/" + name;
    self.entry.size = st.st_size;
    self.entry.mtime = st.st_mtime;
    if (S_ISDIR(st.st_mode)) {
      self.entry.kind = WalkEntry::Kind::kDir;
      const DirChoice choice = choose_(self.entry.path);
      if (choice.descend) {
        Item below;
        below.key = self.key + "/";
        below.subtree = true;
        below.entry.path = self.entry.path;
        frame.items.push_back(std::move(below));
      }
      if (!choice.report) continue;
    } else {
      self.entry.kind = S_ISREG(st.st_mode) ? WalkEntry::Kind::kFile : WalkEntry::Kind::kOther;
    }
    frame.items.push_back(std::move(self));
  }
  closedir(d);
  std::sort(frame.items.begin(), frame.items.end(),
            [](const Item& a, const Item& b) { return a.key < b.key; });
  stack_.push_back(std::move(frame));
}

bool TreeWalk::Next(WalkEntry* entry) {
  while (!stack_.empty()) {
    Frame& top = stack_.back();
    if (top.next == top.items.size()) {
      stack_.pop_back();
      continue;
    }
    Item& item = top.items[top.next++];
    if (item.subtree) {
      const std::string dir = std::move(item.entry.path);
      Push(dir);  // invalidates `top` and `item`
      continue;
    }
    *entry = std::move(item.entry);
    return true;
  }
  return false;
}

}  // namespace vellis::fileindex
