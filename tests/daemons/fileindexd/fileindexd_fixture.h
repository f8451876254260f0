// The indexing daemon and the search daemon of this build as processes
// under a temporary root, with the share "s" registered at
// "<root>/volume1/s". The test process plays the file-change monitor (it
// appends queue lines with the library's AddCustomEvent, one write under the
// queue lock, as the monitor does) and the management side (the library's
// folder operations, the command channel), and reads the index back from
// the search daemon.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/document_requests.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/index_mgr.h"
#include "fileindex/optree.h"
#include "fileindex/util.h"
#include "sdk/domain_socket.h"
#include "sdk/linux/share_registry.h"
#include "sdk/share.h"
#include "tests/support/fileindexd_process.h"
#include "tests/support/searchd_process.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {

class FileindexdTest : public ::testing::Test {
 protected:
  // A file's document: its size and modification time (zero for a folder).
  struct Doc {
    int64_t size = 0;
    int64_t mtime = 0;
    bool operator==(const Doc& o) const { return size == o.size && mtime == o.mtime; }
  };
  // Relative to the share's folder ("/docs/a.txt").
  using Docs = std::map<std::string, Doc>;

  void SetUp() override {
    setenv("VELLIS_SERVICES", "none", 1);  // the test runs the daemons itself
    share_ = root_.Path("/volume1/s");
    MakeDirs(share_ + "/docs");
    sdk::ShareInfo info;
    info.szName = "s";
    info.szPath = share_;
    sdk::RegisterShare(info);
    ASSERT_TRUE(searchd_.Start()) << "the search daemon did not come up";
    ASSERT_TRUE(daemon_.Start(DaemonArgs())) << daemon_.LogTail();
  }
  void TearDown() override {
    if (daemon_.pid() > 0) {
      EXPECT_EQ(daemon_.Stop(SIGTERM), 0) << "a clean stop\n" << daemon_.LogTail();
    }
    searchd_.Stop(SIGTERM);
    unsetenv("VELLIS_SERVICES");
  }
  virtual std::vector<std::string> DaemonArgs() const { return {"--settle-ms=50"}; }

  // --- Files and what the monitor reports of them ---
  void Write(const std::string& rel, const std::string& text = "words") {
    WriteFile(share_ + rel, text);
  }
  // Files rel/d<i>/f<j>.txt, `dirs` folders of `files` each, each holding
  // `word`.
  void WriteTree(const std::string& rel, int dirs, int files, const std::string& word) {
    for (int d = 0; d < dirs; ++d) {
      for (int f = 0; f < files; ++f) {
        Write(rel + "/d" + std::to_string(d) + "/f" + std::to_string(f) + ".txt",
              word + " " + std::to_string(f));
      }
    }
  }
  // One queue line as the monitor writes it.
  void Report(uint32_t bits, const std::string& rel, const std::string& old_rel = "") {
    fileindex::AddCustomEvent(static_cast<int>(bits), share_ + rel,
                              old_rel.empty() ? "" : share_ + old_rel, Json::Value());
  }
  // Adds the folder "/s<rel>" with every category.
  void AddFolder(const std::string& rel) {
    Json::Value f(Json::objectValue);
    f["path"] = "/s" + rel;
    f["name"] = rel.substr(rel.rfind('/') + 1);
    for (const char* c : {"document", "audio", "video", "photo"}) f[c] = true;
    Json::Value list(Json::arrayValue);
    list.append(f);
    fileindex::FolderAdd(list, false);
  }

  std::string QueuePath() const { return sdk::SDKShare("s").GetQueuePath(); }

  // --- The daemon's command channel ---
  // The answer to a command sent as the library sends it; null, and a
  // failure, when none comes.
  Json::Value Command(const std::string& type, const Json::Value& data = Json::Value()) {
    Json::Value answer;
    try {
      const std::string text = fileindex::SendCommandToDaemon(type, data);
      EXPECT_TRUE(JsonFromString(answer, text)) << text;
    } catch (const Error& e) {
      ADD_FAILURE() << "no answer to " << type << ": " << e.what() << "\nlog:\n"
                    << daemon_.LogTail();
    }
    return answer;
  }
  // The status of the share's worker (null without a worker).
  Json::Value ShareStatus() { return Command("status")["data"]["shares"]["s"]; }

