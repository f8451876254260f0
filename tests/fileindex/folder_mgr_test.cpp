// The folder list and its file: loading, saving, updates, sorting and paging.
#include "fileindex/folder_mgr.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::MakeFolder;
using testing::ReadFile;
using testing::Thrown;
using testing::WriteFile;

std::vector<std::string> Paths(const std::vector<std::shared_ptr<Folder>>& folders) {
  std::vector<std::string> paths;
  for (const auto& f : folders) paths.push_back(f->GetPath());
  return paths;
}

// The four content flags as "DAVP" letters, "-" where off.
std::string Flags(const Folder& f) {
  return std::string(f.IsDocument() ? "D" : "-") + (f.IsAudio() ? "A" : "-") +
         (f.IsVideo() ? "V" : "-") + (f.IsPhoto() ? "P" : "-");
}

class FolderMgrTest : public ::testing::Test {
 protected:
  FolderMgrTest() {
    env_.AddShare("music");
    env_.AddShare("photo");
  }

  // The paths in the folders file, in file order.
  std::vector<std::string> SavedPaths() {
    Json::Value saved;
    EXPECT_TRUE(JsonFromFile(saved, env_.FoldersFile()));
    std::vector<std::string> paths;
    for (const Json::Value& f : saved) paths.push_back(f["path"].asString());
    return paths;
  }

  FolderEnv env_;
};

TEST_F(FolderMgrTest, NoFileIsAnEmptyListAndSaveWritesAnEmptyArray) {
  FolderMgr mgr;
  std::vector<std::shared_ptr<Folder>> out;
  unsigned int total = 7;
  mgr.List(out, total, 0, 50, "name", "asc");
  EXPECT_EQ(total, 0u);
  EXPECT_TRUE(out.empty());
  mgr.Save();
  Json::Value saved;
  ASSERT_TRUE(JsonFromFile(saved, env_.FoldersFile()));
  EXPECT_EQ(saved, Json::Value(Json::arrayValue));
}

TEST_F(FolderMgrTest, UnreadableFileIsRefusedAndLeftUntouched) {
  const char* contents[] = {"[{\"path\":", "", "{}", "\"x\"", "[1,2", "null", "\x01\x02"};
  for (const char* content : contents) {
    WriteFile(env_.FoldersFile(), content);
    std::string thrown = Thrown([] { FolderMgr mgr; });
    EXPECT_EQ(thrown, "504 Cannot load json: " + env_.FoldersFile()) << "[" << content << "]";
    EXPECT_EQ(ReadFile(env_.FoldersFile()), content);
  }
}

TEST_F(FolderMgrTest, ElementWithoutRequiredKeyAbortsTheLoad) {
  std::string good = JsonToString(MakeFolder("/music")->GetData());
  WriteFile(env_.FoldersFile(), "[" + good + R"(,{"path":"/photo","name":"p","document":true}])");
  EXPECT_EQ(Thrown([] { FolderMgr mgr; }).rfind("120 Missing property: audio", 0), 0u);
}

