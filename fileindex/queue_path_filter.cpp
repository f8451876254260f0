#include "fileindex/queue_path_filter.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <string_view>
#include <utility>
#include <vector>

#include "common/json_util.h"
#include "common/line_reader.h"

namespace vellis::fileindex {
namespace {

// Files remembered at once, and the most hashes one file may hold before it
// is not filtered at all (8 bytes each).
constexpr size_t kMaxFiles = 4;
constexpr size_t kMaxHashes = size_t{2} << 20;

constexpr uint64_t kFnvOffset = 14695981039346656037ull;
constexpr uint64_t kFnvPrime = 1099511628211ull;

// Collects the hashes of a file's paths.
class HashCollector {
 public:
  explicit HashCollector(std::vector<uint64_t>* hashes) : hashes_(hashes) {}

  // Adds the FNV-1a hash of `path` and of each prefix of it that ends just
  // before a "/": exactly the full paths that `path` lies at or below.
  void AddPath(std::string_view path) {
    uint64_t h = kFnvOffset;
    size_t depth = 0;
    for (char c : path) {
      if (c == '/') Add(h, depth++);
      h = (h ^ static_cast<unsigned char>(c)) * kFnvPrime;
    }
    Add(h, depth);
  }

 private:
  static constexpr size_t kMaxDepth = 64;

  // Queued paths come in runs below the same folders: a hash equal to the
  // last one added at its depth is already collected, and skipping it
  // spares most of the sorting.
  void Add(uint64_t h, size_t depth) {
    if (depth < kMaxDepth) {
      if (last_[depth].first && last_[depth].second == h) return;
      last_[depth] = {true, h};
    }
    hashes_->push_back(h);
  }

  std::vector<uint64_t>* hashes_;
  std::pair<bool, uint64_t> last_[kMaxDepth] = {};
};

uint64_t PathHash(std::string_view path) {
  uint64_t h = kFnvOffset;
  for (char c : path) h = (h ^ static_cast<unsigned char>(c)) * kFnvPrime;
  return h;
}

void Compact(std::vector<uint64_t>* hashes) {
  std::sort(hashes->begin(), hashes->end());
  hashes->erase(std::unique(hashes->begin(), hashes->end()), hashes->end());
}

// Without a backslash a JSON string is its bytes as they stand, so the
// event's paths are among the line's quoted texts; taking every quoted text
// that begins with "/" may record too much, never too little. A line with
// an escape is parsed.
void AddLineHashes(std::string_view line, HashCollector* hashes) {
  if (line.find('\\') != std::string_view::npos) {
    Json::Value event;
    // A line that is no JSON object is skipped by the search too.
    if (!JsonFromString(event, std::string(line)) || !event.isObject()) return;
    for (const char* key : {"path", "path_old"}) {
      const Json::Value path = event.get(key, Json::Value());
      if (path.isConvertibleTo(Json::stringValue)) hashes->AddPath(path.asString());
    }
    return;
  }
  size_t open = line.find('"');
  while (open != std::string_view::npos) {
    size_t close = line.find('"', open + 1);
    if (close == std::string_view::npos) return;
    if (close > open + 1 && line[open + 1] == '/') {
      hashes->AddPath(line.substr(open + 1, close - open - 1));
    }
    open = line.find('"', close + 1);
  }
}

struct FileKey {
  std::string path;
  dev_t dev;
  ino_t ino;
  off_t size;
  timespec mtime;
  timespec ctime;

  bool operator==(const FileKey& o) const {
    return path == o.path && dev == o.dev && ino == o.ino && size == o.size &&
           mtime.tv_sec == o.mtime.tv_sec && mtime.tv_nsec == o.mtime.tv_nsec &&
           ctime.tv_sec == o.ctime.tv_sec && ctime.tv_nsec == o.ctime.tv_nsec;
  }
};

struct FileHashes {
  FileKey key;
  bool filtered = false;         // false: the file could not be read or is too varied
  std::vector<uint64_t> hashes;  // sorted, distinct
};

// Reads the whole file; it holds at least what it held when `key` was
// taken, since queues only grow.
std::shared_ptr<const FileHashes> Build(const FileKey& key) {
  auto file = std::make_shared<FileHashes>();
  file->key = key;
  LineReader reader;
  if (!reader.Open(key.path)) return file;
  HashCollector collector(&file->hashes);
  std::string_view line;
  for (;;) {
    LineReader::Status status = reader.Next(&line);
    if (status == LineReader::Status::kEnd) break;
    if (status == LineReader::Status::kError) return file;
    if (status == LineReader::Status::kTooLong) continue;  // skipped by the search too
    AddLineHashes(line, &collector);
    if (file->hashes.size() > 2 * kMaxHashes) {
      Compact(&file->hashes);
      if (file->hashes.size() > kMaxHashes) {
        file->hashes.clear();
        return file;
      }
    }
  }
  Compact(&file->hashes);
  file->filtered = file->hashes.size() <= kMaxHashes;
  return file;
}

// The recently used files, most recent first.
struct Cache {
  std::mutex mutex;
  std::list<std::shared_ptr<const FileHashes>> files;
};

Cache& GetCache() {
  static Cache* cache = new Cache();  // never destroyed: may be used until exit
  return *cache;
}

std::shared_ptr<const FileHashes> Lookup(const FileKey& key) {
  Cache& c = GetCache();
  std::list<std::shared_ptr<const FileHashes>>* cache = &c.files;
  {
    std::lock_guard<std::mutex> lock(c.mutex);
    for (auto it = cache->begin(); it != cache->end(); ++it) {
      if ((*it)->key == key) {
        cache->splice(cache->begin(), *cache, it);
        return cache->front();
      }
    }
  }
  // Built outside the lock: other files stay answerable meanwhile.
  std::shared_ptr<const FileHashes> built = Build(key);
  std::lock_guard<std::mutex> lock(c.mutex);
  cache->remove_if(
      [&key](const std::shared_ptr<const FileHashes>& f) { return f->key.path == key.path; });
  cache->push_front(built);
  if (cache->size() > kMaxFiles) cache->pop_back();
  return built;
}

}  // namespace

bool QueueMayHoldPath(const std::string& queue_path, const std::string& full_path) {
  struct stat st;
  if (lstat(queue_path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) return false;
  FileKey key{queue_path, st.st_dev, st.st_ino, st.st_size, st.st_mtim, st.st_ctim};
  std::shared_ptr<const FileHashes> file = Lookup(key);
  if (!file->filtered) return true;
  return std::binary_search(file->hashes.begin(), file->hashes.end(), PathHash(full_path));
}

}  // namespace vellis::fileindex
