#include "fileindex/optree.h"

#include <gtest/gtest.h>
#include <pthread.h>

#include <cerrno>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/log.h"
#include "tests/support/fake_platform.h"
#include "tests/support/parse_json.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

std::string Print(const std::shared_ptr<OP>& op) {
  std::ostringstream os;
  os << op;
  return os.str();
}

std::string Join(const std::vector<std::string>& v) {
  std::string s;
  for (const auto& x : v) s += "\n    " + x;
  return s;
}

using testing::ParseJson;

class OPTreeTest : public ::testing::Test {
 protected:
  struct Folded {
    std::vector<std::string> delivered;  // printed forms, in delivery order
    unsigned count = 0;
  };

  std::string WriteQueue(const std::vector<std::string>& lines) {
    std::string text;
    for (const auto& l : lines) text += l + "\n";
    testing::WriteFile(queue_, text);
    return queue_;
  }

  Folded Fold(const std::vector<std::string>& lines) {
    OPTree tree(WriteQueue(lines));
    Folded f;
    f.count = tree.ProcessOP([&](std::shared_ptr<OP> op) { f.delivered.push_back(Print(op)); });
    return f;
  }

  testing::TempRoot root_;
  testing::FakePlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  std::string queue_ = root_.Path("/queue");
};

TEST_F(OPTreeTest, FoldsLinesOfOnePathByTheMergeRules) {
  const std::string create = R"({"event":64,"path":"/s/a"})";
  const std::string modify = R"({"event":2,"path":"/s/a"})";
  const std::string attr = R"({"event":4,"path":"/s/a"})";
  const std::string del = R"({"event":128,"path":"/s/a"})";
  const std::string reindex = R"({"event":65536,"path":"/s/a"})";
  const std::string cfg_doc = R"({"event":131072,"path":"/s/a","data":{"document":true}})";
  const std::string cfg_photo = R"({"event":131072,"path":"/s/a","data":{"photo":true}})";
  struct Case {
    const char* what;
    std::vector<std::string> lines;
    std::vector<std::string> delivered;
    unsigned count;
  } cases[] = {
      {"create then delete: the delete rewrites the upsert", {create, del}, {"[01] /s/a"}, 1},
      {"delete then create: a create revives the path", {del, create}, {"[02] /s/a"}, 1},
      {"delete then modify: the delete stands", {del, modify}, {"[01] /s/a"}, 1},
      {"modify three times", {modify, modify, modify}, {"[02] /s/a"}, 1},
      {"attr then modify: the attr becomes an upsert", {attr, modify}, {"[02] /s/a"}, 1},
      {"modify then attr", {modify, attr}, {"[02] /s/a"}, 1},
      {"two configuration updates merge",
       {cfg_doc, cfg_photo},
       {R"([04] /s/a, data={"audio":false,"document":true,"photo":true,"video":false})"},
       1},
      {"modify then update cfg: the upsert takes the data",
       {modify, cfg_doc},
       {R"([04] /s/a, data={"document":true})"},
       1},
      {"update cfg then delete: both stand",
       {cfg_doc, del},
       {R"([04] /s/a, data={"document":true})", "[01] /s/a"},
       2},
      {"reindex then delete: both stand", {reindex, del}, {"[06] /s/a", "[01] /s/a"}, 2},
      {"modify then reindex", {modify, reindex}, {"[06] /s/a"}, 1},
      {"delete then update cfg: dropped", {del, cfg_doc}, {"[01] /s/a"}, 1},
      {"create and modify on one line yield nothing",
       {R"({"event":66,"path":"/s/a","is_dir":false})"},
       {},
       1},
      {"attr and modify on one line yield nothing", {R"({"event":6,"path":"/s/a"})"}, {}, 1},
      {"a deleted directory is reindexed",
       {R"({"event":128,"path":"/s/d","is_dir":true})"},
       {"[06] /s/d"},
       1},
      {"a created directory is reindexed",
       {R"({"event":64,"path":"/s/d","is_dir":true})"},
       {"[06] /s/d"},
       1},
      {"rename then modify of the new path",
       {R"({"event":256,"path":"/s/b","path_old":"/s/a"})", R"({"event":2,"path":"/s/b"})"},
       {"[05] /s/a -> /s/b", "[02] /s/b"},
       2},
      {"no bit, or only unknown bits: no operation",
       {R"({"event":0,"path":"/s/a"})", R"({"event":9,"path":"/s/a"})"},
       {},
       0},
  };
  for (const auto& c : cases) {
    Folded f = Fold(c.lines);
    EXPECT_EQ(f.delivered, c.delivered) << c.what << ", got:" << Join(f.delivered);
    EXPECT_EQ(f.count, c.count) << c.what;
  }
}

