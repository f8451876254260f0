// The `vellis` command line, run as a user runs it, against fake daemons on
// the test root's sockets and with services off.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>

#include "common/root_path.h"
#include "fileindex/elastic/comm.h"
#include "fileindex/elastic/communication.h"
#include "tests/support/cli_runner.h"
#include "tests/support/fake_index_daemon.h"
#include "tests/support/fake_search_daemon.h"
#include "tests/support/temp_root.h"

namespace vellis::testing {
namespace {

// The share photo (with its recycle bin, and a link to /etc in it) and the
// folder music, not yet shared.
class CliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setenv("VELLIS_SERVICES", "none", 1);
    for (const char* dir : {"/photo/a", "/photo/b", "/music/x"}) MakeDirs(v_ + dir);
    ASSERT_EQ(0, symlink("/etc", (v_ + "/photo/etc").c_str()));
    ExpectRuns({{"share add photo " + v_ + "/photo --recycle-bin", 0, "added photo ..."}});
  }
  void TearDown() override { unsetenv("VELLIS_SERVICES"); }

  TempRoot root_;
  std::string v_ = root_.Path("/volume1");
  std::string photo_line_ =  // of "share list"
      "photo\t" + v_ + "/photo\tindexable=yes encryption=no recycle-bin=yes hide-unreadable=no\n";
  std::string queue_ = root_.Path("/volume1/@fileindex/s.queue");
  FakeSearchDaemon search_{RootPath(kElasticSocketPath)};
  FakeIndexDaemon daemon_{RootPath(fileindex::kFileIndexDaemonSocketPath)};
};

// Folders are added, listed, read, paused and resumed with their share and
// volume, deleted; the indexing daemon hears of each change.
TEST_F(CliTest, FolderShareAndVolumeCommands) {
  const std::string head = "PATH      NAME   DOCUMENT  AUDIO  VIDEO  PHOTO  PAUSED\n";
  ExpectRuns(
      {{"share add music " + v_ + "/music", 0, "..."},
       {"folder add /photo/a /photo/b --categories document,photo", 0, "added 2 folders\n"},
       {R"(folder add --from-json '[{"path": "/music/x", "name": "Tunes", "document": false,
          "audio": true, "video": false, "photo": false}]')",
        0, "added 1 folder\n"},
       {"folder list", 0,
        head + "/music/x  Tunes  no        yes    no     no     no\n" +
            "/photo/a  a      yes       no     no     yes    no\n" +
            "/photo/b  b      yes       no     no     yes    no\ntotal 3\n"},
       {"folder list --offset 1 --limit 1 --desc", 0,
        "PATH      NAME  DOCUMENT  AUDIO  VIDEO  PHOTO  PAUSED\n"  // widths of the rows shown
        "/photo/a  a     yes       no     no     yes    no\ntotal 3\n"},
       {"share pause photo", 0, "paused photo\n"},
       {"folder get /photo/a --json", 0, "...\"paused\" : true,..."},
       {"share resume photo", 0, "resumed photo\n"},
       {"volume pause " + v_, 0, "paused " + v_ + "\n"},
       {"volume resume " + v_, 0, "resumed " + v_ + "\n"},
       {"folder delete /photo/b", 0, "deleted /photo/b\n"},
       {"folder reindex /photo/a", 0, "queued reindex of 1 folder\n"},
       {"volume clear " + v_, 0, "cleared " + v_ + "\n"},  // nothing paused: both stay
       {"folder list --json --status", 0,
        "...\"additional\" : ...\"text\" : ...\"total\" : 2\n}\n"},
       {"folder get /music/x --json", 0,
        "{...\n  \"name\" : \"Tunes\",\n  \"path\" : \"/music/x\",..."}});
  std::string sent;  // what reached the indexing daemon
  for (const Json::Value& c : daemon_.Commands())
    sent += c["type"].asString() + " " + c["data"]["share_name"].asString() + "; ";
  EXPECT_EQ(sent,
            "notify_setting_changed photo; notify_setting_changed music; worker_delete photo; "
            "worker_create photo; worker_delete music; worker_delete photo; worker_create music; "
            "worker_create photo; notify_setting_changed photo; ");
}

