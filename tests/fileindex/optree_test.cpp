// Queue lines, their folding into the operation tree (also against a naive
// model), and the tree's nodes.
#include "fileindex/optree.h"

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <map>
#include <random>
#include <set>
#include <sstream>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "tests/support/fake_platform.h"
#include "tests/support/naive_fold.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

// This binary's read() fails with EIO on the one file g_failing_path names,
// after that file's first chunk; every other read is the C library's.
namespace {
std::atomic<const char*> g_failing_path{nullptr};
std::atomic<int> g_reads_of_path{0};
}  // namespace

extern "C" ssize_t read(int fd, void* buf, size_t count) {
  using Read = ssize_t (*)(int, void*, size_t);
  static const Read real = reinterpret_cast<Read>(dlsym(RTLD_NEXT, "read"));
  if (const char* path = g_failing_path.load()) {
    char link[64], target[PATH_MAX];
    snprintf(link, sizeof(link), "/proc/self/fd/%d", fd);
    const ssize_t n = readlink(link, target, sizeof(target) - 1);
    if (n > 0 && std::string(target, n) == path && g_reads_of_path.fetch_add(1) > 0) {
      errno = EIO;
      return -1;
    }
  }
  return real(fd, buf, count);
}

namespace vellis::fileindex {
namespace {

using Strings = std::vector<std::string>;

std::string Print(const std::shared_ptr<OP>& op) {
  std::ostringstream os;
  os << op;
  return os.str();
}

std::string Line(uint32_t event, const std::string& path, const std::string& extra = "") {
  return R"({"event":)" + std::to_string(event) + R"(,"path":")" + path + "\"" + extra + "}";
}

class OPTreeTest : public ::testing::Test {
 protected:
  void WriteQueue(const Strings& lines) {
    std::string text;
    for (const auto& l : lines) text += l + "\n";
    testing::WriteFile(queue_, text);
  }

  testing::TempRoot root_;
  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::string queue_ = root_.Path("/queue");
};

// Regression: a rename bit whose old path is refused used to turn the
// operation that an earlier bit of the same line had attached into a rename
// with that bad old path.
TEST_F(OPTreeTest, RefusedOldPathLeavesTheEarlierBitsOfTheLineAlone) {
  for (const char* bad_old : {"", "s/a", "/s//a", "/s/a/"}) {
    platform_.ClearLogs();
    WriteQueue({Line(0x102, "/s/b", R"(,"path_old":")" + std::string(bad_old) + "\"")});
    OPTree tree(queue_);
    Strings got;
    EXPECT_EQ(tree.ProcessOP([&](std::shared_ptr<OP> op) { got.push_back(Print(op)); }), 1u);
    EXPECT_EQ(got, Strings{"[02] /s/b"}) << bad_old;
    EXPECT_EQ(platform_.LogsContaining("code=9999").size(), 1u) << bad_old;
  }
}

// Lines are parsed a batch ahead of folding; the log must still read as if
// each line were read, parsed and folded in turn, with only a line's own
// errno on its own failure.
TEST_F(OPTreeTest, LogFollowsTheOrderOfTheLines) {
  const size_t batch = OPTree::kLinesReadAhead;
  const std::set<size_t> not_json = {0, batch - 1, batch + 3}, bad_path = {1, batch, 2 * batch + 6};
  const size_t out_of_range = batch + 1, too_long = batch + 2;
  Strings lines, want_log, want_ops;
  for (size_t i = 0; i < 2 * batch + 7; ++i) {
    const std::string mark = "#" + std::to_string(i) + "#";
    if (i == too_long) {
      lines.push_back(Line(2, "/s/" + mark, R"(,"data":")" + std::string(1u << 20, 'x') + "\""));
      want_log.push_back("skipped " + mark);
      continue;
    }
    want_log.push_back("got " + mark);
    if (i == out_of_range) {  // the parser sets errno
      lines.push_back(Line(2, "/s/" + mark, R"(,"data":1e400)"));
      want_log.insert(want_log.end(), {"check failed " + mark + " err", "skipped " + mark});
    } else if (not_json.count(i) || bad_path.count(i)) {
      lines.push_back(not_json.count(i) ? "not json " + mark : Line(2, "/s//" + mark));
      want_log.insert(want_log.end(), {"check failed " + mark, "skipped " + mark});
    } else {
      lines.push_back(Line(2, "/s/" + mark));
      want_ops.push_back("[02] /s/" + mark);
    }
  }
  WriteQueue(lines);
  log_level = LOG_DEBUG;
  errno = 0;  // whatever the caller left would show on the first line
  OPTree tree(queue_);
  log_level = LOG_INFO;
  Strings ops;
  tree.ProcessOP([&](std::shared_ptr<OP> op) { ops.push_back(Print(op)); });
  EXPECT_EQ(ops, want_ops);
  Strings log;
  for (const auto& l : platform_.Logs()) {
    const size_t at = l.text.find('#');
    if (at == std::string::npos) continue;
    const std::string mark = l.text.substr(at, l.text.find('#', at + 1) - at + 1);
    const std::string err = l.text.find("[err: ") != std::string::npos ? " err" : "";
    if (l.text.find("Got event: ") != std::string::npos) log.push_back("got " + mark + err);
    if (l.text.find(") Failed [") != std::string::npos) log.push_back("check failed " + mark + err);
    if (l.text.find("InsertEvent failed") != std::string::npos)
      log.push_back("skipped " + mark + err);
  }
  EXPECT_EQ(log, want_log);
}

