// The library's side of the search daemon against a fake one: the request
// transport (comm.h), the busy-retry loop and the requests of each call
// (elastic_control.h), the index schema; the command channel to the
// indexing daemon (communication.h).
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <tuple>

#include "common/json_util.h"
#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/elastic/schema.h"
#include "fileindex/status_mgr.h"
#include "sdk/frame.h"
#include "sdk/share.h"
#include "tests/support/fake_daemon.h"
#include "tests/support/parse_json.h"
#include "tests/support/scripted_platform.h"
#include "tests/support/temp_root.h"
#include "tests/support/thrown.h"

namespace vellis::fileindex::elastic {
namespace {

using testing::FakeDaemon;
using ::testing::HasSubstr;
using testing::ParseJson;
using ::testing::StartsWith;
using testing::Thrown;

// Fake search and indexing daemons on their sockets, short transfer
// time-outs, the share music.
class ElasticControlTest : public ::testing::Test {
 protected:
  ElasticControlTest()
      : old_timeouts_(TEST_SetRequestTimeouts({300, 300})),
        old_commands_(TEST_SetCommandTimeouts({300, 300})) {
    platform_.AddShare({"music", "/volume1/music"});
  }
  ~ElasticControlTest() override {
    TEST_SetRequestTimeouts(old_timeouts_);
    TEST_SetCommandTimeouts(old_commands_);
  }

  // "<code> <reason>" of what SendRequestImpl throws; the answer goes to res_.
  std::string Send(const Json::Value& req) {
    return Thrown([&] { SendRequestImpl(res_, req); });
  }
  // "<code> <reason>" of what sending the command pause with `data` throws.
  static std::string Command(const Json::Value& data = Json::Value()) {
    return Thrown([&] { SendCommandToDaemon("pause", data); });
  }
  // Runs of the administrators' notifier that report a lack of memory.
  int MemoryNotifications() const {
    const std::string note = "error:lack_of_memory";
    int n = 0;
    for (const auto& e : platform_.Execs()) n += std::count(e.args.begin(), e.args.end(), note);
    return n;
  }

  testing::TempRoot root_;
  testing::ScriptedPlatform platform_;
  testing::ScopedPlatform scoped_{&platform_};
  const std::string path_ = RootPath(kElasticSocketPath);
  std::unique_ptr<FakeDaemon> daemon_ = std::make_unique<FakeDaemon>(path_);
  const std::string index_path_ = RootPath(kFileIndexDaemonSocketPath);
  std::unique_ptr<FakeDaemon> index_daemon_ = std::make_unique<FakeDaemon>(index_path_);
  RequestTimeouts old_timeouts_;
  CommandTimeouts old_commands_;
  const Json::Value commit_ = ParseJson(R"({"command":"commit","data":{"id":"fileindex_music"}})");
  Json::Value res_;
};
using SendRequestImplTest = ElasticControlTest;
using SendCommandTest = ElasticControlTest;

TEST_F(SendRequestImplTest, WaitsUpToFifteenSecondsForTheSocketThenConnectsAnyway) {
  daemon_.reset();
  EXPECT_EQ(Send(commit_), "913 Connect failed");
  EXPECT_EQ(platform_.Sleeps(), std::vector<unsigned>(15, 1));
  auto waits = platform_.LogsContaining("elastic socket is not ready, retry ... ");
  ASSERT_EQ(waits.size(), 15u);
  for (size_t i = 0; i < waits.size(); ++i)
    EXPECT_THAT(waits[i], HasSubstr("retry ... " + std::to_string(i + 1)));
  // A socket that appears during the third wait of the next call is used.
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps != 18) return;
    daemon_ = std::make_unique<FakeDaemon>(path_);
    daemon_->Push(FakeDaemon::Success(ParseJson(R"([{"QORUMDPath":"/v/s/a"}])")));
  });
  EXPECT_EQ(Send(commit_), "no error");
  EXPECT_EQ(res_, ParseJson(R"({"success":true,"data":[{"QORUMDPath":"/v/s/a"}]})"));
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>{commit_});
  EXPECT_EQ(platform_.Sleeps().size(), 18u);
}

