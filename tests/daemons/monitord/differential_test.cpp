// Random file operations on a real tree while the watcher and the router
// run; each queue is then folded by the library's OPTree and its surviving
// operations applied to a model of the index, the way the indexer applies
// them. The model must end up holding exactly what the tree holds.
//
// VELLIS_MONITOR_SEQUENCES (default 200) and VELLIS_MONITOR_OPS (default 30)
// make the run longer; VELLIS_MONITOR_SEED picks the first seed.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <functional>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "fileindex/optree.h"
#include "tests/daemons/monitord/watch_harness.h"
#include "tests/support/temp_root.h"

namespace vellis::monitord {
namespace {

using fileindex::OP;
using fileindex::OPTree;
using testing::WalkTree;
using testing::WatchHarness;
using vellis::testing::MakeDirs;
using vellis::testing::TempRoot;
using vellis::testing::WriteFile;

int EnvInt(const char* name, int fallback) {
  const char* v = getenv(name);
  return v && *v ? atoi(v) : fallback;
}

bool Below(const std::string& dir, const std::string& path) {
  return path.size() > dir.size() && path.compare(0, dir.size(), dir) == 0 &&
         path[dir.size()] == '/';
}

struct Stat {
  bool exists = false;
  bool is_dir = false;
  bool indexable = false;  // a folder or a regular file
};
Stat Look(const std::string& path) {
  struct stat st;
  Stat s;
  if (lstat(path.c_str(), &st) != 0) return s;
  s.exists = true;
  s.is_dir = S_ISDIR(st.st_mode);
  s.indexable = s.is_dir || S_ISREG(st.st_mode);
  return s;
}

// The index of one watched folder: the paths below it, as the indexer would
// keep them after executing the folded operations against the tree as it
// is now.
class ModelIndex {
 public:
  explicit ModelIndex(std::string root) : root_(std::move(root)) { WalkTree(root_, &paths_); }

  // A round is over: what it lost stays lost until the next crawl.
  void EndRound() { lost_.clear(); }

  void Execute(const OP& op) {
    const std::string path = op.node->GetPath();
    switch (op.op) {
      case fileindex::FILE_INDEX_OP_NONE:
      case fileindex::FILE_INDEX_OP_UPDATE_CFG:
        break;
      case fileindex::FILE_INDEX_OP_DELETE:
        Remove(path);
        break;
      case fileindex::FILE_INDEX_OP_UPSERT:
        UpsertOne(path);
        break;
      case fileindex::FILE_INDEX_OP_ATTR:
        // Attributes of what is indexed; gone or not indexable: removed.
        if (!Look(path).indexable) Remove(path);
        break;
      case fileindex::FILE_INDEX_OP_RENAME: {
        const Stat now = Look(path);
        if (!now.exists) {
          // Gone again: what is stored goes; a later rename of a folder
          // above it finds it.
          Remove(op.path_old);
          lost_.push_back(path);
        } else if (now.indexable && !paths_.count(op.path_old)) {
          // Nothing stored at the old place (renamed again, or repeated):
          // the new place is indexed instead.
          Remove(op.path_old);
          if (now.is_dir) {
            Crawl(path);
          } else {
            UpsertOne(path);
          }
        } else if (now.indexable) {
          // The documents move with the item.
          Remove(path);
          MovePrefix(op.path_old, path);
          if (now.is_dir) FindLost(path, op.path_old);
        } else {
          Remove(op.path_old);
          if (now.exists) Remove(path);
        }
        break;
      }
      case fileindex::FILE_INDEX_OP_REINDEX:
        if (Look(path).is_dir) {
          Crawl(path);
        } else {
          UpsertOne(path);
        }
        break;
      case fileindex::FILE_INDEX_OP_CRASH:
        Crawl(root_);
        break;
    }
  }

  const std::set<std::string>& paths() const { return paths_; }

