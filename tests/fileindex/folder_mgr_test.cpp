// The folder record and its live status; the folder list and its file:
// saving under several processes, updates, sorting and paging, and which
// folder covers and governs a path (/musicbox is not below /music).
#include "fileindex/folder_mgr.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <set>

#include "common/fs_util.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "tests/support/folder_env.h"
#include "tests/support/parse_json.h"

namespace vellis::fileindex {
namespace {

using Strings = std::vector<std::string>;
using testing::ParseJson;
using testing::Thrown;
using testing::WriteFile;

// A folder record with privileged and paused off.
std::shared_ptr<Folder> MakeFolder(const std::string& path, const std::string& name = "n",
                                   bool document = true, bool audio = true, bool video = true,
                                   bool photo = true) {
  return std::make_shared<Folder>(path, name, document, audio, video, photo, false, false);
}

// Optional keys default, and mistyped ones keep their defaults.
TEST(FolderJsonTest, LoadingAndGetDataAreInverses) {
  Folder plain("/music", "music", true, true, false, true, false, false);
  Folder flagged("/photo/2019", "Trip", false, false, true, false, true, true);
  Folder cleaning = plain;
  cleaning.SetVolumeToBeClean("/volume2");
  for (const Folder& f : {plain, flagged, cleaning}) EXPECT_TRUE(Folder(f.GetData()) == f);
  EXPECT_FALSE(plain == cleaning || plain == flagged);
  Json::Value data = ParseJson(
      R"({"path":"/music","name":"music","document":true,"audio":true,"video":false,"photo":true,
          "paused":"true","volume_to_be_clean":[],"unknown":1})");
  EXPECT_EQ(Folder(data).GetData(), plain.GetData());
}

class FolderMgrTest : public testing::FolderEnvTest {
 protected:
  FolderMgrTest() {
    for (const char* share : {"music", "musicbox", "photo"}) AddShare(share);
    AddShare("s", {"/dir"});
    platform_.SetTime(1700000000);
    platform_.SetRealUSleep(1);  // for writers that contend for the folder lock
  }

  void Add(const std::shared_ptr<Folder>& folder) {
    std::shared_ptr<Folder> changed;
    mgr_.Upsert(changed, folder);
  }

  Strings Saved() {
    Strings paths;
    for (const Json::Value& f : ParseJson(testing::ReadFile(FoldersPath()))) {
      paths.push_back(f["path"].asString());
    }
    return paths;
  }

  // Runs `body` in a child process: exit 0 when it returns, 1 when it throws.
  static pid_t Spawn(const std::function<void()>& body) {
    pid_t pid = fork();
    if (pid != 0) return pid;
    try {
      body();
    } catch (...) {
      _exit(1);
    }
    _exit(0);
  }

  FolderMgr mgr_;
};

TEST_F(FolderMgrTest, EachStatusTextInOrderOfPrecedence) {
  const std::string s = Volume() + "/s";
  auto line = [](const std::string& path) { return R"({"event":2,"path":")" + path + "\"}\n"; };
  struct Case {
    std::string status_file, queue, queue_tmp, expected;
  } cases[] = {
      {"", "", "", "finished"},
      {"", line(s + "/dir/a"), "", "processing"},
      {"", "", line(s + "/dir"), "processing"},
      {R"({"resume_time":0})", line(s + "/dir/a"), "", "paused"},
      {R"({"resume_time":1700003600})", line(s + "/dir/a"), "", "paused"},
      {R"({"resume_time":1700000000})", line(s + "/dir/a"), "", "processing"},
      {R"({"share":{"s":1}})", "", "", "need_reindex"},
      {R"({"resume_time":0,"share":{"s":3}})", line(s + "/dir/a"), "", "need_reindex"},
      {R"({"share":{"s":2}})", "", "", "finished"},
  };
  for (const Case& c : cases) {
    const std::string contents[] = {c.status_file, c.queue, c.queue_tmp};
    const std::string files[] = {StatusPath(), QueuePath("s"), QueuePath("s") + ".tmp"};
    for (int i = 0; i < 3; ++i) {
      Unlink(files[i]);
      if (!contents[i].empty()) WriteFile(files[i], contents[i]);
    }
    Json::Value out;
    Folder("/s/dir", "dir", true, true, true, true, false, false).GetStatus(out);
    EXPECT_EQ(out["text"], c.expected) << c.status_file << " " << c.queue << c.queue_tmp;
  }
  // A path that cannot be indexed is an error whatever else holds.
  for (const char* path : {"/s/missing", "/s/dir/"}) {
    Json::Value out;
    Folder(path, "m", 1, 1, 1, 1, 0, 0).GetStatus(out);
    EXPECT_EQ(out, ParseJson(R"({"text":"error","desc":"invalid_path"})")) << path;
  }
}