TEST_F(SendRequestImplTest, RefusesAnswersThatAreNotWholeJsonObjectsWithBoolSuccess) {
  const std::string ok = R"({"success":true})", bad = "913 Recv failed, res=";
  auto raw = [](const std::string& text) { return FakeDaemon::Raw(text); };
  const std::pair<FakeDaemon::Reply, std::string> cases[] = {
      {raw("not json"), bad + "not json"},
      {raw(std::string(10000, 'x')), bad + std::string(4096, 'x') + "...(10000 bytes)"},
      {raw(R"({"data":1})"), bad + R"({"data":1})"},
      {raw(R"({"success":"yes"})"), bad + R"({"success":"yes"})"},
      {raw("[true]"), bad + "[true]"},
      {raw(ok + " x"), bad + ok + " x"},
      {{sdk::EncodeFrameHeader(0)}, bad},
      {{sdk::EncodeFrameHeader(100) + R"({"succ)", true}, bad},
      {{"", true}, bad},                  // closed at once
      {{""}, bad},                        // silent
      {{raw(ok).bytes, false, 40}, bad},  // too slow
      {FakeDaemon::Failure(5, "no such index"), "5 Request failed, msg=no such index"},
      {FakeDaemon::Busy(1401), "1401 Request failed, msg=busy"},
      {raw(R"({"success":false})"), R"(120 Missing property: error, data={"success":false})"},
      {raw(R"({"success":false,"error":{"msg":"m"}})"),
       R"(120 Missing property: code, data={"msg":"m"})"},
      {raw(R"({"success":false,"error":{"code":7}})"),
       R"(120 Missing property: msg, data={"code":7})"},
  };
  for (const auto& [reply, thrown] : cases) {
    daemon_->Push(reply);
    EXPECT_EQ(Send(commit_), thrown);
  }
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>(std::size(cases), commit_));
  EXPECT_EQ(platform_.LogsContaining("receive timed out").size(), 2u) << "silent and too slow";
}

// Failed sub-requests of a compound answer with has_fail are logged, up to
// a busy one, which is thrown.
TEST_F(SendRequestImplTest, CompoundAnswerReportsOnlyABusySubRequest) {
  const Json::Value req =
      ParseJson(R"({"compound":[{"command":"a","data":{}},{"command":"b","data":{}}]})");
  const std::string x = R"({"success":false,"error":{"code":5,"msg":"x"}},)",
                    y = R"({"success":false,"error":{"code":6,"msg":"y"}}])",
                    busy = R"({"success":false,"error":{"code":1400,"msg":"queue full"}},)",
                    has_fail = R"({"success":true,"has_fail":true,"data":)";
  // The answer, whether the request is a compound one, what it throws, failures logged.
  const std::tuple<std::string, bool, std::string, size_t> cases[] = {
      {has_fail + "[" + x + busy + y + "}", true, "1400 queue full", 1},
      {has_fail + "[" + x + y + "}", true, "no error", 2},
      {R"({"success":true,"has_fail":false,"data":[)" + x + busy + y + "}", true, "no error", 0},
      {R"({"success":true,"data":[)" + x + busy + y + "}", true, "no error", 0},
      {has_fail + "[" + x + busy + y + "}", false, "no error", 0},
      {has_fail + "{}}", true, "913 Compound answer without data array, res=" + has_fail + "{}}",
       0},
  };
  for (const auto& [answer, compound, thrown, logged] : cases) {
    platform_.ClearLogs();
    daemon_->Push(FakeDaemon::Raw(answer));
    EXPECT_EQ(Send(compound ? req : commit_), thrown) << answer;
    auto logs = platform_.LogsContaining("(SendRequestImpl) Compound failed: ");
    ASSERT_EQ(logs.size(), logged) << answer;
    for (Json::ArrayIndex i = 0; i < logged; ++i) {
      EXPECT_THAT(logs[i], HasSubstr(JsonToString(req["compound"][i]) + (i ? " (6) y" : " (5) x")));
    }
  }
}

