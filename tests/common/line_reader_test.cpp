#include "common/line_reader.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/temp_root.h"

namespace vellis {
namespace {

using Status = LineReader::Status;
constexpr size_t kMax = LineReader::kDefaultMaxLine;

// A line of `n` bytes whose content depends on its position, so that a
// preview taken from the wrong place does not match.
std::string Line(size_t n, unsigned seed) {
  std::string s(n, ' ');
  for (size_t i = 0; i < n; ++i) s[i] = static_cast<char>('a' + (seed + i * 7) % 26);
  return s;
}

class LineReaderTest : public ::testing::Test {
 protected:
  // The results before the first kEnd or kError: "L:<line>" for a line,
  // "T:<preview>" for a line too long.
  std::vector<std::string> ReadAll(const std::string& content, size_t max_line = kMax) {
    testing::WriteFile(path_, content);
    LineReader reader(max_line);
    EXPECT_TRUE(reader.Open(path_));
    std::vector<std::string> out;
    for (;;) {
      std::string_view line;
      Status s = reader.Next(&line);
      if (s == Status::kEnd || s == Status::kError) return out;
      out.push_back(std::string(s == Status::kLine ? "L:" : "T:") + std::string(line));
    }
  }

  testing::TempRoot root_;
  std::string path_ = root_.Path("/tmp/queue");
};

TEST_F(LineReaderTest, SplitsLinesKeepingEmptyOnesAndTheUnterminatedLast) {
  const std::pair<std::string, std::vector<std::string>> cases[] = {
      {"", {}},
      {"\n", {"L:"}},
      {"a\n\nb\r\nlast", {"L:a", "L:", "L:b\r", "L:last"}},
      {std::string("nul\0in\n", 7), {std::string("L:nul\0in", 8)}},
      // Lines of the maximum or more are skipped, with a preview of their start.
      {"ok\n0123456789abcdef\n\n", {"L:ok", "T:0123456789abcdef", "L:"}},
      {"ok\n" + Line(70000, 5), {"L:ok", "T:" + Line(256, 5)}},
      {"0123456789", {"T:0123456789"}},
      {"012345678\n", {"L:012345678"}}};
  for (const auto& [content, reads] : cases)
    EXPECT_EQ(ReadAll(content, 10), reads) << content.substr(0, 30);
}

// Around the read chunk size and the maximum, random ones, and last an
// unterminated one too long; a line too long gives a preview of its start.
TEST_F(LineReaderTest, LongLinesAcrossChunkBoundariesComeBackIntactOrSkipped) {
  std::vector<std::string> lines;
  const size_t sizes[] = {65535, 65536, 65537, 0, 131072, 1, kMax - 1, kMax, 3 * kMax + 12345};
  for (size_t size : sizes) lines.push_back(Line(size, static_cast<unsigned>(size)));
  for (uint32_t r = 7; lines.size() < 200;) {
    r = r * 1103515245u + 12345u;
    lines.push_back(Line((r >> 8) % ((r & 1) ? 300 : 90000), static_cast<unsigned>(lines.size())));
  }
  lines.push_back(Line(kMax + 1, 4));
  std::string content;
  for (const auto& line : lines) content += line + "\n";
  content.pop_back();
  const auto reads = ReadAll(content);
  ASSERT_EQ(reads.size(), lines.size());
  for (size_t i = 0; i < reads.size(); ++i) {
    const std::string& line = lines[i];
    const size_t preview = std::max<size_t>(reads[i].size(), 3) - 2;
    ASSERT_TRUE(reads[i] == (line.size() < kMax ? "L:" + line : "T:" + line.substr(0, preview)))
        << "line " << i << " of " << line.size() << " bytes";
  }
}

TEST_F(LineReaderTest, OpenRefusesWhatIsNotARegularFileWithoutBlocking) {
  testing::WriteFile(path_, "x\n");
  const std::string fifo = root_.Path("/tmp/fifo"), link = root_.Path("/tmp/link");
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