TEST_F(OPTreeTest, CreatedDirectoryCancelsPendingWorkBelowButNotRenames) {
  Folded f = Fold({
      R"({"event":2,"path":"/s/d/a"})",
      R"({"event":256,"path":"/s/d/y","path_old":"/s/x"})",
      R"({"event":4,"path":"/s/d/e/f"})",
      R"({"event":131072,"path":"/s/d/e","data":{"audio":true}})",
      R"({"event":2,"path":"/s/other"})",
      R"({"event":64,"path":"/s/d","is_dir":true})",
  });
  EXPECT_EQ(f.delivered,
            (std::vector<std::string>{"[05] /s/x -> /s/d/y", "[02] /s/other", "[06] /s/d"}))
      << Join(f.delivered);
  EXPECT_EQ(f.count, 6u);
}

TEST_F(OPTreeTest, RenamedFolderCarriesPendingWorkToTheNewNameAfterTheRename) {
  OPTree tree(WriteQueue({
      R"({"event":2,"path":"/s/old/f"})",
      R"({"event":128,"path":"/s/old/g"})",
      R"({"event":4,"path":"/s/old/h/i"})",
      R"({"event":256,"path":"/s/new","path_old":"/s/old"})",
  }));
  std::vector<std::string> got;
  unsigned count = tree.ProcessOP([&](std::shared_ptr<OP> op) { got.push_back(Print(op)); });
  // The delete is not carried: the old document is removed under its old name.
  EXPECT_EQ(got, (std::vector<std::string>{"[01] /s/old/g", "[05] /s/old -> /s/new",
                                           "[02] /s/new/f", "[03] /s/new/h/i"}))
      << Join(got);
  EXPECT_EQ(count, 6u);
  // Only paths with work to carry are mirrored under the new name.
  std::shared_ptr<OPNode> new_node = tree.GetNodeByPath("/s/new");
  std::vector<std::string> names;
  for (const auto& c : new_node->children) names.push_back(c->name);
  EXPECT_EQ(names, (std::vector<std::string>{"f", "h"}));
}

TEST_F(OPTreeTest, RenameThereAndBackKeepsWorkOnTheOriginalName) {
  Folded f = Fold({
      R"({"event":2,"path":"/s/a/f"})",
      R"({"event":256,"path":"/s/b","path_old":"/s/a"})",
      R"({"event":256,"path":"/s/a","path_old":"/s/b"})",
  });
  EXPECT_EQ(f.delivered,
            (std::vector<std::string>{"[05] /s/a -> /s/b", "[05] /s/b -> /s/a", "[02] /s/a/f"}))
      << Join(f.delivered);
  EXPECT_EQ(f.count, 5u);
}

// Regression: a rename bit whose old path is refused used to turn the
// operation that an earlier bit of the same line had attached into a rename
// with that bad old path.
TEST_F(OPTreeTest, RefusedOldPathLeavesTheEarlierBitsOfTheLineAlone) {
  for (const char* bad_old : {"", "s/a", "/s//a", "/s/a/"}) {
    Json::Value line(Json::objectValue);
    line["event"] = 0x2 | 0x100;
    line["path"] = "/s/b";
    line["path_old"] = bad_old;
    platform_.ClearLogs();
    Folded f = Fold({JsonToString(line)});
    EXPECT_EQ(f.delivered, (std::vector<std::string>{"[02] /s/b"}))
        << "path_old=" << bad_old << Join(f.delivered);
    EXPECT_EQ(platform_.LogsContaining("code=9999").size(), 1u) << "path_old=" << bad_old;
  }
}