TEST_F(ElasticControlTest, BusyDaemonIsWaitedOutAndNotifiedOnceAfterTheEleventhAnswer) {
  platform_.SetRandValues({0, 1, 2, 3, 4, 7});
  daemon_->Push(FakeDaemon::Busy(1401), 11);
  SendRequestRetryOnBusy(res_, commit_);
  EXPECT_EQ(res_, ParseJson(R"({"success":true})"));
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>(12, commit_));
  std::vector<unsigned> expected_sleeps = {900, 960, 1020, 1080, 1140};
  expected_sleeps.resize(11, 1020);  // 7 % 5 == 2 from then on
  EXPECT_EQ(platform_.Sleeps(), expected_sleeps);
  EXPECT_EQ(MemoryNotifications(), 1);
  auto retries = platform_.LogsContaining("since qoruelasticd is busy");
  ASSERT_EQ(retries.size(), 11u);
  for (size_t i = 0; i < retries.size(); ++i) {
    EXPECT_THAT(retries[i], HasSubstr("Retry[" + std::to_string(i) +
                                      "] since qoruelasticd is busy. "
                                      "Command: commit, db: fileindex_music"));
  }
}

// Each call counts its own busy answers; any other error ends its loop.
TEST_F(ElasticControlTest, NotificationDependsOnlyOnTheBusyAnswersOfOneCall) {
  for (auto [busy, fails, notified] :
       {std::tuple{0, false, 0}, {10, false, 0}, {11, false, 1}, {30, false, 1}, {2, true, 0}}) {
    const size_t requests = daemon_->Requests().size();
    const int notes = MemoryNotifications();
    daemon_->Push(FakeDaemon::Busy(1400), busy);
    if (fails) daemon_->Push(FakeDaemon::Failure(7, "no such index"));
    EXPECT_EQ(Thrown([&] { SendRequestDiscardResult(commit_); }),
              fails ? "7 Request failed, msg=no such index" : "no error");
    EXPECT_EQ(daemon_->Requests().size() - requests, busy + 1u) << busy << " busy answers";
    EXPECT_EQ(MemoryNotifications() - notes, notified) << busy << " busy answers";
  }
}

// A busy sub-request has the whole compound request sent again; the retry
// names the request by its size and first sub-request.
TEST_F(ElasticControlTest, CompoundWithBusySubRequestIsRetriedWhole) {
  const Json::Value req = ParseJson(R"({"compound":[{"command":"document_set_by_id",
      "data":{"id":"fileindex_s","doc_id":"/v/s/a"}},{"command":"commit","data":{}}]})");
  daemon_->Push(FakeDaemon::Raw(R"({"success":true,"has_fail":true,"data":[
      {"success":true},{"success":false,"error":{"code":1401,"msg":"later"}}]})"));
  daemon_->Push(FakeDaemon::Busy(1400));
  SendRequestDiscardResult(req);
  EXPECT_EQ(daemon_->Requests(), std::vector<Json::Value>(3, req));
  EXPECT_EQ(platform_.LogsContaining("compound[2] document_set_by_id, db: fileindex_s").size(), 2u);
  daemon_->Push(FakeDaemon::Busy(1400));
  SendRequestDiscardResult(ParseJson(R"({"compound":[]})"));
  EXPECT_EQ(platform_.LogsContaining("Command: compound[0], db: ").size(), 1u);
}

