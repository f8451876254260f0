// The monitor against a real configuration folder under a temporary root:
// what it refuses, what it follows, and queues it cannot write.
#include "daemons/monitord/monitor.h"

#include <gtest/gtest.h>
#include <json/json.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "common/root_path.h"
#include "daemons/monitord/inotify_watcher.h"
#include "sdk/linux/monitor_queues.h"
#include "tests/daemons/monitord/watch_harness.h"
#include "tests/support/temp_root.h"

namespace vellis::monitord {
namespace {

using testing::NowMs;
using vellis::testing::MakeDirs;
using vellis::testing::ReadFile;
using vellis::testing::TempRoot;
using vellis::testing::WriteFile;

class MonitorTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string why;
    auto watcher = InotifyWatcher::Create(&why);
    ASSERT_TRUE(watcher) << why;
    monitor_ = std::make_unique<Monitor>(std::move(watcher), MonitorOptions{}, NowMs);
    MakeDirs(RootPath(sdk::kMonitorQueueDir));
  }

  // The configuration file `app`.json: each queue with its folders.
  void Configure(const std::string& app,
                 const std::vector<std::pair<std::string, std::vector<std::string>>>& queues) {
    Json::Value root(Json::objectValue);
    root["app"] = app;
    root["queues"] = Json::Value(Json::objectValue);
    for (const auto& [queue, folders] : queues) {
      Json::Value q(Json::objectValue);
      q["type"] = 1;
      q["config"] = Json::Value(Json::arrayValue);
      for (const std::string& f : folders) {
        Json::Value item(Json::objectValue);
        item["path"] = f;
        item["mask"] = 0xFFC6;
        item["ignore"] = Json::Value(Json::arrayValue);
        q["config"].append(item);
      }
      root["queues"][queue] = q;
    }
    WriteFile(ConfigFile(app), JsonToString(root));
  }
  static std::string ConfigFile(const std::string& app) {
    return RootPath(sdk::kMonitorQueueDir) + "/" + app + ".json";
  }

  // Steps the monitor until `done` or 5 s.
  bool StepUntil(const std::function<bool()>& done) {
    const int64_t deadline = NowMs() + 5000;
    for (;;) {
      monitor_->Step();
      if (done()) return true;
      if (NowMs() >= deadline) return false;
      pollfd p = {monitor_->watcher().fd(), POLLIN, 0};
      poll(&p, 1, 10);
    }
  }
  // Steps for `ms` whatever comes.
  void StepFor(int64_t ms) {
    StepUntil([end = NowMs() + ms] { return NowMs() >= end; });
  }

  // The paths of the queue's lines.
  static std::vector<std::string> QueuePaths(const std::string& queue) {
    std::vector<std::string> out;
    const std::string text = ReadFile(queue);
    size_t start = 0;
    while (start < text.size()) {
      const size_t end = text.find('\n', start);
      Json::Value v;
      EXPECT_TRUE(JsonFromString(v, text.substr(start, end - start)));
      out.push_back(v["path"].asString());
      start = end == std::string::npos ? text.size() : end + 1;
    }
    return out;
  }
  static bool Has(const std::vector<std::string>& v, const std::string& s) {
    return std::find(v.begin(), v.end(), s) != v.end();
  }
  std::vector<std::string> Folders() const {
    std::vector<std::string> out;
    const Json::Value status = monitor_->Status();
    for (const Json::Value& f : status["folders"]) out.push_back(f.asString());
    return out;
  }
  // True when some error in Status() holds `part`.
  bool ErrorHas(const std::string& part) const {
    const Json::Value status = monitor_->Status();
    for (const Json::Value& e : status["errors"]) {
      if (e.asString().find(part) != std::string::npos) return true;
    }
    return false;
  }

  TempRoot tmp_;
  std::unique_ptr<Monitor> monitor_;
};

TEST_F(MonitorTest, RefusedConfigurationsLeaveTheOthersWatched) {
  const std::string good = tmp_.Path("/vol/good"), target = tmp_.Path("/vol/target");
  const std::string link = tmp_.Path("/vol/link"), queue = tmp_.Path("/q/good.queue");
  MakeDirs(good);
  MakeDirs(target);
  ASSERT_EQ(symlink(target.c_str(), link.c_str()), 0);
  Configure("a-good", {{queue, {good}}});
  Configure("b-missing", {{tmp_.Path("/q/missing.queue"), {tmp_.Path("/vol/nowhere")}}});
  Configure("c-link", {{tmp_.Path("/q/link.queue"), {link}}});
  WriteFile(ConfigFile("d-corrupt"), "{\"app\": \"x\", \"queues\": {");
  WriteFile(ConfigFile("e-not-an-object"), "[1, 2]");
  monitor_->Reload();

  EXPECT_EQ(Folders(), std::vector<std::string>{good});
  EXPECT_TRUE(ErrorHas("d-corrupt.json")) << monitor_->Status()["errors"];
  EXPECT_TRUE(ErrorHas("e-not-an-object.json")) << monitor_->Status()["errors"];
  EXPECT_TRUE(ErrorHas(tmp_.Path("/vol/nowhere") + " does not exist"));
  EXPECT_TRUE(ErrorHas(link + " is a symbolic link"));

  WriteFile(good + "/f", "x");
  WriteFile(target + "/through-the-link", "x");
  EXPECT_TRUE(StepUntil([&] { return Has(QueuePaths(queue), good + "/f"); }));
  StepFor(100);
  EXPECT_NE(access(tmp_.Path("/q/link.queue").c_str(), F_OK), 0);
  EXPECT_NE(access(tmp_.Path("/q/missing.queue").c_str(), F_OK), 0);
}