// A killed save's temporary file goes; one that a save under way may own
// stays; the file is readable by all.
TEST_F(FolderMgrTest, SaveRemovesOnlyTemporaryFilesOfSavesLongGone) {
  const std::string stale = FoldersPath() + ".tmp-Ab12Cd", fresh = FoldersPath() + ".tmp-Ef34Gh",
                    other = FoldersPath() + ".bak";
  for (const std::string& f : {stale, fresh, other, FoldersPath()}) WriteFile(f, "[");
  chmod(FoldersPath().c_str(), 0600);
  struct stat st;
  ASSERT_EQ(stat(fresh.c_str(), &st), 0);
  const timespec times[2] = {{st.st_mtime - 120, 0}, {st.st_mtime - 120, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, stale.c_str(), times, 0), 0);
  ASSERT_EQ(utimensat(AT_FDCWD, other.c_str(), times, 0), 0);
  mgr_.Save();
  EXPECT_NE(stat(stale.c_str(), &st), 0);
  EXPECT_EQ(stat(fresh.c_str(), &st) + stat(other.c_str(), &st), 0);
  ASSERT_EQ(stat(FoldersPath().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
}

// The change reported is the categories that differ from the governing
// folder's, as a plain record: never privileged or paused.
TEST_F(FolderMgrTest, UpsertReportsTheCategoriesThatChangeAgainstTheGoverningFolder) {
  std::shared_ptr<Folder> changed;
  Add(MakeFolder("/music", "m", true, false, true, false));
  mgr_.Upsert(changed,
              std::make_shared<Folder>("/music/sub", "s", false, false, true, true, true, true));
  EXPECT_EQ(changed->GetIndexCfg(),
            ParseJson(R"({"document":true,"audio":false,"video":false,"photo":true})"));
  EXPECT_FALSE(changed->IsPrivileged() || changed->IsPaused());
  for (const char* path : {"/music/a", "/musicbox/b", "/photo"}) Add(MakeFolder(path));
  mgr_.DeleteByShare("music");
  mgr_.Save();
  EXPECT_EQ(Saved(), (Strings{"/musicbox/b", "/photo"}));
}

// Text keys ignore case, flag keys put folders without the flag first;
// unknown keys sort by name, unknown directions ascending.
TEST_F(FolderMgrTest, ListSortsAndPages) {
  Add(MakeFolder("/music/b", "delta", true, false, true, false));
  Add(MakeFolder("/music/C", "Alpha", false, true, true, false));
  Add(MakeFolder("/music/a", "charlie", false, false, false, true));
  Add(MakeFolder("/music/D", "Bravo", true, true, false, true));
  Add(MakeFolder("/music/e", "echo", false, false, false, false));
  auto list = [&](unsigned int offset, unsigned int limit, const char* key, const char* dir) {
    std::vector<std::shared_ptr<Folder>> out;
    unsigned int total = 0;
    mgr_.List(out, total, offset, limit, key, dir);
    EXPECT_EQ(total, 5u);
    return out;
  };
  struct Case {
    const char *sort_by, *direction;
    unsigned int offset, limit;
    std::string names;
  } cases[] = {
      {"path", "asc", 0, 50, "charlie delta Alpha Bravo echo "},
      {"path", "desc", 0, 50, "echo Bravo Alpha delta charlie "},
      {"name", "asc", 1, 3, "Bravo charlie delta "},
      {"size", "DESC", 0, 50, "Alpha Bravo charlie delta echo "},
      {"path", "asc", 4, 1, "echo "},
      {"path", "asc", 5, 1, ""},
  };
  for (const Case& c : cases) {
    std::string names;
    for (const auto& f : list(c.offset, c.limit, c.sort_by, c.direction))
      names += f->GetName() + " ";
    EXPECT_EQ(names, c.names) << c.sort_by << " " << c.direction << " " << c.offset;
  }
  for (const auto& [key, flag] : {std::pair{"document", &Folder::IsDocument},
                                  {"audio", &Folder::IsAudio},
                                  {"video", &Folder::IsVideo},
                                  {"photo", &Folder::IsPhoto}}) {
    for (const char* dir : {"asc", "desc"}) {
      std::string flags;
      for (const auto& f : list(0, 50, key, dir)) flags += ((*f).*flag)() ? "1" : "0";
      std::string sorted = flags;
      std::sort(sorted.begin(), sorted.end());
      if (dir[0] == 'd') std::reverse(sorted.begin(), sorted.end());
      EXPECT_EQ(flags, sorted) << key << " " << dir;
    }
  }
}

TEST_F(FolderMgrTest, TheDeepestCoveringFolderGoverns) {
  Add(MakeFolder("/music", "music"));
  Add(MakeFolder("/music/live", "live"));
  Add(MakeFolder("/photo/2019", "first"));
  Add(MakeFolder("/photo/2019", "replaced"));
  struct Case {
    std::string full_path, governing;
    bool indexed, own_cfg;
  } cases[] = {
      {"/music/live/a.mp3", "live", true, false},     {"/music/live", "live", true, true},
      {"/music/studio/b.mp3", "music", true, false},  {"/music", "music", true, true},
      {"/musicbox/c.mp3", "none", false, false},      {"/music/liveX/a", "music", true, false},
      {"/photo/2019/x.jpg", "replaced", true, false}, {"/photo/2020/x.jpg", "none", false, false},
      {"/MUSIC/a.mp3", "none", false, false},         {"/photo/2019/", "replaced", true, false},
  };
  for (const Case& c : cases) {
    const std::shared_ptr<Folder> cfg = mgr_.GetMostSuitableCfg(Volume() + c.full_path);
    EXPECT_EQ(cfg ? cfg->GetName() : "none", c.governing) << c.full_path;
    EXPECT_EQ(mgr_.IsFullPathIndexed(Volume() + c.full_path), c.indexed) << c.full_path;
    EXPECT_EQ(mgr_.IsFullPathHasOwnCfg(Volume() + c.full_path), c.own_cfg) << c.full_path;
  }
  EXPECT_FALSE(mgr_.HasFolder("/music/live/") || mgr_.HasFolder("/musicbox"));
  EXPECT_FALSE(mgr_.IsShareIndexed("musicbox") || mgr_.IsShareIndexed("mus"));
  EXPECT_EQ(mgr_.GetIndexedShares(), (std::set<std::string>{"music", "photo"}));
  std::shared_ptr<Folder> out;
  EXPECT_EQ(Thrown([&] { mgr_.Get(out, "/Music/live"); }), "902 /Music/live");
}

TEST_F(FolderMgrTest, NeedMetaFollowsTheGoverningFoldersFlagForTheFileType) {
  Add(MakeFolder("/music/docs", "docs", true, false, false, false));
  Add(MakeFolder("/music/media", "media", false, true, true, true));
  Add(MakeFolder("/music/none", "none", false, false, false, false));
  struct Case {
    std::string full_path;
    bool expected;
  } cases[] = {
      {"/music/docs/a.PDF", true},   {"/music/docs/README", true},    {"/music/docs/a.mp3", false},
      {"/music/media/a.pdf", false}, {"/music/media/a.flac", true},   {"/music/media/a.mkv", true},
      {"/music/media/a.jpg", true},  {"/music/none/a.jpg", false},    {"/music/none/a.exe", true},
      {"/musicbox/a.exe", false},    {"/music/media/.profile", true},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(mgr_.IsFullPathNeedMeta(Volume() + c.full_path), c.expected) << c.full_path;
  }
}

TEST_F(FolderMgrTest, TwoWritersUnderTheFolderLockLoseNoUpdate) {
  std::vector<pid_t> writers;
  for (int w = 0; w < 2; ++w) {
    writers.push_back(Spawn([w] {
      for (int i = 0; i < 10; ++i) {
        LockFile lock(RootPath(kFolderCfgLockPath), true);
        FolderMgr mgr;
        std::shared_ptr<Folder> changed;
        mgr.Upsert(changed, MakeFolder("/music/w" + std::to_string(w) + "_" + std::to_string(i)));
        mgr.Save();
      }
    }));
  }
  for (pid_t pid : writers) {
    int status = -1;
    waitpid(pid, &status, 0);
    EXPECT_EQ(status, 0) << "writer " << pid << " failed";
  }
  const Strings saved = Saved();
  EXPECT_EQ(std::set<std::string>(saved.begin(), saved.end()).size(), 20u);
}

// The writer alternates between the base list and the base list plus one
// folder, saving as fast as it can until it is killed.
TEST_F(FolderMgrTest, WriterKilledWhileSavingLeavesTheOldOrTheNewList) {
  for (size_t i = 0; i < 200; ++i) Add(MakeFolder("/music/d" + std::to_string(i)));
  mgr_.Save();
  sdk::Platform* real = platform_.target();
  for (int round = 0; round < 30; ++round) {
    pid_t writer = Spawn([] {
      FolderMgr mgr;
      std::shared_ptr<Folder> changed;
      for (int i = 0;; ++i) {
        if (i % 2 == 0) mgr.Upsert(changed, MakeFolder("/music/extra"));
        if (i % 2 == 1) mgr.Delete(changed, "/music/extra");
        mgr.Save();
      }
    });
    real->USleep(static_cast<uint64_t>(real->Rand() % 30000));
    kill(writer, SIGKILL);
    int status = 0;
    waitpid(writer, &status, 0);
    ASSERT_TRUE(WIFSIGNALED(status)) << "round " << round << ": the writer stopped by itself";
    size_t total = 0;
    EXPECT_EQ(Thrown([&] { total = FolderMgr().GetFolders().size(); }), "no error") << round;
    EXPECT_TRUE(total == 200 || total == 201) << "round " << round << ": " << total;
  }
}

}  // namespace
}  // namespace vellis::fileindex
