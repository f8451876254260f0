// The automatic choice: whichever backend takes a root, its changes come
// through the one descriptor, and a root that no backend can watch fails.
#include "daemons/monitord/auto_watcher.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

namespace vellis::monitord {
namespace {

TEST(AutoWatcherTest, ChangesComeThroughOneDescriptorWhicheverBackendWatches) {
  std::string why;
  std::unique_ptr<AutoWatcher> w = AutoWatcher::Create(&why);
  ASSERT_NE(w, nullptr) << why;
  char tmpl[] = "/tmp/auto_watcher_test_XXXXXX";
  ASSERT_NE(mkdtemp(tmpl), nullptr);
  const std::string root = tmpl;

  ASSERT_TRUE(w->AddTree(root)) << strerror(errno);
  EXPECT_TRUE(w->Name() == "fanotify" || w->Name() == "inotify") << w->Name();
  EXPECT_GE(w->stats().watches, 1u);
  errno = 0;
  EXPECT_FALSE(w->AddTree(root + "/missing"));
  EXPECT_EQ(errno, ENOENT);

  std::ofstream(root + "/a.txt") << "x";
  std::vector<FsEvent> events;
  for (int i = 0; i < 100; ++i) {
    pollfd p = {w->fd(), POLLIN, 0};
    if (poll(&p, 1, 20) > 0) w->Read(&events);
    bool closed = false;
    for (const FsEvent& e : events) closed |= e.kind == FsEventKind::kCloseWrite;
    if (closed) break;
  }
  ASSERT_FALSE(events.empty()) << w->Name();
  EXPECT_EQ(events.front().kind, FsEventKind::kCreate);
  EXPECT_EQ(events.front().path, root + "/a.txt");
  EXPECT_EQ(events.back().kind, FsEventKind::kCloseWrite);

  w->RemoveTree(root);
  events.clear();
  std::ofstream(root + "/b.txt") << "y";
  usleep(50 * 1000);
  w->Read(&events);
  EXPECT_TRUE(events.empty()) << "a removed root reports nothing";
  unlink((root + "/a.txt").c_str());
  unlink((root + "/b.txt").c_str());
  rmdir(root.c_str());
}

}  // namespace
}  // namespace vellis::monitord