TEST_F(CliTest, BadRequestsFailWithTheirCodeAndReason) {
  ExpectRuns({
      {"folder add /photo/a", 0, "added 1 folder\n"},
      {"folder add /photo/a", 1, "error 901: Duplicated ID: /photo/a\n"},
      {"folder add", 1, "error 120: Missing path\n"},
      {"folder add /photo/b --categories docs", 1, "error 120: Unknown category: docs\n"},
      {R"(folder add --from-json '{"path":"/photo/b"}')", 1,
       "error 120: {\"path\":\"/photo/b\"}\n"},
      {"folder add --from-json '[{'", 1, "error 120: Not JSON: [{\n"},
      {"folder get /photo/zz", 1, "error 902: /photo/zz\n"},
      {"folder frobnicate", 106, "A subcommand is required\n..."},
      {"share clear photo ''", 1, "error 120: Missing share path\n"},
      {"share rename photo ''", 1, "error 120: Missing share_to\n"},
      {"share check-recycle nosuch", 1, "error 800: QORUShareGet failed, share=nosuch\n"},
      {"share add 'a/b' " + v_ + "/a/b", 1, "error 120: share name contains \"/\"\n"},
      {"user rename '' bob", 1, "error 120: Missing user_from\n"},
      {"home enable --auth nis", 105, "--auth: nis not in {local,domain,ldap}\n..."},
      {"queue fold", 106, "FILE is required\n..."},
      {"share list", 0, photo_line_},                      // no share added
      {"folder list --json", 0, "...\"total\" : 1\n}\n"},  // and one folder
  });
}

// The path commands, music shared read-only, listed and removed, and the
// services, off, reported and not run.
TEST_F(CliTest, PathShareAndServicesCommands) {
  ExpectRuns({
      {"path check " + v_ + "/photo/a", 0, "indexable\n"},
      {"path check " + v_ + "/photo/etc", 1, "not indexable: not-canonical\n"},
      {"path check --json " + v_ + "/photo/a", 0,
       "{\"indexable\":true,\"path\":\"" + v_ + "/photo/a\",\"rule\":\"indexable\"}\n"},
      {"path check --json /proc", 1,
       "{\"indexable\":false,\"path\":\"/proc\",\"rule\":\"system-fs\"}\n"},
      {"path check " + v_ + "/music", 1,
       "error 502: QORUShareNamePathGet failed, full_path=" + v_ + "/music\n"},
      {"path type /x/IMG.JPG", 0, "3 image\n"},
      {"path type /x/a.exe", 0, "4 unknown\n"},
      {"path share " + v_ + "/photo/a/b", 0, "photo\t" + v_ + "/photo\n"},
      {"share add music " + v_ + "/music --read-only", 0, "added music " + v_ + "/music\n"},
      {"share list", 0,
       photo_line_ + "music\t" + v_ +
           "/music\tindexable=no encryption=no recycle-bin=no hide-unreadable=no\n"},
      {"share remove music", 0, "..."},
      {"share remove music", 1, "error 800: no such share: \"music\"\n"},
      {"-v services prepare", 0,
       "...Service stop pkg-Vellis-fileindexd skipped: VELLIS_SERVICES=none\n"
       "...services prepared\n"},
  });
}

// Fold prints the operations that survive, then their count; rotate moves
// the queue to its side file, which pending then reads.
TEST_F(CliTest, QueueFoldRotateAndPending) {
  WriteFile(queue_, R"({"event":64,"path":"/volume1/s/a"}
{"event":128,"path":"/volume1/s/a"}
not json
{"event":256,"path":"/volume1/s/new","path_old":"/volume1/s/old"}
{"event":131072,"path":"/volume1/s","data":{"photo":true}})");
  ExpectRuns({{"queue fold " + queue_, 0,
               "[01] /volume1/s/a\n[05] /volume1/s/old -> /volume1/s/new\n"
               "[04] /volume1/s, data={\"photo\":true}\n3\n"}});
  const std::string line = "{\"event\":65536,\"path\":\"/volume1/s/dir\"}\n";
  WriteFile(queue_, line);
  ExpectRuns({
      {"queue rotate " + queue_, 0, "..."},
      {"queue pending " + queue_ + " /volume1/s/dir/x", 0, "processing: no\nreindex: yes\n"},
      {"queue pending " + queue_ + " /volume1/s/di", 0, "processing: no\nreindex: no\n"},
      {"queue pending " + queue_ + " /volume1/s", 0, "processing: yes\nreindex: no\n"},
  });
  EXPECT_EQ(ReadFile(queue_ + ".tmp"), line);
}

}  // namespace
}  // namespace vellis::testing