// The lines of the chunk that was read are folded and logged, in order; then
// the round fails with 502 and the read's errno.
TEST_F(OPTreeTest, LinesBeforeAReadErrorAreFoldedAndLoggedThenTheRoundFails) {
  // The reader reads 64 KiB at a time: the bad line ends the first chunk.
  std::string text;
  for (int i = 0; i < 2520; ++i) text += Line(2, "/s/a") + "\n";
  text += "not json #last#\n";
  ASSERT_EQ(text.size(), 64u * 1024);
  testing::WriteFile(queue_, text + text);
  g_failing_path = queue_.c_str();
  g_reads_of_path = 0;
  errno = 0;
  EXPECT_EQ(testing::Thrown([&] { OPTree tree(queue_); }),
            "502 Failed to read queue, reason=Input/output error");
  g_failing_path = nullptr;
  EXPECT_EQ(g_reads_of_path.load(), 2);
  // The bad line is logged without the read's errno, before the failure
  // that carries it.
  Strings seen;
  for (const auto& l : platform_.Logs()) {
    const std::string err =
        l.text.find("[err: Input/output error]") != std::string::npos ? ", err" : "";
    if (l.text.find("reason: Malformed event_raw: not json #last#") != std::string::npos)
      seen.push_back("bad line" + err);
    if (l.text.find("Failed to read queue") != std::string::npos)
      seen.push_back("read failed" + err);
  }
  EXPECT_EQ(seen, (Strings{"bad line", "read failed, err"}));
}

// Lookups remember the last path and its folder: whatever came before, a
// path resolves to the one node of that path (/a/bc is not /a/b), and a
// refused path in between changes nothing.
TEST_F(OPTreeTest, LookupFindsTheNodeOfThePathWhateverCameBefore) {
  WriteQueue({});
  OPTree tree(queue_);
  const std::string longest = "/a/" + std::string(OPTree::kMaxPathBytes - 3, 'n');
  const std::string too_long = longest + "n";
  const Strings sequence = {longest, "",       "/",      "/..",   "/a/.b/..c", "/a/b",
                            "/a/b",  "/a//b",  "/a/b",   "/a/bc", "/a/b/c",    "/a",
                            "/x",    "/a/b",   "/a/b/",  "/a/b",  "/ab/b",     "/a/c",
                            "/b/c",  "/a/c",   "/a/.",   "/a/..", too_long,    "/a/c",
                            "/a/",   "/a/b/c", "/a/b/.", "/a/b",  "/x/y",      "/x"};
  const std::set<std::string> refused = {"",     "/",     "/..",    "/a//b", "/a/b/",
                                         "/a/.", "/a/..", too_long, "/a/",   "/a/b/."};
  std::map<std::string, std::shared_ptr<OPNode>> seen;
  for (const std::string& path : sequence) {
    std::shared_ptr<OPNode> node;
    try {
      node = tree.GetNodeByPath(path);
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrNodeByPath);
      EXPECT_EQ(refused.count(path), 1u) << path.substr(0, 20) << " was refused";
      continue;
    }
    EXPECT_EQ(refused.count(path), 0u) << path.substr(0, 20) << " was accepted";
    EXPECT_EQ(node->GetPath(), path);
    EXPECT_EQ(seen.emplace(path, node).first->second, node) << path << " has a second node";
  }
  // The root, the longest path, /a/.b/..c and every prefix of the others.
  size_t nodes = 0;
  tree.TraverseNodeDescendant(
      tree.root, [&](std::shared_ptr<OPNode>) { ++nodes; }, false);
  EXPECT_EQ(nodes, 15u);
}