 private:
  void Remove(const std::string& path) {
    for (auto it = paths_.lower_bound(path);
         it != paths_.end() && (*it == path || Below(path, *it));)
      it = paths_.erase(it);
  }
  void FindLost(const std::string& path, const std::string& old_path) {
    for (auto it = lost_.begin(); it != lost_.end();) {
      if (!Below(old_path, *it)) {
        ++it;
        continue;
      }
      *it = path + it->substr(old_path.size());
      const Stat st = Look(*it);
      if (!st.exists) {
        ++it;
        continue;
      }
      const std::string found = *it;
      it = lost_.erase(it);
      if (st.is_dir) {
        Crawl(found);
      } else {
        UpsertOne(found);
      }
    }
  }
  // What is stored at and below `from` now sits at `to`.
  void MovePrefix(const std::string& from, const std::string& to) {
    std::set<std::string> moved;
    for (auto it = paths_.begin(); it != paths_.end();) {
      if (*it == from || Below(from, *it)) {
        moved.insert(to + it->substr(from.size()));
        it = paths_.erase(it);
      } else {
        ++it;
      }
    }
    paths_.insert(moved.begin(), moved.end());
  }
  void UpsertOne(const std::string& path) {
    if (Look(path).indexable && Below(root_, path)) {
      paths_.insert(path);
    } else {
      Remove(path);
    }
  }
  // What is stored below `dir` made what the tree holds there.
  void Crawl(const std::string& dir) {
    if (dir != root_) Remove(dir);
    for (auto it = paths_.lower_bound(dir); it != paths_.end() && Below(dir, *it);)
      it = paths_.erase(it);
    if (dir != root_) paths_.insert(dir);
    WalkTree(dir, &paths_);
  }

  std::string root_;
  std::set<std::string> paths_;
  std::vector<std::string> lost_;  // renames whose item was gone, this round
};

// One random sequence on a fresh tree.
class Sequence {
 public:
  Sequence(uint32_t seed, const std::string& base) : rng_(seed) {
    a_ = base + "/A";
    b_ = base + "/B";
    out_ = base + "/out";
    MakeDirs(a_);
    MakeDirs(b_);
    MakeDirs(out_);
    // Something to start from.
    WriteFile(a_ + "/d0/f0", "x");
    WriteFile(b_ + "/d1/f1", "y");
    MakeDirs(a_ + "/d2/d3");
  }

  const std::string& a() const { return a_; }
  const std::string& b() const { return b_; }
  const std::vector<std::string>& log() const { return log_; }

