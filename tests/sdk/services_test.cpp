// Service control of the Linux platform: logged only under
// VELLIS_SERVICES=none, systemctl where systemd runs, and our own daemons
// started and stopped with pid files elsewhere.
#include "sdk/linux/services.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <optional>
#include <string>
#include <vector>

#include "sdk/linux/linux_platform.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::MakeDirs;
using testing::WriteFile;

// Sets an environment variable for the scope.
class ScopedEnv {
 public:
  ScopedEnv(const char* name, const std::string& value) : name_(name) {
    if (const char* old = getenv(name)) old_ = old;
    setenv(name, value.c_str(), 1);
  }
  ~ScopedEnv() {
    if (old_) {
      setenv(name_, old_->c_str(), 1);
    } else {
      unsetenv(name_);
    }
  }

 private:
  const char* name_;
  std::optional<std::string> old_;
};

class ServicesTest : public ::testing::Test {
 protected:
  ServicesTest() { unsetenv(kServicesEnv); }

  testing::TempRoot root_;
  testing::FakeSharePlatform fake_;  // records the process runner's runs
  testing::ScopedPlatform scoped_{&fake_};
  LinuxPlatform linux_;
};

TEST_F(ServicesTest, WithServicesOffEveryRequestIsOnlyLogged) {
  ScopedEnv off(kServicesEnv, "none");
  MakeDirs(root_.Path(kSystemdRunDir));
  EXPECT_EQ(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBServiceStop("qorucontentextractd", false), 0);
  EXPECT_EQ(linux_.QLIBServiceRestart("samba"), 0);
  EXPECT_EQ(linux_.QLIBServicectlStart("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_EQ(linux_.QLIBServicectlStop("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_TRUE(fake_.Execs().empty());
  for (const char* line : {"Service start qorucontentextractd skipped: VELLIS_SERVICES=none",
                           "Service stop qorucontentextractd skipped: VELLIS_SERVICES=none",
                           "Service restart samba skipped: VELLIS_SERVICES=none",
                           "Service start pkg-Vellis-fileindexd skipped: VELLIS_SERVICES=none",
                           "Service stop pkg-Vellis-fileindexd skipped: VELLIS_SERVICES=none"}) {
    EXPECT_EQ(fake_.LogsContaining(line).size(), 1u) << line;
  }
  // An unknown name is refused all the same.
  EXPECT_LT(linux_.QLIBServiceStart("sshd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL);
}

TEST_F(ServicesTest, UnderSystemdEachRequestIsOneSystemctlRun) {
  MakeDirs(root_.Path(kSystemdRunDir));
  fake_.SetExecResult(0);
  EXPECT_EQ(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBServiceStop("qorucontentextractd", false), 0);
  EXPECT_EQ(linux_.QLIBServiceRestart("samba"), 0);
  EXPECT_EQ(linux_.QLIBServicectlStart("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_EQ(linux_.QLIBServicectlStop("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  std::vector<std::vector<std::string>> runs;
  for (const auto& e : fake_.Execs()) {
    EXPECT_EQ(e.program, "/bin/systemctl");
    runs.push_back(e.args);
  }
  EXPECT_EQ(runs, (std::vector<std::vector<std::string>>{
                      {"start", "vellis-extractd.service"},
                      {"stop", "--no-block", "vellis-extractd.service"},
                      {"restart", "smbd.service"},
                      {"start", "vellis-fileindexd.service"},
                      {"stop", "vellis-fileindexd.service"}}));
}

TEST_F(ServicesTest, SystemctlFailuresAreNegativeWithAReason) {
  MakeDirs(root_.Path(kSystemdRunDir));
  struct Case {
    int exit_status;
    int err;
  } cases[] = {{5, ENOENT}, {1, EIO}, {-1, ENOENT}};
  for (const Case& c : cases) {
    fake_.SetExecResult(c.exit_status);
    EXPECT_LT(linux_.QLIBServiceStart("pkg-Vellis-fileindexd", true), 0) << c.exit_status;
    EXPECT_EQ(linux_.QLIBCErrGet(), c.err) << c.exit_status;
    EXPECT_EQ(linux_.QLIBCErrorGetFile(), "services.cpp");
  }
  EXPECT_LT(linux_.QLIBServicectlStart("pkg-Vellis-fileindexd", 7), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL);
}

class OwnDaemonTest : public ServicesTest {
 protected:
  OwnDaemonTest() : bin_(root_.Path("/bin")), dir_(kDaemonDirEnv, bin_) {
    MakeDirs(bin_);
    WriteFile(bin_ + "/vellis-fileindexd", "#!/bin/sh\nexec sleep 30\n");
    chmod((bin_ + "/vellis-fileindexd").c_str(), 0755);
  }
  ~OwnDaemonTest() override {
    int pid = RunningServicePid("vellis-fileindexd");
    if (pid > 0) kill(pid, SIGKILL);
  }

  std::string bin_;
  ScopedEnv dir_;
};

TEST_F(OwnDaemonTest, StartRunsTheProgramOnceAndStopEndsIt) {
  // What this process ignores is not passed on to the daemon.
  struct sigaction ignore = {}, old = {};
  ignore.sa_handler = SIG_IGN;
  sigaction(SIGTERM, &ignore, &old);
  int started = linux_.QLIBServicectlStart("pkg-Vellis-fileindexd", kServicectlUpstart);
  sigaction(SIGTERM, &old, nullptr);
  ASSERT_EQ(started, 0);
  int pid = RunningServicePid("vellis-fileindexd");
  ASSERT_GT(pid, 0);
  EXPECT_EQ(kill(pid, 0), 0);
  std::string status = testing::ReadFile("/proc/" + std::to_string(pid) + "/status");
  EXPECT_NE(status.find("SigIgn:\t0000000000000000\n"), std::string::npos) << status;
  EXPECT_EQ(linux_.QLIBServicectlStart("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_EQ(RunningServicePid("vellis-fileindexd"), pid) << "started twice";

  ASSERT_EQ(linux_.QLIBServicectlStop("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_EQ(RunningServicePid("vellis-fileindexd"), 0);
  struct stat st;
  EXPECT_NE(stat(ServicePidFile("vellis-fileindexd").c_str(), &st), 0);
  // Stopping what is not running succeeds.
  EXPECT_EQ(linux_.QLIBServicectlStop("pkg-Vellis-fileindexd", kServicectlUpstart), 0);
  EXPECT_TRUE(fake_.Execs().empty()) << "no systemctl without systemd";
}

TEST_F(OwnDaemonTest, APidFileOfAnotherProcessIsNotTrusted) {
  // Our own pid, with a start time that is not ours: a recycled pid.
  MakeDirs(root_.Path(kServicePidDir));
  WriteFile(ServicePidFile("vellis-fileindexd"), std::to_string(getpid()) + " 1\n");
  EXPECT_EQ(RunningServicePid("vellis-fileindexd"), 0);
  ASSERT_EQ(linux_.QLIBServiceRestart("pkg-Vellis-fileindexd"), 0);  // must not signal us
  int pid = RunningServicePid("vellis-fileindexd");
  EXPECT_GT(pid, 0);
  EXPECT_NE(pid, getpid());
}

TEST_F(OwnDaemonTest, AProgramThatIsNotInstalledFailsCleanly) {
  EXPECT_LT(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), ENOENT);
  WriteFile(bin_ + "/vellis-extractd", "#!/bin/sh\nexit 0\n");
  chmod((bin_ + "/vellis-extractd").c_str(), 0644);
  EXPECT_LT(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EACCES);
  EXPECT_EQ(RunningServicePid("vellis-extractd"), 0);
  // Samba is not ours to run without systemd or its init script.
  EXPECT_LT(linux_.QLIBServiceRestart("samba"), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), ENOTSUP);
}

}  // namespace
}  // namespace vellis::sdk
