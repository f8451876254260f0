// A queue that cannot be read to its end. This binary's read() fails with
// EIO on the one file a test names, after that file's first chunk; every
// other read goes to the C library's read().
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <climits>
#include <cstring>
#include <string>

#include "common/error.h"
#include "fileindex/optree.h"
#include "tests/support/fake_platform.h"
#include "tests/support/temp_root.h"

namespace {

std::atomic<const char*> g_failing_path{nullptr};  // null: every read is real
std::atomic<int> g_reads_of_path{0};

bool IsFailingPath(int fd, const char* path) {
  char link[64];
  char target[PATH_MAX];
  snprintf(link, sizeof(link), "/proc/self/fd/%d", fd);
  const ssize_t n = readlink(link, target, sizeof(target) - 1);
  return n > 0 && static_cast<size_t>(n) == strlen(path) && memcmp(target, path, n) == 0;
}

}  // namespace

extern "C" ssize_t read(int fd, void* buf, size_t count) {
  using Read = ssize_t (*)(int, void*, size_t);
  static const Read real = reinterpret_cast<Read>(dlsym(RTLD_NEXT, "read"));
  const char* path = g_failing_path.load();
  if (path != nullptr && IsFailingPath(fd, path) && g_reads_of_path.fetch_add(1) > 0) {
    errno = EIO;
    return -1;
  }
  return real(fd, buf, count);
}

namespace vellis::fileindex {
namespace {

// The lines of the chunk that was read are folded and logged, in order,
// and then the round fails with 502 and the read's errno.
TEST(OPTreeReadErrorTest, LinesBeforeAReadErrorAreFoldedAndLoggedThenTheRoundFails) {
  testing::TempRoot root;
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  const std::string queue = root.Path("/queue");
  // The reader reads 64 KiB at a time: the bad line ends the first chunk,
  // so it is read ahead in the batch whose next read fails.
  const std::string good = R"({"event":2,"path":"/s/a"})" "\n";
  std::string text;
  for (int i = 0; i < 2520; ++i) text += good;
  text += "not json #last#\n";
  ASSERT_EQ(text.size(), 64u * 1024);
  for (int i = 0; i < 2520; ++i) text += good;
  testing::WriteFile(queue, text);

  g_failing_path = queue.c_str();
  g_reads_of_path = 0;
  int code = 0;
  errno = 0;  // whatever the test left would show on the first failure
  try {
    OPTree tree(queue);
  } catch (const Error& e) {
    code = e.GetCode();
    EXPECT_STREQ(e.what(), "Failed to read queue, reason=Input/output error");
  }
  g_failing_path = nullptr;
  EXPECT_EQ(code, kErrInternal);
  EXPECT_EQ(g_reads_of_path.load(), 2);

  // The bad line is logged without the read's errno, before the failure
  // that carries it.
  std::vector<std::string> seen;
  for (const auto& l : platform.Logs()) {
    if (l.text.find("reason: Malformed event_raw: not json #last#") != std::string::npos) {
      seen.push_back(l.text.find("[err: ") == std::string::npos ? "bad line" : "bad line, err");
    } else if (l.text.find("Failed to read queue") != std::string::npos) {
      seen.push_back(l.text.find("[err: Input/output error]") != std::string::npos
                         ? "read failed, err"
                         : "read failed");
    }
  }
  EXPECT_EQ(seen, (std::vector<std::string>{"bad line", "read failed, err"}));
}

}  // namespace
}  // namespace vellis::fileindex
