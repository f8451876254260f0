// The indexer against the real search daemon: what each operation leaves in
// a share's index, by indexability and folder categories, and crawls that
// merge the tree with the stored documents.
#include "fileindex/indexer.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "fileindex/elastic/elastic_control.h"
#include "tests/support/folder_env.h"
#include "tests/support/searchd_process.h"

namespace vellis::fileindex {
namespace {

using testing::Strings;

class IndexerTest : public testing::FolderEnvTest {
 protected:
  void SetUp() override {
    share_ = AddShare("s", {"/docs", "/all", "/outside"});
    ASSERT_TRUE(daemon_.Start());
    elastic::ShareIndexCreate("s");
    SetFolders({{"/s/docs", true, false, false, false}, {"/s/all", true, true, true, true}});
  }
  void TearDown() override { EXPECT_EQ(daemon_.Stop(SIGTERM), 0); }

  struct FolderSpec {
    std::string path;
    bool document, audio, video, photo;
  };
  // Replaces the folder list that the next indexer judges by.
  void SetFolders(const std::vector<FolderSpec>& specs) {
    folders_ = std::make_unique<FolderMgr>();
    for (const FolderSpec& f : specs) {
      std::shared_ptr<Folder> changed;
      folders_->Upsert(changed, std::make_shared<Folder>(testing::IndexMgrTest::FolderJson(
                                    f.path, f.document, f.audio, f.video, f.photo)));
    }
    IndexerOptions options;
    options.batch_size = 3;  // small, so batches and pages turn over often
    options.page_size = 2;
    indexer_ = std::make_unique<Indexer>("s", *folders_, options);
  }

  void Write(const std::string& rel, const std::string& text = "words") {
    testing::WriteFile(share_ + rel, text);
  }
  // An operation on `rel` (and `old_rel` for a rename), as a round hands it.
  void Run(FileIndexOP kind, const std::string& rel, const std::string& old_rel = "") {
    std::shared_ptr<OPNode> node = std::make_shared<OPNode>(nullptr, "");
    const std::string path = share_ + rel;
    for (size_t at = 1; at < path.size();) {
      size_t end = std::min(path.find('/', at), path.size());
      node = std::make_shared<OPNode>(node, path.substr(at, end - at));
      at = end + 1;
    }
    indexer_->Execute(OP(node, kind, old_rel.empty() ? "" : share_ + old_rel, Json::Value()));
  }
  // The documents of the share, below its folder, relative to it.
  Strings Stored() {
    indexer_->Finish();
    std::vector<std::string> paths;
    elastic::IndexGetByPrefixPath("s", share_, paths);
    for (std::string& p : paths) p = p.substr(share_.size());
    return paths;
  }

