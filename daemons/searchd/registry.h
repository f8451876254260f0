// The daemon's list of indexes: id, database folder and pause state, kept
// in one JSON file so that the daemon finds its indexes again after a
// restart. The file is replaced atomically on every change (written beside,
// flushed, renamed over), so a crash leaves the old or the new list whole.
#pragma once

#include <map>
#include <string>

namespace vellis::searchd {

// The registry file; resolve with RootPath() at use.
inline constexpr char kRegistryPath[] = "/var/packages/Vellis/etc/searchd.indexes";

struct RegistryEntry {
  std::string path;
  bool paused = false;
};

class Registry {
 public:
  // Loads `file`; a missing file is an empty registry. Throws Error
  // kErrStorage when the file exists but cannot be read as a registry (it is
  // never overwritten then).
  explicit Registry(std::string file);

  const std::map<std::string, RegistryEntry>& entries() const { return entries_; }
  const RegistryEntry* Find(const std::string& id) const;

  // Change the list and save it. Throw kErrStorage when saving fails; the
  // list in memory is then left as it was.
  void Put(const std::string& id, const RegistryEntry& entry);
  void Remove(const std::string& id);
  // Removes `old_id` and puts `new_id` (which may equal it) in one save.
  void Replace(const std::string& old_id, const std::string& new_id, const RegistryEntry& entry);

 private:
  void Save(const std::map<std::string, RegistryEntry>& entries);

  std::string file_;
  std::map<std::string, RegistryEntry> entries_;
};

}  // namespace vellis::searchd
