// The full-path index against the plain rule: a folder F covers P when
// P + "/" begins with F + "/", and the longest covering F governs.
#include "fileindex/full_path_index.h"

#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

namespace vellis::fileindex {
namespace {

// As unclever as possible: compare with every entry.
size_t NaiveCovering(const std::vector<std::string>& entries, const std::string& path) {
  size_t best = FullPathIndex::kNone;
  size_t best_length = 0;
  for (size_t i = 0; i < entries.size(); ++i) {
    const std::string& f = entries[i];
    if ((path + "/").rfind(f + "/", 0) == 0 && f.size() > best_length) {
      best = i;
      best_length = f.size();
    }
  }
  return best;
}

TEST(FullPathIndexTest, AgreesWithThePlainRuleOnAwkwardPaths) {
  const std::vector<std::string> entries = {"/v/music", "/v/music/live", "/v/music", "/v/a/",
                                            "/v/a",     "/v/b//c",       "/v/x.y",   "/"};
  FullPathIndex index(entries);
  const char* paths[] = {"/v/music",
                         "/v/music/",
                         "/v/music/live/a",
                         "/v/musicbox/c",
                         "/v/music/liveX",
                         "/v/a/",
                         "/v/a//x",
                         "/v/a/x",
                         "/v/b//c/d",
                         "/v/b/c",
                         "/v/x.y",
                         "/v/x",
                         "",
                         "/",
                         "//",
                         "v/music",
                         "/V/music",
                         "/v/music//"};
  for (const char* p : paths) {
    EXPECT_EQ(index.FindCovering(p), NaiveCovering(entries, p)) << "[" << p << "]";
  }
  EXPECT_EQ(index.Find("/v/music"), 0u) << "the first of two equal entries";
  EXPECT_EQ(index.Find("/v/music/"), FullPathIndex::kNone);
}

TEST(FullPathIndexTest, AgreesWithThePlainRuleOnRandomTrees) {
  std::mt19937 rng(1);
  std::uniform_int_distribution<int> part(0, 3), depth(1, 5);
  auto random_path = [&] {
    std::string p;
    for (int d = depth(rng); d > 0; --d)
      p += "/" + std::string(1, "abAb"[part(rng)]) + (part(rng) == 0 ? "b" : "");
    return p;
  };
  for (int round = 0; round < 20; ++round) {
    std::vector<std::string> entries;
    for (int i = 0; i < 30; ++i) entries.push_back(random_path());
    FullPathIndex index(entries);
    for (int i = 0; i < 200; ++i) {
      std::string p = random_path();
      ASSERT_EQ(index.FindCovering(p), NaiveCovering(entries, p)) << "round " << round << " " << p;
    }
  }
}

}  // namespace
}  // namespace vellis::fileindex
