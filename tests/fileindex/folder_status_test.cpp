// The live status of a folder and the additional items of its report.
#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "common/error.h"
#include "common/fs_util.h"
#include "common/json_util.h"
#include "fileindex/folder.h"
#include "tests/support/folder_env.h"

namespace vellis::fileindex {
namespace {

using testing::FolderEnv;
using testing::MakeDirs;
using testing::ParseJson;
using testing::WriteFile;

constexpr int64_t kNow = 1700000000;

class FolderStatusTest : public ::testing::Test {
 protected:
  FolderStatusTest() : share_(env_.AddShare("s")) {
    MakeDirs(share_ + "/dir");
    env_.platform().SetTime(kNow);
  }

  // Queue lines for events at these full paths.
  static std::string EventLine(const std::string& path, const std::string& path_old = "") {
    return R"({"event":2,"path":")" + path + R"(","path_old":")" + path_old + "\"}\n";
  }

  std::string StatusText(const Folder& folder) {
    Json::Value out;
    folder.GetStatus(out);
    return out["text"].asString() + (out.isMember("desc") ? "/" + out["desc"].asString() : "");
  }

  FolderEnv env_;
  std::string share_;
  Folder dir_{"/s/dir", "dir", true, true, true, true, false, false};
};

TEST_F(FolderStatusTest, EachStatusTextInOrderOfPrecedence) {
  struct Case {
    const char* label;
    std::string status_file;  // empty: no status file
    std::string queue;
    std::string queue_tmp;
    std::string expected;
  } cases[] = {
      {"no events", "", "", "", "finished"},
      {"event for a sibling only", "", EventLine(share_ + "/dirx/a"), "", "finished"},
      {"event waiting, never paused", "", EventLine(share_ + "/dir/a"), "", "processing"},
      {"event in the side file", "", "", EventLine(share_ + "/dir"), "processing"},
      {"renamed out of the folder", "", EventLine(share_ + "/y", share_ + "/dir/x"), "",
       "processing"},
      {"resume -1", R"({"resume_time":-1})", EventLine(share_ + "/dir/a"), "", "processing"},
      {"resume 0", R"({"resume_time":0})", EventLine(share_ + "/dir/a"), "", "paused"},
      {"resume ahead", R"({"resume_time":1700003600})", EventLine(share_ + "/dir/a"), "", "paused"},
      {"resume now", R"({"resume_time":1700000000})", EventLine(share_ + "/dir/a"), "",
       "processing"},
      {"resume past", R"({"resume_time":1699999999})", EventLine(share_ + "/dir/a"), "",
       "processing"},
      {"need reindex, queue empty", R"({"share":{"s":1}})", "", "", "need_reindex"},
      {"need reindex over paused", R"({"resume_time":0,"share":{"s":3}})",
       EventLine(share_ + "/dir/a"), "", "need_reindex"},
      {"other bits only", R"({"share":{"s":2}})", "", "", "finished"},
  };
  for (const Case& c : cases) {
    Unlink(env_.StatusFile());
    Unlink(env_.QueuePath("s"));
    Unlink(env_.QueuePath("s") + ".tmp");
    if (!c.status_file.empty()) WriteFile(env_.StatusFile(), c.status_file);
    if (!c.queue.empty()) WriteFile(env_.QueuePath("s"), c.queue);
    if (!c.queue_tmp.empty()) WriteFile(env_.QueuePath("s") + ".tmp", c.queue_tmp);
    EXPECT_EQ(StatusText(dir_), c.expected) << c.label;
  }
}

TEST_F(FolderStatusTest, PathThatCannotBeIndexedIsAnErrorWhateverElseHolds) {
  WriteFile(env_.StatusFile(), R"({"share":{"s":1}})");
  Folder missing("/s/missing", "missing", true, true, true, true, false, false);
  EXPECT_EQ(StatusText(missing), "error/invalid_path");
  Folder trailing("/s/dir/", "trailing", true, true, true, true, false, false);
  EXPECT_EQ(StatusText(trailing), "error/invalid_path");
}

TEST_F(FolderStatusTest, StatusIsTheOnlyAdditionalItem) {
  EXPECT_EQ(dir_.GetDataWithAdditional(Json::Value(Json::arrayValue)), dir_.GetData());
  WriteFile(env_.StatusFile(), R"({"share":{"s":1}})");
  Json::Value report = dir_.GetDataWithAdditional(ParseJson(R"(["status"])"));
  EXPECT_EQ(report["additional"]["status"]["text"], "need_reindex");
  report.removeMember("additional");
  EXPECT_EQ(report, dir_.GetData());
}

TEST_F(FolderStatusTest, BadAdditionalsFailTheWholeCall) {
  struct Case {
    const char* additionals;
    const char* expected;
  } cases[] = {
      {R"("status")", "120 additional is not an array"},
      {"null", "120 additional is not an array"},
      {R"({"status":true})", "120 additional is not an array"},
      {R"([5])", "120 additional item is not a string"},
      {R"(["status", null])", "120 additional item is not a string"},
      {R"(["size"])", "120 Unknown additioal: size"},
      {R"(["status", "Status"])", "120 Unknown additioal: Status"},
  };
  for (const Case& c : cases) {
    std::string thrown = "no error";
    try {
      dir_.GetDataWithAdditional(ParseJson(c.additionals));
    } catch (const Error& e) {
      thrown = std::to_string(e.GetCode()) + " " + e.what();
    }
    EXPECT_EQ(thrown, c.expected) << c.additionals;
  }
  EXPECT_EQ(env_.platform().LogsContaining("Failed [!addiitionals.isArray()]").size(), 3u);
}

}  // namespace
}  // namespace vellis::fileindex
