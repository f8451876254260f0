#include "sdk/linux/services.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fstream>
#include <sstream>
#include <vector>

#include "common/fs_util.h"
#include "common/lock_file.h"
#include "common/root_path.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

constexpr ServiceMapping kServices[] = {
    {"samba", "smbd.service", nullptr},
    {kSearchService, "vellis-searchd.service", "vellis-searchd"},
    {kMonitorService, "vellis-monitord.service", "vellis-monitord"},
    {"qorucontentextractd", "vellis-extractd.service", "vellis-extractd"},
    // The indexing daemon needs the changes that the monitor reports.
    {"pkg-Vellis-fileindexd", "vellis-fileindexd.service", "vellis-fileindexd", "vellis-monitord"},
};

// A stopped daemon gets this long after SIGTERM before SIGKILL.
constexpr int kStopPolls = 100;
constexpr useconds_t kStopPollMicros = 100 * 1000;
// systemctl's exit status for a unit that is not installed.
constexpr int kSystemctlNoSuchUnit = 5;

enum class Action { kStart, kStop, kRestart };

const char* ActionName(Action a) {
  switch (a) {
    case Action::kStart:
      return "start";
    case Action::kStop:
      return "stop";
    case Action::kRestart:
      return "restart";
  }
  return "";
}

bool ServicesDisabled() {
  const char* env = getenv(kServicesEnv);
  return env && strcmp(env, "none") == 0;
}

bool HasSystemd() { return IsDirExist(RootPath(kSystemdRunDir), true); }

std::string ExecutableDir() {
  char buf[PATH_MAX];
  ssize_t n = readlink("/proc/self/exe", buf, sizeof(buf) - 1);
  if (n <= 0) return "";
  return Dirname(std::string(buf, static_cast<size_t>(n)));
}

// Field 22 of /proc/<pid>/stat (the start time in clock ticks since boot),
// and whether the process is a zombie. False when there is no such process.
bool ReadProcStat(int pid, unsigned long long* start_time, bool* zombie) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string text;
  if (!in || !std::getline(in, text)) return false;
  // The command name may hold spaces and parentheses: fields follow the last ")".
  size_t close = text.rfind(')');
  if (close == std::string::npos) return false;
  std::istringstream fields(text.substr(close + 1));
  std::string state;
  fields >> state;
  std::string skip;
  for (int i = 4; i < 22; ++i) fields >> skip;
  if (!(fields >> *start_time)) return false;
  *zombie = state == "Z" || state == "X";
  return true;
}

void MakeDirs(const std::string& dir) {
  for (size_t pos = 1; pos <= dir.size(); ++pos) {
    if (pos == dir.size() || dir[pos] == '/') mkdir(dir.substr(0, pos).c_str(), 0755);
  }
}

bool WritePidFile(const std::string& program, int pid, unsigned long long start_time) {
  const std::string file = ServicePidFile(program);
  const std::string tmp = file + ".tmp";
  {
    std::ofstream out(tmp, std::ios::trunc);
    out << pid << " " << start_time << "\n";
    if (!out.flush()) return false;
  }
  return rename(tmp.c_str(), file.c_str()) == 0;
}

std::string ServiceLockPath(const std::string& program) {
  return RootPath(kServiceLockPrefix + program + ".lock");
}