TEST_F(OPTreeTest, CrashMarkerStopsReadingAndDeliversOnlyTheCrash) {
  // Enough bad lines after the marker to fill the batch it is read in and
  // the next one: none of them is folded or logged.
  std::vector<std::string> lines = {R"({"event":2,"path":"/s/a"})", R"({"event":512,"path":"/s/b"})"};
  lines.resize(lines.size() + 2 * OPTree::kLinesReadAhead, "not json after the crash");
  OPTree tree(WriteQueue(lines));
  std::vector<std::shared_ptr<OP>> got;
  unsigned count = tree.ProcessOP([&](std::shared_ptr<OP> op) { got.push_back(op); });
  ASSERT_EQ(got.size(), 1u);
  EXPECT_EQ(got[0]->op, FILE_INDEX_OP_CRASH);
  EXPECT_EQ(got[0]->node, tree.root);
  EXPECT_EQ(count, 1u);
  EXPECT_EQ(platform_.LogsContaining("Queue crashed: " + queue_).size(), 1u);
  EXPECT_TRUE(platform_.LogsContaining("not json after the crash").empty());
}

// Lines are parsed ahead of folding, a batch at a time; the log must still
// read as if each line were read, parsed and folded in turn, across batches.
TEST_F(OPTreeTest, LogFollowsTheOrderOfTheLines) {
  const size_t batch = OPTree::kLinesReadAhead;
  const std::set<size_t> not_json = {0, batch - 1, batch + 3};
  const std::set<size_t> bad_path = {1, batch, 2 * batch + 6};
  // A number out of range: the parser sets errno, and only this line's
  // check failure may carry it.
  const size_t out_of_range = batch + 1;
  // 1 MiB or more: skipped with its first bytes logged, and not parsed.
  const size_t too_long = batch + 2;
  std::vector<std::string> lines;
  std::vector<std::string> expected_log, expected_ops;
  for (size_t i = 0; i < 2 * batch + 7; ++i) {
    const std::string mark = "#" + std::to_string(i) + "#";
    if (i == too_long) {
      lines.push_back(R"({"event":2,"path":"/s/)" + mark + R"(","data":")" +
                      std::string(1u << 20, 'x') + R"("})");
      expected_log.push_back("line skipped " + mark);
      continue;
    }
    expected_log.push_back("got " + mark);
    if (i == out_of_range) {
      lines.push_back(R"({"event":2,"path":"/s/)" + mark + R"(","data":1e400})");
      expected_log.push_back("check failed " + mark + " err");
      expected_log.push_back("line skipped " + mark);
      continue;
    }
    if (not_json.count(i)) {
      lines.push_back("not json " + mark);
    } else if (bad_path.count(i)) {
      lines.push_back(R"({"event":2,"path":"/s//)" + mark + R"("})");
    } else {
      lines.push_back(R"({"event":2,"path":"/s/)" + mark + R"("})");
      expected_ops.push_back("[02] /s/" + mark);
      continue;
    }
    expected_log.push_back("check failed " + mark);
    expected_log.push_back("line skipped " + mark);
  }
  struct DebugLog {
    DebugLog() { log_level = LOG_DEBUG; }
    ~DebugLog() { log_level = LOG_INFO; }
  } debug;
  WriteQueue(lines);
  errno = 0;  // whatever the caller left would show on the first line
  OPTree tree(queue_);
  std::vector<std::string> delivered;
  tree.ProcessOP([&](std::shared_ptr<OP> op) { delivered.push_back(Print(op)); });
  EXPECT_EQ(delivered, expected_ops);
  std::vector<std::string> log;
  for (const auto& l : platform_.Logs()) {
    const size_t at = l.text.find('#');
    if (at == std::string::npos) continue;
    const std::string mark = l.text.substr(at, l.text.find('#', at + 1) - at + 1);
    const std::string err = l.text.find("[err: ") != std::string::npos ? " err" : "";
    if (l.text.find("Got event: ") != std::string::npos) {
      log.push_back("got " + mark + err);
    } else if (l.text.find(") Failed [") != std::string::npos) {
      log.push_back("check failed " + mark + err);
    } else if (l.text.find("InsertEvent failed") != std::string::npos) {
      log.push_back("line skipped " + mark + err);
    }
  }
  EXPECT_EQ(log, expected_log) << Join(log);
}

TEST_F(OPTreeTest, EmptyQueueDeliversNothing) {
  testing::WriteFile(queue_, "");
  OPTree tree(queue_);
  int calls = 0;
  EXPECT_EQ(tree.ProcessOP([&](std::shared_ptr<OP>) { ++calls; }), 0u);
  EXPECT_EQ(calls, 0);
}