  std::string share_;
  testing::SearchdProcess daemon_;
  std::unique_ptr<FolderMgr> folders_;
  std::unique_ptr<Indexer> indexer_;
};

// Upsert by indexability and category: docs/ indexes documents only, all/
// everything; nothing outside a folder, behind a link or in a hidden
// folder is indexed.
TEST_F(IndexerTest, UpsertKeepsWhatQualifiesAndRemovesWhatDoesNot) {
  for (const char* rel : {"/docs/a.txt", "/docs/b.mp3", "/all/c.mp3", "/all/d.jpg",
                          "/outside/e.txt", "/docs/@eaDir/x.txt", "/docs/sub/f.txt"}) {
    Write(rel);
  }
  ASSERT_EQ(symlink("/etc", (share_ + "/docs/link").c_str()), 0);
  ASSERT_EQ(mkfifo((share_ + "/docs/fifo").c_str(), 0644), 0);
  for (const char* rel :
       {"/docs/a.txt", "/docs/b.mp3", "/all/c.mp3", "/all/d.jpg", "/outside/e.txt",
        "/docs/@eaDir/x.txt", "/docs/link", "/docs/fifo", "/docs/sub", "/docs/gone.txt"}) {
    Run(FILE_INDEX_OP_UPSERT, rel);
  }
  EXPECT_EQ(Stored(), (Strings{"/all/c.mp3", "/all/d.jpg", "/docs/a.txt", "/docs/sub"}));
  EXPECT_EQ(indexer_->stats().operations, 10u);

  // A file that stops qualifying leaves the index on its next upsert.
  SetFolders({{"/s/all", true, false, true, true}});
  Run(FILE_INDEX_OP_UPSERT, "/all/c.mp3");
  Run(FILE_INDEX_OP_ATTR, "/all/d.jpg");
  EXPECT_EQ(Stored(), (Strings{"/all/d.jpg", "/docs/a.txt", "/docs/sub"}));
}

TEST_F(IndexerTest, DeleteRenameAndAttributeFollowTheFiles) {
  for (const char* rel : {"/docs/a.txt", "/docs/n.txt", "/docs/sub/s.txt", "/docs/sub/s.mp3"}) {
    Write(rel);
  }
  Run(FILE_INDEX_OP_REINDEX, "/docs");
  EXPECT_EQ(Stored(),
            (Strings{"/docs", "/docs/a.txt", "/docs/n.txt", "/docs/sub", "/docs/sub/s.txt"}));

  const struct {
    const char* from;
    const char* to;
  } moves[] = {
      {"/docs/a.txt", "/docs/a2.txt"},  // within the folder: the document moves
      {"/docs/n.txt", "/docs/n.mp3"},   // into a category that is not indexed
      {"/docs/sub", "/all/sub"},        // to a folder that indexes more
  };
  for (const auto& m : moves) {
    ASSERT_EQ(rename((share_ + m.from).c_str(), (share_ + m.to).c_str()), 0) << m.from;
    Run(FILE_INDEX_OP_RENAME, m.to, m.from);
  }
  EXPECT_EQ(Stored(),
            (Strings{"/all/sub", "/all/sub/s.mp3", "/all/sub/s.txt", "/docs", "/docs/a2.txt"}));
  EXPECT_EQ(indexer_->stats().renamed, 1u);
  // The same rename again (a round repeated after a crash, or reported
  // twice): nothing at the old place, and the index stays right.
  Run(FILE_INDEX_OP_RENAME, "/docs/a2.txt", "/docs/a.txt");
  EXPECT_EQ(Stored(),
            (Strings{"/all/sub", "/all/sub/s.mp3", "/all/sub/s.txt", "/docs", "/docs/a2.txt"}));
  EXPECT_EQ(indexer_->stats().renamed, 1u);

  Run(FILE_INDEX_OP_ATTR, "/docs/a2.txt");
  ASSERT_EQ(unlink((share_ + "/all/sub/s.mp3").c_str()), 0);
  Run(FILE_INDEX_OP_DELETE, "/all/sub/s.mp3");
  EXPECT_EQ(Stored(), (Strings{"/all/sub", "/all/sub/s.txt", "/docs", "/docs/a2.txt"}));
  Run(FILE_INDEX_OP_DELETE, "/all/sub");  // a folder takes what is below it
  EXPECT_EQ(Stored(), (Strings{"/docs", "/docs/a2.txt"}));
}

// Byte order is not walk order ("b.txt" sorts between "b" and "b/x"); pages
// of two documents make the merge turn over at every step.
TEST_F(IndexerTest, CrawlMergesTheTreeWithTheIndexAndSkipsWhatIsUnchanged) {
  const Strings files = {"/all/b",         "/all/b.txt", "/all/b/x.txt",
                         "/all/b-c/y.txt", "/all/a.jpg", "/all/b/z/deep.txt"};
  for (const std::string& rel : files) {
    if (rel != "/all/b") Write(rel);
  }
  Run(FILE_INDEX_OP_UPDATE_CFG, "/all");
  const Strings all = {"/all",         "/all/a.jpg",     "/all/b",
                       "/all/b-c",     "/all/b-c/y.txt", "/all/b.txt",
                       "/all/b/x.txt", "/all/b/z",       "/all/b/z/deep.txt"};
  EXPECT_EQ(Stored(), all);

  Run(FILE_INDEX_OP_REINDEX, "/all");
  EXPECT_EQ(indexer_->stats().unchanged, all.size() - 1) << "all but the crawl's root";
  const uint64_t upserted = indexer_->stats().upserted;
  Run(FILE_INDEX_OP_REINDEX, "/all");
  EXPECT_EQ(indexer_->stats().upserted, upserted + 1) << "only the root";

  Write("/all/b.txt", "longer words now");
  ASSERT_EQ(unlink((share_ + "/all/b/x.txt").c_str()), 0);
  Write("/all/b/new.txt");
  SetFolders({{"/s/all", true, true, true, false}});  // photos off
  Run(FILE_INDEX_OP_REINDEX, "/all");
  EXPECT_EQ(Stored(), (Strings{"/all", "/all/b", "/all/b-c", "/all/b-c/y.txt", "/all/b.txt",
                               "/all/b/new.txt", "/all/b/z", "/all/b/z/deep.txt"}));
  EXPECT_EQ(indexer_->stats().upserted, 3u) << "the root, the changed file, the new one";
}

// A crash marker crawls the whole share: what lies outside every folder
// leaves the index, what is inside is made whole.
TEST_F(IndexerTest, CrashMarkerCrawlsTheWholeShare) {
  Write("/outside/stray.txt");
  Write("/docs/a.txt");
  Write("/all/deep/er/b.txt");
  elastic::IndexUpsert("s", share_ + "/outside/stray.txt", false);
  Run(FILE_INDEX_OP_CRASH, "");
  EXPECT_EQ(Stored(), (Strings{"/all", "/all/deep", "/all/deep/er", "/all/deep/er/b.txt", "/docs",
                               "/docs/a.txt"}));
}

// A file whose content cannot be read is still found by its name; an
// unreachable search daemon stops the round with the transport's error.
TEST_F(IndexerTest, FailuresAreCountedOrStopTheRound) {
  struct UnreadableContent : sdk::PlatformWrapper {
    using PlatformWrapper::PlatformWrapper;
    int ParseFile(const std::string& path, const Json::Value& options, Json::Value* doc) override {
      if (options["need_meta"].asBool()) return -1;
      return target()->ParseFile(path, options, doc);
    }
  } unreadable(&platform_);
  testing::ScopedPlatform scoped(&unreadable);
  Write("/docs/locked.txt");
  Run(FILE_INDEX_OP_UPSERT, "/docs/locked.txt");
  EXPECT_EQ(Stored(), (Strings{"/docs/locked.txt"}));
  EXPECT_EQ(indexer_->stats().failed, 1u);
  ASSERT_EQ(indexer_->stats().errors.size(), 1u);
  EXPECT_NE(indexer_->stats().errors[0].find("/docs/locked.txt: content could not be read"),
            std::string::npos);

  EXPECT_EQ(daemon_.Stop(SIGKILL), -SIGKILL);
  EXPECT_EQ(testing::Thrown([&] {
              Run(FILE_INDEX_OP_DELETE, "/docs/locked.txt");
              indexer_->Finish();
            }),
            "913 Connect failed");
  ASSERT_TRUE(daemon_.Start());
}

}  // namespace
}  // namespace vellis::fileindex
