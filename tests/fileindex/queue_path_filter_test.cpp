// The quick "certainly not" of a queue file: never "no" where the queue
// search finds an event, and "no" for paths that the queue does not touch.
#include "fileindex/queue_path_filter.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "fileindex/queue_mgr.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

using testing::TempRoot;
using testing::WriteFile;

class QueuePathFilterTest : public ::testing::Test {
 protected:
  QueuePathFilterTest() : queue_(root_.Path("/queue")) {}

  TempRoot root_;
  std::string queue_;
};

TEST_F(QueuePathFilterTest, NeverSaysNoWhereTheSearchFindsAnEvent) {
  WriteFile(queue_, R"({"event":2,"path":"/v/s/a/file.txt"})"
                    "\n"
                    R"({"event":256,"path":"/v/s/new","path_old":"/v/s/old/x"})"
                    "\n"
                    R"({"event":2,"path":"\/v\/s\/escaped\/f"})"
                    "\n"
                    R"({"event":2,"path":"/v/s/caf\u00e9/f"})"
                    "\n"
                    R"({"event": 64 , "is_dir" : true , "path" : "/v/s/spaced/d" })"
                    "\n"
                    R"({"event":2,"path":"/v/s/\"q\"/f"})"
                    "\n"
                    R"({"event":2,"path":"/v/s/uni/ü/f"})"
                    "\n"
                    "not json at all /v/s/junk\n"
                    R"({"event":2,"path":"/v/s/last"})");
  QueueMgr search(queue_);
  const char* folders[] = {"/v/s/a",        "/v/s/a/file.txt", "/v/s",         "/v",
                           "/v/s/old",      "/v/s/new",        "/v/s/escaped", "/v/s/café",
                           "/v/s/spaced/d", "/v/s/\"q\"",      "/v/s/uni/ü",   "/v/s/last",
                           "/v/s/ab",       "/v/s/a/file",     "/v/s/junk",    "/w",
                           "/v/s/old/x/y",  "/v/s/cafe"};
  int certain_no = 0;
  for (const char* folder : folders) {
    bool found = search.IsFullPathProcessing(folder);
    bool maybe = QueueMayHoldPath(queue_, folder);
    if (found) {
      EXPECT_TRUE(maybe) << folder << ": the search finds an event";
    }
    certain_no += !maybe;
  }
  // The siblings, the non-matching prefix and the other tree are ruled out.
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/ab"));
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/a/file"));
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/w"));
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/old/x/y"));
  EXPECT_GE(certain_no, 5);
}

TEST_F(QueuePathFilterTest, SeesAppendedLinesAndARotatedQueue) {
  WriteFile(queue_, R"({"event":2,"path":"/v/s/a/f"})"
                    "\n");
  EXPECT_TRUE(QueueMayHoldPath(queue_, "/v/s/a"));
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/b"));
  WriteFile(queue_, R"({"event":2,"path":"/v/s/a/f"})"
                    "\n"
                    R"({"event":2,"path":"/v/s/b/g"})"
                    "\n");
  EXPECT_TRUE(QueueMayHoldPath(queue_, "/v/s/b"));
  ASSERT_EQ(rename(queue_.c_str(), (queue_ + ".tmp").c_str()), 0);
  WriteFile(queue_, R"({"event":2,"path":"/v/s/c/h"})"
                    "\n");
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/b"));
  EXPECT_TRUE(QueueMayHoldPath(queue_, "/v/s/c"));
  EXPECT_TRUE(QueueMayHoldPath(queue_ + ".tmp", "/v/s/b"));
}

TEST_F(QueuePathFilterTest, AbsentOrNonRegularQueueHoldsNothing) {
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v"));
  WriteFile(root_.Path("/elsewhere"), R"({"event":2,"path":"/v/s/a"})"
                                      "\n");
  ASSERT_EQ(symlink(root_.Path("/elsewhere").c_str(), queue_.c_str()), 0);
  EXPECT_FALSE(QueueMayHoldPath(queue_, "/v/s/a"));
  EXPECT_FALSE(QueueMgr(queue_).IsFullPathProcessing("/v/s/a")) << "the search agrees";
}

}  // namespace
}  // namespace vellis::fileindex
