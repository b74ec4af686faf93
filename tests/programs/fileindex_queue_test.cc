// Runs the built fileindex-queue program on queue files written here and
// checks what it prints and how it exits.
#include <sys/stat.h>
#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <iterator>

#include "orvex/version.h"
#include "support/program_test.h"

namespace orvex {
namespace testing {
namespace {

class FileindexQueueTest : public ProgramTest {
 protected:
  FileindexQueueTest() : ProgramTest("fileindex-queue") {}
  // Writes a queue file of the given lines and returns its path.
  std::string Queue(const std::vector<std::string>& lines) {
    std::string text;
    for (const auto& line : lines) text += line + "\n";
    return Write("queue", text);
  }
  // A new FIFO to hand the program as its standard input.
  std::string Fifo() {
    const std::string path = io_.Join("fifo" + std::to_string(fifos_++));
    EXPECT_EQ(0, ::mkfifo(path.c_str(), 0600)) << path;
    return path;
  }
  // Starts a process that writes head, then zeros zero bytes, then tail to
  // fifo and exits with 0 once all is written.
  static pid_t Feed(const std::string& fifo, const std::string& head, size_t zeros,
                    const std::string& tail) {
    const std::string block(1 << 20, '\0');  // built before fork
    const pid_t pid = ::fork();
    if (pid != 0) return pid;
    const int fd = ::open(fifo.c_str(), O_WRONLY);
    auto put = [fd](const char* data, size_t size) {
      while (size > 0) {
        const ssize_t n = ::write(fd, data, size);
        if (n <= 0) ::_exit(1);
        data += n;
        size -= static_cast<size_t>(n);
      }
    };
    if (fd < 0) ::_exit(1);
    put(head.data(), head.size());
    for (size_t left = zeros; left > 0;) {
      const size_t n = std::min(left, block.size());
      put(block.data(), n);
      left -= n;
    }
    put(tail.data(), tail.size());
    ::_exit(0);
  }
  static int WaitFor(pid_t pid) {
    int status = 0;
    return ::waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  int fifos_ = 0;
};

// Nine lines for four operations: two lines are bad and skipped.
const std::vector<std::string> kMixedQueue = {
    R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 2, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 4, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
    R"({"event": 64, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
    "not json at all",
    R"({"event": 128, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
    R"({"event": 256, "is_dir": false, "path": "/volume1/photo/d.jpg", "path_old": "/volume1/photo/c.jpg"})",
    R"({"event": 64, "is_dir": true, "path": "/"})",
    R"({"event":131072,"path":"/volume1/photo/2024","path_old":"","data":{"document":true,"audio":false,"video":true,"photo":false}})",
};

TEST_F(FileindexQueueTest, PrintsCoalescedOperationsInProcessingOrderThenSummary) {
  const ProgramOutcome text = Run({Queue(kMixedQueue)});
  EXPECT_EQ(0, text.status) << text.err;
  EXPECT_EQ(
      "[02] /volume1/photo/a.jpg\n"
      "[01] /volume1/photo/b.jpg\n"
      "[05] /volume1/photo/c.jpg -> /volume1/photo/d.jpg\n"
      "[04] /volume1/photo/2024, "
      "data={\"audio\":false,\"document\":true,\"photo\":false,\"video\":true}\n"
      "lines read: 9, skipped as bad: 2, operations pending: 4, crashed: no\n",
      text.out);
  EXPECT_EQ("", text.err);

  const Json::Value json = Parse(Run({"--json", Queue(kMixedQueue)}).out);
  EXPECT_EQ(Parse(R"({"op": 5, "path": "/volume1/photo/d.jpg",
      "path_old": "/volume1/photo/c.jpg", "data": null})"),
            json["operations"][2]);
  EXPECT_EQ(4u, json["operations"].size());
  EXPECT_EQ(2, json["lines_skipped"].asInt());
}

TEST_F(FileindexQueueTest, CrashedQueueStopsReadingAndReportsOneWholeShareOperation) {
  const std::string queue = Queue({
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/a.jpg"})",
      R"({"event": 2, "is_dir": false, "path": "/volume1/photo/b.jpg"})",
      R"({"event": 512, "is_dir": false, "path": "/volume1/photo"})",
      R"({"event": 64, "is_dir": false, "path": "/volume1/photo/c.jpg"})",
  });
  const ProgramOutcome text = Run({queue});
  EXPECT_EQ(0, text.status);
  EXPECT_EQ("[07] \nlines read: 3, skipped as bad: 0, operations pending: 1, crashed: yes\n",
            text.out);
}

TEST_F(FileindexQueueTest, ExitStatusAndOutputOfEveryOutcome) {
  const std::string empty = Queue({});
  const std::string missing = root_.Join("no-such-queue");
  const std::string cannot_read = "fileindex-queue: error 502: cannot read queue ";
  const std::string no_ops =
      "lines read: 0, skipped as bad: 0, operations pending: 0, crashed: no\n";
  const struct {
    std::vector<std::string> args;
    int status;
    std::string out;
    std::string err;  // the whole of it, or its first line when usage follows
  } cases[] = {
      {{empty}, 0, no_ops, ""},
      {{"--", empty}, 0, no_ops, ""},
      {{"--version"}, 0, std::string("fileindex-queue ") + ORVEX_VERSION + "\n", ""},
      {{missing}, 2, "", cannot_read + missing + ": No such file or directory\n"},
      {{root_.path()}, 2, "", cannot_read + root_.path() + ": Is a directory\n"},
      {{"--bogus", empty}, 2, "", "fileindex-queue: error 120: unknown option --bogus"},
      {{"-x"}, 2, "", "fileindex-queue: error 120: unknown option -x"},
      {{}, 2, "", "fileindex-queue: error 120: missing QUEUE_FILE"},
      {{empty, empty}, 2, "", "fileindex-queue: error 120: unexpected argument " + empty},
  };
  for (const auto& c : cases) {
    const std::string shown = c.args.empty() ? "(none)" : c.args[0];
    const ProgramOutcome r = Run(c.args);
    EXPECT_EQ(c.status, r.status) << shown;
    EXPECT_EQ(c.out, r.out) << shown;
    if (r.err.find("usage: fileindex-queue") == std::string::npos) {
      EXPECT_EQ(c.err, r.err) << shown;
    } else {
      EXPECT_EQ(c.err + "\n", r.err.substr(0, r.err.find('\n') + 1)) << shown;
    }
  }
  const ProgramOutcome help = Run({"--help"});
  EXPECT_EQ(0, help.status);
  EXPECT_EQ(0u, help.out.rfind("usage: fileindex-queue", 0)) << help.out;
}

TEST_F(FileindexQueueTest, DashReadsTheQueueFromStandardInput) {
  const std::string queue = Queue(kMixedQueue);
  const ProgramOutcome by_path = Run({queue});
  ASSERT_EQ(0, by_path.status) << by_path.err;
  const ProgramOutcome from_file = Run({"-"}, queue);
  EXPECT_EQ(0, from_file.status) << from_file.err;
  EXPECT_EQ(by_path.out, from_file.out);
  // A FIFO, as from a shell pipe.
  const std::string fifo = Fifo();
  const pid_t feeder = Feed(fifo, ReadFileText(queue), 0, "");
  const ProgramOutcome from_pipe = Run({"--json", "-"}, fifo);
  EXPECT_EQ(0, WaitFor(feeder));
  EXPECT_EQ(0, from_pipe.status) << from_pipe.err;
  EXPECT_EQ(Parse(Run({"--json", queue}).out), Parse(from_pipe.out));
}

TEST_F(FileindexQueueTest, AnEndlessLineOfZeroBytesOnAPipeIsSkippedInBoundedMemory) {
  // 200 MB without a newline between two good lines: read through, counted
  // as one bad line, never held.
  const std::string fifo = Fifo();
  const pid_t feeder =
      Feed(fifo, kMixedQueue[0] + "\n", size_t{200} << 20, "\n" + kMixedQueue[3] + "\n");
  const ProgramOutcome r = Run({"-"}, fifo);
  EXPECT_EQ(0, WaitFor(feeder));
  EXPECT_EQ(0, r.status) << r.err;
  EXPECT_EQ(
      "[02] /volume1/photo/a.jpg\n[02] /volume1/photo/b.jpg\n"
      "lines read: 3, skipped as bad: 1, operations pending: 2, crashed: no\n",
      r.out);
  EXPECT_GT(r.max_rss_kb, 0);
  EXPECT_LT(r.max_rss_kb, 100 * 1024) << "peak resident memory in KiB";
}

// Strict UTF-8: no overlong forms, no surrogates, nothing past U+10FFFF.
bool IsUtf8(const std::string& s) {
  static const uint32_t kMin[] = {0, 0x80, 0x800, 0x10000};
  for (size_t i = 0; i < s.size();) {
    const unsigned char c = static_cast<unsigned char>(s[i]);
    size_t more = 0;
    uint32_t cp = c;
    if (c < 0x80) {
      ++i;
      continue;
    } else if ((c & 0xE0) == 0xC0) {
      more = 1, cp = c & 0x1F;
    } else if ((c & 0xF0) == 0xE0) {
      more = 2, cp = c & 0x0F;
    } else if ((c & 0xF8) == 0xF0) {
      more = 3, cp = c & 0x07;
    } else {
      return false;
    }
    if (i + more >= s.size()) return false;
    for (size_t k = 1; k <= more; ++k) {
      const unsigned char b = static_cast<unsigned char>(s[i + k]);
      if ((b & 0xC0) != 0x80) return false;
      cp = (cp << 6) | (b & 0x3F);
    }
    if (cp < kMin[more] || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) return false;
    i += more + 1;
  }
  return true;
}

// The bytes behind a string read back from the JSON output: a lone
// \udcXX escape, which the JSON reader turns into the three bytes of
// U+DCXX (ED B2 xx or ED B3 xx), stands for the byte XX.
std::string Recovered(const std::string& s) {
  std::string out;
  for (size_t i = 0; i < s.size();) {
    const auto at = [&s](size_t k) { return static_cast<unsigned char>(s[k]); };
    if (i + 2 < s.size() && at(i) == 0xED && (at(i + 1) == 0xB2 || at(i + 1) == 0xB3)) {
      out += static_cast<char>(((at(i + 1) & 0x03) << 6) | (at(i + 2) & 0x3F));
      i += 3;
    } else {
      out += s[i++];
    }
  }
  return out;
}

// A JSON string for a queue line: raw bytes, control characters escaped.
std::string QueueString(const std::string& bytes) {
  std::string out = "\"";
  for (const char ch : bytes) {
    const unsigned char c = static_cast<unsigned char>(ch);
    if (c == '"' || c == '\\') {
      out += '\\', out += ch;
    } else if (c < 0x20) {
      char escape[8];
      std::snprintf(escape, sizeof escape, "\\u%04x", c);
      out += escape;
    } else {
      out += ch;
    }
  }
  return out + "\"";
}

TEST_F(FileindexQueueTest, JsonOutputIsUtf8AndGivesBackEveryByteOfEveryPath) {
  const std::string paths[] = {
      "/v/s/plain",
      "/v/s/\xC3\xA9t\xC3\xA9",    // valid two-byte sequences
      "/v/s/\xF0\x9F\x98\x80",     // valid four-byte sequence
      "/v/s/\xFF\xFE",             // never valid
      "/v/s/\xE2\x82-",            // truncated sequence
      "/v/s/\xC3",                 // truncated at the end
      "/v/s/\xED\xA0\x80",         // an encoded surrogate
      "/v/s/\xC0\xAF",             // overlong
      "/v/s/\xF4\x90\x80\x80",     // past U+10FFFF
      "/v/s/\xE0\x9F\xBF",         // overlong three-byte form
      "/v/s/t\tn\nc\x01\x1F\x7F",  // control characters
      "/v/s/q\"b\\s",
      "/v/s/\\udcff",  // an escape's text, not an escape
  };
  std::vector<std::string> lines;
  for (const std::string& path : paths) {
    lines.push_back(R"({"event":64,"is_dir":false,"path":)" + QueueString(path) + "}");
  }
  lines.push_back(R"({"event":256,"path":)" + QueueString("/v/t/new\xFF") + R"(,"path_old":)" +
                  QueueString("/v/t/old\xFE") + "}");
  lines.push_back(R"({"event":131072,"path":"/v/u","data":{)" + QueueString("k\xFF") + ":" +
                  QueueString("\xFE\x01") + "}}");
  const ProgramOutcome r = Run({"--json", Queue(lines)});
  ASSERT_EQ(0, r.status) << r.err;
  EXPECT_TRUE(IsUtf8(r.out));
  EXPECT_EQ(r.out.find_first_of(std::string("\0\x01\x1F\t\r", 5)), std::string::npos);
  EXPECT_EQ(r.out.find('\n'), r.out.size() - 1);
  EXPECT_NE(r.out.find(R"("path":"/v/s/\udcff\udcfe")"), std::string::npos) << r.out;
  const Json::Value json = Parse(r.out);
  const Json::Value& ops = json["operations"];
  ASSERT_EQ(ops.size(), std::size(paths) + 2);
  for (Json::ArrayIndex i = 0; i < std::size(paths); ++i) {
    EXPECT_EQ(Recovered(ops[i]["path"].asString()), paths[i]) << "path " << i;
  }
  const Json::Value& rename = ops[Json::ArrayIndex{std::size(paths)}];
  EXPECT_EQ(Recovered(rename["path"].asString()), "/v/t/new\xFF");
  EXPECT_EQ(Recovered(rename["path_old"].asString()), "/v/t/old\xFE");
  const Json::Value& data = ops[Json::ArrayIndex{std::size(paths) + 1}]["data"];
  ASSERT_EQ(data.size(), 1u);
  EXPECT_EQ(Recovered(data.getMemberNames()[0]), "k\xFF");
  EXPECT_EQ(Recovered(data[data.getMemberNames()[0]].asString()), "\xFE\x01");
}

}  // namespace
}  // namespace testing
}  // namespace orvex
