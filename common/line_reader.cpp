#include "common/line_reader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "common/fs_util.h"

namespace vellis {
namespace {

constexpr size_t kChunk = 1u << 16;
constexpr size_t kTooLongPreview = 256;

}  // namespace

LineReader::LineReader(size_t max_line) : max_line_(max_line) {}

LineReader::~LineReader() {
  if (fd_ >= 0) close(fd_);
}

bool LineReader::Open(const std::string& path) {
  int fd = OpenRegularFile(path, O_RDONLY);
  if (fd < 0) return false;
  if (fd_ >= 0) close(fd_);
  fd_ = fd;
  begin_ = end_ = 0;
  eof_ = false;
  return true;
}

// Reads one more chunk behind the valid bytes, first moving them to the
// front. Returns false at end of file or on error (errno set, eof_ clear).
bool LineReader::Fill() {
  if (begin_ > 0) {
    memmove(&buf_[0], &buf_[begin_], end_ - begin_);
    end_ -= begin_;
    begin_ = 0;
  }
  if (buf_.size() < end_ + kChunk) buf_.resize(end_ + kChunk);
  for (;;) {
    ssize_t n = read(fd_, &buf_[end_], kChunk);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    if (n == 0) {
      eof_ = true;
      return false;
    }
    end_ += static_cast<size_t>(n);
    return true;
  }
}

LineReader::Status LineReader::Next(std::string_view* line) {
  if (fd_ < 0) {
    errno = EBADF;
    return Status::kError;
  }
  bool skipping = false;  // inside a line too long to keep: only preview_ is kept
  size_t scan_from = begin_;
  for (;;) {
    const char* nl =
        static_cast<const char*>(memchr(buf_.data() + scan_from, '\n', end_ - scan_from));
    if (nl != nullptr) {
      size_t pos = static_cast<size_t>(nl - buf_.data());
      size_t start = begin_;
      size_t len = pos - start;
      begin_ = pos + 1;
      if (!skipping && len < max_line_) {
        *line = std::string_view(buf_.data() + start, len);
        return Status::kLine;
      }
      if (!skipping) preview_.assign(buf_.data() + start, std::min(len, kTooLongPreview));
      *line = preview_;
      return Status::kTooLong;
    }
    if (skipping) {
      begin_ = end_;
    } else if (end_ - begin_ >= max_line_) {
      // Only valid bytes of this line: max_line_ may be below the preview size.
      preview_.assign(buf_.data() + begin_, std::min(end_ - begin_, kTooLongPreview));
      skipping = true;
      begin_ = end_;
    }
    size_t unread = end_ - begin_;  // already scanned, holds no newline
    if (!Fill()) {
      if (!eof_) return Status::kError;
      if (skipping) {
        *line = preview_;
        return Status::kTooLong;
      }
      if (begin_ == end_) return Status::kEnd;
      *line = std::string_view(buf_.data() + begin_, end_ - begin_);
      begin_ = end_;
      return Status::kLine;
    }
    scan_from = begin_ + unread;
  }
}

}  // namespace vellis
