// The process runner: fork and exec, without a shell.
#include "sdk/linux/process.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <vector>

#include "common/fs_util.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

std::string ExecutableDir() {
  char buf[PATH_MAX];
  ssize_t n = readlink("/proc/self/exe", buf, sizeof(buf) - 1);
  if (n <= 0) return "";
  return Dirname(std::string(buf, static_cast<size_t>(n)));
}

// Only async-signal-safe calls between fork and exec: the parent may have
// other threads holding locks.
[[noreturn]] void RunChild(const char* path, char* const argv[], int options) {
  int null_fd = open("/dev/null", O_RDWR);
  if (null_fd < 0) _exit(127);
  dup2(null_fd, STDIN_FILENO);
  if (options & kExecStdoutToNull) dup2(null_fd, STDOUT_FILENO);
  if (options & kExecStderrToNull) dup2(null_fd, STDERR_FILENO);
  // Descriptors opened without O_CLOEXEC, by us or a library, must not leak
  // into the program.
  if (close_range(3, ~0U, 0) != 0) {
    for (int fd = 3; fd < 65536; ++fd) close(fd);
  }
  execv(path, argv);
  _exit(127);
}

int Run(const std::string& program, int options, const std::vector<std::string>& args) {
  std::string path = MapProgram(program);
  if (path.empty() || path[0] != '/') return FailWith(ENOENT);
  if (access(path.c_str(), X_OK) != 0) return FailWith(errno);
  std::vector<std::string> strings;
  strings.push_back(path);
  strings.insert(strings.end(), args.begin(), args.end());
  std::vector<char*> argv;
  for (std::string& s : strings) argv.push_back(&s[0]);
  argv.push_back(nullptr);

  pid_t pid = fork();
  if (pid < 0) return FailWith(errno);
  if (pid == 0) RunChild(path.c_str(), argv.data(), options);
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) return FailWith(errno);
  }
  if (!WIFEXITED(status)) return FailWith(EINTR);
  return WEXITSTATUS(status);
}

}  // namespace

std::string MapProgram(const std::string& program) {
  if (program != kHmxNotifyProgram) return program;
  const char* env = getenv(kNotifierEnv);
  if (env && *env) return env;
  std::string dir = ExecutableDir();
  return dir.empty() ? "" : dir + "/" + kNotifierName;
}

int LinuxPlatform::QLIBCExec(const std::string& program, const std::vector<std::string>& args) {
  return Run(program, 0, args);
}

int LinuxPlatform::QLIBCExecl(const std::string& program, int options,
                              const std::vector<std::string>& args) {
  return Run(program, options, args);
}

}  // namespace vellis::sdk
