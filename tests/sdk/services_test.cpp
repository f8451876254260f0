// Service control of the Linux platform: only logged under VELLIS_SERVICES=none,
// systemctl under systemd, our own daemons with pid files elsewhere.
#include "sdk/linux/services.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <functional>
#include <string>
#include <vector>

#include "sdk/linux/linux_platform.h"
#include "tests/support/fake_share_platform.h"
#include "tests/support/temp_root.h"

namespace vellis::sdk {
namespace {

using testing::MakeDirs;
using testing::WriteFile;

constexpr char kIndexd[] = "pkg-Vellis-fileindexd";

struct Request {
  std::string logged;  // "<action> <service>"
  std::function<int(LinuxPlatform&)> run;
  std::vector<std::string> systemctl;  // its arguments under systemd
};

const Request kRequests[] = {
    {"start qorucontentextractd",
     [](LinuxPlatform& p) { return p.QLIBServiceStart("qorucontentextractd", true); },
     {"start", "vellis-extractd.service"}},
    {"stop qorucontentextractd",
     [](LinuxPlatform& p) { return p.QLIBServiceStop("qorucontentextractd", false); },
     {"stop", "--no-block", "vellis-extractd.service"}},
    {"restart samba",
     [](LinuxPlatform& p) { return p.QLIBServiceRestart("samba"); },
     {"restart", "smbd.service"}},
    {"start pkg-Vellis-fileindexd",
     [](LinuxPlatform& p) { return p.QLIBServicectlStart(kIndexd, kServicectlUpstart); },
     {"start", "vellis-fileindexd.service"}},
    {"stop pkg-Vellis-fileindexd",
     [](LinuxPlatform& p) { return p.QLIBServicectlStop(kIndexd, kServicectlUpstart); },
     {"stop", "vellis-fileindexd.service"}}};

class ServicesTest : public ::testing::Test {
 protected:
  ServicesTest() {
    unsetenv(kServicesEnv);
    MakeDirs(bin_);
  }
  ~ServicesTest() override {
    unsetenv(kServicesEnv);
    unsetenv(kDaemonDirEnv);
    if (int pid = RunningServicePid("vellis-fileindexd"); pid > 0) kill(pid, SIGKILL);
  }

  testing::TempRoot root_;
  testing::FakeSharePlatform fake_;  // records the process runner's runs
  testing::ScopedPlatform scoped_{&fake_};
  LinuxPlatform linux_;
  std::string bin_ = root_.Path("/bin");
};

TEST_F(ServicesTest, WithServicesOffEveryRequestIsOnlyLogged) {
  setenv(kServicesEnv, "none", 1);
  MakeDirs(root_.Path(kSystemdRunDir));
  for (const Request& r : kRequests) {
    EXPECT_EQ(r.run(linux_), 0) << r.logged;
    EXPECT_EQ(fake_.LogsContaining("Service " + r.logged + " skipped: VELLIS_SERVICES=none").size(),
              1u);
  }
  EXPECT_TRUE(fake_.Execs().empty());
  // An unknown name is refused all the same.
  EXPECT_LT(linux_.QLIBServiceStart("sshd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL);
}

TEST_F(ServicesTest, UnderSystemdEachRequestIsOneSystemctlRunAndFailuresHaveAReason) {
  MakeDirs(root_.Path(kSystemdRunDir));
  for (const Request& r : kRequests) {
    fake_.SetExecResult(0);
    EXPECT_EQ(r.run(linux_), 0) << r.logged;
    ASSERT_FALSE(fake_.Execs().empty());
    EXPECT_EQ(fake_.Execs().back().program, "/bin/systemctl");
    EXPECT_EQ(fake_.Execs().back().args, r.systemctl) << r.logged;
  }
  EXPECT_EQ(fake_.Execs().size(), std::size(kRequests));
  // The exit status 5 of systemctl: no such unit.
  const std::pair<int, int> failures[] = {{5, ENOENT}, {1, EIO}, {-1, ENOENT}};
  for (auto [exit_status, err] : failures) {
    fake_.SetExecResult(exit_status);
    EXPECT_LT(linux_.QLIBServiceStart(kIndexd, true), 0) << exit_status;
    EXPECT_EQ(linux_.QLIBCErrGet(), err) << exit_status;
    EXPECT_EQ(linux_.QLIBCErrorGetFile(), "services.cpp");
  }
  EXPECT_LT(linux_.QLIBServicectlStart(kIndexd, 7), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EINVAL);
}

TEST_F(ServicesTest, OwnDaemonStartsOnceWithDefaultSignalsAndStopEndsIt) {
  setenv(kDaemonDirEnv, bin_.c_str(), 1);
  WriteFile(bin_ + "/vellis-fileindexd", "#!/bin/sh\nexec sleep 30\n");
  ASSERT_EQ(chmod((bin_ + "/vellis-fileindexd").c_str(), 0755), 0);
  // Our own pid, with a start time that is not ours: a recycled pid, which
  // the restart must not signal.
  WriteFile(ServicePidFile("vellis-fileindexd"), std::to_string(getpid()) + " 1\n");
  EXPECT_EQ(RunningServicePid("vellis-fileindexd"), 0);
  // What this process ignores is not passed on to the daemon.
  struct sigaction ignore = {}, old = {};
  ignore.sa_handler = SIG_IGN;
  sigaction(SIGTERM, &ignore, &old);
  int restarted = linux_.QLIBServiceRestart(kIndexd);
  sigaction(SIGTERM, &old, nullptr);
  ASSERT_EQ(restarted, 0);
  int pid = RunningServicePid("vellis-fileindexd");
  ASSERT_GT(pid, 0);
  EXPECT_NE(pid, getpid());
  std::string status = testing::ReadFile("/proc/" + std::to_string(pid) + "/status");
  EXPECT_NE(status.find("SigIgn:\t0000000000000000\n"), std::string::npos) << status;
  EXPECT_EQ(linux_.QLIBServicectlStart(kIndexd, kServicectlUpstart), 0);
  EXPECT_EQ(RunningServicePid("vellis-fileindexd"), pid) << "started twice";

  for (int i = 0; i < 2; ++i) {  // stopping what is not running succeeds
    ASSERT_EQ(linux_.QLIBServicectlStop(kIndexd, kServicectlUpstart), 0);
    EXPECT_EQ(RunningServicePid("vellis-fileindexd"), 0);
    EXPECT_NE(access(ServicePidFile("vellis-fileindexd").c_str(), F_OK), 0);
  }
  EXPECT_TRUE(fake_.Execs().empty()) << "no systemctl without systemd";
}

TEST_F(ServicesTest, OwnDaemonThatIsNotInstalledFailsCleanly) {
  setenv(kDaemonDirEnv, bin_.c_str(), 1);
  EXPECT_LT(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), ENOENT);
  WriteFile(bin_ + "/vellis-extractd", "#!/bin/sh\nexit 0\n");
  EXPECT_LT(linux_.QLIBServiceStart("qorucontentextractd", true), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), EACCES) << "not executable";
  EXPECT_EQ(RunningServicePid("vellis-extractd"), 0);
  // Samba is not ours to run without systemd or its init script.
  EXPECT_LT(linux_.QLIBServiceRestart("samba"), 0);
  EXPECT_EQ(linux_.QLIBCErrGet(), ENOTSUP);
}

}  // namespace
}  // namespace vellis::sdk
