// The indexing daemon's commands and a share worker's steps, in-process on
// an injected clock, against the real search daemon.
#include "daemons/fileindexd/indexing_service.h"

#include <gtest/gtest.h>

#include <fstream>
#include <string>

#include "common/json_util.h"
#include "fileindex/elastic/elastic_control.h"
#include "tests/support/folder_env.h"
#include "tests/support/parse_json.h"
#include "tests/support/searchd_process.h"

namespace vellis::fileindexd {
namespace {

using testing::ParseJson;

class IndexingServiceTest : public testing::FolderEnvTest {
 protected:
  void SetUp() override {
    share_ = AddShare("s", {"/docs"});
    ASSERT_TRUE(searchd_.Start());
    fileindex::elastic::ShareIndexCreate("s");
    SaveFolders(false);
    options_.settle_ms = 1000;
    options_.first_retry_ms = 500;
    service_ = std::make_unique<IndexingService>(
        options_, [this] { return now_; }, false);
  }
  void TearDown() override {
    service_.reset();
    searchd_.Stop(SIGTERM);
  }

  void SaveFolders(bool paused) {
    fileindex::FolderMgr folders;
    Json::Value f = testing::IndexMgrTest::FolderJson("/s/docs");
    f["paused"] = paused;
    std::shared_ptr<fileindex::Folder> changed;
    folders.Upsert(changed, std::make_shared<fileindex::Folder>(f));
    folders.Save();
  }
  // The answer to a command from a peer (root by default).
  Json::Value Command(const std::string& text, uid_t uid = 0) {
    daemon::Peer peer;
    peer.uid = uid;
    return ParseJson(service_->Handle(text, peer));
  }
  void Queue(const std::string& line) {
    std::ofstream(QueuePath("s"), std::ios::app) << line << "\n";
  }
  int64_t Documents() {
    Json::Value answer = Command(R"({"type": "status"})");
    return answer["data"]["shares"]["s"]["documents"].asInt64();
  }