TEST_F(FolderMgrTest, SaveKeepsOrderAndFieldsAndSetsMode0644) {
  WriteFile(env_.FoldersFile(), "[]");
  chmod(env_.FoldersFile().c_str(), 0600);
  std::shared_ptr<Folder> changed;
  {
    FolderMgr mgr;
    auto paused = MakeFolder("/photo/2019", "Trip", false, true, false, true);
    paused->SetPaused(true);
    paused->SetVolumeToBeClean("/volume2");
    mgr.Upsert(changed, MakeFolder("/music"));
    mgr.Upsert(changed, paused);
    mgr.Save();
  }
  Json::Value saved;
  ASSERT_TRUE(JsonFromFile(saved, env_.FoldersFile()));
  ASSERT_EQ(saved.size(), 2u);
  EXPECT_EQ(saved[0], MakeFolder("/music")->GetData());
  EXPECT_EQ(saved[1]["paused"], true);
  EXPECT_EQ(saved[1]["volume_to_be_clean"], "/volume2");
  struct stat st;
  ASSERT_EQ(stat(env_.FoldersFile().c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & 07777, 0644u);
}

TEST_F(FolderMgrTest, SaveRemovesOnlyTemporaryFilesOfSavesLongGone) {
  const std::string stale = env_.FoldersFile() + ".tmp-Ab12Cd";
  const std::string fresh = env_.FoldersFile() + ".tmp-Ef34Gh";
  const std::string other = env_.FoldersFile() + ".bak";
  for (const std::string& f : {stale, fresh, other}) WriteFile(f, "[");
  struct stat st;
  ASSERT_EQ(stat(fresh.c_str(), &st), 0);
  // Two minutes older than the file system's own clock says now.
  const timespec times[2] = {{st.st_mtime - 120, 0}, {st.st_mtime - 120, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, stale.c_str(), times, 0), 0);
  ASSERT_EQ(utimensat(AT_FDCWD, other.c_str(), times, 0), 0);
  FolderMgr().Save();
  EXPECT_NE(stat(stale.c_str(), &st), 0) << "a killed save's file stays";
  EXPECT_EQ(stat(fresh.c_str(), &st), 0) << "a save under way may own it";
  EXPECT_EQ(stat(other.c_str(), &st), 0);
}

TEST_F(FolderMgrTest, UpsertOfAKnownPathReplacesItAndMovesItToTheEnd) {
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  for (const char* path : {"/music/a", "/music/b", "/music/c"})
    mgr.Upsert(changed, MakeFolder(path));
  mgr.Upsert(changed, MakeFolder("/music/a", "renamed", false, true, true, true));
  mgr.Save();
  Json::Value saved;
  ASSERT_TRUE(JsonFromFile(saved, env_.FoldersFile()));
  ASSERT_EQ(saved.size(), 3u);
  EXPECT_EQ(saved[0]["path"], "/music/b");
  EXPECT_EQ(saved[1]["path"], "/music/c");
  EXPECT_EQ(saved[2]["path"], "/music/a");
  EXPECT_EQ(saved[2]["name"], "renamed");
}

TEST_F(FolderMgrTest, The1001stDistinctFolderFailsAndTheFileStaysAsItWas) {
  {
    FolderMgr mgr;
    std::shared_ptr<Folder> changed;
    for (size_t i = 0; i < kFileIndexFoldersMax; ++i) {
      mgr.Upsert(changed, MakeFolder("/music/d" + std::to_string(i)));
    }
    mgr.Upsert(changed, MakeFolder("/music/d0", "again"));  // a replacement still fits
    mgr.Save();
  }
  const std::string before = ReadFile(env_.FoldersFile());
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  EXPECT_EQ(Thrown([&] { mgr.Upsert(changed, MakeFolder("/music/extra")); }), "900 ");
  EXPECT_EQ(ReadFile(env_.FoldersFile()), before);
  EXPECT_EQ(SavedPaths().size(), kFileIndexFoldersMax);
}

TEST_F(FolderMgrTest, UpsertReportsTheChangeAgainstTheGoverningFolder) {
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  mgr.Upsert(changed, MakeFolder("/music", "m", true, false, true, false));
  EXPECT_EQ(Flags(*changed), "DAVP") << "nothing governed /music before";
  EXPECT_EQ(changed->GetPath(), "/music");
  mgr.Upsert(changed, MakeFolder("/music/live", "l", true, false, true, false));
  EXPECT_EQ(Flags(*changed), "----") << "same flags as the parent";
  mgr.Upsert(changed, MakeFolder("/music/studio", "s", false, true, true, false));
  EXPECT_EQ(Flags(*changed), "DA--");
  EXPECT_FALSE(changed->IsPrivileged() || changed->IsPaused());
}

TEST_F(FolderMgrTest, DeleteReportsTheChangeAgainstWhatGovernsAfterwards) {
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  mgr.Upsert(changed, MakeFolder("/music", "m", true, false, false, false));
  mgr.Upsert(changed, MakeFolder("/music/live", "l", true, true, false, true));
  mgr.Upsert(changed, MakeFolder("/photo"));
  mgr.Delete(changed, "/music/live");
  EXPECT_EQ(Flags(*changed), "-A-P");
  EXPECT_EQ(changed->GetPath(), "/music/live");
  mgr.Delete(changed, "/music");
  EXPECT_EQ(Flags(*changed), "DAVP") << "nothing governs /music any more";
  EXPECT_FALSE(mgr.HasFolder("/music"));
  EXPECT_EQ(Thrown([&] { mgr.Delete(changed, "/music/none"); }), "902 /music/none");
}

TEST_F(FolderMgrTest, DeleteByShareRemovesOnlyThatShare) {
  env_.AddShare("music2");
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  for (const char* path : {"/music/a", "/music2/b", "/photo", "/music"}) {
    mgr.Upsert(changed, MakeFolder(path));
  }
  mgr.DeleteByShare("music");
  mgr.Save();
  EXPECT_EQ(SavedPaths(), (std::vector<std::string>{"/music2/b", "/photo"}));
}

TEST_F(FolderMgrTest, GetFindsByExactPath) {
  FolderMgr mgr;
  std::shared_ptr<Folder> changed;
  mgr.Upsert(changed, MakeFolder("/music/Live", "live"));
  std::shared_ptr<Folder> out;
  mgr.Get(out, "/music/Live");
  EXPECT_EQ(out->GetName(), "live");
  EXPECT_EQ(Thrown([&] { mgr.Get(out, "/music/live"); }), "902 /music/live");
  EXPECT_EQ(Thrown([&] { mgr.Get(out, "/music/Live/"); }), "902 /music/Live/");
}

class FolderListTest : public FolderMgrTest {
 protected:
  FolderListTest() {
    std::shared_ptr<Folder> changed;
    // Flags chosen so that each key splits the list differently.
    mgr_.Upsert(changed, MakeFolder("/music/b", "delta", true, false, true, false));
    mgr_.Upsert(changed, MakeFolder("/music/C", "Alpha", false, true, true, false));
    mgr_.Upsert(changed, MakeFolder("/music/a", "charlie", false, false, false, true));
    mgr_.Upsert(changed, MakeFolder("/music/D", "Bravo", true, true, false, true));
    mgr_.Upsert(changed, MakeFolder("/music/e", "echo", false, false, false, false));
  }

  std::vector<std::shared_ptr<Folder>> Page(unsigned int offset, unsigned int limit,
                                            const std::string& sort_by,
                                            const std::string& direction) {
    std::vector<std::shared_ptr<Folder>> out;
    unsigned int total = 0;
    mgr_.List(out, total, offset, limit, sort_by, direction);
    EXPECT_EQ(total, 5u) << sort_by << " " << direction;
    return out;
  }

  FolderMgr mgr_;
};

TEST_F(FolderListTest, TextKeysSortIgnoringCaseBothWays) {
  struct Case {
    const char* sort_by;
    const char* direction;
    std::vector<std::string> expected;
  } cases[] = {
      {"path", "asc", {"/music/a", "/music/b", "/music/C", "/music/D", "/music/e"}},
      {"path", "desc", {"/music/e", "/music/D", "/music/C", "/music/b", "/music/a"}},
      {"name", "asc", {"/music/C", "/music/D", "/music/a", "/music/b", "/music/e"}},
      {"name", "desc", {"/music/e", "/music/b", "/music/a", "/music/D", "/music/C"}},
      {"size", "", {"/music/C", "/music/D", "/music/a", "/music/b", "/music/e"}},
      {"name", "DESC", {"/music/C", "/music/D", "/music/a", "/music/b", "/music/e"}},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Paths(Page(0, 50, c.sort_by, c.direction)), c.expected)
        << c.sort_by << " " << c.direction;
  }
}