TEST_F(OPTreeTest, ExceptionFromTheCallbackStopsDelivery) {
  OPTree tree(WriteQueue({R"({"event":2,"path":"/s/a"})", R"({"event":2,"path":"/s/b"})"}));
  std::vector<std::string> got;
  EXPECT_THROW(tree.ProcessOP([&](std::shared_ptr<OP> op) {
    got.push_back(Print(op));
    throw Error(kErrBusy, "busy");
  }),
               Error);
  EXPECT_EQ(got, (std::vector<std::string>{"[02] /s/a"}));
}

TEST_F(OPTreeTest, GetNodeByPathReturnsOneNodePerPathInCreationOrder) {
  OPTree tree(WriteQueue({}));
  std::shared_ptr<OPNode> a = tree.GetNodeByPath("/volume1/share/a");
  EXPECT_EQ(tree.GetNodeByPath("/volume1/share/a"), a);
  EXPECT_EQ(a->GetPath(), "/volume1/share/a");
  tree.GetNodeByPath("/volume1/share/b");
  tree.GetNodeByPath("/volume1/share/ab");
  std::shared_ptr<OPNode> share = tree.GetNodeByPath("/volume1/share");
  EXPECT_EQ(a->parent, share);
  std::vector<std::string> names;
  for (const auto& c : share->children) names.push_back(c->name);
  EXPECT_EQ(names, (std::vector<std::string>{"a", "b", "ab"}));
}

TEST_F(OPTreeTest, GetNodeByPathRefusesPathsThatAreNotCanonical) {
  OPTree tree(WriteQueue({}));
  const std::string longest = [] {
    std::string p;
    while (p.size() + 2 <= OPTree::kMaxPathBytes) p += "/a";
    return p + std::string(OPTree::kMaxPathBytes - p.size(), 'b');
  }();
  ASSERT_EQ(longest.size(), 4095u);
  EXPECT_EQ(tree.GetNodeByPath(longest)->GetPath(), longest);
  for (const std::string& bad :
       {std::string(), std::string("/"), std::string("volume1/share"), std::string("/a//b"),
        std::string("/a/"), std::string("/a/./b"), std::string("/a/../b"), std::string("/."),
        std::string("//a"), std::string("/a/."), std::string("/.."), std::string("/a/.."),
        std::string("/a/b//"), longest + "c"}) {
    try {
      tree.GetNodeByPath(bad);
      ADD_FAILURE() << "accepted: \"" << bad << "\"";
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrNodeByPath) << bad;
      EXPECT_EQ(std::string(e.what()), "GetNodeByPath failed, path=" + bad);
    }
  }
  // Names that merely begin with dots are ordinary names.
  EXPECT_EQ(tree.GetNodeByPath("/a/.b/..c/...")->GetPath(), "/a/.b/..c/...");
}

// Lookups remember the last path and its folder: whatever came before, a
// path always resolves to the one node of that path, and a refused path in
// between changes nothing.
TEST_F(OPTreeTest, LookupFindsTheNodeOfThePathWhateverCameBefore) {
  OPTree tree(WriteQueue({}));
  // A refused path right after a good one of the same folder must be
  // refused as well, whatever it shares with it.
  const std::string too_long = "/a/" + std::string(OPTree::kMaxPathBytes, 'n');
  const std::vector<std::string> sequence = {
      "/a/b",  "/a/b", "/a//b", "/a/b",   "/a/bc", "/a/b/c", "/a",   "/x",     "/a/b",
      "/a/b/", "/a/b", "/ab/b", "/a/c",   "/b/c",  "/a/c",   "/a/.", "/a/..",  too_long,
      "/a/c",  "/a/",  "/a/b/c", "/a/b/.", "/a/b", "/x/y",   "/x"};
  const std::set<std::string> refused = {"/a//b", "/a/b/", "/a/.", "/a/..",
                                         too_long, "/a/",  "/a/b/."};
  std::map<std::string, std::shared_ptr<OPNode>> seen;
  for (const std::string& path : sequence) {
    std::shared_ptr<OPNode> node;
    try {
      node = tree.GetNodeByPath(path);
    } catch (const Error& e) {
      EXPECT_EQ(e.GetCode(), kErrNodeByPath) << path;
      EXPECT_EQ(refused.count(path), 1u) << path << " was refused";
      continue;
    }
    EXPECT_EQ(refused.count(path), 0u) << path.substr(0, 20) << " was accepted";
    EXPECT_EQ(node->GetPath(), path);
    auto [it, fresh] = seen.emplace(path, node);
    EXPECT_TRUE(fresh || it->second == node) << path << " resolved to a second node";
  }
  // Every path and prefix has exactly one node: /a /a/b /a/bc /a/b/c /a/c
  // /x /x/y /ab /ab/b /b /b/c, and the root.
  size_t nodes = 0;
  std::vector<OPNode*> stack{tree.root.get()};
  while (!stack.empty()) {
    OPNode* n = stack.back();
    stack.pop_back();
    ++nodes;
    for (const auto& c : n->children) stack.push_back(c.get());
  }
  EXPECT_EQ(nodes, 12u);
}