// The requests of each call, from a share's name and paths; a document as
// extraction gives it, with the file name for the name search.
TEST_F(ElasticControlTest, EachCallSendsItsRequest) {
  platform_.SetParseFile([](const std::string& path, const Json::Value& options, Json::Value* doc) {
    *doc = ParseJson(R"({"QORUMDPath":")" + path + R"(","QORUMDFSName":"a.txt"})");
    (*doc)["options"] = options;
    return 0;
  });
  auto req = [](const std::string& command, const std::string& data) {
    return R"({"command":")" + command + R"(","data":)" + data + "}";
  };
  const std::string music = R"({"id":"fileindex_music")", s = R"({"id":"fileindex_s")";
  const std::string doc = s + R"(,"doc_id":"/v/s/a.txt","data":{"QORUMDPath":"/v/s/a.txt",
      "QORUMDFSName":"a.txt","QORUMDSearchFileName":"a.txt","options":{"need_meta":)";
  const std::vector<std::string> ids = {"id1", "id2"};
  const std::pair<std::function<void()>, std::string> cases[] = {
      {[] { ShareIndexCreate("music"); },
       req("index_create", music + R"(,"path":")" + sdk::SDKShare("music").GetDBPath() +
                               R"(","settings":{},"event_handler":{"lib_path":")" +
                               kEventHandlerLibPath + R"("},"mappings":)" +
                               JsonToString(GetFileIndexMappings()) + "}")},
      {[] { ShareIndexDelete("music"); }, req("index_delete", music + "}")},
      {[] { ShareIndexPause("music"); }, req("index_pause", music + "}")},
      {[] { ShareIndexResume("my music"); }, req("index_resume", R"({"id":"fileindex_my music"})")},
      {[] { ShareIndexRename("old", "new", "/volume2/@db/new"); },
       req("index_config_set",
           R"({"id":"fileindex_old","data":{"id":"fileindex_new","path":"/volume2/@db/new"}})")},
      {[] { ShareIndexMigrate("music", "/volume3/@db/music"); },
       req("index_config_set", music + R"(,"data":{"path":"/volume3/@db/music"}})")},
      {[] { IndexDel("s", "/v/s/b"); }, req("document_del_by_id", s + R"(,"doc_id":"/v/s/b"})")},
      {[] { IndexDelDir("s", "/v/s/a"); },
       req("document_del_by_query",
           s + R"(,"query":{"qsl":{"prefix":{"QORUMDPath":"/v/s/a/"}}}})")},
      {[] { IndexCommit("music"); }, req("commit", music + "}")},
      {[] { IndexUpsert("s", "/v/s/a.txt", true); }, req("document_upsert_by_id", doc + "true}}}")},
      {[] { IndexUpsert("s", "/v/s/a.txt", false); },
       req("document_upsert_by_id", doc + "false}}}")},
      {[] { IndexAttr("s", "/v/s/a.txt"); }, req("document_set_by_id", doc + "false}}}")},
      {[&] { UpdateTermSuggestion("db1", ids); },
       R"({"compound":[)" +
           req("update_term_suggestion", R"({"doc_id_field":"id1","db_name":"db1"})") + "," +
           req("update_term_suggestion", R"({"doc_id_field":"id2","db_name":"db1"})") + "]}"},
      {[] { UpdateTermSuggestion("db1", {}); }, R"({"compound":[]})"},
  };
  for (const auto& [call, request] : cases) {
    const size_t before = daemon_->Requests().size();
    call();
    ASSERT_EQ(daemon_->Requests().size(), before + 1) << request;
    EXPECT_EQ(daemon_->Requests().back(), ParseJson(request));
  }
}

