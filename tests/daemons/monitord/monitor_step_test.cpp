// The monitor's step on an injected clock with a fake watcher: what reaches
// the queue files, the overflow's crash markers, and the rescans of folders
// past the watch limit.
#include <gtest/gtest.h>
#include <json/json.h>
#include <unistd.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/monitord/monitor.h"
#include "sdk/linux/monitor_queues.h"
#include "tests/support/fake_watcher.h"
#include "tests/support/temp_root.h"

namespace vellis::monitord {
namespace {

using vellis::testing::FakeWatcher;
using vellis::testing::MakeDirs;
using vellis::testing::ReadFile;
using vellis::testing::TempRoot;
using vellis::testing::WriteFile;

class MonitorStepTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const std::string& f : {a_, b_}) MakeDirs(f);
    Json::Value root(Json::objectValue);
    root["app"] = "fileindex";
    for (const auto& [queue, folder] : {std::pair{qa_, a_}, std::pair{qb_, b_}}) {
      Json::Value item(Json::objectValue);
      item["path"] = folder;
      item["mask"] = 0xFFC6;
      item["ignore"].append("@eaDir");
      root["queues"][queue]["type"] = 1;
      root["queues"][queue]["config"].append(item);
    }
    WriteFile(RootPath(sdk::kMonitorQueueDir) + "/fileindex.json", JsonToString(root));
    auto fake = std::make_unique<FakeWatcher>();
    fake_ = fake.get();
    MonitorOptions options;
    options.rescan_ms = 60 * 1000;
    monitor_ = std::make_unique<Monitor>(std::move(fake), options, [this] { return now_; });
    monitor_->Reload();
  }

  // The events of the queue's lines, "<bit> <path>" each.
  std::vector<std::string> Lines(const std::string& queue) {
    std::vector<std::string> out;
    std::istringstream in(ReadFile(queue));
    for (std::string line; std::getline(in, line);) {
      Json::Value v;
      EXPECT_TRUE(JsonFromString(v, line)) << line;
      out.push_back(std::to_string(v["event"].asInt()) + " " + v["path"].asString());
    }
    return out;
  }

  TempRoot root_;
  std::string a_ = root_.Path("/volume1/a"), b_ = root_.Path("/volume1/b");
  std::string qa_ = root_.Path("/volume1/@fileindex/a/queue");
  std::string qb_ = root_.Path("/volume1/@fileindex/b/queue");
  int64_t now_ = 1000;
  FakeWatcher* fake_ = nullptr;
  std::unique_ptr<Monitor> monitor_;
};

TEST_F(MonitorStepTest, ChangesReachTheirQueueAndOverflowMarksEveryQueue) {
  EXPECT_EQ(fake_->roots, (std::set<std::string>{a_, b_}));
  fake_->events = {{FsEventKind::kCreate, a_ + "/x.txt", false, 0},
                   {FsEventKind::kCreate, b_ + "/@eaDir/t.jpg", false, 0},
                   {FsEventKind::kMovedFrom, b_ + "/old", true, 3}};
  EXPECT_EQ(monitor_->Step(), now_ + 50) << "the rename half waits for its other half";
  EXPECT_EQ(Lines(qa_), std::vector<std::string>{"64 " + a_ + "/x.txt"});
  now_ += 50;
  EXPECT_EQ(monitor_->Step(), -1);
  EXPECT_EQ(Lines(qb_), std::vector<std::string>{"128 " + b_ + "/old"}) << "moved out";

  fake_->events = {{FsEventKind::kOverflow, "", false, 0}};
  EXPECT_EQ(monitor_->Step(), now_ + 10) << "lines soon after a write wait for the next";
  EXPECT_EQ(Lines(qa_).size(), 1u);
  now_ += 10;
  monitor_->Step();
  EXPECT_EQ(Lines(qa_).back(), "512 " + a_);
  EXPECT_EQ(Lines(qb_).back(), "512 " + b_);
  Json::Value status = monitor_->Status();
  EXPECT_EQ(status["overflows"].asUInt64(), 1u);
  EXPECT_EQ(status["backend"], "fake");
  EXPECT_EQ(status["events"].asUInt64(), 4u);
  EXPECT_EQ(status["lines"].asUInt64(), 4u);
}

// A folder the watch limit left out gets the crash marker once, then a
// reindex line at once and every rescan period.
TEST_F(MonitorStepTest, FoldersPastTheWatchLimitAreRescanned) {
  fake_->unwatched = {a_ + "/deep"};
  EXPECT_EQ(monitor_->Step(), now_ + 60 * 1000);
  EXPECT_EQ(Lines(qa_), (std::vector<std::string>{"512 " + a_, "65536 " + a_ + "/deep"}));
  now_ += 59 * 1000;
  EXPECT_EQ(monitor_->Step(), now_ + 1000) << "not yet";
  now_ += 1000;
  monitor_->Step();
  EXPECT_EQ(Lines(qa_).size(), 3u);
  EXPECT_EQ(Lines(qa_).back(), "65536 " + a_ + "/deep");
  fake_->unwatched = {a_ + "/deep"};  // reported again: no second marker
  monitor_->Step();
  EXPECT_EQ(Lines(qa_).size(), 3u);
  EXPECT_TRUE(Lines(qb_).empty());
}

// A queue that cannot be written keeps its lines, tried again each second
// rather than at the pace of the batching.
TEST_F(MonitorStepTest, LinesForAQueueThatCannotBeWrittenWaitASecond) {
  MakeDirs(qa_);  // a folder where the queue file should be
  fake_->events = {{FsEventKind::kCreate, a_ + "/x.txt", false, 0}};
  EXPECT_EQ(monitor_->Step(), now_ + 1000);
  EXPECT_EQ(monitor_->Status()["errors"].size(), 1u);
  now_ += 1000;
  ASSERT_EQ(rmdir(qa_.c_str()), 0);
  EXPECT_EQ(monitor_->Step(), -1) << "written once the queue can be";
  EXPECT_EQ(Lines(qa_), std::vector<std::string>{"64 " + a_ + "/x.txt"});
}

}  // namespace
}  // namespace vellis::monitord
