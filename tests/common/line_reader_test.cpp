#include "common/line_reader.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
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
  struct Case {
    std::string content;
    std::vector<std::string> reads;
  } cases[] = {{"", {}},
               {"\n", {"L:"}},
               {"a\n\nb\r\nlast", {"L:a", "L:", "L:b\r", "L:last"}},
               {std::string("nul\0in\n", 7), {std::string("L:nul\0in", 8)}},
               // Lines of the maximum or more are skipped, with a preview of their start.
               {"ok\n0123456789abcdef\n\n", {"L:ok", "T:0123456789abcdef", "L:"}},
               {"ok\n" + Line(70000, 5), {"L:ok", "T:" + Line(256, 5)}},
               {"0123456789", {"T:0123456789"}},
               {"012345678\n", {"L:012345678"}}};
  for (const auto& c : cases) EXPECT_EQ(ReadAll(c.content, 10), c.reads) << c.content.substr(0, 30);
}

TEST_F(LineReaderTest, LongLinesAcrossChunkBoundariesComeBackIntactOrSkipped) {
  std::vector<std::string> lines;
  std::string content;
  uint32_t r = 7;
  const size_t sizes[] = {65535, 65536, 65537, 0, 131072, 1, kMax - 1, kMax, 3 * kMax + 12345};
  for (size_t size : sizes) lines.push_back(Line(size, static_cast<unsigned>(size)));
  while (lines.size() < 200) {
    r = r * 1103515245u + 12345u;
    lines.push_back(Line((r >> 8) % ((r & 1) ? 300 : 90000), static_cast<unsigned>(lines.size())));
  }
  for (const auto& line : lines) content += line + "\n";
  const auto reads = ReadAll(content + Line(kMax + 1, 4));
  ASSERT_EQ(reads.size(), lines.size() + 1);
  for (size_t i = 0; i < reads.size(); ++i) {
    const std::string& line = i < lines.size() ? lines[i] : Line(kMax + 1, 4);
    if (line.size() < kMax) {
      ASSERT_TRUE(reads[i] == "L:" + line) << "line " << i << " of " << line.size() << " bytes";
    } else {
      EXPECT_EQ(reads[i].substr(0, 3), "T:" + line.substr(0, 1))
          << "line " << i << " of " << line.size();
      EXPECT_EQ(line.compare(0, reads[i].size() - 2, reads[i].substr(2)), 0)
          << "preview of line " << i << " is not its start";
    }
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
