// Helpers of the indexing daemon's benchmark (fileindexd_bench.cpp): the
// daemons of this build as child processes, and their CPU time and memory
// as /proc tells them.
#pragma once

#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "sdk/domain_socket.h"

namespace vellis::bench {

using Clock = std::chrono::steady_clock;

inline double SecondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

// Creates `path` and its missing parents.
inline void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos <= path.size(); ++pos) {
    if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), 0755);
  }
}

inline void Sleep(int ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

inline std::string FindBinary(const char* env, const std::string& name) {
  if (const char* e = getenv(env); e != nullptr && *e != '\0') return e;
  std::vector<std::string> candidates = {"build/bin/" + name};
  char self[4096];
  const ssize_t n = readlink("/proc/self/exe", self, sizeof(self) - 1);
  if (n > 0) {
    std::string dir(self, static_cast<size_t>(n));
    candidates.push_back(dir.substr(0, dir.rfind('/')) + "/../bin/" + name);
  }
  for (const std::string& c : candidates) {
    if (access(c.c_str(), X_OK) == 0) return c;
  }
  throw std::runtime_error(name + " not found (set " + env + ")");
}

// User + system CPU seconds of a process, from /proc/<pid>/stat; 0 when it
// cannot be read.
inline double ProcessCpuSeconds(pid_t pid) {
  if (pid <= 0) return 0;
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  const size_t paren = text.rfind(')');
  if (paren == std::string::npos) return 0;
  std::istringstream fields(text.substr(paren + 2));
  std::string f;
  double ticks = 0;
  for (int i = 3; i <= 15 && fields >> f; ++i) {  // field 3 is the state
    if (i == 14 || i == 15) ticks += std::stod(f);
  }
  return ticks / static_cast<double>(sysconf(_SC_CLK_TCK));
}

inline double SelfCpuSeconds() {
  rusage ru;
  getrusage(RUSAGE_SELF, &ru);
  return static_cast<double>(ru.ru_utime.tv_sec + ru.ru_stime.tv_sec) +
         static_cast<double>(ru.ru_utime.tv_usec + ru.ru_stime.tv_usec) / 1e6;
}

// The peak resident memory of a process in MiB (VmHWM); 0 when unknown.
inline double PeakRssMiB(pid_t pid) {
  if (pid <= 0) return 0;
  std::ifstream in("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(in, line);) {
    if (line.rfind("VmHWM:", 0) == 0) return std::stod(line.substr(6)) / 1024.0;
  }
  return 0;
}

// "exit status N" or "signal N", from a waitpid() status.
inline std::string DescribeExit(int status) {
  if (WIFEXITED(status)) return "exit status " + std::to_string(WEXITSTATUS(status));
  if (WIFSIGNALED(status)) return "signal " + std::to_string(WTERMSIG(status));
  return "status " + std::to_string(status);
}

// A program of this build as a child process, its standard error in a log
// file. Only ever signals the child that it started.
class ChildProcess {
 public:
  ~ChildProcess() { Stop(); }

  void Spawn(const std::string& bin, const std::vector<std::string>& args, const std::string& log) {
    bin_ = bin;
    log_ = log;
    pid_ = fork();
    if (pid_ < 0) throw std::runtime_error(std::string("fork: ") + strerror(errno));
    if (pid_ == 0) {                     // no other threads in this process
      prctl(PR_SET_PDEATHSIG, SIGKILL);  // never outlive the benchmark
      if (freopen(log.c_str(), "w", stderr) == nullptr) _exit(126);
      std::vector<char*> argv = {const_cast<char*>(bin.c_str())};
      for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
      argv.push_back(nullptr);
      execv(bin.c_str(), argv.data());
      _exit(127);
    }
  }

  // SIGTERM, up to 10 s for a clean stop, then SIGKILL.
  void Stop() {
    if (pid_ <= 0) return;
    kill(pid_, SIGTERM);
    for (int i = 0; i < 1000; ++i, Sleep(10)) {
      if (waitpid(pid_, nullptr, WNOHANG) == pid_) {
        pid_ = -1;
        return;
      }
    }
    fprintf(stderr, "%s did not stop within 10 s; killed\n", bin_.c_str());
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

  // Throws when the child has exited.
  void CheckAlive() {
    int status = 0;
    if (pid_ > 0 && waitpid(pid_, &status, WNOHANG) == pid_) {
      pid_ = -1;
      throw std::runtime_error(bin_ + " exited (" + DescribeExit(status) + "); see " + log_);
    }
  }

  pid_t pid() const { return pid_; }

 protected:
  std::string bin_;
  std::string log_;
  pid_t pid_ = -1;
};

// A daemon of this build in the foreground, ready once its socket takes
// connections.
class Daemon : public ChildProcess {
 public:
  void Start(const std::string& bin, const std::vector<std::string>& args, const std::string& log,
             const std::string& socket) {
    Spawn(bin, args, log);
    for (int i = 0; i < 1000; ++i, Sleep(10)) {
      if (sdk::DomainSockConnection(socket).Connect()) return;
      CheckAlive();
      if (pid_ < 0) break;
    }
    throw std::runtime_error(bin + " did not open " + socket + " within 10 s");
  }
};

}  // namespace vellis::bench
