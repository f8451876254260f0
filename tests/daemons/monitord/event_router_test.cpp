// The router on its own: watcher events in, queue lines out, with two
// queues (shares s and t), a nested folder and an ignored name.
#include "daemons/monitord/event_router.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace vellis::monitord {
namespace {

using K = FsEventKind;

const std::string kQs = "/v/@fileindex/s/queue";
const std::string kQt = "/v/@fileindex/t/queue";

std::vector<WatchedFolder> Folders() {
  return {{"/v/s/docs", 65478, {"@eaDir"}, kQs},
          {"/v/s/docs/notes", 0x40 | 0x80, {}, kQs},  // only creates and deletes
          {"/v/t", 65478, {"@eaDir"}, kQt}};
}

struct Case {
  const char* what;
  std::vector<FsEvent> events;  // taken at t=0
  int64_t flush_at;             // then Flush at this time
  std::string s_lines;
  std::string t_lines;
};

TEST(EventRouterTest, EventsBecomeTheLinesOfTheirQueue) {
  const Case cases[] = {
      {"create, with is_dir",
       {{K::kCreate, "/v/s/docs/a.txt", false, 0}, {K::kCreate, "/v/t/dir", true, 0}},
       0,
       R"({"event":64,"is_dir":false,"path":"/v/s/docs/a.txt"})"
       "\n",
       R"({"event":64,"is_dir":true,"path":"/v/t/dir"})"
       "\n"},
      {"writes are one line, at the close",
       {{K::kModify, "/v/s/docs/a.txt", false, 0},
        {K::kModify, "/v/s/docs/a.txt", false, 0},
        {K::kCloseWrite, "/v/s/docs/a.txt", false, 0}},
       5000,
       R"({"event":2,"is_dir":false,"path":"/v/s/docs/a.txt"})"
       "\n",
       ""},
      {"a file kept open is reported after the flush time",
       {{K::kModify, "/v/t/log", false, 0}},
       1000,
       "",
       R"({"event":2,"is_dir":false,"path":"/v/t/log"})"
       "\n"},
      {"attributes and delete",
       {{K::kAttrib, "/v/t/x", false, 0}, {K::kDelete, "/v/t/d", true, 0}},
       0,
       "",
       R"({"event":4,"is_dir":false,"path":"/v/t/x"})"
       "\n"
       R"({"event":128,"is_dir":true,"path":"/v/t/d"})"
       "\n"},
      {"rename within one queue: one line",
       {{K::kMovedFrom, "/v/s/docs/a", true, 7}, {K::kMovedTo, "/v/s/docs/b", true, 7}},
       0,
       R"({"event":256,"is_dir":true,"path":"/v/s/docs/b","path_old":"/v/s/docs/a"})"
       "\n",
       ""},
      {"move across queues: a delete and a create",
       {{K::kMovedFrom, "/v/s/docs/a.txt", false, 8}, {K::kMovedTo, "/v/t/a.txt", false, 8}},
       0,
       R"({"event":128,"is_dir":false,"path":"/v/s/docs/a.txt"})"
       "\n",
       R"({"event":64,"is_dir":false,"path":"/v/t/a.txt"})"
       "\n"},
      {"moved out: a delete once the grace time is over",
       {{K::kMovedFrom, "/v/t/gone", true, 9}},
       50,
       "",
       R"({"event":128,"is_dir":true,"path":"/v/t/gone"})"
       "\n"},
      {"moved in: a create",
       {{K::kMovedTo, "/v/t/new", true, 10}},
       0,
       "",
       R"({"event":64,"is_dir":true,"path":"/v/t/new"})"
       "\n"},
      {"outside every folder, or in an ignored folder: nothing",
       {{K::kCreate, "/v/u/a", false, 0},
        {K::kCreate, "/v/s/docsx", false, 0},
        {K::kCreate, "/v/t/@eaDir/thumb.jpg", false, 0},
        {K::kCreate, "/v/t/x/@eaDir", true, 0}},
       0,
       "",
       ""},
      {"the deepest folder's mask decides",
       {{K::kAttrib, "/v/s/docs/notes/n.txt", false, 0},
        {K::kCreate, "/v/s/docs/notes/n.txt", false, 0}},
       0,
       R"({"event":64,"is_dir":false,"path":"/v/s/docs/notes/n.txt"})"
       "\n",
       ""},
      {"a name that is not UTF-8 is left out; a rename from it is a create",
       {{K::kCreate, "/v/t/bad\xff", false, 0},
        {K::kMovedFrom, "/v/t/bad\xff", false, 11},
        {K::kMovedTo, "/v/t/good", false, 11},
        {K::kMovedFrom, "/v/t/good2", false, 12},
        {K::kMovedTo, "/v/t/bad\xfe", false, 12}},
       0,
       "",
       R"({"event":64,"is_dir":false,"path":"/v/t/good"})"
       "\n"
       R"({"event":128,"is_dir":false,"path":"/v/t/good2"})"
       "\n"},
      {"overflow: the crash marker in every queue",
       {{K::kOverflow, "", false, 0}},
       0,
       R"({"event":512,"path":"/v/s/docs"})"
       "\n",
       R"({"event":512,"path":"/v/t"})"
       "\n"},
  };
  for (const Case& c : cases) {
    EventRouter router;
    router.SetFolders(Folders());
    for (const FsEvent& e : c.events) router.Take(e, 0);
    router.Flush(c.flush_at);
    auto lines = router.TakeLines();
    EXPECT_EQ(lines[kQs], c.s_lines) << c.what;
    EXPECT_EQ(lines[kQt], c.t_lines) << c.what;
  }
}

// What waits says when it is due; a write that a rename carries is
// reported under the new name.
TEST(EventRouterTest, WaitingHalvesAndWritesAreDueOnTime) {
  EventRouter router;
  router.SetFolders(Folders());
  EXPECT_EQ(router.Flush(0), -1);
  router.Take({K::kModify, "/v/t/a", false, 0}, 100);
  router.Take({K::kMovedFrom, "/v/t/d", true, 5}, 200);
  EXPECT_EQ(router.Flush(220), 250) << "the rename half first";
  EXPECT_EQ(router.Flush(250), 1100) << "then the write";
  router.Take({K::kMovedFrom, "/v/t/a", false, 6}, 300);
  router.Take({K::kMovedTo, "/v/t/b", false, 6}, 300);
  EXPECT_EQ(router.Flush(1100), -1);
  EXPECT_EQ(router.TakeLines()[kQt],
            R"({"event":128,"is_dir":true,"path":"/v/t/d"})"
            "\n"
            R"({"event":256,"is_dir":false,"path":"/v/t/b","path_old":"/v/t/a"})"
            "\n"
            R"({"event":2,"is_dir":false,"path":"/v/t/b"})"
            "\n");
  EXPECT_EQ(router.stats().events, 4u);
}

}  // namespace
}  // namespace vellis::monitord