// Regression: a child made with OPNode::GetChild was unknown to the tree's
// index of a folder's children, and GetNodeByPath made a second node of the
// same name beside it. Children appended to `children` directly, with their
// folder, another or no parent, are found as well, in a narrow folder
// (scanned) and a wide one (indexed), while lookups hop between folders.
TEST_F(OPTreeTest, ChildMadeOutsideTheTreeIsTheNodeOfItsPath) {
  WriteQueue({});
  OPTree tree(queue_);
  for (int width : {3, 300}) {
    const std::string dir = "/v/w" + std::to_string(width);
    std::shared_ptr<OPNode> folder = tree.GetNodeByPath(dir), other = tree.GetNodeByPath("/v/o");
    std::vector<std::shared_ptr<OPNode>> made, parents = {folder, other, nullptr};
    for (int i = 0; i < width; ++i) {
      const std::string name = "f" + std::to_string(i);
      if (i % 3 == 0) made.push_back(folder->GetChild(name));
      if (i % 3 == 1) made.push_back(tree.GetNodeByPath(dir + "/" + name));
      if (i % 3 == 2)
        folder->children.push_back(std::make_shared<OPNode>(parents[i % 9 / 3], name));
      if (i % 3 == 2) made.push_back(folder->children.back());
      tree.GetNodeByPath("/v/other/g" + std::to_string(i % 7));
    }
    for (int i = width - 1; i >= 0; --i) {
      const std::string name = "f" + std::to_string(i);
      EXPECT_EQ(tree.GetNodeByPath(dir + "/" + name), made[i]) << dir << name;
      EXPECT_EQ(folder->GetChild(name), made[i]) << dir << name;
      EXPECT_EQ(tree.GetNodeByPath(dir + "/" + name + "/x")->parent, made[i]) << dir << name;
    }
    EXPECT_EQ(folder->children, made);
    // A name appended twice resolves to its first node, as a scan would.
    folder->children.push_back(std::make_shared<OPNode>(folder, "f1"));
    EXPECT_EQ(tree.GetNodeByPath(dir + "/f1"), made[1]);
  }
}

// Operations a caller kept outlive the tree and still print their paths;
// every node goes with the tree however it was made, also when a caller
// cleared a node's parent link.
TEST_F(OPTreeTest, KeptOperationsOutliveTheTreeAndEveryNodeGoesWithIt) {
  WriteQueue({Line(64, "/v/s/a/new.txt"), Line(256, "/v/s/b", R"(,"path_old":"/v/s/a")"),
              Line(131072, "/v/s", R"(,"data":{"audio":true})"), Line(128, "/v/s")});
  Strings printed;
  std::vector<std::weak_ptr<OPNode>> nodes;
  {
    std::vector<std::shared_ptr<OP>> kept;
    {
      OPTree tree(queue_);
      tree.ProcessOP([&](std::shared_ptr<OP> op) { kept.push_back(op); });
      std::ostringstream node;
      node << tree.GetNodeByPath("/v/s");
      EXPECT_EQ(node.str(), R"(Node[/v/s]: [04] /v/s, data={"audio":true}, [01] /v/s)");
      std::shared_ptr<OPNode> v = tree.GetNodeByPath("/v");
      v->GetChild("made");
      v->children.push_back(std::make_shared<OPNode>(v, "appended"));
      tree.GetNodeByPath("/v/made/below");
      tree.GetNodeByPath("/v/appended/below/deeper");
      tree.GetNodeByPath("/v/cut/below")->parent->parent = nullptr;
      tree.TraverseNodeDescendant(
          tree.root, [&](std::shared_ptr<OPNode> n) { nodes.push_back(n); }, false);
    }
    for (const auto& op : kept) printed.push_back(Print(op));
  }
  EXPECT_EQ(printed, (Strings{"[05] /v/s/a -> /v/s/b", "[02] /v/s/b/new.txt",
                              R"([04] /v/s, data={"audio":true})", "[01] /v/s"}));
  ASSERT_EQ(nodes.size(), 14u);
  for (const auto& n : nodes) EXPECT_TRUE(n.expired());
}