TEST_F(ElasticControlTest, FailedCommitOnAFullVolumeFlagsTheShare) {
  for (auto [space_enough, thrown, bits] :
       {std::tuple{true, "7 Request failed, msg=disk error", 0},
        {false, "1003 Share (music) space not enough", kShareStatusNeedReindex}}) {
    platform_.SetQuota(space_enough, sdk::kPlatformErrNoSpace);
    daemon_->Push(FakeDaemon::Failure(7, "disk error"));
    EXPECT_EQ(Thrown([] { IndexCommit("music"); }), thrown);
    EXPECT_EQ(StatusMgr().GetShareStatus("music"), bits) << thrown;
  }
  platform_.ClearCalls();
  IndexCommit("music");
  const auto calls = platform_.Calls();
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "QORUQuotaIsEnough"), 0)
      << "a commit that succeeds asks nothing about space";
}

TEST_F(ElasticControlTest, ExtractionFailureIsParseFailedAndSendsNothing) {
  int failure = 0;  // a failure code, an exception of any type, a document that is no object
  platform_.SetParseFile([&](const std::string&, const Json::Value&, Json::Value* doc) -> int {
    if (failure == 1) throw 42;
    if (failure == 2) *doc = "not an object";
    return failure == 2 ? 0 : -1;
  });
  const std::string parse_failed = "914 Parse failed, path=/v/s/x.pdf";
  for (; failure < 3; ++failure) {
    EXPECT_EQ(Thrown([] { IndexUpsert("s", "/v/s/x.pdf", true); }), parse_failed) << failure;
    EXPECT_EQ(Thrown([] { IndexAttr("s", "/v/s/x.pdf"); }), parse_failed) << failure;
  }
  EXPECT_TRUE(daemon_->Requests().empty());
}

TEST_F(ElasticControlTest, RenameMovesTheDocumentAndRewritesOnlyThoseBelowIt) {
  daemon_->Push(FakeDaemon::Success());
  daemon_->Push(FakeDaemon::Success(ParseJson(
      R"([{"QORUMDPath":"/v/s/a/x.txt"},{"QORUMDPath":"/v/s/ab/x"},{"QORUMDPath":"/v/s/a/y/z"}])")));
  IndexRename("s", "/v/s/New.TXT", "/v/s/a");
  auto sent = daemon_->Requests();
  ASSERT_EQ(sent.size(), 3u) << "set, query, one compound";
  EXPECT_EQ(sent[0], ParseJson(R"({"command":"document_set_by_id","data":{"id":"fileindex_s",
      "doc_id":"/v/s/a","data":{"QORUMDPath":"/v/s/New.TXT","QORUMDParent":"/v/s",
      "QORUMDFSName":"New.TXT","QORUMDSearchFileName":"New.TXT","QORUMDDisplayName":"New.TXT",
      "QORUMDKind":"txt","QORUMDExtension":"TXT"}}})"));
  EXPECT_EQ(sent[1]["data"]["query"], ParseJson(R"({"qsl":{"prefix":{"QORUMDPath":"/v/s/a/"}}})"));
  EXPECT_EQ(sent[2], ParseJson(R"({"compound":[
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a/x.txt",
       "data":{"QORUMDPath":"/v/s/New.TXT/x.txt","QORUMDParent":"/v/s/New.TXT"}}},
      {"command":"document_set_by_id","data":{"id":"fileindex_s","doc_id":"/v/s/a/y/z",
       "data":{"QORUMDPath":"/v/s/New.TXT/y/z","QORUMDParent":"/v/s/New.TXT/y"}}}]})"));
  EXPECT_EQ(platform_.LogsContaining("Skip rename of a document not below /v/s/a: ").size(), 1u);
}

