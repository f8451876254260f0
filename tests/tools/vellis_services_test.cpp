// `vellis services` and `vellis status` with the real daemons of this build,
// started by the command line itself under the test root (no systemd there,
// so the services layer runs them and keeps their pid files).
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <string>

#include "common/json_util.h"
#include "common/root_path.h"
#include "tests/support/cli_runner.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

// Output and exit status of one `vellis` run.
std::pair<int, std::string> RunCli(const std::string& args) {
  const char* dir = getenv("VELLIS_TEST_BINARY_DIR");
  FILE* p = popen((std::string(dir ? dir : ".") + "/bin/vellis " + args + " 2>&1").c_str(), "r");
  std::string out;
  char buf[4096];
  for (size_t n; p && (n = fread(buf, 1, sizeof(buf), p)) > 0;) out.append(buf, n);
  const int status = p ? pclose(p) : -1;
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, out};
}

class CliServicesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    unsetenv("VELLIS_SERVICES");
    for (int i = 0; i < 30; ++i) WriteFile(docs_ + "/a/f" + std::to_string(i) + ".txt", "plum");
    WriteFile(docs_ + "/b/readme.md", "apricot notes");
  }
  // The daemons must be gone before the root is removed.
  void TearDown() override { RunCli("services stop"); }

  int DaemonPid(const std::string& program) {
    std::ifstream in(RootPath("/var/run/" + program + ".pid"));
    int pid = 0;
    in >> pid;
    return pid;
  }

  TempRoot root_;
  std::string docs_ = root_.Path("/volume1/docs");
};

// start runs only what does not answer, so a second start changes nothing
// and a start after a crash brings back what died; status exits 0 only when
// every daemon that should run answers; stop ends them all.
TEST_F(CliServicesTest, StartStatusAndStopFollowWhatRuns) {
  ExpectRuns({
      {"services status", 1, "...vellis-searchd     yes ... -    no\n..."},
      {"services start", 0,
       "vellis-searchd: started\n...vellis-fileindexd: not needed (no indexed folder)\n"},
      {"services start", 0, "vellis-searchd: running (pid ...)\n..."},
      {"services status", 0, "...vellis-fileindexd  no ..."},
      {"share add docs " + docs_, 0, "..."},
      // Adding the first folder starts the indexing daemon.
      {"folder add /docs", 0, "added 1 folder\n"},
      {"services status --json", 0,
       "...\"answers\" : true,...\"program\" : \"vellis-fileindexd\",\n    \"should_run\" : "
       "true..."},
  });
  const int pid = DaemonPid("vellis-fileindexd");
  ASSERT_GT(pid, 0);
  ASSERT_EQ(0, kill(pid, SIGKILL));
  for (int i = 0; i < 100 && kill(pid, 0) == 0; ++i) usleep(20000);
  ExpectRuns({
      {"services status", 1, "...vellis-fileindexd  yes ... no\n"},
      {"services start", 0, "vellis-searchd: running...vellis-fileindexd: started\n"},
      {"services status", 0, "..."},
      {"services stop", 0,
       "vellis-fileindexd: stopped\nvellis-monitord: stopped\nvellis-searchd: stopped\n"},
      {"services status", 1, "..."},
  });
  EXPECT_NE(DaemonPid("vellis-fileindexd"), pid);
}

// A folder is followed until it is finished; its documents are then
// searchable, and a change reported with `queue add` follows.
TEST_F(CliServicesTest, StatusWatchesAFolderUntilItsChangesAreSearchable) {
  ExpectRuns({
      {"services start", 0, "..."},
      {"share add docs " + docs_, 0, "..."},
      {"folder add /docs", 0, "added 1 folder\n"},
      {"status --watch --timeout 60", 0, "...100%  34 documents, 0 events waiting, finished\n"},
      {"search apricot", 0, docs_ + "/b/readme.md\n...1 hit (1 shown)\n"},
  });
  Json::Value st;
  ASSERT_TRUE(JsonFromString(st, RunCli("status --json").second));
  EXPECT_EQ(st["folders"][0]["path"], "/docs");
  EXPECT_EQ(st["folders"][0]["status"], "finished");
  EXPECT_EQ(st["folders"][0]["documents"], 34);  // the share, two folders and 31 files
  EXPECT_EQ(st["pause"]["paused"], false);

  ASSERT_EQ(0, rename((docs_ + "/b").c_str(), (docs_ + "/c").c_str()));
  WriteFile(docs_ + "/a/f0.txt", "quince");
  ExpectRuns({
      {"queue add rename " + docs_ + "/c --old " + docs_ + "/b", 0, ""},
      {"queue add modify " + docs_ + "/a/f0.txt", 0, ""},
      {"status --watch --timeout 60", 0, "...finished\n"},
      {"search apricot", 0, docs_ + "/c/readme.md\n...1 hit (1 shown)\n"},
      {"search quince", 0, docs_ + "/a/f0.txt\n...1 hit (1 shown)\n"},
      {"search plum", 0, "...29 hits..."},
  });
}

// Bad reports change nothing and say why.
TEST_F(CliServicesTest, QueueAddRefusesWhatTheMonitorWouldNotWrite) {
  ExpectRuns({
      {"share add docs " + docs_, 0, "..."},
      {"queue add touch " + docs_ + "/a", 1, "error 120: Unknown event: touch\n"},
      {"queue add rename " + docs_ + "/c", 1,
       "error 120: --old goes with rename, and only with it\n"},
      {"queue add modify " + docs_ + "/a --old /x", 1, "error 120: ...only with it\n"},
      {"queue add modify " + root_.Path("/elsewhere/x"), 1, "error 502: ...\n"},
  });
  EXPECT_EQ(ReadFile(root_.Path("/volume1/@fileindex/docs/queue")), "");
}

}  // namespace
}  // namespace vellis::testing