// Regression: a child made with OPNode::GetChild was unknown to the tree's
// index, and GetNodeByPath made a second node of the same name beside it.
TEST_F(OPTreeTest, ChildMadeWithGetChildIsTheNodeOfItsPath) {
  OPTree tree(WriteQueue({}));
  std::shared_ptr<OPNode> a = tree.GetNodeByPath("/v/a");
  EXPECT_EQ(a->parent->GetChild("a"), a);
  std::shared_ptr<OPNode> b = a->parent->GetChild("b");
  std::shared_ptr<OPNode> d = b->GetChild("d");
  EXPECT_EQ(tree.GetNodeByPath("/v/b/d"), d);
  EXPECT_EQ(tree.GetNodeByPath("/v/b"), b);
  EXPECT_EQ(tree.GetNodeByPath("/v/b/c")->parent, b);
  EXPECT_EQ(a->parent->children.size(), 2u);
  EXPECT_EQ(b->children.size(), 2u);
  // A child appended with no parent, or with another one, is found in the
  // folder it was appended to, and so are its siblings looked up next.
  std::shared_ptr<OPNode> orphan = std::make_shared<OPNode>(nullptr, "orphan");
  std::shared_ptr<OPNode> stray = std::make_shared<OPNode>(d, "stray");
  b->children.push_back(orphan);
  b->children.push_back(stray);
  EXPECT_EQ(tree.GetNodeByPath("/v/b/orphan"), orphan);
  EXPECT_EQ(tree.GetNodeByPath("/v/b/e")->parent, b);
  EXPECT_EQ(tree.GetNodeByPath("/v/b/stray"), stray);
  EXPECT_EQ(tree.GetNodeByPath("/v/b/f")->parent, b);
  EXPECT_EQ(b->children.size(), 6u);
}

// A wide folder is searched through an index of its children: children
// made by the tree, by GetChild or appended to `children` directly are all
// found, once each, in creation order, while lookups hop between folders.
TEST_F(OPTreeTest, WideFolderFindsEveryChildWhicheverWayItWasMade) {
  OPTree tree(WriteQueue({}));
  std::shared_ptr<OPNode> wide = tree.GetNodeByPath("/v/wide");
  std::vector<std::shared_ptr<OPNode>> made;
  for (int i = 0; i < 300; ++i) {
    const std::string name = "f" + std::to_string(i);
    if (i % 3 == 0) {
      made.push_back(wide->GetChild(name));
    } else if (i % 3 == 1) {
      made.push_back(tree.GetNodeByPath("/v/wide/" + name));
    } else {
      wide->children.push_back(std::make_shared<OPNode>(wide, name));
      made.push_back(wide->children.back());
    }
    tree.GetNodeByPath("/v/other/g" + std::to_string(i % 7));  // another folder in between
  }
  for (int i = 299; i >= 0; --i) {
    const std::string name = "f" + std::to_string(i);
    EXPECT_EQ(tree.GetNodeByPath("/v/wide/" + name), made[i]) << name;
    EXPECT_EQ(wide->GetChild(name), made[i]) << name;
    EXPECT_EQ(tree.GetNodeByPath("/v/wide/" + name + "/x")->parent, made[i]) << name;
  }
  ASSERT_EQ(wide->children.size(), 300u);
  for (int i = 0; i < 300; ++i) EXPECT_EQ(wide->children[i], made[i]);
  // A name appended twice resolves to its first node, as a scan would.
  wide->children.push_back(std::make_shared<OPNode>(wide, "f7"));
  EXPECT_EQ(tree.GetNodeByPath("/v/wide/f7"), made[7]);
}

