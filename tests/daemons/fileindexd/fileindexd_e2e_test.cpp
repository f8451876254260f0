// vellis-fileindexd as a process against vellis-searchd: what the monitor
// queues and what the folder commands change reaches the index; pause,
// resume and the worker commands hold and release the work.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <cstdio>
#include <functional>
#include <string>
#include <vector>

#include "tests/daemons/fileindexd/fileindexd_fixture.h"
#include "tests/support/cli_runner.h"

namespace vellis::testing {
namespace {

using fileindex::kEventAttr;
using fileindex::kEventCreate;
using fileindex::kEventDelete;
using fileindex::kEventModify;
using fileindex::kEventRename;
using Paths = std::vector<std::string>;

class FileindexdEndToEndTest : public FileindexdTest {};

// Lines of creates, edits, deletes and attribute changes, each step in a
// round of its own: the index then holds exactly the folder's files, with
// their current content.
TEST_F(FileindexdEndToEndTest, MonitorLinesBecomeDocuments) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  using Searches = std::vector<std::pair<std::string, Paths>>;  // word, documents holding it
  const struct {
    const char* what;
    std::function<void()> act;
    Searches searches;
    std::function<void()> check;  // more, when set
  } steps[] = {
      {"created",
       [&] {
         Write("/docs/a.txt", "alpha");
         Write("/docs/b.txt", "beta");
         Write("/docs/sub/c.txt", "gamma");
         Write("/outside/x.txt", "alpha");  // in no indexed folder
         for (const char* rel :
              {"/docs/a.txt", "/docs/b.txt", "/docs/sub", "/docs/sub/c.txt", "/outside/x.txt"}) {
           Report(kEventCreate, rel);
         }
       },
       {{"alpha", {"/docs/a.txt"}}, {"gamma", {"/docs/sub/c.txt"}}}},
      {"edited, same size",  // only the content tells
       [&] {
         Write("/docs/a.txt", "delta");
         Report(kEventModify, "/docs/a.txt");
       },
       {{"alpha", {}}, {"delta", {"/docs/a.txt"}}}},
      {"edited, longer",
       [&] {
         Write("/docs/b.txt", "epsilon epsilon");
         Report(kEventModify, "/docs/b.txt");
       },
       {{"beta", {}}, {"epsilon", {"/docs/b.txt"}}}},
      {"attributes changed",
       [&] {
         ASSERT_EQ(chmod((share_ + "/docs/sub/c.txt").c_str(), 0600), 0);
         Report(kEventAttr, "/docs/sub/c.txt");
       },
       {{"gamma", {"/docs/sub/c.txt"}}},
       [&] { EXPECT_EQ(Search("gamma", 1)["hits"][0]["fields"]["QORUMDPrivilege"], "0600"); }},
      {"created and deleted at once",
       [&] {
         Write("/docs/tmp.txt", "zeta");
         Report(kEventCreate, "/docs/tmp.txt");
         Report(kEventModify, "/docs/tmp.txt");
         ASSERT_EQ(unlink((share_ + "/docs/tmp.txt").c_str()), 0);
         Report(kEventDelete, "/docs/tmp.txt");
       },
       {{"zeta", {}}}},
      {"file deleted",
       [&] {
         ASSERT_EQ(unlink((share_ + "/docs/b.txt").c_str()), 0);
         Report(kEventDelete, "/docs/b.txt");
       },
       {{"epsilon", {}}}},
      {"folder deleted with its file",
       [&] {
         ASSERT_EQ(unlink((share_ + "/docs/sub/c.txt").c_str()), 0);
         ASSERT_EQ(rmdir((share_ + "/docs/sub").c_str()), 0);
         Report(kEventDelete, "/docs/sub/c.txt");
         Report(kEventDelete, "/docs/sub");
       },
       {{"gamma", {}}}},
  };
  for (const auto& step : steps) {
    SCOPED_TRACE(step.what);
    ASSERT_NO_FATAL_FAILURE(step.act());
    ASSERT_TRUE(WaitSettled());
    EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
    for (const auto& [word, paths] : step.searches) EXPECT_EQ(Found(word), paths) << word;
    if (step.check) step.check();
  }
}

// A folder of 1,000 files renamed within the indexed folder, out of it and
// back in: the documents follow it and none stays at the old place.
TEST_F(FileindexdEndToEndTest, RenamedFolderTakesAllItsDocuments) {
  WriteTree("/docs/old", 10, 100, "needle");
  Write("/docs/old2/x.txt", "needle");  // a sibling with the same prefix
  MakeDirs(share_ + "/docs/back");
  MakeDirs(share_ + "/outside");
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  ASSERT_EQ(Diff(Disk("/docs"), Index()), "");
  ASSERT_EQ(Index().size(), 1 + 1 + 10 + 1000 + 1 + 1 + 1u);

  const struct {
    const char* from;
    const char* to;
    size_t found;  // documents holding the word
    bool carried;  // the documents were moved, not read again
  } moves[] = {
      {"/docs/old", "/docs/new", 1001, true},           // within the folder
      {"/docs/new", "/outside/moved", 1, false},        // out of every folder: they go
      {"/outside/moved", "/docs/back/in", 1001, false}  // in again: crawled
  };
  for (const auto& m : moves) {
    SCOPED_TRACE(std::string(m.from) + " -> " + m.to);
    ASSERT_EQ(rename((share_ + m.from).c_str(), (share_ + m.to).c_str()), 0);
    Report(kEventRename, m.to, m.from);
    ASSERT_TRUE(WaitSettled());
    EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
    EXPECT_EQ(Hits("needle"), m.found);
    if (m.carried) {
      EXPECT_EQ(ShareStatus()["last_round"]["upserted"], 0);
    }
  }
}

// The folder commands of `vellis` with the daemon running: documents follow
// a folder's categories, and leave with the folder.
TEST_F(FileindexdEndToEndTest, FolderCommandsReachTheIndex) {
  AddFolder("/docs");
  for (const char* rel : {"/media/a.txt", "/media/b.mp3", "/media/c.jpg", "/media/d.mp4",
                          "/media/e.bin", "/media/sub/f.txt"}) {
    Write(rel);
  }
  const struct {
    std::string args;
    std::string printed;
    Paths below;  // what the index holds below /media afterwards
  } steps[] = {
      {"folder add /s/media --categories document",
       "added 1 folder\n",
       {"/media", "/media/a.txt", "/media/e.bin", "/media/sub", "/media/sub/f.txt"}},
      {"folder set /s/media --categories document,audio",
       "...",
       {"/media", "/media/a.txt", "/media/b.mp3", "/media/e.bin", "/media/sub",
        "/media/sub/f.txt"}},
      {"folder set /s/media --categories photo,video",
       "...",
       {"/media", "/media/c.jpg", "/media/d.mp4", "/media/e.bin", "/media/sub"}},
      {"folder delete /s/media", "deleted /s/media\n", {}},
  };
  for (const auto& step : steps) {
    SCOPED_TRACE(step.args);
    ExpectRuns({{step.args, 0, step.printed}});
    ASSERT_TRUE(WaitSettled());
    Paths below;
    for (const auto& [path, doc] : Below(Index(), "/media")) below.push_back(path);
    EXPECT_EQ(below, step.below);
  }
  EXPECT_EQ(Diff(Disk("/docs"), Index()), "") << "the other folder stays as it was";

  // The share's last folder: its worker and its index go.
  auto indexes = [] {
    Json::Value list;
    fileindex::elastic::SendRequestRetryOnBusy(
        list, fileindex::elastic::MakeRequest("index_list", Json::Value(Json::objectValue)));
    return JsonToString(list["data"]);
  };
  ASSERT_NE(indexes().find("\"fileindex_s\""), std::string::npos) << indexes();
  ExpectRuns({{"folder delete /s/docs", 0, "deleted /s/docs\n"}});
  EXPECT_TRUE(WaitFor([&] { return ShareStatus().isNull(); }, "the worker goes"));
  EXPECT_EQ(indexes().find("\"fileindex_s\""), std::string::npos) << indexes();
}

// Paused until resumed, or until a time: queue lines wait, the worker says
// so, and the round runs once the pause ends.
TEST_F(FileindexdEndToEndTest, PauseHoldsQueuedWorkUntilItEnds) {
  AddFolder("/docs");
  ASSERT_TRUE(WaitSettled());
  const struct {
    const char* what;
    int64_t resume_in;  // seconds from now; 0: until a resume command
  } cases[] = {{"until resumed", 0}, {"until a time", 2}};
  int n = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    const int64_t resume_time = c.resume_in == 0 ? 0 : time(nullptr) + c.resume_in;
    Json::Value data;
    data["resume_time"] = static_cast<Json::Int64>(resume_time);
    EXPECT_EQ(Command("pause", data)["success"], true);
    const Json::Value status = Command("status")["data"];
    EXPECT_EQ(status["paused"], true);
    EXPECT_EQ(status["resume_time"].asInt64(), resume_time);

    const std::string rel = "/docs/p" + std::to_string(n++) + ".txt";
    Write(rel);
    Report(kEventCreate, rel);
    ASSERT_TRUE(WaitFor([&] { return ShareStatus()["state"] == "paused"; }, "the worker holds"));
    EXPECT_EQ(ShareStatus()["events_waiting"], 1);
    EXPECT_EQ(Index().count(rel), 0u) << "nothing indexed while paused";
    if (c.resume_in == 0) {
      EXPECT_EQ(Command("resume")["success"], true);
    }
    ASSERT_TRUE(WaitSettled(10000));
    EXPECT_EQ(Index().count(rel), 1u);
    EXPECT_EQ(Command("status")["data"]["paused"], false);
  }
}

// worker_delete stops the share's worker, in the middle of a round too; the
// queue keeps what comes meanwhile, and worker_create catches up.
TEST_F(FileindexdEndToEndTest, WorkerDeleteStopsTheShareAndCreateCatchesUp) {
  WriteTree("/docs", 4, 250, "word");
  AddFolder("/docs");
  Json::Value share;
  share["share_name"] = "s";
  ASSERT_TRUE(WaitFor([&] { return ShareStatus()["crawl"]["crawled"].asInt() > 0; },
                      "the first crawl runs"));
  EXPECT_EQ(Command("worker_delete", share)["success"], true);
  EXPECT_TRUE(ShareStatus().isNull()) << "the worker is gone";

  Write("/docs/late.txt");
  Report(kEventCreate, "/docs/late.txt");
  usleep(200 * 1000);  // several settle times: nobody works on the share
  EXPECT_EQ(Index().count("/docs/late.txt"), 0u);
  EXPECT_GT(Index().size(), 0u) << "what the stopped round sent was committed";

  EXPECT_EQ(Command("worker_create", share)["success"], true);
  ASSERT_TRUE(WaitSettled());
  EXPECT_EQ(Diff(Disk("/docs"), Index()), "");
}

}  // namespace
}  // namespace vellis::testing