TEST_F(FolderListTest, FlagKeysPutFoldersWithoutTheFlagFirstOrLastWithDesc) {
  struct Case {
    const char* sort_by;
    bool (Folder::*flag)() const;
  } cases[] = {{"document", &Folder::IsDocument},
               {"audio", &Folder::IsAudio},
               {"video", &Folder::IsVideo},
               {"photo", &Folder::IsPhoto}};
  for (const Case& c : cases) {
    for (const std::string direction : {"asc", "desc"}) {
      std::string flags;
      for (const auto& f : Page(0, 50, c.sort_by, direction)) flags += ((*f).*c.flag)() ? "1" : "0";
      std::string sorted = flags;
      std::sort(sorted.begin(), sorted.end());
      if (direction == "desc") std::reverse(sorted.begin(), sorted.end());
      EXPECT_EQ(flags, sorted) << c.sort_by << " " << direction;
    }
  }
}

TEST_F(FolderListTest, PagesAtAndPastTheEnd) {
  struct Case {
    unsigned int offset;
    unsigned int limit;
    std::vector<std::string> expected;
  } cases[] = {
      {2, 1, {"/music/C"}}, {3, 50, {"/music/D", "/music/e"}},
      {4, 1, {"/music/e"}}, {5, 1, {}},
      {7, 3, {}},           {0, 0, {}},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Paths(Page(c.offset, c.limit, "path", "asc")), c.expected)
        << "offset " << c.offset << " limit " << c.limit;
  }
}

}  // namespace
}  // namespace vellis::fileindex
