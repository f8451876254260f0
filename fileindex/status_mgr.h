// The indexing service's small persistent state: whether indexing is paused
// and until when, and status bits per share.
//
// The status file (kFileIndexStatusCfgPath under RootPath) is one JSON
// object: "resume_time" (int64: -1 not paused, else the epoch second at
// which the pause ends) and "share" (object: share name -> int32 bits), both
// optional. Every instance loads the file when built; every mutation takes
// the status lock (kStatusCfgLockPath), changes the loaded document and
// saves it at once. The file is replaced atomically, so a crash or a full
// disk leaves the whole old file or the whole new one.
//
// The document is loaded at construction: build a StatusMgr right before
// use, or a change made meanwhile by another process may be overwritten.
// One instance is used by one thread at a time.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::fileindex {

inline constexpr char kFileIndexStatusCfgPath[] = "/var/packages/Vellis/etc/fileindex.status";

// Share status bit: the share's index is incomplete and must be rebuilt.
inline constexpr int kShareStatusNeedReindex = 1;

class StatusMgr {
 public:
  // Loads the status file; a missing file is an empty state. Throws Error
  // 504 "Cannot load json: <path>" when the file is there but is not a JSON
  // object (or its "share" member is not an object); the file is left as it
  // is.
  StatusMgr();
  // Writes nothing.
  ~StatusMgr() = default;

  // "resume_time", or -1 when absent or not an integer.
  long long GetPauseInfo() const;
  // The bits of `share`; 0 when absent or not an integer.
  int GetShareStatus(const std::string& share) const;

  // Pauses indexing for `hours` hours from now (platform clock) and tells the
  // indexing daemon ("pause" with {"resume_time": <time>}). The lock is taken
  // first; then a negative `hours` throws Error 120 "Pause length should NOT
  // be negative" with nothing changed.
  void Pause(int hours);
  // Ends a pause (-1) and tells the daemon ("resume" with a null argument).
  void Resume();

  // OR `bits` into the share's bits / clear `bits` (the member stays) /
  // remove the share's member. No daemon command.
  void SetShareStatus(const std::string& share, int bits);
  void UnsetShareStatus(const std::string& share, int bits);
  void ClearShareStatus(const std::string& share);

  // Writes the document with the effective user switched to "root", mode
  // 0644. Throws Error 505 "Failed to save json: <path>" (old file kept) or
  // 502 "chmod failed, reason=<text>"; Error 503 when the switch fails.
  //
  // The mutations above throw Error 506 when the lock cannot be taken, and
  // Pause/Resume the command channel's Error 502 after the new state has been
  // saved.
  void Save();

 private:
  Json::Value data_;
};

}  // namespace vellis::fileindex
