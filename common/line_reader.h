// Reads a text file line by line with a bound on the line length.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace vellis {

class LineReader {
 public:
  // Lines of this many bytes or more are not returned whole (see Next).
  static constexpr size_t kDefaultMaxLine = 1u << 20;

  explicit LineReader(size_t max_line = kDefaultMaxLine);
  ~LineReader();
  LineReader(const LineReader&) = delete;
  LineReader& operator=(const LineReader&) = delete;

  // Opens `path` for reading. Only a regular file is accepted: a symbolic
  // link, FIFO, socket or directory is refused without blocking. Returns
  // false with errno set on failure.
  bool Open(const std::string& path);

  enum class Status {
    kLine,     // *line holds one line without its newline
    kTooLong,  // a line of max_line bytes or more was skipped; *line holds its start
    kEnd,      // end of file
    kError,    // a read failed; errno says why
  };

  // The next line. The last line needs no newline. *line stays valid until
  // the next call.
  Status Next(std::string_view* line);

 private:
  bool Fill();

  size_t max_line_;
  int fd_ = -1;
  std::string buf_;
  std::string preview_;  // start of the last line that was too long
  size_t begin_ = 0;  // first unread byte of buf_
  size_t end_ = 0;    // one past the last valid byte of buf_
  bool eof_ = false;
};

}  // namespace vellis
