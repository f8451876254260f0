#include "sdk/linux/smb_conf.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <vector>

#include "common/lock_file.h"
#include "common/root_path.h"
#include "sdk/linux/last_error.h"
#include "sdk/linux/linux_platform.h"

namespace vellis::sdk {
namespace {

constexpr char kSpotlightSection[] = "global";
constexpr char kSpotlightKey[] = "spotlight";
constexpr char kSmbConfLockPath[] = "/tmp/vellis_smb_conf.lock";

std::string Lower(std::string s) {
  for (char& c : s) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
  return s;
}

std::string Trim(const std::string& s) {
  size_t b = s.find_first_not_of(" \t\r");
  if (b == std::string::npos) return "";
  size_t e = s.find_last_not_of(" \t\r");
  return s.substr(b, e - b + 1);
}

// Key names count without their blanks and case.
std::string NormalizeKey(const std::string& s) {
  std::string out;
  for (char c : s) {
    if (c != ' ' && c != '\t' && c != '\r')
      out += static_cast<char>(tolower(static_cast<unsigned char>(c)));
  }
  return out;
}

// One logical line: physical lines [first, last] joined by continuations.
struct Logical {
  size_t first;
  size_t last;
  enum class Kind { kOther, kSection, kSetting } kind = Kind::kOther;
  std::string name;  // section name (lower case) or normalised key
  std::string value;
  std::string indent;
  std::string section;  // the section it lies in (lower case)
};

struct Physical {
  std::string body;    // without the line ending
  std::string ending;  // "\n", "\r\n" or "" for a last line without one
};

std::vector<Physical> SplitLines(const std::string& text) {
  std::vector<Physical> lines;
  size_t pos = 0;
  while (pos < text.size()) {
    size_t nl = text.find('\n', pos);
    Physical p;
    if (nl == std::string::npos) {
      p.body = text.substr(pos);
      pos = text.size();
    } else {
      p.body = text.substr(pos, nl - pos);
      p.ending = "\n";
      pos = nl + 1;
    }
    if (!p.body.empty() && p.body.back() == '\r' && !p.ending.empty()) {
      p.body.pop_back();
      p.ending = "\r\n";
    }
    lines.push_back(std::move(p));
  }
  return lines;
}

std::vector<Logical> Parse(const std::vector<Physical>& lines) {
  std::vector<Logical> out;
  std::string section;
  for (size_t i = 0; i < lines.size(); ++i) {
    Logical l;
    l.first = i;
    std::string joined = lines[i].body;
    // A trailing backslash joins the next physical line.
    while (!joined.empty() && joined.back() == '\\' && i + 1 < lines.size()) {
      joined.pop_back();
      joined += lines[++i].body;
    }
    l.last = i;
    size_t start = joined.find_first_not_of(" \t");
    l.indent = joined.substr(0, start == std::string::npos ? joined.size() : start);
    std::string content = Trim(joined);
    if (!content.empty() && content[0] == '[') {
      size_t close = content.find(']');
      if (close != std::string::npos) {
        l.kind = Logical::Kind::kSection;
        l.name = Lower(Trim(content.substr(1, close - 1)));
        section = l.name;
      }
    } else if (!content.empty() && content[0] != '#' && content[0] != ';') {
      size_t eq = content.find('=');
      if (eq != std::string::npos) {
        l.kind = Logical::Kind::kSetting;
        l.name = NormalizeKey(content.substr(0, eq));
        l.value = Trim(content.substr(eq + 1));
      }
    }
    l.section = section;
    out.push_back(std::move(l));
  }
  return out;
}

bool ReadWhole(const std::string& path, std::string* out) {
  std::ifstream in(path, std::ios::binary);
  if (!in) return false;
  std::ostringstream ss;
  ss << in.rdbuf();
  if (in.bad()) return false;
  *out = ss.str();
  return true;
}

// Temporary file beside the target, flushed, given the old file's mode and
// owner, renamed over it: readers see the old text or the new one.
int ReplaceFile(const std::string& path, const std::string& text) {
  struct stat st;
  if (stat(path.c_str(), &st) != 0) return FailAt(errno, __FILE__, __LINE__);
  std::string tmp = path + ".vellis.tmp";
  FILE* f = fopen(tmp.c_str(), "wbe");
  if (!f) return FailAt(errno, __FILE__, __LINE__);
  bool ok = fwrite(text.data(), 1, text.size(), f) == text.size() && fflush(f) == 0 &&
            fsync(fileno(f)) == 0;
  int err = errno;
  if (fclose(f) != 0 && ok) {
    ok = false;
    err = errno;
  }
  if (ok && (chmod(tmp.c_str(), st.st_mode & 07777) != 0 ||
             (chown(tmp.c_str(), st.st_uid, st.st_gid) != 0 && errno != EPERM))) {
    ok = false;
    err = errno;
  }
  if (ok && rename(tmp.c_str(), path.c_str()) != 0) {
    ok = false;
    err = errno;
  }
  if (!ok) {
    unlink(tmp.c_str());
    return FailAt(err, __FILE__, __LINE__);
  }
  return 0;
}

}  // namespace

bool IsIniTrue(const std::string& value) {
  std::string v = Lower(value);
  return v == "yes" || v == "true" || v == "on" || v == "1";
}

std::optional<std::string> GetIniOption(const std::string& text, const std::string& section,
                                        const std::string& key) {
  std::optional<std::string> found;
  const std::string want_section = Lower(section);
  const std::string want_key = NormalizeKey(key);
  for (const Logical& l : Parse(SplitLines(text))) {
    if (l.kind == Logical::Kind::kSetting && l.section == want_section && l.name == want_key) {
      found = l.value;
    }
  }
  return found;
}

std::string SetIniOption(const std::string& text, const std::string& section,
                         const std::string& key, const std::string& value) {
  std::vector<Physical> lines = SplitLines(text);
  std::vector<Logical> logical = Parse(lines);
  const std::string want_section = Lower(section);
  const std::string want_key = NormalizeKey(key);
  const std::string setting = key + " = " + value;

  bool replaced = false;
  long anchor = -1;  // the physical line after which a new setting goes
  bool section_seen = false;
  bool in_first_occurrence = false;
  std::string out;
  for (const Logical& l : logical) {
    if (l.kind == Logical::Kind::kSection) {
      in_first_occurrence = !section_seen && l.name == want_section;
      if (in_first_occurrence) {
        section_seen = true;
        anchor = static_cast<long>(l.last);
      }
    } else if (l.kind == Logical::Kind::kSetting && in_first_occurrence) {
      anchor = static_cast<long>(l.last);
    }
    if (l.kind == Logical::Kind::kSetting && l.section == want_section && l.name == want_key) {
      replaced = true;
      out += l.indent + setting + lines[l.last].ending;
      continue;
    }
    for (size_t i = l.first; i <= l.last; ++i) out += lines[i].body + lines[i].ending;
  }
  if (replaced) return out;

  if (!section_seen) {
    std::string eol = !lines.empty() && lines[0].ending == "\r\n" ? "\r\n" : "\n";
    return "[" + section + "]" + eol + "\t" + setting + eol + text;
  }
  out.clear();
  for (size_t i = 0; i < lines.size(); ++i) {
    out += lines[i].body;
    if (static_cast<long>(i) == anchor) {
      std::string eol = lines[i].ending.empty() ? "\n" : lines[i].ending;
      out += eol + "\t" + setting + eol;
    } else {
      out += lines[i].ending;
    }
  }
  return out;
}

int LinuxPlatform::QORUSMBIsEnableSpotlight() {
  std::string text;
  // No configuration (the service is not installed) reads as "off".
  if (!ReadWhole(RootPath(kSmbConfPath), &text)) return 0;
  std::optional<std::string> v = GetIniOption(text, kSpotlightSection, kSpotlightKey);
  return v && IsIniTrue(*v) ? 1 : 0;
}

int LinuxPlatform::QORUSMBSetSpotlight(int enable) {
  const std::string path = RootPath(kSmbConfPath);
  struct stat st;
  if (lstat(path.c_str(), &st) != 0) return FailAt(errno, __FILE__, __LINE__);
  if (!S_ISREG(st.st_mode)) return FailAt(EINVAL, __FILE__, __LINE__);
  try {
    // Two writers (two management operations) must not lose each other's
    // edit of the same file.
    LockFile lock(RootPath(kSmbConfLockPath), true);
    std::string text;
    if (!ReadWhole(path, &text)) return FailAt(errno ? errno : EIO, __FILE__, __LINE__);
    std::string updated =
        SetIniOption(text, kSpotlightSection, kSpotlightKey, enable ? "yes" : "no");
    if (updated == text) return 0;
    return ReplaceFile(path, updated);
  } catch (const std::exception&) {
    return FailAt(EAGAIN, __FILE__, __LINE__);
  }
}

}  // namespace vellis::sdk