TEST_F(ElasticControlTest, PrefixListingAppendsPathsAndRefusesAnswersWithoutData) {
  daemon_->Push(FakeDaemon::Success(ParseJson(
      R"([{"QORUMDPath":"/v/s/d/1"},{"other":1},{"QORUMDPath":7},{"QORUMDPath":"/v/s/d/2"}])")));
  std::vector<std::string> paths = {"kept"};
  IndexGetByPrefixPath("s", "/v/s/d", paths);
  EXPECT_EQ(paths, (std::vector<std::string>{"kept", "/v/s/d/1", "/v/s/d/2"}));
  EXPECT_EQ(daemon_->Requests()[0], ParseJson(R"({"command":"document_get_by_query","data":{
      "id":"fileindex_s","query":{"qsl":{"prefix":{"QORUMDPath":"/v/s/d/"}}},
      "load_field":["QORUMDPath"]}})"));
  for (const char* answer : {R"({"success":true})", R"({"success":true,"data":{}})"}) {
    daemon_->Push(FakeDaemon::Raw(answer));
    EXPECT_THAT(Thrown([&] { IndexGetByPrefixPath("s", "/v/s/d", paths); }), StartsWith("916 "));
  }
  EXPECT_EQ(paths.size(), 3u);
}

// An unknown share, or a path that would match nothing: nothing is sent.
TEST_F(ElasticControlTest, BadArgumentsAreRefusedBeforeAnythingIsSent) {
  EXPECT_THAT(Thrown([] { ShareIndexCreate("nosuch"); }), StartsWith("800 "));
  for (const std::string bad : {"", "/v/s/x/"}) {
    std::vector<std::string> paths;
    EXPECT_THAT(Thrown([&] { IndexDelDir("s", bad); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexGetByPrefixPath("s", bad, paths); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexRename("s", "/v/s/y", bad); }), StartsWith("120 ")) << bad;
    EXPECT_THAT(Thrown([&] { IndexRename("s", bad, "/v/s/y"); }), StartsWith("120 ")) << bad;
  }
  EXPECT_TRUE(daemon_->Requests().empty());
}

TEST_F(SendCommandTest, DeliversCommandsAndReturnsTheAnswerText) {
  EXPECT_TRUE(old_commands_.send_ms == 1000 && old_commands_.recv_ms == 10000)
      << "a second to take the command, ten to answer";
  index_daemon_->Push(FakeDaemon::Raw(R"({"success":false} )"));
  EXPECT_EQ(SendCommandToDaemon("pause", ParseJson(R"({"resume_time":1700007200})")),
            R"({"success":false} )");
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":true})");
  SendCommandToDaemon("worker_create", Json::Value("music"));
  const Json::Value sent = ParseJson(R"([{"type":"pause","data":{"resume_time":1700007200}},
      {"type":"resume","data":null},{"type":"worker_create","data":"music"}])");
  EXPECT_EQ(index_daemon_->Commands(), std::vector<Json::Value>(sent.begin(), sent.end()));
  EXPECT_TRUE(platform_.Sleeps().empty());
}

TEST_F(SendCommandTest, ConnectIsRetriedFiveTimesOnlyWhileTheSocketIsMissing) {
  index_daemon_.reset();
  EXPECT_THAT(Command(), StartsWith("502 write failed, reason="));
  EXPECT_EQ(platform_.Sleeps(), std::vector<unsigned>(4, 1));
  // A daemon whose socket appears during the waits is reached.
  platform_.SetOnSleep([this](unsigned, size_t sleeps) {
    if (sleeps == 6) index_daemon_ = std::make_unique<FakeDaemon>(index_path_);
  });
  EXPECT_EQ(SendCommandToDaemon("resume", Json::Value()), R"({"success":true})");
  EXPECT_EQ(platform_.Sleeps().size(), 6u);
  EXPECT_EQ(index_daemon_->Commands().size(), 1u);
  // Any other connect error ends the attempts at once.
  index_daemon_.reset();
  testing::WriteFile(index_path_, "");  // not a socket
  EXPECT_THAT(Command(), StartsWith("502 write failed, reason="));
  EXPECT_EQ(platform_.Sleeps().size(), 6u);
}