  // Polls `done` every few milliseconds until it holds or `timeout_ms`
  // passed; the failure shows `what`, the share's status and the log.
  ::testing::AssertionResult WaitFor(const std::function<bool()>& done, const std::string& what,
                                     int timeout_ms = 20000) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    for (;;) {
      if (!daemon_.Running()) {
        return ::testing::AssertionFailure() << "the daemon exited with " << daemon_.exit_status()
                                             << " while waiting: " << what << "\nlog:\n"
                                             << daemon_.LogTail();
      }
      if (done()) break;
      if (std::chrono::steady_clock::now() > end) {
        return ::testing::AssertionFailure()
               << "not within " << timeout_ms << " ms: " << what
               << "\nstatus: " << JsonToString(Command("status")) << "\nlog:\n"
               << daemon_.LogTail();
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return ::testing::AssertionSuccess();
  }
  // The worker has nothing left: no queue line waits and no round runs
  // (the side file goes after a round's last commit).
  ::testing::AssertionResult WaitSettled(int timeout_ms = 20000) {
    return WaitFor(
        [&] {
          const Json::Value s = ShareStatus();
          return s["state"] == "idle" && s["events_waiting"] == 0;
        },
        "the worker settles", timeout_ms);
  }

  // --- The index ---
  // Every document below the share's folder with its file-system fields. A
  // path that the index holds twice fails the test.
  Docs Index() {
    const Json::Value page = fileindex::elastic::IndexGetPage(
        "s", share_, "", 1 << 30,
        {fileindex::elastic::kQORUMDFSSize, fileindex::elastic::kQORUMDFSContentChangeDate,
         fileindex::elastic::kQORUMDIsDir});
    Docs docs;
    for (const Json::Value& d : page) {
      const std::string path = d[fileindex::elastic::kQORUMDPath].asString();
      // A folder's own fields change with what it holds; only files count.
      const Doc doc = d[fileindex::elastic::kQORUMDIsDir].asBool()
                          ? Doc{}
                          : Doc{d[fileindex::elastic::kQORUMDFSSize].asInt64(),
                                d[fileindex::elastic::kQORUMDFSContentChangeDate].asInt64()};
      EXPECT_TRUE(docs.emplace(Rel(path), doc).second) << "held twice: " << path;
    }
    return docs;
  }
  // The search for `word` below the share's folder `rel`: its answer's data.
  Json::Value Search(const std::string& word, int limit, const std::string& rel = "") {
    Json::Value req(Json::objectValue);
    req["command"] = "document_search";
    req["data"]["id"] = fileindex::elastic::GetFileIndexID("s");
    req["data"]["query"] = word;
    req["data"]["path"] = share_ + rel + "/";
    req["data"]["limit"] = limit;
    const Json::Value answer = sdk::Exchange(RootPath(kElasticSocketPath), req);
    EXPECT_TRUE(answer["success"].asBool()) << JsonToString(answer);
    return answer["data"];
  }
  // The documents below `rel` whose content or name holds `word` (at most
  // 1,000).
  std::vector<std::string> Found(const std::string& word, const std::string& rel = "") {
    std::vector<std::string> paths;
    const Json::Value data = Search(word, 1000, rel);
    for (const Json::Value& hit : data["hits"]) {
      paths.push_back(Rel(hit["id"].asString()));
    }
    std::sort(paths.begin(), paths.end());
    return paths;
  }
  // How many hold it below `rel`.
  int64_t Hits(const std::string& word, const std::string& rel = "") {
    return Search(word, 0, rel)["total"].asInt64();
  }
  // What the index should hold for the folder `rel` with every category:
  // the folder, and every directory and regular file below it.
  Docs Disk(const std::string& rel) {
    Docs docs;
    auto add = [&](const std::string& path) {
      struct stat st;
      if (lstat(path.c_str(), &st) != 0) return;
      if (S_ISDIR(st.st_mode)) docs[Rel(path)] = {};
      if (S_ISREG(st.st_mode)) docs[Rel(path)] = {st.st_size, st.st_mtime};
    };
    std::error_code ec;
    if (!std::filesystem::is_directory(share_ + rel, ec)) return docs;
    add(share_ + rel);
    for (auto it = std::filesystem::recursive_directory_iterator(share_ + rel, ec);
         !ec && it != std::filesystem::recursive_directory_iterator(); it.increment(ec)) {
      add(it->path().string());
    }
    return docs;
  }
  // "" when `got` is `want`; else what is missing, extra and stale (a few
  // of each).
  static std::string Diff(const Docs& want, const Docs& got) {
    std::string missing, extra, stale;
    int n_missing = 0, n_extra = 0, n_stale = 0;
    auto note = [](std::string& list, int& n, const std::string& item) {
      if (++n <= 8) list += " " + item;
    };
    for (const auto& [path, doc] : want) {
      auto it = got.find(path);
      if (it == got.end()) {
        note(missing, n_missing, path);
      } else if (!(it->second == doc)) {
        note(stale, n_stale,
             path + " (" + std::to_string(it->second.size) + "@" +
                 std::to_string(it->second.mtime) + ", file " + std::to_string(doc.size) + "@" +
                 std::to_string(doc.mtime) + ")");
      }
    }
    for (const auto& [path, doc] : got) {
      if (!want.count(path)) note(extra, n_extra, path);
    }
    std::string out;
    if (n_missing) out += std::to_string(n_missing) + " missing:" + missing + "\n";
    if (n_extra) out += std::to_string(n_extra) + " extra:" + extra + "\n";
    if (n_stale) out += std::to_string(n_stale) + " stale:" + stale + "\n";
    return out;
  }
  // Of `docs`, those at or below `rel`.
  static Docs Below(const Docs& docs, const std::string& rel) {
    Docs out;
    for (const auto& [path, doc] : docs) {
      if ((path + "/").rfind(rel + "/", 0) == 0) out.emplace(path, doc);
    }
    return out;
  }
  std::string Rel(const std::string& path) const {
    return path.rfind(share_, 0) == 0 ? path.substr(share_.size()) : path;
  }

  TempRoot root_;
  std::string share_;
  SearchdProcess searchd_;
  FileindexdProcess daemon_;
};

}  // namespace vellis::testing
