#include "common/line_reader.h"

#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cstring>
#include <iterator>
#include <string>
#include <vector>

#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using Status = LineReader::Status;
using testing::TempRoot;
using testing::WriteFile;

constexpr size_t kMax = LineReader::kDefaultMaxLine;

// A line of `n` bytes whose content depends on its position, so that a
// preview taken from the wrong place does not match.
std::string Line(size_t n, unsigned seed) {
  std::string s(n, ' ');
  for (size_t i = 0; i < n; ++i) s[i] = static_cast<char>('a' + (seed + i * 7) % 26);
  return s;
}

struct Read {
  Status status;
  std::string text;
};

class LineReaderTest : public ::testing::Test {
 protected:
  // Every result up to and including the first kEnd or kError.
  std::vector<Read> ReadAll(const std::string& content, size_t max_line = kMax) {
    WriteFile(path_, content);
    LineReader reader(max_line);
    std::vector<Read> out;
    if (!reader.Open(path_)) {
      ADD_FAILURE() << "Open failed: " << strerror(errno);
      return out;
    }
    for (;;) {
      std::string_view line;
      Status s = reader.Next(&line);
      out.push_back({s, std::string(line.data(), s == Status::kLine || s == Status::kTooLong
                                                     ? line.size()
                                                     : 0)});
      if (s == Status::kEnd || s == Status::kError) return out;
    }
  }

  TempRoot root_;
  std::string path_ = root_.Path("/tmp/queue");
};

TEST_F(LineReaderTest, SplitsLinesKeepingEmptyOnesAndTheUnterminatedLast) {
  struct Case {
    std::string content;
    std::vector<std::string> lines;
  } cases[] = {
      {"", {}},
      {"\n", {""}},
      {"a\n\nb\r\nlast", {"a", "", "b\r", "last"}},
      {"one\ntwo\n", {"one", "two"}},
      {std::string("nul\0inside\n", 11), {std::string("nul\0inside", 10)}},
  };
  for (const auto& c : cases) {
    const auto reads = ReadAll(c.content);
    ASSERT_EQ(reads.size(), c.lines.size() + 1) << c.content;
    for (size_t i = 0; i < c.lines.size(); ++i) {
      EXPECT_EQ(reads[i].status, Status::kLine) << c.content;
      EXPECT_EQ(reads[i].text, c.lines[i]) << c.content;
    }
    EXPECT_EQ(reads.back().status, Status::kEnd) << c.content;
  }
}

TEST_F(LineReaderTest, SkipsLinesOfTheMaximumOrMoreAndGoesOn) {
  const std::string longest = Line(kMax - 1, 1);
  const std::string too_long[] = {Line(kMax, 2), Line(3 * kMax + 12345, 3), Line(kMax + 1, 4)};
  const auto reads = ReadAll(longest + "\nnext\n" + too_long[0] + "\nafter\n" + too_long[1] +
                             "\n\n" + too_long[2]);
  const Status expected[] = {Status::kLine, Status::kLine,    Status::kTooLong, Status::kLine,
                             Status::kTooLong, Status::kLine, Status::kTooLong, Status::kEnd};
  ASSERT_EQ(reads.size(), std::size(expected));
  for (size_t i = 0; i < reads.size(); ++i) EXPECT_EQ(reads[i].status, expected[i]) << i;
  EXPECT_TRUE(reads[0].text == longest) << "size " << reads[0].text.size();
  EXPECT_EQ(reads[1].text, "next");
  EXPECT_EQ(reads[3].text, "after");
  EXPECT_EQ(reads[5].text, "");
  for (size_t i : {2, 4, 6}) {
    const std::string& line = too_long[(i - 2) / 2];
    EXPECT_FALSE(reads[i].text.empty()) << i;
    EXPECT_EQ(line.compare(0, reads[i].text.size(), reads[i].text), 0)
        << "preview of read " << i << " is not the start of its line";
  }
}

TEST_F(LineReaderTest, PreviewOfALongLineHoldsOnlyThatLine) {
  struct Case {
    std::string content;
    std::string line;  // the too-long one
  } cases[] = {
      {"0123456789abcdef", "0123456789abcdef"},
      {"0123456789abcdef\nok", "0123456789abcdef"},
      {"ok\n" + Line(70000, 5), Line(70000, 5)},
  };
  for (const auto& c : cases) {
    std::string preview;
    for (const auto& r : ReadAll(c.content, 10)) {
      if (r.status == Status::kTooLong) preview = r.text;
    }
    EXPECT_FALSE(preview.empty()) << c.content.substr(0, 20);
    EXPECT_LE(preview.size(), c.line.size()) << c.content.substr(0, 20);
    EXPECT_EQ(c.line.compare(0, preview.size(), preview), 0) << c.content.substr(0, 20);
  }
}

TEST_F(LineReaderTest, LinesAcrossChunkBoundariesComeBackIntact) {
  std::vector<std::string> lines;
  std::string content;
  uint32_t r = 7;
  for (size_t size : {65535u, 65536u, 65537u, 0u, 131072u, 1u}) {
    lines.push_back(Line(size, 9));
    content += lines.back() + "\n";
  }
  while (content.size() < 3u << 20) {
    r = r * 1103515245u + 12345u;
    lines.push_back(Line((r >> 8) % ((r & 1) ? 300 : 90000), static_cast<unsigned>(lines.size())));
    content += lines.back() + "\n";
  }
  const auto reads = ReadAll(content);
  ASSERT_EQ(reads.size(), lines.size() + 1);
  for (size_t i = 0; i < lines.size(); ++i) {
    ASSERT_EQ(reads[i].status, Status::kLine) << "line " << i;
    ASSERT_TRUE(reads[i].text == lines[i]) << "line " << i << " of " << lines[i].size() << " bytes";
  }
}

TEST_F(LineReaderTest, OpenRefusesWhatIsNotARegularFileWithoutBlocking) {
  WriteFile(path_, "x\n");
  const std::string fifo = root_.Path("/tmp/fifo");
  const std::string link = root_.Path("/tmp/link");
  ASSERT_EQ(mkfifo(fifo.c_str(), 0644), 0);
  ASSERT_EQ(symlink(path_.c_str(), link.c_str()), 0);
  for (const std::string& p : {fifo, link, root_.Path("/tmp"), root_.Path("/tmp/missing")}) {
    LineReader reader;
    errno = 0;
    EXPECT_FALSE(reader.Open(p)) << p;
    EXPECT_NE(errno, 0) << p;
    std::string_view line;
    EXPECT_EQ(reader.Next(&line), Status::kError) << p;
  }
}

}  // namespace
}  // namespace vellis
