// A walk of a directory tree that hands out paths in byte order of the
// whole path, the order in which the search daemon lists documents, so that
// a crawl can merge the two lists in one pass.
//
// Byte order is not depth-first order: "/a/b.txt" comes between "/a/b" and
// "/a/b/x", since "." sorts before "/". The walk keeps, per level, one
// directory's entries (sorted, with their lstat facts); memory is bounded
// by the depth times the widest directory. Symbolic links are reported as
// what they are and never followed; directories are opened with O_NOFOLLOW.
// Not thread-safe.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace vellis::fileindex {

struct WalkEntry {
  enum class Kind {
    kFile,        // a regular file
    kDir,         // a directory (its own entry)
    kOther,       // a link, FIFO, socket or device
    kUnreadable,  // a directory that could not be listed: what lies below
                  // it is unknown, not gone
  };
  std::string path;
  Kind kind = Kind::kFile;
  int64_t size = 0;
  int64_t mtime = 0;  // seconds since the epoch
};

class TreeWalk {
 public:
  // What to do with a directory below the root, asked once per directory:
  // report its own entry, and walk into it.
  struct DirChoice {
    bool report = true;
    bool descend = true;
  };
  using ChooseDir = std::function<DirChoice(const std::string& path)>;

  // Walks what lies below the directory `root` (not `root` itself).
  TreeWalk(const std::string& root, ChooseDir choose);
  ~TreeWalk();
  TreeWalk(const TreeWalk&) = delete;
  TreeWalk& operator=(const TreeWalk&) = delete;

  // The next entry in byte order; false at the end. A root that cannot be
  // listed gives one kUnreadable entry for itself.
  bool Next(WalkEntry* entry);

 private:
  struct Item;
  struct Frame;
  void Push(const std::string& dir);

  ChooseDir choose_;
  std::vector<Frame> stack_;
};

}  // namespace vellis::fileindex
