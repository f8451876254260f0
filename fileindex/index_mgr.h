// The management operations that callers (web requests, the appliance's
// hooks, the `vellis` command line) use to change the indexed folders and to
// keep shares, volumes, home folders and users in step with the index.
//
// Each operation loads the folder list (fileindex/folder_mgr.h) afresh and
// lets it go when it ends. The folder operations take the folder lock
// (LockFile on RootPath(kFolderCfgLockPath)) for their whole run; the share,
// volume, rename and recycle operations do not, and their callers serialise
// them with folder changes. Failures are thrown as vellis::Error after one
// log line; errors of the pieces called (folder list, search daemon, monitor
// configuration, daemon command) pass through unchanged. What stays done
// after a failure is stated per operation. docs/operations.md describes each
// operation step by step.
#pragma once

#include <json/json.h>

#include <string>

#include "fileindex/folder_mgr.h"

namespace vellis::fileindex {

// The application under which the share queues are registered with the
// file-change monitor.
inline constexpr char kAppName[] = "fileindex";
// What the monitor reports for every indexed folder, and the one folder
// name it never watches.
inline constexpr int kMonitorMask = 65478;
inline constexpr char kMonitorIgnoredName[] = "@eaDir";
// Services that indexing needs (sdk/platform.h, "Services and monitor").
inline constexpr char kSambaService[] = "samba";
inline constexpr char kContentExtractService[] = "qorucontentextractd";
inline constexpr char kFileIndexService[] = "pkg-Vellis-fileindexd";
// Daemon commands of the share workers and of setting changes.
inline constexpr char kCmdWorkerCreate[] = "worker_create";
inline constexpr char kCmdWorkerDelete[] = "worker_delete";
inline constexpr char kCmdNotifySettingChanged[] = "notify_setting_changed";

// --- Folders (folder_ops.cpp, folder_delete.cpp, folder_reindex.cpp) ---

// FolderUpsert(folder_list, true, updater_mode): adds folders. A path that is
// already listed fails with Error 901 "Duplicated ID: <path>".
void FolderAdd(const Json::Value& folder_list, bool updater_mode);
// FolderUpsert(folder_list, false, updater_mode): adds or replaces folders.
void FolderSet(const Json::Value& folder_list, bool updater_mode);

// Under the folder lock: loads the list; checks that `folder_list` is an
// array (Error 120, reason its JSON text) and, element by element, builds the
// record (Folder's Error 120), refuses a path that cannot be indexed unless
// `updater_mode` (903 "Path cannot index: <path>"), a duplicate when `create`
// (901 "Duplicated ID: <path>", earlier elements counting), and a share short
// of space (1003 "Share (<share>) space not enough"). Then starts the related
// services, creates the index of each share that had no folder before (only
// when `create`) and rewrites each share's monitor configuration, saves the
// list, sends "notify_setting_changed" {"share_name", "is_upsert": true} per
// share in name order, and, unless `updater_mode`, queues a configuration
// update (0x20000) per element with the categories to index. A failure in the
// checks changes nothing; one while indexes and monitor configurations are
// written leaves those already done and the list unsaved.
void FolderUpsert(const Json::Value& folder_list, bool create, bool updater_mode);

// Fills `result` with {"folder": [...], "total": <all folders>, "offset":
// offset}: the page of the list sorted by `sort_by` / `sort_direction`
// (FolderMgr::List), each folder as GetDataWithAdditional(additional). A
// folder whose data cannot be made is left out; "total" still counts it.
// Takes no lock. Throws the list's load error.
void FolderList(Json::Value& result, unsigned int offset, unsigned int limit,
                const std::string& sort_by, const std::string& sort_direction,
                const Json::Value& additional);
// Fills `result` with the GetData() of the folder with share path `path`.
// Throws Error 902 (reason the path) for a folder that is not listed.
void FolderGet(Json::Value& result, const std::string& path);

// Under the folder lock, removes the folder with share path `path`: Error 120
// "Missing path" for an empty one, 902 (reason the path) when it is not
// listed, both before any change. When it was its share's last folder, the
// share's monitor configuration is removed, the list saved, the daemon told
// ("notify_setting_changed", "is_upsert": false), and the share's index and
// status bits dropped. Otherwise the share's monitor configuration is
// rewritten, the list saved, the daemon told, and a configuration update
// (0x20000) queued for the folder's full path with the categories that the
// removal changes there (FolderMgr::Delete's `changed`).
void FolderDelete(const std::string& path);

// Asks for the folders with the share paths in `path_list` (an array of
// strings) to be indexed again: checks every element first (Error 120 when
// `path_list` is not an array or an element not a string, 902 when a folder
// is not listed), then clears the need-reindex bit of each share concerned
// and queues a reindex event (0x10000) for each folder's full path, in array
// order. A failed event sets the bit again (AddCustomEvent), so the bit is
// cleared before the events are queued. Takes the folder lock.
void FolderReindex(const Json::Value& path_list);

// Sends "notify_setting_changed" {"share_name": share_name, "is_upsert":
// is_upsert} to the indexing daemon. Throws the command channel's Error 502.
void NotifyDaemonSettingChanged(const std::string& share_name, bool is_upsert);

// --- Shares (share_ops.cpp) ---

// Takes a share out of indexing: unless it has no indexed folder (then
// nothing at all happens), stops the daemon's worker ("worker_delete"),
// removes the monitor configuration, pauses the index, marks the share's
// folders paused and saves the list, in that order. Error 120 "Missing share
// name" for an empty name. A failure leaves the steps before it done;
// calling again completes the pause.
void SharePause(const std::string& share_name);
// The mirror image: resumes the index, writes the monitor configuration,
// starts the daemon's worker ("worker_create"), clears the folders' paused
// flag and saves the list.
void ShareResume(const std::string& share_name);
// Forgets a share that is gone for good: its queue and index database are
// removed, its index deleted, its folders removed from the list (saved), and
// the related services stopped when no folder is left. Error 120 "Missing
// share name" / "Missing share path" for empty arguments.
void ShareClearPaused(const std::string& share_name, const std::string& share_path);

// A share moved to another volume; `old_share_path` is its full path before
// the move. Error 120 "Missing share name" / "Missing share path" for empty
// arguments; a share without indexed folders is left alone. Otherwise stops
// the daemon's worker, removes the monitor configuration of the old queue,
// moves the index to the new database path (ShareIndexMigrate), writes the
// monitor configuration of the new queue, starts the worker again, and
// queues the rename (0x100) of the share's folder from its old path to its
// new one followed by a reindex (0x10000) of each of the share's folders
// (share_migrate.cpp).
void ShareMigrate(const std::string& share_name, const std::string& old_share_path);

// --- Volumes (volume_ops.cpp) ---

// A folder lies on the volume `mount_point` when its full path + "/" begins
// with mount_point + "/". Error 120 "Missing mount point" for an empty one,
// before anything is loaded.
// Marks every folder on the volume paused with volume_to_be_clean =
// mount_point, saves the list, then per share in name order: "worker_delete",
// monitor configuration removed, index paused.
void VolumePause(const std::string& mount_point);
// Clears the paused flag of the paused folders on the volume, saves the
// list, then per share in name order: index resumed, "worker_create",
// monitor configuration written.
void VolumeResume(const std::string& mount_point);
// Removes the folders that are paused with volume_to_be_clean equal to
// `mount_point`, share by share (status bits cleared), saves the list and
// stops the related services when no folder is left.
void VolumeClearPaused(const std::string& mount_point);

// --- Related services and the monitor configuration (services.cpp) ---

// SetupRelatedServices(true) when the folder list holds a folder, (false)
// when it is empty. Never throws: a list that cannot be loaded is logged.
void PrepareServices();
// With `enable`: the file-sharing service's search support switched on (and
// the service restarted when it changed), the content-extraction service
// and the indexing daemon started; without, the mirror image. Every step
// runs whatever the one before did; failures are only logged.
void SetupRelatedServices(bool enable);
// Registers with the file-change monitor the queue of `share` with one
// watched folder per folder of the share in `folder_mgr`, in list order (an
// empty "config" when it has none). Throws the share's Error 800 / 502 and
// Error 502 "MonitorQueue::Upsert failed, share=<share>".
void UpsertQORUNotifydCfg(const std::string& share, const FolderMgr& folder_mgr);
// Removes the queue of `share` from the monitor. Throws the share's errors
// and Error 502 "MonitorQueue::Delete failed, share=<share>".
void DeleteQORUNotifydCfg(const std::string& share);
// Removes the share's queue, side queue and index database (composed from
// its full path `share_path`) and clears its status bits. Throws Error 502
// when a path cannot be composed; what was removed before stays removed.
void CleanShareIndexData(const std::string& share_name, const std::string& share_path);

// --- Recycle bins (recycle_ops.cpp) ---

// Queue a reindex (0x10000) of every home folder's recycle bin: HomeEnable
// of the homes of the account source `auth_type`, HomeDisable of all homes.
// Never throw; failures are logged.
void HomeEnable(int auth_type);
void HomeDisable(int auth_type);
// Queues a reindex of "<share path>/#recycle" when the share's path is an
// existing directory (not a link). Throws the share's Error 800.
void ShareCheckRecycle(const std::string& share_name);

// --- Renames (rename_ops.cpp) ---

// Moves the folders under "/homes/<user_from>" to "/homes/<user_to>" (whole
// components: "alice2" is not under "alice"), saves the list, and queues the
// rename of the home folder. Error 120 "Missing user_from" / "Missing
// user_to" before anything is loaded.
void UserRename(const std::string& user_from, const std::string& user_to);
// After a share was renamed: moves its folders to the new name, saves the
// list, renames the index (to the new share's database path) and queues the
// rename of the share's top folder. Error 120 "Missing share_from" /
// "Missing share_to"; Error 800 when the new share does not exist (the list
// is saved by then).
void ShareRename(const std::string& share_from, const std::string& share_to);

}  // namespace vellis::fileindex
