// The folders file under several processes: writers under the folder lock
// lose no update, and a writer killed at any moment leaves a readable file.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "fileindex/folder_mgr.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::MakeFolder;

// Runs `body` in a child process; the child exits 0 when it returns and 1
// when it throws.
pid_t Spawn(const std::function<void()>& body) {
  pid_t pid = fork();
  if (pid != 0) return pid;
  int rc = 0;
  try {
    body();
  } catch (...) {
    rc = 1;
  }
  _exit(rc);
}

int WaitStatus(pid_t pid) {
  int status = 0;
  waitpid(pid, &status, 0);
  return status;
}

class FolderFileProcessTest : public ::testing::Test {
 protected:
  FolderFileProcessTest() { env_.AddShare("music"); }

  FolderEnv env_;
};

TEST_F(FolderFileProcessTest, TwoWritersUnderTheFolderLockLoseNoUpdate) {
  constexpr int kPerWriter = 10;
  std::vector<pid_t> writers;
  for (int w = 0; w < 2; ++w) {
    writers.push_back(Spawn([w] {
      for (int i = 0; i < kPerWriter; ++i) {
        LockFile lock(RootPath(kFolderCfgLockPath), true);
        FolderMgr mgr;
        std::shared_ptr<Folder> changed;
        mgr.Upsert(changed, MakeFolder("/music/w" + std::to_string(w) + "_" + std::to_string(i)));
        mgr.Save();
      }
    }));
  }
  for (pid_t pid : writers) EXPECT_EQ(WaitStatus(pid), 0) << "writer " << pid << " failed";
  FolderMgr mgr;
  for (int w = 0; w < 2; ++w) {
    for (int i = 0; i < kPerWriter; ++i) {
      std::string path = "/music/w" + std::to_string(w) + "_" + std::to_string(i);
      EXPECT_TRUE(mgr.HasFolder(path)) << path << " was lost";
    }
  }
}

TEST_F(FolderFileProcessTest, WriterKilledWhileSavingLeavesTheOldOrTheNewList) {
  constexpr size_t kBase = 200;
  {
    FolderMgr mgr;
    std::shared_ptr<Folder> changed;
    for (size_t i = 0; i < kBase; ++i)
      mgr.Upsert(changed, MakeFolder("/music/d" + std::to_string(i)));
    mgr.Save();
  }
  sdk::Platform* real = env_.platform().target();
  for (int round = 0; round < 30; ++round) {
    // The writer alternates between the base list and the base list plus
    // one folder, saving as fast as it can until it is killed.
    pid_t writer = Spawn([] {
      FolderMgr mgr;
      std::shared_ptr<Folder> changed;
      for (int i = 0;; ++i) {
        if (i % 2 == 0) {
          mgr.Upsert(changed, MakeFolder("/music/extra"));
        } else {
          mgr.Delete(changed, "/music/extra");
        }
        mgr.Save();
      }
    });
    real->USleep(static_cast<uint64_t>(real->Rand() % 30000));
    kill(writer, SIGKILL);
    int status = WaitStatus(writer);
    ASSERT_TRUE(WIFSIGNALED(status)) << "round " << round << ": the writer stopped by itself";
    try {
      FolderMgr loaded;
      std::vector<std::shared_ptr<Folder>> out;
      unsigned int total = 0;
      loaded.List(out, total, 0, 0, "path", "asc");
      EXPECT_TRUE(total == kBase || total == kBase + 1) << "round " << round << ": " << total;
    } catch (const Error& e) {
      ADD_FAILURE() << "round " << round << ": code " << e.GetCode() << " " << e.what();
    }
  }
}

}  // namespace
}  // namespace vellis::fileindex
