// Small path and file helpers used across the library.
#pragma once

#include <dirent.h>

#include <string>

namespace vellis {

// open(2) of a regular file with `flags` plus O_CLOEXEC, O_NOFOLLOW and
// O_NONBLOCK (`mode` when O_CREAT creates it): a symbolic link, FIFO,
// socket, device or folder is refused without blocking. Returns the
// descriptor, or -1 with errno set (EISDIR for a folder, EINVAL for any
// other non-regular file).
int OpenRegularFile(const std::string& path, int flags, unsigned int mode = 0644);

// True when lstat succeeds and `path` is a regular file (a symbolic link is
// not followed and counts as not existing).
bool IsFileExist(const std::string& path);

// lstat: a directory is true; a symbolic link, when `follow_link` is true, is
// answered by IsDirExist(target, true) with the target as read (at most 4096
// bytes, a relative target not resolved against the link's folder; at most
// 40 links deep); anything else or a failure is false.
bool IsDirExist(const std::string& path, bool follow_link);

// By the entry's type: true only for DT_DIR; an entry of unknown type is
// never reported as a directory.
bool IsDirentDir(const dirent& entry, const std::string& path);

// True when the platform grants the effective user any bit of `perm`
// (1 execute, 2 write, 4 read) on `path`; false when the platform cannot
// say.
bool CheckACLPerm(const std::string& path, int perm);

// True when the platform says `path` is a mount point.
bool IsMountPoint(const std::string& path);

// True when `s` begins with `prefix`; an empty prefix always matches.
bool StringStartWith(const std::string& s, const std::string& prefix);

// The part after the last "/": the whole string when there is none, empty for
// a path ending in "/".
std::string Basename(const std::string& path);

// The part before the last "/": the whole string when there is none, empty
// for "/x".
std::string Dirname(const std::string& path);

// Of Basename(path), the part after the last "."; empty when there is no ".".
// A leading dot counts (".profile" gives "profile"). With `lower`, each byte
// goes through tolower.
std::string GetFileExtension(const std::string& path, bool lower);

// mkdir -p: creates `path` and its missing parents with `mode` (before
// umask). True when the folder exists afterwards.
bool MakeDirs(const std::string& path, unsigned int mode = 0755);

// realpath(3) of `path`; empty on failure.
std::string RealPath(const std::string& path);

// True when the file was removed or did not exist.
bool Unlink(const std::string& path);

// Moves / copies a regular file through the platform, replacing `to`.
// True on success.
bool MVFile(const std::string& from, const std::string& to);
bool CPFile(const std::string& from, const std::string& to);

// The name of the package's own service user.
inline constexpr char kServiceUserName[] = "Vellis";

// Gives `path` to the service user "Vellis" and its group. Returns whether
// chown succeeded. Throws Error 801 when the user cannot be looked up.
bool ChownVellis(const std::string& path);

}  // namespace vellis
