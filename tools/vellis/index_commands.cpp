// vellis index load: fills a share's index in the search daemon from the
// files of the share, through the library's own requests. A stand-in for
// the indexing daemon's first full pass.
#include <filesystem>
#include <iostream>
#include <memory>
#include <string>
#include <system_error>

#include "common/error.h"
#include "common/log.h"
#include "fileindex/elastic/elastic_control.h"
#include "fileindex/util.h"
#include "sdk/share.h"
#include "tools/vellis/commands.h"

namespace vellis::cli {
namespace {

struct LoadArgs {
  std::string share;
  size_t limit = 0;
};

struct LoadCounts {
  size_t loaded = 0;
  size_t skipped = 0;  // refused by the indexability rules
  size_t failed = 0;   // extraction or request failed (logged)
};

// Upserts `path` when it may be indexed; one failure does not stop the load.
void LoadOne(const std::string& share, const std::string& path, LoadCounts* counts) {
  if (!fileindex::CanFullPathBeIndexed(path)) {
    ++counts->skipped;
    return;
  }
  try {
    fileindex::elastic::IndexUpsert(share, path, true);
    ++counts->loaded;
  } catch (const Error& e) {
    ++counts->failed;
    VELLIS_LOG_ERRNO("IndexUpsert failed, path=%s, code=%d, reason=%s", path.c_str(),
                     static_cast<int>(e.GetCode()), e.what());
  }
}

void Load(const LoadArgs& args) {
  sdk::SDKShare share(args.share);
  const std::string root = share.GetPath();
  fileindex::elastic::ShareIndexCreate(args.share);
  LoadCounts counts;
  LoadOne(args.share, root, &counts);  // the share's own folder is a document too
  namespace fs = std::filesystem;
  std::error_code ec;
  // Symbolic links are not followed: what they point at is outside the
  // share as often as not, and the rules refuse them anyway.
  fs::recursive_directory_iterator it(root, fs::directory_options::skip_permission_denied, ec);
  if (ec) throw Error(kErrInternal, "Cannot read share folder " + root + ": " + ec.message());
  for (; it != fs::recursive_directory_iterator(); it.increment(ec)) {
    if (ec) break;
    if (args.limit > 0 && counts.loaded >= args.limit) break;
    if (fileindex::IsSystemPreservedFileName(it->path().filename().string())) {
      it.disable_recursion_pending();
      continue;
    }
    LoadOne(args.share, it->path().string(), &counts);
  }
  fileindex::elastic::IndexCommit(args.share);
  std::cout << "loaded " << counts.loaded << " documents into "
            << fileindex::elastic::GetFileIndexID(args.share) << " (" << counts.skipped
            << " paths refused by the indexing rules, " << counts.failed << " failed)\n";
}

}  // namespace

void AddIndexCommands(CLI::App& app, Context& ctx) {
  auto args = std::make_shared<LoadArgs>();
  CLI::App* index = app.add_subcommand("index", "Fill the search daemon's index of a share");
  index->require_subcommand(1);
  CLI::App* load = index->add_subcommand(
      "load",
      "Create the share's index if needed and upsert every indexable file and folder "
      "of the share (content included), then commit");
  load->add_option("SHARE", args->share, "Share name")->required();
  load->add_option("--limit", args->limit, "Stop after this many documents (0: no limit)");
  load->callback([&ctx, args] { ctx.action = [args] { Load(*args); }; });
}

}  // namespace vellis::cli