// The tree's nodes and operations live in memory the tree allocates in
// bulk: operations a caller kept still print their paths after the tree is
// gone.
TEST_F(OPTreeTest, DeliveredOperationsOutliveTheTree) {
  std::vector<std::shared_ptr<OP>> kept;
  {
    OPTree tree(WriteQueue({R"({"event":64,"path":"/v/s/a/new.txt"})",
                            R"({"event":256,"path":"/v/s/b","path_old":"/v/s/a"})",
                            R"({"event":131072,"path":"/v/s","data":{"audio":true}})"}));
    tree.ProcessOP([&](std::shared_ptr<OP> op) { kept.push_back(op); });
  }
  std::vector<std::string> printed;
  for (const auto& op : kept) printed.push_back(Print(op));
  EXPECT_EQ(printed, (std::vector<std::string>{"[05] /v/s/a -> /v/s/b", "[02] /v/s/b/new.txt",
                                               R"([04] /v/s, data={"audio":true})"}))
      << Join(printed);
}

// Every node goes with the tree, however it was made: by the tree, with
// GetChild, appended to `children` directly, or made by the tree below one
// of those, also when a caller cleared a node's parent link; none is kept
// alive by a parent and child holding each other.
TEST_F(OPTreeTest, EveryNodeGoesWithTheTree) {
  std::vector<std::weak_ptr<OPNode>> nodes;
  {
    OPTree tree(WriteQueue({R"({"event":2,"path":"/v/a/f"})", R"({"event":2,"path":"/v/b"})"}));
    std::shared_ptr<OPNode> v = tree.GetNodeByPath("/v");
    std::shared_ptr<OPNode> made = v->GetChild("made");
    v->children.push_back(std::make_shared<OPNode>(v, "appended"));
    tree.GetNodeByPath("/v/made/below");
    tree.GetNodeByPath("/v/appended/below/deeper");
    tree.GetNodeByPath("/v/c");  // made by the tree after the others
    tree.GetNodeByPath("/v/cut/below")->parent->parent = nullptr;  // a link a caller cleared
    std::vector<std::shared_ptr<OPNode>> stack{tree.root};
    while (!stack.empty()) {
      std::shared_ptr<OPNode> n = stack.back();
      stack.pop_back();
      nodes.push_back(n);
      for (const auto& c : n->children) stack.push_back(c);
    }
  }
  ASSERT_EQ(nodes.size(), 13u);
  for (const auto& n : nodes) EXPECT_TRUE(n.expired());
}

// Dropping the last reference to the bottom of a very deep chain of nodes,
// after the tree is gone, frees the chain without one stack frame per level.
TEST_F(OPTreeTest, DroppingAKeptNodeOfAVeryDeepChainDoesNotRecurse) {
  std::shared_ptr<OPNode> bottom;
  {
    OPTree tree(WriteQueue({}));
    bottom = tree.root;
    for (int i = 0; i < 100000; ++i) bottom = bottom->GetChild("d");
  }
  std::weak_ptr<OPNode> top = [&] {
    std::shared_ptr<OPNode> n = bottom;
    while (n->parent) n = n->parent;
    return n;
  }();
  // 256 KiB of stack: far less than 100,000 destructor frames take.
  pthread_attr_t attr;
  ASSERT_EQ(pthread_attr_init(&attr), 0);
  ASSERT_EQ(pthread_attr_setstacksize(&attr, 256 * 1024), 0);
  pthread_t thread;
  ASSERT_EQ(pthread_create(
                &thread, &attr,
                [](void* p) -> void* {
                  static_cast<std::shared_ptr<OPNode>*>(p)->reset();
                  return nullptr;
                },
                &bottom),
            0);
  ASSERT_EQ(pthread_join(thread, nullptr), 0);
  pthread_attr_destroy(&attr);
  EXPECT_TRUE(top.expired());
}

TEST_F(OPTreeTest, ReindexOfAShallowFolderCancelsWorkOnAVeryDeepPath) {
  std::string deep = "/s";
  while (deep.size() + 2 <= OPTree::kMaxPathBytes) deep += "/d";
  Folded f = Fold({R"({"event":2,"path":")" + deep + R"("})", R"({"event":65536,"path":"/s"})"});
  EXPECT_EQ(f.delivered, (std::vector<std::string>{"[06] /s"}));
  EXPECT_EQ(f.count, 2u);
}