TEST_F(SendCommandTest, TransferFailuresAreErrors) {
  const std::pair<FakeDaemon::Reply, const char*> cases[] = {
      {{"", false, 0, false}, "502 write failed, reason=Resource temporarily unavailable"},
      {{sdk::EncodeFrameHeader(0), true}, "502 bad answer: announced message length is 0"},
      {{sdk::EncodeFrameHeader(0xFFFFFFFFu), true},
       "502 bad answer: announced message length 4294967295"},
      {{sdk::EncodeFrameHeader(100) + "{\"succ", true}, "502 read failed, reason=end of stream"},
      {{"", true}, "502 read failed, reason=end of stream"},
      {{""}, "502 read failed, reason=Resource temporarily unavailable"},
  };
  for (const auto& [reply, thrown] : cases) {
    index_daemon_->Push(reply);
    // A command the daemon does not read fills the socket buffer.
    EXPECT_THAT(Command(reply.read ? Json::Value() : Json::Value(std::string(4 << 20, 'x'))),
                StartsWith(thrown));
  }
  EXPECT_EQ(index_daemon_->Commands().size(), std::size(cases) - 1);
}

TEST(BufferTest, WritesInPiecesOfAtMost1024Bytes) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, fds), 0);
  const std::vector<unsigned char> data(3000, 'a');
  BufferWrite(fds[0], 0, data.data());
  BufferWrite(fds[0], 3000, data.data());
  // Each packet of a SOCK_SEQPACKET socket is one write.
  std::vector<ssize_t> pieces;
  char buf[4096];
  for (ssize_t n; (n = recv(fds[1], buf, sizeof(buf), MSG_DONTWAIT)) > 0;) pieces.push_back(n);
  EXPECT_EQ(pieces, (std::vector<ssize_t>{1024, 1024, 952}));
  close(fds[0]);
  close(fds[1]);
}

// A peer that closed ends a read early and fails a write, without SIGPIPE.
TEST(BufferTest, ReadsAndWritesFailOnAClosedPeer) {
  int fds[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds), 0);
  unsigned char buf[10] = {};
  ASSERT_EQ(write(fds[1], "tail", 4), 4);
  close(fds[1]);
  EXPECT_EQ(Thrown([&] { BufferRead(fds[0], 10, buf); }), "502 read failed, reason=end of stream");
  EXPECT_EQ(Thrown([&] { BufferWrite(fds[0], 4, buf); }), "502 write failed, reason=Broken pipe");
  close(fds[0]);
}

// The JSON library hands members back sorted by key, so the order that the
// daemon sees is read off the template text, one `    "<name>": {...` a line.
TEST(SchemaTest, MappingsListFiftyThreeFieldsInTheirFixedOrder) {
  const Json::Value mappings = GetFileIndexMappings();
  const std::string text = kFileIndexMappingsText, start = "\n    \"";
  std::vector<std::string> keys;
  for (size_t at = text.find(start); at != std::string::npos; at = text.find(start, at + 1)) {
    const size_t name = at + start.size();
    keys.push_back(text.substr(name, text.find('"', name) - name));
  }
  EXPECT_EQ(mappings["property_id"], kQORUMDPath);
  EXPECT_EQ(keys.size(), static_cast<size_t>(kFileIndexMappedFields));
  std::vector<std::string> sorted = keys;
  std::sort(sorted.begin(), sorted.end());
  EXPECT_EQ(sorted, mappings["properties"].getMemberNames()) << "the same fields, none twice";
  auto at = keys.begin();  // some fields in their order: the first, the last and some between
  for (const char* field :
       {"QORUMDPath", "QORUMDFSName", "QORUMDTextContent", "QORUMDKeywords", "QORUMDFinderLabel",
        "QORUMDSearchFileName", "_QORUMDUserTags", "QORUMDSpotlightBoost"}) {
    EXPECT_NE(at = std::find(at, keys.end(), field), keys.end()) << field << ", missing or early";
  }
  EXPECT_TRUE(keys.front() == "QORUMDPath" && keys.back() == "QORUMDSpotlightBoost");
}

}  // namespace
}  // namespace vellis::fileindex::elastic