// Dropping the last reference to the bottom of a very deep chain of nodes,
// after the tree is gone, frees the chain without one stack frame per level.
TEST_F(OPTreeTest, DroppingAKeptNodeOfAVeryDeepChainDoesNotRecurse) {
  std::shared_ptr<OPNode> bottom;
  std::weak_ptr<OPNode> top;
  {
    WriteQueue({});
    OPTree tree(queue_);
    top = bottom = tree.root;
    for (int i = 0; i < 100000; ++i) bottom = bottom->GetChild("d");
  }
  pthread_attr_t attr;  // 256 KiB of stack: far less than 100,000 frames take
  ASSERT_EQ(pthread_attr_init(&attr), 0);
  ASSERT_EQ(pthread_attr_setstacksize(&attr, 256 * 1024), 0);
  pthread_t thread;
  auto drop = [](void* p) -> void* {
    static_cast<std::shared_ptr<OPNode>*>(p)->reset();
    return nullptr;
  };
  ASSERT_EQ(pthread_create(&thread, &attr, drop, &bottom), 0);
  ASSERT_EQ(pthread_join(thread, nullptr), 0);
  EXPECT_TRUE(top.expired());
}

// The tree reads a whole queue through one reused event: each line must
// leave exactly its own fields, whatever the line before it held.
TEST(EventTest, AssignOverAnEarlierLineKeepsNothingOfIt) {
  struct Case {
    std::string line, fields;
  } cases[] = {
      {R"({"event":131328,"is_dir":true,"path":"/s/new","path_old":"/s/old","data":{"audio":true}})",
       R"(131328 1 /s/new /s/old {"audio":true})"},
      {R"({"event":2,"path":"/s/a"})", "2 0 /s/a  null"},
      {R"({"event":256,"path":"/s/b","path_old":"/s/a/very/long/old/path/beyond/short/strings"})",
       "256 0 /s/b /s/a/very/long/old/path/beyond/short/strings null"},
      // Numbers and null convert as the JSON helpers convert them.
      {R"({"path_old":null,"path":"/s/c","is_dir":1,"event":64})", "64 1 /s/c  null"},
      {R"({"data":[1],"event":4,"is_dir":"yes","path":"/s/d","path_old":5})", "4 0 /s/d 5 [1]"},
  };
  Event e;
  for (int pass = 0; pass < 2; ++pass) {  // the second pass follows the last case
    for (const auto& c : cases) {
      e.Assign(c.line);
      EXPECT_EQ(std::to_string(e.event) + " " + std::to_string(e.is_dir) + " " + e.path + " " +
                    e.path_old + " " + JsonToString(e.data),
                c.fields);
    }
  }
}

// Random queue lines over a few nested paths, so that lines meet each
// other's work: every event bit alone and combined, renames back and forth
// and into a folder's own child, junk data, bad lines and crash markers.
struct StreamMaker {
  std::mt19937 rng;

  int Uniform(int lo, int hi) { return std::uniform_int_distribution<int>(lo, hi)(rng); }
  bool Chance(int percent) { return Uniform(1, 100) <= percent; }
  template <typename T, size_t N>
  const T& Pick(const T (&arr)[N]) {
    return arr[Uniform(0, N - 1)];
  }

  std::string Path() {
    static const char* const kBad[] = {"",        "/",      "v/s/a",    "/v//s/a",
                                       "/v/s/a/", "/v/./s", "/v/s/../a"};
    static const char* const kGood[] = {"/v/s",         "/v/s/a", "/v/s/a/x", "/v/s/a/x/y",
                                        "/v/s/a/x/y/z", "/v/s/b", "/v/s/b/x", "/v/s/ab",
                                        "/v/s/ab/x",    "/v/t"};
    return Chance(4) ? Pick(kBad) : Pick(kGood);
  }

