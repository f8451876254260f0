// Paths and classification: share paths and full paths, which paths may be
// indexed, file types by extension, notifications to administrators, and
// the custom events that the library queues itself.
//
// A share path begins with "/" and the share's name ("/photo/2019/a.jpg");
// a full path begins with the share's volume ("/volume1/photo/2019/a.jpg").
// Paths are byte strings. Every function is reentrant and keeps no state;
// those that read shares see the platform's share database as it is at the
// moment of the call.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "common/fs_util.h"

namespace vellis::fileindex {

// --- Share paths (share_path.cpp) ---

using vellis::Basename;
using vellis::Dirname;
using vellis::GetFileExtension;
using vellis::StringStartWith;

// The first component of `share_path` into `share_name`: "/photo/2019/a.jpg"
// and "/photo" give "photo", "/" gives "". Throws Error 120 (reason: the
// path) when `share_path` is empty or does not begin with "/".
void GetShareNameByPath(std::string& share_name, const std::string& share_path);

// The full path of `share_path`: the volume of its share followed by
// `share_path` ("/photo/a.jpg" -> "/volume1/photo/a.jpg"); the share's name
// is used as it stands in `share_path`. Throws the 120 of GetShareNameByPath
// and Error 800 when there is no such share.
std::string GetFullPath(const std::string& share_path);

// The share that holds `full_path`: its name into `share_name` and its own
// full path into `share_path_on_disk` ("photo", "/volume1/photo"). Throws
// Error 502 "QORUShareNamePathGet failed, full_path=<path>" when no share
// holds it, and Error 120 when `full_path` contains a NUL byte.
void GetShareNamePathByFullPath(std::string& share_name, std::string& share_path_on_disk,
                                const std::string& full_path);

// `path` with its first component equal to `old_share` replaced by
// `new_share` ("/volume1/a/x/a/y", "b", "a" -> "/volume1/b/x/a/y"). Throws
// Error 120 "Cannot find share: <old_share>" when no whole component is
// `old_share`.
std::string ReplacePathShare(const std::string& path, const std::string& new_share,
                             const std::string& old_share);

// --- Indexability (indexability.cpp) ---

// The rule that refuses a full path, in the order the rules are tried.
enum class IndexRule {
  kIndexable,          // no rule refuses the path
  kInSnapshot,         // in a share's snapshot folder
  kUnexaminable,       // its file system cannot be examined
  kRemoteFs,           // on a remote file system
  kImageFs,            // on an image file system
  kPseudoFs,           // on one of the system's own file systems (type 12)
  kShareNotIndexable,  // its share is encrypted (locked) or read-only
  kInRecycleBin,       // in a share's or a home folder's recycle bin
  kMountPoint,         // a mount point other than an encrypted share's
  kUnresolvable,       // realpath fails (missing, or a loop)
  kNotCanonical,       // a link, "." or "..", a doubled or trailing "/"
};

// A short name of `rule` ("indexable", "snapshot", "remote-fs", ...).
const char* IndexRuleName(IndexRule rule);

// The first rule that refuses `full_path`, or kIndexable. The cheap text
// tests come first; the platform's snapshot test is asked only for a path
// containing "#snapshot", the share's recycle test only for one containing
// "#recycle", and realpath comes last. Throws the Errors of
// GetShareNamePathByFullPath and SDKShare (the share lookups); every other
// failing platform test counts as a no.
IndexRule CheckFullPathIndexable(const std::string& full_path);

// True when `full_path` lies in a share's recycle bin or in the recycle bin
// of a home folder. Throws the Errors of GetShareNamePathByFullPath.
bool IsFullPathInRecycleBin(const std::string& full_path);

// CheckFullPathIndexable(full_path) == IndexRule::kIndexable.
bool CanFullPathBeIndexed(const std::string& full_path);

// CanFullPathBeIndexed(GetFullPath(share_path)); throws as both do.
bool CanPathBeIndexed(const std::string& share_path);

// The names that the system keeps for itself, compared whole and
// case-sensitively: ".TemporaryItems", ".QORUPPSDB", ".DS_Store".
inline constexpr const char* kSystemPreservedFileNames[] = {".TemporaryItems", ".QORUPPSDB",
                                                            ".DS_Store"};

// True when `name` (one path component) is the platform's hidden metadata
// folder or one of kSystemPreservedFileNames.
bool IsSystemPreservedFileName(const std::string& name);

// --- File types (file_type.cpp) ---

enum FileType : int {
  kDocument = 0,  // office files, text, source code, subtitles, archives, e-books, mail
  kAudio = 1,
  kVideo = 2,
  kImage = 3,
  kUnknownFileType = 4,  // the extension is not in the table
};

// The constant list behind the extension table, in its order: lower-case
// extensions (the empty one first, with kDocument) and their types.
const std::vector<std::pair<const char*, FileType>>& FileExtensionPairs();

// A table from `pairs`: where an extension repeats, its first pair is kept.
std::map<std::string, FileType> BuildExtensionTable(
    const std::vector<std::pair<const char*, FileType>>& pairs);

// The table built from FileExtensionPairs(), once, before first use.
const std::map<std::string, FileType>& FileExtensionTable();

// The type of `full_path` by its lower-cased extension
// (GetFileExtension(full_path, true)): a name without a dot, or ending in
// one, has the empty extension and is a document; an extension not in the
// table is kUnknownFileType. The file itself is never touched.
FileType GetFileTypeByFullPath(const std::string& full_path);

// The search-query texts of the four content categories, extensions joined
// by " OR ", used as they stand: they are not derived from the extension
// table and differ from it (the document text holds "msgc", for one).
struct CategoryQuery {
  const char* category;  // "document", "audio", "video", "image"
  const char* query;
};
extern const CategoryQuery kCategoryQueries[4];

// The query text of `category`; empty for another name.
std::string GetCategoryQuery(const std::string& category);

// --- Notifications (notify.cpp) ---

// The notifier and the option of the process runner used for both
// notifications.
inline constexpr char kHmxNotifyPath[] = "/usr/qoru/bin/qoruhmxnotify";
inline constexpr int kNotifyExecOption = 187;

// Tells the administrators that the index has run out of space / that
// indexing has run short of memory, by running the notifier. Return the
// process runner's result; never throw, never log.
int SendHMXNotify();
int NotifyLackOfMemory();
// Tells the administrators that the file-change monitor reached the
// kernel's watch limit and rescans instead ("error:watch_limit").
int NotifyWatchLimit();

// --- Custom events (custom_event.cpp) ---
//
// Events that the library itself queues for the indexing daemon: renames
// made by management operations, reindex requests and configuration
// updates. They go into the share's queue in the monitor's line format, so
// that they are folded and processed in order with the monitored changes.

// Appends the line {"data": data, "event": event, "path": path, "path_old":
// path_old} and a newline to the queue of the share that holds the full path
// `path` ("path" is the new path of a rename, "path_old" the former one).
// The queue's lock (QueueLockPath) is held from before the queue is opened
// until the line is written, so a rotation of the queue never splits or
// loses it, and the line is written with one write(2) on an O_APPEND
// descriptor, so concurrent appenders never interleave with it. The queue
// (and its folder) is created when missing; a queue that is a symbolic
// link, a FIFO or anything but a regular file is refused.
//
// Never throws: a failure (no share holds the path, the share does not
// exist, its queue path cannot be composed, the lock cannot be taken, the
// queue cannot be written) is logged with its code and reason, and the
// share is flagged need-reindex (StatusMgr::SetShareStatus(share,
// kShareStatusNeedReindex)), so that the lost event is made good by
// reindexing the whole share. When no share holds `path` there is nothing
// to flag and the failure is only logged.
void AddCustomEvent(int event, const std::string& path, const std::string& path_old,
                    const Json::Value& data);

// Appends `lines` (whole lines, each ending in a newline) to the queue file
// `queue_path` as AddCustomEvent does: under the queue's lock, with one
// write(2) on an O_APPEND descriptor, creating the queue and its folder when
// missing and refusing a queue that is not a regular file. Throws Error 502
// with the reason when the queue cannot be opened or written, and the
// lock's errors.
void AppendQueueLines(const std::string& queue_path, const std::string& lines);

}  // namespace vellis::fileindex