TEST_F(MonitorTest, ReloadFollowsFoldersAddedAndRemoved) {
  const std::string a = tmp_.Path("/vol/a"), b = tmp_.Path("/vol/b");
  const std::string qa = tmp_.Path("/q/a.queue"), qb = tmp_.Path("/q/b.queue");
  MakeDirs(a);
  MakeDirs(b);
  Configure("app", {{qa, {a}}});
  monitor_->Reload();
  EXPECT_EQ(Folders(), std::vector<std::string>{a});

  // b added, in its own queue.
  Configure("app", {{qa, {a}}, {qb, {b}}});
  monitor_->Reload();
  EXPECT_EQ(Folders(), (std::vector<std::string>{a, b}));
  WriteFile(b + "/1", "x");
  EXPECT_TRUE(StepUntil([&] { return Has(QueuePaths(qb), b + "/1"); }));

  // a removed: its changes no longer reported; b's still are.
  Configure("app", {{qb, {b}}});
  monitor_->Reload();
  EXPECT_EQ(Folders(), std::vector<std::string>{b});
  WriteFile(a + "/2", "x");
  WriteFile(b + "/3", "x");
  EXPECT_TRUE(StepUntil([&] { return Has(QueuePaths(qb), b + "/3"); }));
  StepFor(100);
  EXPECT_FALSE(Has(QueuePaths(qa), a + "/2"));

  // The configuration file removed: nothing is watched.
  ASSERT_EQ(unlink(ConfigFile("app").c_str()), 0);
  monitor_->Reload();
  EXPECT_TRUE(Folders().empty());
  EXPECT_EQ(monitor_->watcher().stats().watches, 0u);
}

struct BadQueue {
  const char* name;
  std::function<void(const std::string& queue, const std::string& elsewhere)> make;
};

class MonitorBadQueueTest : public MonitorTest, public ::testing::WithParamInterface<BadQueue> {};

TEST_P(MonitorBadQueueTest, LinesWaitUntilTheQueueIsFixed) {
  const std::string a = tmp_.Path("/vol/a"), queue = tmp_.Path("/q/a.queue");
  const std::string elsewhere = tmp_.Path("/elsewhere");
  MakeDirs(a);
  MakeDirs(tmp_.Path("/q"));
  WriteFile(elsewhere, "");
  GetParam().make(queue, elsewhere);
  Configure("app", {{queue, {a}}});
  monitor_->Reload();

  WriteFile(a + "/f", "x");
  EXPECT_TRUE(StepUntil([&] { return ErrorHas(queue); })) << monitor_->Status()["errors"];
  EXPECT_EQ(ReadFile(elsewhere), "");  // nothing written through the link

  // Fixed: what waited is written, and what comes after.
  ASSERT_EQ(unlink(queue.c_str()), 0);
  WriteFile(a + "/g", "y");
  EXPECT_TRUE(StepUntil([&] {
    const auto paths = QueuePaths(queue);
    return Has(paths, a + "/f") && Has(paths, a + "/g");
  }));
  struct stat st;
  ASSERT_EQ(lstat(queue.c_str(), &st), 0);
  EXPECT_TRUE(S_ISREG(st.st_mode));
}

INSTANTIATE_TEST_SUITE_P(
    Queue, MonitorBadQueueTest,
    ::testing::Values(BadQueue{"SymbolicLink",
                               [](const std::string& q, const std::string& elsewhere) {
                                 ASSERT_EQ(symlink(elsewhere.c_str(), q.c_str()), 0);
                               }},
                      BadQueue{"Fifo",
                               [](const std::string& q, const std::string&) {
                                 ASSERT_EQ(mkfifo(q.c_str(), 0644), 0);
                               }}),
    [](const auto& info) { return std::string(info.param.name); });

TEST_F(MonitorTest, WatchedFolderDeletedAndMadeAgainIsWatchedAfterReload) {
  const std::string a = tmp_.Path("/vol/a"), queue = tmp_.Path("/q/a.queue");
  WriteFile(a + "/sub/f", "x");
  Configure("app", {{queue, {a}}});
  monitor_->Reload();
  WriteFile(a + "/before", "x");
  EXPECT_TRUE(StepUntil([&] { return Has(QueuePaths(queue), a + "/before"); }));

  ASSERT_EQ(system(("rm -rf '" + a + "'").c_str()), 0);
  StepFor(100);
  MakeDirs(a + "/sub");
  monitor_->Reload();
  EXPECT_EQ(Folders(), std::vector<std::string>{a});
  WriteFile(a + "/after", "x");
  WriteFile(a + "/sub/deep", "x");
  EXPECT_TRUE(StepUntil([&] {
    const auto paths = QueuePaths(queue);
    return Has(paths, a + "/after") && Has(paths, a + "/sub/deep");
  })) << ReadFile(queue);
}

}  // namespace
}  // namespace vellis::monitord