  void RandomOp() {
    switch (Pick(12)) {
      case 0:
      case 1: {  // create a file
        const std::string p = AnyDir() + "/" + Fresh("f");
        Did("create " + p);
        WriteFile(p, "new");
        break;
      }
      case 2: {  // write to a file
        const std::string f = AnyOf(Entries(false));
        if (f.empty()) return;
        Did("write " + f);
        std::ofstream(f, std::ios::app) << "more";
        break;
      }
      case 3: {  // mkdir, sometimes a deep one with a file at once
        std::string p = AnyDir() + "/" + Fresh("d");
        if (Pick(2)) {
          p += "/" + Fresh("d") + "/" + Fresh("d");
          Did("mkdir -p " + p + " and a file in it");
          MakeDirs(p);
          WriteFile(p + "/" + Fresh("f"), "deep");
        } else {
          Did("mkdir " + p);
          mkdir(p.c_str(), 0755);
        }
        break;
      }
      case 4: {  // rename a file within its folder, sometimes over another
        const std::string f = AnyOf(Entries(false));
        if (f.empty()) return;
        const std::string dir = f.substr(0, f.rfind('/'));
        std::string to = dir + "/" + Fresh("f");
        if (Pick(4) == 0) {
          std::vector<std::string> siblings;
          for (const std::string& s : Entries(false)) {
            if (s != f && s.substr(0, s.rfind('/')) == dir) siblings.push_back(s);
          }
          if (!siblings.empty()) to = AnyOf(siblings);
        }
        Move(f, to);
        break;
      }
      case 5: {  // rename a folder within its parent
        const std::string d = AnyOf(Entries(true));
        if (d.empty()) return;
        Move(d, d.substr(0, d.rfind('/')) + "/" + Fresh("d"));
        break;
      }
      case 6: {  // across the two watched folders
        const std::string e = AnyOf(Pick(2) ? Entries(true) : Entries(false));
        if (e.empty()) return;
        const bool in_a = Below(a_, e);
        std::vector<std::string> dirs = Dirs(in_a ? b_ : a_);
        Move(e, AnyOf(dirs) + "/" + Fresh(Look(e).is_dir ? "d" : "f"));
        break;
      }
      case 7: {  // out of what is watched
        const std::string e = AnyOf(Pick(2) ? Entries(true) : Entries(false));
        if (e.empty()) return;
        const std::string to = out_ + "/" + Fresh("o");
        outside_.push_back({to, e});
        Move(e, to);
        break;
      }
      case 8: {  // back in: to where it was when that is free, else anywhere
        if (outside_.empty()) return;
        const size_t i = Pick(outside_.size());
        const auto [at, was] = outside_[i];
        outside_.erase(outside_.begin() + i);
        std::string to = was;
        if (Look(to).exists || !Look(to.substr(0, to.rfind('/'))).is_dir || Pick(3) == 0)
          to = AnyDir() + "/" + Fresh("i");
        Move(at, to);
        break;
      }
      case 9: {  // delete a file
        const std::string f = AnyOf(Entries(false));
        if (f.empty()) return;
        Did("rm " + f);
        unlink(f.c_str());
        break;
      }
      case 10: {  // rm -rf a folder
        const std::string d = AnyOf(Entries(true));
        if (d.empty()) return;
        Did("rm -rf " + d);
        RemoveAll(d);
        break;
      }
      case 11: {  // attributes
        const std::string e = AnyOf(Pick(2) ? Entries(true) : Entries(false));
        if (e.empty()) return;
        Did("chmod " + e);
        chmod(e.c_str(), Look(e).is_dir ? 0700 : 0600);
        break;
      }
    }
  }

  size_t Pick(size_t n) { return std::uniform_int_distribution<size_t>(0, n - 1)(rng_); }

 private:
  void Did(const std::string& what) { log_.push_back(what); }
  std::string Fresh(const char* prefix) { return prefix + std::to_string(++names_); }
  template <typename T>
  T AnyOf(const std::vector<T>& v) {
    return v.empty() ? T() : v[Pick(v.size())];
  }
  // Folders at and below `root`.
  std::vector<std::string> Dirs(const std::string& root) {
    std::vector<std::string> out = {root};
    for (const std::string& e : Walk(root)) {
      if (Look(e).is_dir) out.push_back(e);
    }
    return out;
  }
  std::string AnyDir() {
    std::vector<std::string> all = Dirs(a_);
    for (const std::string& d : Dirs(b_)) all.push_back(d);
    return AnyOf(all);
  }
  // Files (or folders) below the two watched folders.
  std::vector<std::string> Entries(bool dirs) {
    std::vector<std::string> out;
    for (const std::string& root : {a_, b_}) {
      for (const std::string& e : Walk(root)) {
        if (Look(e).is_dir == dirs) out.push_back(e);
      }
    }
    return out;
  }
  static std::set<std::string> Walk(const std::string& root) {
    std::set<std::string> s;
    WalkTree(root, &s);
    return s;
  }
  void Move(const std::string& from, const std::string& to) {
    Did("mv " + from + " " + to);
    rename(from.c_str(), to.c_str());
  }
  static void RemoveAll(const std::string& dir) {
    std::set<std::string> below = Walk(dir);
    for (auto it = below.rbegin(); it != below.rend(); ++it) remove(it->c_str());
    rmdir(dir.c_str());
  }