TEST_F(OPTreeTest, PrintsOperationsAndNodes) {
  OPTree tree(WriteQueue({}));
  auto node = [&](const char* p) { return tree.GetNodeByPath(p); };
  struct Case {
    std::shared_ptr<OP> op;
    std::string printed;
  } cases[] = {
      {std::make_shared<OP>(node("/volume1/share/a.txt"), FILE_INDEX_OP_UPSERT, "", Json::Value()),
       "[02] /volume1/share/a.txt"},
      {std::make_shared<OP>(node("/volume1/share/new"), FILE_INDEX_OP_RENAME, "/volume1/share/old",
                            Json::Value()),
       "[05] /volume1/share/old -> /volume1/share/new"},
      {std::make_shared<OP>(node("/volume1/share/d"), FILE_INDEX_OP_REINDEX, "", Json::Value()),
       "[06] /volume1/share/d"},
      {std::make_shared<OP>(node("/volume1/share/d"), FILE_INDEX_OP_UPDATE_CFG, "",
                            ParseJson(R"({"photo":true,"audio":false})")),
       R"([04] /volume1/share/d, data={"audio":false,"photo":true})"},
  };
  for (const auto& c : cases) EXPECT_EQ(Print(c.op), c.printed);

  std::shared_ptr<OPNode> n = node("/volume1/share/x");
  n->ops.push_back(std::make_shared<OP>(n, FILE_INDEX_OP_ATTR, "", Json::Value()));
  n->ops.push_back(std::make_shared<OP>(n, FILE_INDEX_OP_DELETE, "", Json::Value()));
  std::ostringstream os;
  os << n;
  EXPECT_EQ(os.str(), "Node[/volume1/share/x]: [03] /volume1/share/x, [01] /volume1/share/x");
}

// The incoming flags are read with the JSON helper, so they convert as the
// JSON library converts a value to a boolean: "video": 1 and "audio": 0.5
// count as true (a reader might expect them to count as false, but the
// helper deliberately keeps the library's rules), null is false, and a string
// is no boolean at all and leaves the default false. The pending side counts
// only a real true.
TEST(OPMergeDataTest, OrsTheFourCategoryFlagsAsTheJsonHelperReadsThem) {
  struct Case {
    const char* data;
    const char* other;
    const char* merged;
  } cases[] = {
      {R"({"audio":true})", R"({"document":true})",
       R"({"audio":true,"document":true,"photo":false,"video":false})"},
      {R"({"audio":true})", R"({"video":1})",
       R"({"audio":true,"document":false,"photo":false,"video":true})"},
      {R"({})", R"({"document":"yes","audio":0.5,"photo":null})",
       R"({"audio":true,"document":false,"photo":false,"video":false})"},
      {R"({"video":true})", R"({"video":false})",
       R"({"audio":false,"document":false,"photo":false,"video":true})"},
      {R"({"photo":"yes"})", R"({})",
       R"({"audio":false,"document":false,"photo":false,"video":false})"},
      {R"({"other":"x"})", R"({"other":"y","photo":true})",
       R"({"audio":false,"document":false,"other":"x","photo":true,"video":false})"},
      {"null", R"({"audio":true})",
       R"({"audio":true,"document":false,"photo":false,"video":false})"},
      {R"({"document":true})", "5",
       R"({"audio":false,"document":true,"photo":false,"video":false})"},
  };
  for (const auto& c : cases) {
    OP op(nullptr, FILE_INDEX_OP_UPDATE_CFG, "", ParseJson(c.data));
    op.MergeData(ParseJson(c.other));
    EXPECT_EQ(op.data, ParseJson(c.merged))
        << c.data << " merged with " << c.other << " gave " << JsonToString(op.data);
  }
}

TEST(OPMergeDataTest, MergingItsOwnDataKeepsTheFlags) {
  OP op(nullptr, FILE_INDEX_OP_UPDATE_CFG, "", ParseJson(R"({"audio":true,"photo":1})"));
  op.MergeData(op.data);
  // The stored 1 is no real true on the pending side, but the same 1 read
  // as the incoming flag is.
  EXPECT_EQ(op.data, ParseJson(R"({"audio":true,"document":false,"photo":true,"video":false})"))
      << JsonToString(op.data);
}

}  // namespace
}  // namespace vellis::fileindex