// Runs `path` detached: a grandchild in a session of its own, standard
// streams on /dev/null, no descriptor of ours inherited. Returns its pid, or
// -1 with errno set when it could not be started (exec failures included,
// reported back through a close-on-exec pipe).
int Spawn(const std::string& path) {
  int pipe_fds[2];
  if (pipe2(pipe_fds, O_CLOEXEC) != 0) return -1;
  pid_t child = fork();
  if (child < 0) {
    int err = errno;
    close(pipe_fds[0]);
    close(pipe_fds[1]);
    errno = err;
    return -1;
  }
  if (child == 0) {
    // Only async-signal-safe calls: other threads may hold locks.
    setsid();
    pid_t grandchild = fork();
    if (grandchild != 0) {
      int report[2] = {grandchild, grandchild < 0 ? errno : 0};
      if (write(pipe_fds[1], report, sizeof(report)) < 0) _exit(1);
      _exit(0);
    }
    // A daemon starts with default signal handling, whatever this process
    // ignores or blocks (SIGPIPE is often ignored here).
    struct sigaction dfl = {};
    dfl.sa_handler = SIG_DFL;
    for (int sig = 1; sig < NSIG; ++sig) sigaction(sig, &dfl, nullptr);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    int null_fd = open("/dev/null", O_RDWR);
    if (null_fd >= 0) {
      dup2(null_fd, STDIN_FILENO);
      dup2(null_fd, STDOUT_FILENO);
      dup2(null_fd, STDERR_FILENO);
    }
    if (close_range(3, ~0U, CLOSE_RANGE_CLOEXEC) != 0) {
      for (int fd = 3; fd < 65536; ++fd) {
        if (fd != pipe_fds[1]) close(fd);
      }
    }
    // Already detached here: our daemons must not fork again, or the pid
    // recorded would be the wrong one.
    char* argv[] = {const_cast<char*>(path.c_str()), const_cast<char*>("--foreground"), nullptr};
    execv(path.c_str(), argv);
    int report[2] = {-1, errno};
    if (write(pipe_fds[1], report, sizeof(report)) < 0) _exit(127);
    _exit(127);
  }
  close(pipe_fds[1]);
  int status = 0;
  while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  // First report: the grandchild's pid; a second one only when exec failed.
  int report[2] = {-1, ECHILD};
  int exec_report[2] = {0, 0};
  ssize_t n = read(pipe_fds[0], report, sizeof(report));
  ssize_t m = n == sizeof(report) && report[0] > 0
                  ? read(pipe_fds[0], exec_report, sizeof(exec_report))
                  : 0;
  close(pipe_fds[0]);
  if (n != sizeof(report) || report[0] <= 0) {
    errno = report[1] ? report[1] : ECHILD;
    return -1;
  }
  if (m == sizeof(exec_report)) {
    waitpid(report[0], nullptr, WNOHANG);  // not our child; the system reaps it
    errno = exec_report[1] ? exec_report[1] : ENOEXEC;
    return -1;
  }
  return report[0];
}

int StartOwn(const std::string& program) {
  const std::string path = ServiceProgramPath(program);
  if (path.empty()) return FailAt(ENOENT, __FILE__, __LINE__);
  if (access(path.c_str(), X_OK) != 0) return FailAt(errno, __FILE__, __LINE__);
  try {
    LockFile lock(ServiceLockPath(program), true);
    if (RunningServicePid(program) > 0) return 0;
    int pid = Spawn(path);
    if (pid < 0) return FailAt(errno, __FILE__, __LINE__);
    unsigned long long start_time = 0;
    bool zombie = false;
    ReadProcStat(pid, &start_time, &zombie);
    MakeDirs(RootPath(kServicePidDir));
    if (!WritePidFile(program, pid, start_time)) return FailAt(errno, __FILE__, __LINE__);
    return 0;
  } catch (const std::exception&) {
    return FailAt(EAGAIN, __FILE__, __LINE__);
  }
}

int StopOwn(const std::string& program, bool wait) {
  try {
    LockFile lock(ServiceLockPath(program), true);
    int pid = RunningServicePid(program);
    if (pid > 0) {
      if (kill(pid, SIGTERM) != 0 && errno != ESRCH) return FailAt(errno, __FILE__, __LINE__);
      if (wait) {
        for (int i = 0; i < kStopPolls && RunningServicePid(program) == pid; ++i) {
          usleep(kStopPollMicros);
        }
        if (RunningServicePid(program) == pid) {
          kill(pid, SIGKILL);
          for (int i = 0; i < kStopPolls && RunningServicePid(program) == pid; ++i) {
            usleep(kStopPollMicros);
          }
          if (RunningServicePid(program) == pid) return FailAt(EBUSY, __FILE__, __LINE__);
        }
      }
    }
    if (unlink(ServicePidFile(program).c_str()) != 0 && errno != ENOENT) {
      return FailAt(errno, __FILE__, __LINE__);
    }
    return 0;
  } catch (const std::exception&) {
    return FailAt(EAGAIN, __FILE__, __LINE__);
  }
}