  std::string share_;
  testing::SearchdProcess searchd_;
  WorkerOptions options_;
  int64_t now_ = 1'700'000'000'000;
  std::unique_ptr<IndexingService> service_;
};

TEST_F(IndexingServiceTest, CommandsAreCheckedAndChangesNeedAnAdministrator) {
  const struct {
    std::string command;
    uid_t uid;
    int code;  // 0: success
    const char* msg;
  } cases[] = {
      {"not json", 0, 120, "a command is"},
      {R"({"data": {}})", 0, 120, "a command is"},
      {R"({"type": "reboot"})", 0, 120, "unknown command: reboot"},
      {R"({"type": "pause", "data": {"resume_time": "soon"}})", 0, 120,
       "data.resume_time must be an integer"},
      {R"({"type": "worker_create", "data": {}})", 0, 120, "data.share_name must be a string"},
      {R"({"type": "worker_create", "data": {"share_name": "../x"}})", 0, 120, "not a share name"},
      {R"({"type": "notify_setting_changed", "data": {"share_name": "s"}})", 0, 120,
       "data.is_upsert must be a bool"},
      {R"({"type": "worker_create", "data": {"share_name": "nosuch"}})", 0, 800, ""},
      {R"({"type": "pause", "data": {"resume_time": 0}})", 4242, 503, "permission denied"},
      {R"({"type": "status"})", 4242, 0, ""},
  };
  for (const auto& c : cases) {
    Json::Value answer = Command(c.command, c.uid);
    if (c.code == 0) {
      EXPECT_TRUE(answer["success"].asBool()) << c.command << " -> " << JsonToString(answer);
      continue;
    }
    EXPECT_EQ(answer["error"]["code"].asInt(), c.code) << c.command << " -> " << answer;
    EXPECT_NE(answer["error"]["msg"].asString().find(c.msg), std::string::npos)
        << c.command << " -> " << answer;
  }
}

TEST_F(IndexingServiceTest, PauseResumeAndWorkersFollowTheCommands) {
  service_->Load();
  ASSERT_NE(service_->Worker("s"), nullptr) << "a share with indexed folders has a worker";
  Command(R"({"type": "pause", "data": {"resume_time": 1700000100}})");
  EXPECT_EQ(service_->HeldUntilMs(), 1'700'000'100'000);
  Json::Value status = Command(R"({"type": "status"})")["data"];
  EXPECT_TRUE(status["paused"].asBool());
  EXPECT_EQ(status["resume_time"].asInt64(), 1700000100);
  Command(R"({"type": "resume"})");
  EXPECT_FALSE(Command(R"({"type": "status"})")["data"]["paused"].asBool());

  Command(R"({"type": "worker_delete", "data": {"share_name": "s", "extra": 1}})");
  EXPECT_EQ(service_->Worker("s"), nullptr);
  Command(R"({"type": "worker_create", "data": {"share_name": "s"}})");
  EXPECT_NE(service_->Worker("s"), nullptr);
  testing::WriteFile(FoldersPath(), "[]");  // the last folder went
  Command(R"({"type": "notify_setting_changed", "data": {"share_name": "s", "is_upsert": false}})");
  EXPECT_EQ(service_->Worker("s"), nullptr);
}

// The worker waits for the queue to settle, holds while paused, and keeps
// the side file of a failed round for a retry that comes later each time.
TEST_F(IndexingServiceTest, WorkerStepsSettleHoldAndRetry) {
  service_->Load();
  ShareWorker& worker = *service_->Worker("s");
  testing::WriteFile(share_ + "/docs/a.txt", "alpha");
  EXPECT_EQ(worker.Step(), -1) << "nothing queued";
  Queue(R"({"event": 64, "path": ")" + share_ + R"(/docs/a.txt"})");
  const int64_t first = now_;
  EXPECT_EQ(worker.Step(), now_ + 1000) << "a burst settles first";
  now_ += 600;
  Queue(R"({"event": 2, "path": ")" + share_ + R"(/docs/a.txt"})");
  EXPECT_EQ(worker.Step(), now_ + 1000) << "the settle time counts from the last line";
  for (int i = 0; i < 20; ++i) {  // a queue that never stops growing
    now_ += 600;
    Queue(R"({"event": 2, "path": ")" + share_ + R"(/docs/a.txt"})");
    if (worker.Step() == first + 10 * 1000) break;
  }
  EXPECT_EQ(worker.Step(), first + 10 * 1000) << "is taken ten settle times after it began";
  Command(R"({"type": "pause", "data": {"resume_time": 0}})");
  now_ = first + 10 * 1000;
  EXPECT_EQ(worker.Step(), -1) << "held until resumed";
  EXPECT_EQ(worker.status().state, "paused");
  Command(R"({"type": "resume"})");
  EXPECT_EQ(worker.Step(), -1) << "the round ran and the queue is empty";
  EXPECT_EQ(Documents(), 1);

  Queue(R"({"event": 128, "path": ")" + share_ + R"(/docs/a.txt"})");
  EXPECT_EQ(searchd_.Stop(SIGKILL), -SIGKILL);
  now_ += 5000;
  worker.Step();  // notices the work
  now_ += 1000;
  EXPECT_EQ(worker.Step(), now_ + 500) << "failed: retry after the first delay";
  EXPECT_EQ(worker.status().state, "waiting for the search daemon");
  std::ifstream side(QueuePath("s") + ".tmp");
  EXPECT_TRUE(side.good()) << "the side file stays for the retry";
  now_ += 500;
  EXPECT_EQ(worker.Step(), now_ + 1000) << "the delay doubles";
  ASSERT_TRUE(searchd_.Start());
  now_ += 1000;
  EXPECT_EQ(worker.Step(), -1);
  EXPECT_EQ(Documents(), 0);
  EXPECT_EQ(worker.status().state, "idle");
}

// A share whose folders are all paused keeps its queue until a wake-up
// finds a folder running again.
TEST_F(IndexingServiceTest, APausedShareKeepsItsQueue) {
  SaveFolders(true);
  service_->Load();
  ShareWorker& worker = *service_->Worker("s");
  testing::WriteFile(share_ + "/docs/a.txt", "alpha");
  Queue(R"({"event": 64, "path": ")" + share_ + R"(/docs/a.txt"})");
  worker.Step();
  now_ += 1000;
  worker.Step();
  EXPECT_EQ(worker.Step(), -1);
  EXPECT_EQ(worker.status().state, "paused");
  EXPECT_EQ(Documents(), 0);
  SaveFolders(false);
  worker.Wake();
  EXPECT_EQ(worker.Step(), -1);
  EXPECT_EQ(Documents(), 1);
}

}  // namespace
}  // namespace vellis::fileindexd