  std::mt19937 rng_;
  std::string a_, b_, out_;
  std::vector<std::string> log_;
  std::vector<std::pair<std::string, std::string>> outside_;
  int names_ = 0;
};

std::string Listing(const std::set<std::string>& s) {
  std::string out;
  for (const std::string& p : s) out += "  " + p + "\n";
  return out;
}

// Runs one sequence; empty when the model matches the tree, else what
// differs, with the operations and the lines.
std::string RunOne(uint32_t seed, int ops) {
  TempRoot tmp;
  RouterOptions options;
  options.move_grace_ms = 10;
  WatchHarness h(options);
  std::unique_ptr<ModelIndex> model_a, model_b;
  std::string trouble, folded;
  // Everything reported so far folded (the kernel queues an event within
  // the call that causes it, so no quiet time is needed) by the library and applied to the
  // index, as one round of the indexer.
  auto read_queues = [&] {
    if (!h.Settle(0)) trouble += "never settled\n";
    for (auto [queue, model] :
         {std::pair{tmp.Path("/qa"), model_a.get()}, {tmp.Path("/qb"), model_b.get()}}) {
      auto it = h.raw().find(queue);
      WriteFile(queue, it == h.raw().end() ? "" : it->second);
      folded += queue + " folded:\n" + (it == h.raw().end() ? "" : it->second);
      OPTree tree(queue);
      tree.ProcessOP([&, model = model](std::shared_ptr<OP> op) {
        std::ostringstream os;
        os << "  => " << op << "\n";
        folded += os.str();
        model->Execute(*op);
      });
      model->EndRound();
    }
    h.Clear();
  };
  Sequence seq(seed, tmp.path());
  h.Watch(seq.a(), tmp.Path("/qa"));
  h.Watch(seq.b(), tmp.Path("/qb"));
  if (!h.Settle(0)) return "never settled before the start";
  model_a = std::make_unique<ModelIndex>(seq.a());
  model_b = std::make_unique<ModelIndex>(seq.b());
  h.Clear();

  for (int i = 0; i < ops; ++i) {
    seq.RandomOp();
    // Sometimes the events are taken at once, sometimes they pile up.
    if (seq.Pick(3) == 0) h.Pump();
  }
  read_queues();

  std::string why = trouble;
  for (auto [root, model] : {std::pair{seq.a(), model_a.get()}, {seq.b(), model_b.get()}}) {
    std::set<std::string> real;
    WalkTree(root, &real);
    if (model->paths() == real) continue;
    std::set<std::string> missing, stale;
    for (const std::string& p : real) {
      if (!model->paths().count(p)) missing.insert(p);
    }
    for (const std::string& p : model->paths()) {
      if (!real.count(p)) stale.insert(p);
    }
    why += root + ": not in the index:\n" + Listing(missing) + "in the index, not on disk:\n" +
           Listing(stale);
  }
  if (why.empty()) return why;
  std::ostringstream os;
  os << "seed " << seed << "\n" << why << "operations:\n";
  for (const std::string& op : seq.log()) os << "  " << op << "\n";
  os << folded;
  return os.str();
}

TEST(MonitorDifferentialTest, FoldedQueuesMatchTheTree) {
  const int sequences = EnvInt("VELLIS_MONITOR_SEQUENCES", 200);
  const int ops = EnvInt("VELLIS_MONITOR_OPS", 30);
  const uint32_t first = static_cast<uint32_t>(EnvInt("VELLIS_MONITOR_SEED", 1));
  int failed = 0;
  for (int i = 0; i < sequences; ++i) {
    const std::string why = RunOne(first + static_cast<uint32_t>(i), ops);
    if (why.empty()) continue;
    ADD_FAILURE() << why;
    if (++failed == 3) break;  // enough to go on
  }
}

}  // namespace
}  // namespace vellis::monitord