int Systemctl(const ServiceMapping& s, Action action, bool wait) {
  std::vector<std::string> args = {ActionName(action)};
  if (!wait) args.push_back("--no-block");
  args.push_back(s.unit);
  int rc = GetPlatform()->QLIBCExec(kSystemctlProgram, args);
  if (rc < 0) return FailAt(ENOENT, __FILE__, __LINE__);
  if (rc == kSystemctlNoSuchUnit) return FailAt(ENOENT, __FILE__, __LINE__);
  if (rc != 0) return FailAt(EIO, __FILE__, __LINE__);
  return 0;
}

// Without systemd samba is not ours to run: its own init script is used
// where it is installed.
int SambaInitScript(Action action) {
  const std::string script = RootPath(kSambaInitScript);
  if (access(script.c_str(), X_OK) != 0) return FailAt(ENOTSUP, __FILE__, __LINE__);
  int rc = GetPlatform()->QLIBCExec(script, {ActionName(action)});
  if (rc != 0) return FailAt(rc < 0 ? ENOENT : EIO, __FILE__, __LINE__);
  return 0;
}

int Control(const std::string& service, Action action, bool wait) {
  const ServiceMapping* s = FindService(service);
  if (!s) return FailAt(EINVAL, __FILE__, __LINE__);
  if (ServicesDisabled()) {
    GetPlatform()->Syslog(LOG_NOTICE, std::string("Service ") + ActionName(action) + " " + service +
                                          " skipped: " + kServicesEnv + "=none");
    return 0;
  }
  if (HasSystemd()) return Systemctl(*s, action, wait);
  if (!s->program) return SambaInitScript(action);
  if (s->companion && access(ServiceProgramPath(s->companion).c_str(), X_OK) == 0) {
    const int rc = action == Action::kStop ? StopOwn(s->companion, wait) : StartOwn(s->companion);
    if (rc != 0) {
      GetPlatform()->Syslog(LOG_ERR, std::string("Service ") + ActionName(action) + " " +
                                         s->companion + " failed with " + s->service);
    }
  }
  switch (action) {
    case Action::kStart:
      return StartOwn(s->program);
    case Action::kStop:
      return StopOwn(s->program, wait);
    case Action::kRestart:
      if (StopOwn(s->program, true) != 0) return -1;
      return StartOwn(s->program);
  }
  return FailAt(EINVAL, __FILE__, __LINE__);
}

}  // namespace

const ServiceMapping* FindService(const std::string& service) {
  for (const ServiceMapping& s : kServices) {
    if (service == s.service) return &s;
  }
  return nullptr;
}

std::string ServiceProgramPath(const std::string& program) {
  const char* env = getenv(kDaemonDirEnv);
  std::string dir = env && *env ? env : ExecutableDir();
  return dir.empty() ? "" : dir + "/" + program;
}

std::string ServicePidFile(const std::string& program) {
  return RootPath(std::string(kServicePidDir) + "/" + program + ".pid");
}

int RunningServicePid(const std::string& program) {
  std::ifstream in(ServicePidFile(program));
  long long pid = 0;
  unsigned long long recorded = 0;
  if (!in || !(in >> pid >> recorded) || pid <= 0 || pid > INT_MAX) return 0;
  unsigned long long start_time = 0;
  bool zombie = false;
  if (!ReadProcStat(static_cast<int>(pid), &start_time, &zombie)) return 0;
  if (zombie || start_time != recorded) return 0;
  return static_cast<int>(pid);
}

int LinuxPlatform::QLIBServiceStart(const std::string& service, bool wait) {
  return Control(service, Action::kStart, wait);
}

int LinuxPlatform::QLIBServiceStop(const std::string& service, bool wait) {
  return Control(service, Action::kStop, wait);
}

int LinuxPlatform::QLIBServiceRestart(const std::string& service) {
  return Control(service, Action::kRestart, true);
}

int LinuxPlatform::QLIBServicectlStart(const std::string& service, int type) {
  if (type != kServicectlUpstart) return FailAt(EINVAL, __FILE__, __LINE__);
  return Control(service, Action::kStart, true);
}

int LinuxPlatform::QLIBServicectlStop(const std::string& service, int type) {
  if (type != kServicectlUpstart) return FailAt(EINVAL, __FILE__, __LINE__);
  return Control(service, Action::kStop, true);
}

}  // namespace vellis::sdk
