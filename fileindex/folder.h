// One indexed folder: the folder a user asked to have indexed, which kinds
// of file content are indexed in it, and two administrative flags.
//
// The folders file stores exactly GetData() per folder; the folder manager
// holds the list as std::shared_ptr<Folder>. A record is a plain value and
// is not synchronised: even its const accessors fill lazy caches, so one
// record must not be used from two threads at once.
#pragma once

#include <json/json.h>

#include <string>

namespace vellis::fileindex {

class Folder {
 public:
  // A record from its fields; volume_to_be_clean and both caches start
  // empty.
  Folder(const std::string& path, const std::string& name, bool document, bool audio, bool video,
         bool photo, bool privileged, bool paused);

  // A record from a folder object. "path", "name", "document", "audio",
  // "video" and "photo" are required: a missing one throws Error 120
  // "Missing property: <key>", one of the wrong type throws Error 120 as
  // well. "privileged", "paused" (default false) and "volume_to_be_clean"
  // (default empty) are optional: missing or of the wrong type, they keep
  // their default. Other keys are ignored. No partial record escapes.
  explicit Folder(const Json::Value& data);

  // The share name of the path (its first component), computed on first use
  // and cached. Throws Error 120 when the path does not begin with "/".
  std::string GetShare() const;

  // Renames the share part of the record: the first whole component of the
  // path equal to the old share name becomes `share`, and the share cache is
  // set to it. The full-path cache is kept as it is. Throws Error 120 when
  // the path holds no component equal to the old share name.
  void SetShare(const std::string& share);

  // The folder's path on disk (the share's volume followed by the path),
  // computed on first use and cached. Throws what the share lookup throws
  // (Error 800 for a share that does not exist).
  std::string GetFullPath() const;

  // The stored and reported form: "path", "name", "document", "audio",
  // "video", "photo", "paused", "privileged", "volume_to_be_clean".
  // Folder(GetData()) equals the record.
  Json::Value GetData() const;

  // Only the four content flags "document", "audio", "video", "photo".
  Json::Value GetIndexCfg() const;

  // Whether events at or below the folder's full path are still waiting in
  // its share's live or side queue. Throws the share's and the queue's
  // errors.
  bool IsIndexing() const;

  // Writes the folder's live status into out["text"], the first that
  // applies: "error" (with out["desc"] = "invalid_path") when the path may
  // not be indexed, "need_reindex" when the share has the need-reindex bit,
  // "finished" when no event is waiting, "processing" when indexing is not
  // paused (no resume time stored, or one already past), otherwise "paused"
  // (a stored resume time of 0 counts as paused). The folder's own "paused"
  // flag is not consulted. Throws the share's, queue's and status file's
  // errors.
  void GetStatus(Json::Value& out) const;

  // GetData() extended by out["additional"][item] for each item named in
  // `additionals`, an array of strings; "status" (GetStatus) is the only
  // item known. Throws Error 120 when `additionals` is not an array, an
  // element is not a string, or an item is unknown ("Unknown additioal:
  // <item>"); nothing partial is returned.
  Json::Value GetDataWithAdditional(const Json::Value& additionals) const;

  const std::string& GetPath() const { return path_; }
  const std::string& GetName() const { return name_; }
  const std::string& GetVolumeToBeClean() const { return volume_to_be_clean_; }
  bool IsDocument() const { return document_; }
  bool IsAudio() const { return audio_; }
  bool IsVideo() const { return video_; }
  bool IsPhoto() const { return photo_; }
  bool IsPrivileged() const { return privileged_; }
  bool IsPaused() const { return paused_; }

  void SetPaused(bool paused) { paused_ = paused; }
  // Replaces the path; the share and full path are computed afresh on next
  // use.
  void SetPath(const std::string& path) {
    path_ = path;
    share_.clear();
    full_path_.clear();
  }
  void SetVolumeToBeClean(const std::string& volume) { volume_to_be_clean_ = volume; }

  // Equal in the nine stored fields; the caches do not count.
  bool operator==(const Folder& other) const;
  bool operator!=(const Folder& other) const { return !(*this == other); }

 private:
  std::string path_;
  std::string name_;
  std::string volume_to_be_clean_;
  bool document_ = false;
  bool audio_ = false;
  bool video_ = false;
  bool photo_ = false;
  bool privileged_ = false;
  bool paused_ = false;
  mutable std::string share_;
  mutable std::string full_path_;
};

}  // namespace vellis::fileindex
