#include "sdk/linux/content_extract.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <unistr.h>

#include <cerrno>
#include <cstring>

#include "common/fs_util.h"
#include "common/log.h"
#include "sdk/linux/linux_platform.h"
#include "sdk/metadata_fields.h"

namespace vellis::sdk {
namespace {

namespace fe = vellis::sdk::metadata;

// Opens `path` without resolving any symbolic link on the way, so that a link
// inside a share can never lead the indexer out of it. A link as the last
// component is opened as itself when `flags` has O_PATH | O_NOFOLLOW.
int OpenNoSymlinks(const std::string& path, int flags) {
  open_how how;
  memset(&how, 0, sizeof(how));
  // The raw call gets no O_LARGEFILE from the C library: a 32-bit process
  // asks for it itself (the kernel refuses it together with O_PATH).
  const int large = (flags & O_PATH) ? 0 : O_LARGEFILE;
  how.flags = static_cast<uint64_t>(flags | O_CLOEXEC | O_NOFOLLOW | large);
  how.resolve = RESOLVE_NO_SYMLINKS;
  long fd = syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof(how));
  if (fd < 0 && errno == ENOSYS) {
    // Kernels before 5.6: only the last component is protected.
    return open(path.c_str(), flags | O_CLOEXEC | O_NOFOLLOW);
  }
  return static_cast<int>(fd);
}

bool FactsOf(int fd, FileFacts* facts) {
  struct statx stx;
  memset(&stx, 0, sizeof(stx));
  if (statx(fd, "", AT_EMPTY_PATH | AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME, &stx) !=
      0) {
    return false;
  }
  facts->mode = stx.stx_mode;
  facts->size = stx.stx_size;
  facts->blocks = stx.stx_blocks;
  facts->mtime = stx.stx_mtime.tv_sec;
  facts->ctime = stx.stx_ctime.tv_sec;
  facts->has_btime = (stx.stx_mask & STATX_BTIME) != 0;
  facts->btime = stx.stx_btime.tv_sec;
  facts->uid = stx.stx_uid;
  facts->gid = stx.stx_gid;
  return true;
}

// Reads the start of the regular file that `facts` describes. A FIFO or
// device put in its place since the stat is refused by the fstat check, and
// O_NONBLOCK keeps the open itself from waiting on one.
bool ReadText(const std::string& path, const FileFacts& facts, std::string* text) {
  int fd = OpenNoSymlinks(path, O_RDONLY | O_NONBLOCK);
  if (fd < 0) return false;
  struct stat st;
  if (fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) || st.st_mode != facts.mode) {
    close(fd);
    return false;
  }
  // A few bytes beyond the limit tell whether a character was cut.
  std::string bytes(kMaxTextContentBytes + 4, '\0');
  size_t got = 0;
  while (got < bytes.size()) {
    ssize_t n = read(fd, &bytes[got], bytes.size() - got);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    got += static_cast<size_t>(n);
  }
  close(fd);
  bytes.resize(got);
  return TextContentFromBytes(bytes, text);
}

}  // namespace

void FillFileSystemFields(const std::string& path, const FileFacts& facts, Json::Value* doc) {
  Json::Value& d = *doc;
  d[fe::kQORUMDPath] = path;
  d[fe::kQORUMDFSName] = Basename(path);
  d[fe::kQORUMDParent] = Dirname(path);
  d[fe::kQORUMDExtension] = GetFileExtension(path, false);
  d[fe::kQORUMDKind] = GetFileExtension(path, true);
  d[fe::kQORUMDIsDir] = S_ISDIR(facts.mode);
  d[fe::kQORUMDFSSize] = static_cast<Json::Int64>(facts.size);
  d[fe::kQORUMDLogicalSize] = static_cast<Json::Int64>(facts.size);
  d[fe::kQORUMDPhysicalSize] = static_cast<Json::Int64>(facts.blocks * 512);
  d[fe::kQORUMDFSContentChangeDate] = static_cast<Json::Int64>(facts.mtime);
  d[fe::kQORUMDAttributeChangeDate] = static_cast<Json::Int64>(facts.ctime);
  if (facts.has_btime) {
    d[fe::kQORUMDFSCreationDate] = static_cast<Json::Int64>(facts.btime);
  } else {
    d.removeMember(fe::kQORUMDFSCreationDate);
  }
  // Ids and permissions are keyword fields in the mappings: text.
  d[fe::kQORUMDOwnerUserID] = std::to_string(facts.uid);
  d[fe::kQORUMDOwnerGroupID] = std::to_string(facts.gid);
  d[fe::kQORUMDPrivilege] = StringPrintf("%04o", facts.mode & 07777);
}

bool IsPlainTextExtension(const std::string& lower_extension) {
  static const char* const kTextExtensions[] = {"txt", "text", "log",  "md",  "csv",  "tsv", "json",
                                                "xml", "htm",  "html", "ini", "conf", "cfg", "yaml",
                                                "yml", "c",    "h",    "cc",  "cpp",  "hpp", "py",
                                                "sh",  "java", "js",   "css", "srt",  "tex"};
  for (const char* ext : kTextExtensions) {
    if (lower_extension == ext) return true;
  }
  return false;
}

bool TextContentFromBytes(const std::string& bytes, std::string* text) {
  size_t end = bytes.size();
  if (end > kMaxTextContentBytes) {
    end = kMaxTextContentBytes;
    // Back off over continuation bytes to the start of the character that
    // does not fit whole.
    while (end > 0 && (static_cast<unsigned char>(bytes[end]) & 0xC0) == 0x80) --end;
  }
  const uint8_t* data = reinterpret_cast<const uint8_t*>(bytes.data());
  if (memchr(data, 0, end) != nullptr || u8_check(data, end) != nullptr) return false;
  text->assign(bytes, 0, end);
  return true;
}

int ExtractDocument(const std::string& path, const Json::Value& options, Json::Value* doc) {
  int fd = OpenNoSymlinks(path, O_PATH);
  if (fd < 0) return -1;
  FileFacts facts;
  bool ok = FactsOf(fd, &facts);
  int saved = errno;
  close(fd);
  if (!ok) {
    errno = saved;
    return -1;
  }
  Json::Value out(Json::objectValue);
  FillFileSystemFields(path, facts, &out);
  const bool need_meta =
      options.isObject() && options[fe::kCENeedMeta].isBool() && options[fe::kCENeedMeta].asBool();
  std::string text;
  if (need_meta && S_ISREG(facts.mode) && IsPlainTextExtension(GetFileExtension(path, true)) &&
      ReadText(path, facts, &text)) {
    out[fe::kQORUMDTextContent] = std::move(text);
  }
  *doc = std::move(out);
  errno = 0;
  return 0;
}

int LinuxPlatform::ParseFile(const std::string& path, const Json::Value& options,
                             Json::Value* doc) {
  return ExtractDocument(path, options, doc);
}

}  // namespace vellis::sdk