  Json::Value Data() {
    static const Json::Value kJunk[] = {5, "s", Json::Value(Json::arrayValue), Json::Value()};
    static const Json::Value kValues[] = {true, false, 1, "x", Json::Value()};
    if (Chance(15)) return Pick(kJunk);
    Json::Value data(Json::objectValue);
    for (const char* key : {"document", "audio", "video", "photo", "other"}) {
      if (Chance(40)) data[key] = Pick(kValues);
    }
    return data;
  }

  uint32_t Bits() {
    static const uint32_t kBits[] = {0x2, 0x4, 0x40, 0x80, 0x100, 0x10000, 0x20000};
    if (Chance(1)) return 0x200 | (Chance(50) ? Pick(kBits) : 0);  // the crash marker
    if (Chance(2)) return Chance(50) ? 0 : 0x8;                    // no bit, or only an unknown one
    uint32_t bits = Pick(kBits);
    for (int extra = Chance(25) ? Uniform(1, 2) : 0; extra > 0; --extra) bits |= Pick(kBits);
    return bits;
  }

  std::string Line() {
    static const char* const kBadLines[] = {"not json",
                                            "",
                                            "[]",
                                            R"({"event":"x","path":"/v/s/a"})",
                                            R"({"event":2})",
                                            R"({"event":2,"path":"/v/s/a")",
                                            R"({"event":2,"path":7})"};
    if (Chance(3)) return Pick(kBadLines);
    Json::Value ev(Json::objectValue);
    const uint32_t bits = Bits();
    ev["event"] = bits;
    ev["path"] = Path();
    if (!Chance(10)) ev["is_dir"] = Chance(35);
    if ((bits & 0x100) || Chance(5)) {
      const std::string p = ev["path"].asString();
      if (Chance(70)) {
        ev["path_old"] = Path();
      } else if (Chance(50)) {
        ev["path_old"] = p;     // renamed onto itself
      } else if (Chance(90)) {  // a folder into its own child, or the reverse
        ev["path_old"] = p.substr(0, std::min(p.rfind('/'), p.size()));
      }
    }
    if (((bits & 0x20000) || Chance(5)) && !Chance(5)) ev["data"] = Data();
    return JsonToString(ev);
  }
};

// The base seed is fixed; set VELLIS_FUZZ_ITERATIONS to run more streams.
TEST_F(OPTreeTest, RealTreeDeliversWhatTheNaiveModelDelivers) {
  const char* env = getenv("VELLIS_FUZZ_ITERATIONS");
  const int iterations = env != nullptr && atoi(env) > 0 ? atoi(env) : 2000;
  auto join = [](const Strings& ops) {
    std::string out;
    for (const auto& op : ops) out += "    " + op + "\n";
    return out;
  };
  std::set<int> kinds_seen;
  for (int i = 0, failures = 0; i < iterations && failures < 3; ++i) {
    const uint32_t seed = 20261122 + static_cast<uint32_t>(i);
    StreamMaker maker{std::mt19937(seed)};
    Strings lines(maker.Uniform(20, 60));
    std::string text;
    for (size_t k = 0; k < lines.size(); ++k) {
      lines[k] = maker.Line();
      text += lines[k] + (k + 1 < lines.size() || seed % 2 == 0 ? "\n" : "");  // last \n optional
    }
    unlink(queue_.c_str());  // a fresh file: rewriting in place makes ext4 flush on close
    testing::WriteFile(queue_, text);
    platform_.ClearLogs();
    Strings got;
    OPTree tree(queue_);
    const unsigned count = tree.ProcessOP([&](std::shared_ptr<OP> op) {
      got.push_back(testing::OpText(op->op, op->node->GetPath(), op->path_old, op->data));
    });
    got.push_back("count=" + std::to_string(count));
    const Strings want = testing::NaiveFold(lines);
    for (const auto& op : want) kinds_seen.insert(atoi(op.c_str() + 1));  // 0 for "count="
    if (got != want) {
      ADD_FAILURE() << "seed " << seed << ", lines:\n"
                    << text << "\n  real tree:\n"
                    << join(got) << "  naive model:\n"
                    << join(want);
      ++failures;
    }
  }
  // The streams must reach every kind, or the comparison proves little.
  EXPECT_EQ(kinds_seen, (std::set<int>{0, 1, 2, 3, 4, 5, 6, 7})) << "over " << iterations;
}

}  // namespace
}  // namespace vellis::fileindex
