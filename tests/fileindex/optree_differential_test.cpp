// The real tree against the naive model, on random queue files.
//
// Each stream is a few dozen lines over a small set of nested paths (so that
// lines meet each other's pending work): every event bit alone and in
// combination, files and directories, renames back and forth and into a
// folder's own child, configuration data with junk values, bad lines, and
// now and then a crash marker. The base seed is fixed; set
// VELLIS_FUZZ_ITERATIONS to run more streams.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "common/json_util.h"
#include "fileindex/optree.h"
#include "tests/support/fake_platform.h"
#include "tests/support/naive_fold.h"
#include "tests/support/temp_root.h"

namespace vellis::fileindex {
namespace {

using testing::NaiveFold;
using testing::NaiveOp;

constexpr uint32_t kBaseSeed = 20261122;
constexpr int kDefaultIterations = 2000;

const char* const kPaths[] = {"/v/s",     "/v/s/a",   "/v/s/a/x", "/v/s/a/x/y", "/v/s/a/x/y/z",
                              "/v/s/b",   "/v/s/b/x", "/v/s/ab",  "/v/s/ab/x",  "/v/t"};
const char* const kBadPaths[] = {"", "/", "v/s/a", "/v//s/a", "/v/s/a/", "/v/./s", "/v/s/../a"};
const char* const kBadLines[] = {
    "not json",
    "",
    R"({"event":"x","path":"/v/s/a"})",
    R"({"event":2})",
    R"({"event":2,"path":"/v/s/a")",
    R"({"event":2,"path":7})",
    "[]",
};
const uint32_t kBits[] = {0x2, 0x4, 0x40, 0x80, 0x100, 0x10000, 0x20000};

class StreamMaker {
 public:
  explicit StreamMaker(uint32_t seed) : rng_(seed) {}

  std::vector<std::string> Make() {
    std::vector<std::string> lines;
    int n = Uniform(20, 60);
    for (int i = 0; i < n; ++i) lines.push_back(Line());
    return lines;
  }

 private:
  int Uniform(int lo, int hi) { return std::uniform_int_distribution<int>(lo, hi)(rng_); }
  bool Chance(int percent) { return Uniform(1, 100) <= percent; }
  template <typename T, size_t N>
  const T& Pick(const T (&arr)[N]) {
    return arr[Uniform(0, N - 1)];
  }

  std::string Path() { return Chance(4) ? Pick(kBadPaths) : Pick(kPaths); }

  Json::Value Data() {
    if (Chance(15)) {
      const Json::Value junk[] = {Json::Value(5), Json::Value("s"), Json::Value(Json::arrayValue),
                                  Json::Value()};
      return Pick(junk);
    }
    Json::Value data(Json::objectValue);
    for (const char* key : {"document", "audio", "video", "photo", "other"}) {
      if (!Chance(40)) continue;
      const Json::Value values[] = {Json::Value(true), Json::Value(false), Json::Value(1),
                                    Json::Value("x"), Json::Value()};
      data[key] = Pick(values);
    }
    return data;
  }

  uint32_t Bits() {
    if (Chance(1)) return 0x200 | (Chance(50) ? Pick(kBits) : 0);
    if (Chance(2)) return Chance(50) ? 0 : 0x8;  // no bit, or only an unknown one
    uint32_t bits = Pick(kBits);
    if (Chance(25)) {
      int extra = Uniform(1, 2);
      for (int i = 0; i < extra; ++i) bits |= Pick(kBits);
    }
    return bits;
  }

  std::string Line() {
    if (Chance(3)) return Pick(kBadLines);
    Json::Value ev(Json::objectValue);
    ev["event"] = Bits();
    ev["path"] = Path();
    if (!Chance(10)) ev["is_dir"] = Chance(35);
    uint32_t bits = ev["event"].asUInt();
    if ((bits & 0x100) || Chance(5)) {
      if (Chance(70)) {
        ev["path_old"] = Path();
      } else if (Chance(50)) {
        ev["path_old"] = ev["path"];  // renamed onto itself
      } else if (Chance(90)) {
        // a folder into its own child, or the reverse
        std::string p = ev["path"].asString();
        size_t slash = p.rfind('/');
        ev["path_old"] = slash == std::string::npos ? p : p.substr(0, slash);
      }  // else: no path_old at all
    }
    if ((bits & 0x20000) || Chance(5)) {
      if (!Chance(5)) ev["data"] = Data();
    }
    return JsonToString(ev);
  }

  std::mt19937 rng_;
};

int Iterations() {
  const char* env = getenv("VELLIS_FUZZ_ITERATIONS");
  if (env != nullptr && atoi(env) > 0) return atoi(env);
  return kDefaultIterations;
}

std::string Describe(const std::vector<NaiveOp>& ops, unsigned count) {
  std::ostringstream os;
  for (const auto& op : ops) os << "    " << testing::ToString(op) << "\n";
  os << "    count=" << count << "\n";
  return os.str();
}

TEST(OPTreeDifferentialTest, RealTreeDeliversWhatTheNaiveModelDelivers) {
  testing::TempRoot root;
  testing::FakePlatform platform;
  testing::ScopedPlatform scoped(&platform);
  const std::string queue = root.Path("/queue");
  const int iterations = Iterations();
  std::set<int> kinds_seen;
  int failures = 0;

  for (int i = 0; i < iterations && failures < 3; ++i) {
    const uint32_t seed = kBaseSeed + static_cast<uint32_t>(i);
    StreamMaker maker(seed);
    std::vector<std::string> lines = maker.Make();
    std::string text;
    for (size_t k = 0; k < lines.size(); ++k) {
      text += lines[k];
      if (k + 1 < lines.size() || seed % 2 == 0) text += "\n";  // last newline optional
    }
    unlink(queue.c_str());  // a fresh file: rewriting in place makes ext4 flush on close
    testing::WriteFile(queue, text);
    platform.ClearLogs();

    std::vector<NaiveOp> got;
    OPTree tree(queue);
    unsigned got_count = tree.ProcessOP([&](std::shared_ptr<OP> op) {
      got.push_back(NaiveOp{op->node->GetPath(), op->op, op->path_old, op->data});
    });
    auto [want, want_count] = NaiveFold(lines);
    for (const auto& op : want) kinds_seen.insert(op.kind);

    if (got != want || got_count != want_count) {
      ++failures;
      ADD_FAILURE() << "seed " << seed << " (iteration " << i << "), lines:\n"
                    << text << "\n  real tree:\n"
                    << Describe(got, got_count) << "  naive model:\n"
                    << Describe(want, want_count);
    }
  }
  // The streams must reach every kind, or the comparison proves little.
  EXPECT_EQ(kinds_seen, (std::set<int>{1, 2, 3, 4, 5, 6, 7})) << "over " << iterations
                                                              << " streams";
}

}  // namespace
}  // namespace vellis::fileindex
