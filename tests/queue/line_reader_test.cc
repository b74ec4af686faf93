#include "queue/line_reader.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "support/temp_dir.h"

namespace orvex {
namespace fileindex {
namespace {

// One line as Next returned it, with what the reader said about it.
struct Read {
  std::string text;
  bool complete;
  bool too_long;
  uint64_t length;

  bool operator==(const Read& o) const {
    return text == o.text && complete == o.complete && too_long == o.too_long && length == o.length;
  }
};

std::ostream& operator<<(std::ostream& out, const Read& r) {
  return out << "{\"" << r.text << "\", " << (r.complete ? "complete" : "unterminated")
             << (r.too_long ? ", too long" : "") << ", " << r.length << "}";
}

std::vector<Read> ReadAll(LineReader& reader) {
  std::vector<Read> lines;
  for (std::string line; reader.Next(line);) {
    lines.push_back(Read{line, reader.last_line_complete(), reader.last_line_too_long(),
                         reader.last_line_length()});
  }
  return lines;
}

// Shows newlines in a failing input.
std::string Visible(const std::string& text) {
  std::string out;
  for (char c : text) out += c == '\n' ? std::string("\\n") : std::string(1, c);
  return out;
}

class LineReaderTest : public ::testing::Test {
 protected:
  std::vector<Read> ReadText(const std::string& text, size_t max_line) {
    LineReader reader(dir_.Write("queue", text), max_line);
    EXPECT_TRUE(reader.ok());
    return ReadAll(reader);
  }

  testing::TempDir dir_;
};

TEST_F(LineReaderTest, SplitsLikeGetlineAndTellsWhetherEachNewlineWasThere) {
  const struct {
    std::string text;
    std::vector<Read> lines;
  } cases[] = {
      {"", {}},
      {"\n", {{"", true, false, 0}}},
      {"a\n", {{"a", true, false, 1}}},
      {"a", {{"a", false, false, 1}}},
      {"a\n\nbc", {{"a", true, false, 1}, {"", true, false, 0}, {"bc", false, false, 2}}},
      // The cap is 8 here: a line of exactly 8 bytes is kept whole.
      {"12345678\n12345678", {{"12345678", true, false, 8}, {"12345678", false, false, 8}}},
      // Over the cap: only the head comes back, reading resumes after the newline.
      {"123456789\nx\n", {{"12345678", true, true, 9}, {"x", true, false, 1}}},
      {"x\n123456789abc", {{"x", true, false, 1}, {"12345678", false, true, 12}}},
      {"123456789\n\n", {{"12345678", true, true, 9}, {"", true, false, 0}}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(ReadText(c.text, 8), c.lines) << "text: " << Visible(c.text);
  }
}

TEST_F(LineReaderTest, KeepsLinesUpToTheDefaultCapAcrossBufferRefills) {
  // The second line starts near the end of the first buffer load and is
  // exactly the cap: the buffer must make room for it and its newline.
  const size_t cap = LineReader::kDefaultMaxLine;
  const std::string first(cap - 10, 'a');
  const std::string second(cap, 'b');
  const std::string third(cap + 1, 'c');
  const std::string text = first + "\n" + second + "\n" + third + "\nlast\n";
  const std::vector<Read> expected = {
      {first, true, false, cap - 10},
      {second, true, false, cap},
      {std::string(LineReader::kLongLineHead, 'c'), true, true, cap + 1},
      {"last", true, false, 4},
  };
  EXPECT_EQ(ReadText(text, cap), expected);
}

TEST_F(LineReaderTest, AnEndlessLineIsCountedNotKept) {
  // A sparse file of zero bytes: one line far longer than any buffer.
  const std::string path = dir_.Join("zeros");
  const off_t size = off_t{64} << 20;
  {
    const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(0, ::ftruncate(fd, size));
    ::close(fd);
  }
  LineReader reader(path);
  std::string line;
  ASSERT_TRUE(reader.Next(line));
  EXPECT_EQ(line, std::string(LineReader::kLongLineHead, '\0'));
  EXPECT_TRUE(reader.last_line_too_long());
  EXPECT_FALSE(reader.last_line_complete());
  EXPECT_EQ(reader.last_line_length(), static_cast<uint64_t>(size));
  EXPECT_FALSE(reader.Next(line));
}

// Regression: opening a FIFO waited for a writer, forever once the writer
// of a piped queue had finished.
TEST_F(LineReaderTest, AFifoWhoseWriterIsGoneIsReadNotWaitedOn) {
  const std::string fifo = dir_.Join("fifo");
  ASSERT_EQ(0, ::mkfifo(fifo.c_str(), 0600));
  {
    LineReader never_written(fifo);
    EXPECT_TRUE(never_written.ok());
    EXPECT_EQ(ReadAll(never_written), std::vector<Read>{});
  }
  // Someone holds the read end (as a shell holds a pipe on standard input)
  // while the writer writes and leaves.
  const int held = ::open(fifo.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
  ASSERT_GE(held, 0);
  const int writer = ::open(fifo.c_str(), O_WRONLY | O_CLOEXEC);
  ASSERT_GE(writer, 0);
  ASSERT_EQ(3, ::write(writer, "a\nb", 3));
  ::close(writer);
  LineReader reader(fifo);
  EXPECT_EQ(ReadAll(reader), (std::vector<Read>{{"a", true, false, 1}, {"b", false, false, 1}}));
  ::close(held);
}

TEST_F(LineReaderTest, OpenFailuresKeepTheirErrno) {
  for (const auto& [path, error] :
       {std::pair<std::string, int>{dir_.Join("absent"), ENOENT}, {dir_.path(), EISDIR}}) {
    errno = 0;
    LineReader reader(path);
    EXPECT_FALSE(reader.ok()) << path;
    EXPECT_EQ(errno, error) << path;
    std::string line;
    EXPECT_FALSE(reader.Next(line)) << path;
  }
}

}  // namespace
}  // namespace fileindex
}  // namespace orvex
