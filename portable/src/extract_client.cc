#include "extract_client.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <climits>
#include <cstring>
#include <ctime>
#include <memory>
#include <mutex>
#include <sstream>
#include <utility>
#include <vector>

#include "compact_json.h"
#include "kalo/kalo_sock.h"
#include "orvex/portable/atomic_file.h"
#include "orvex/portable/extract_protocol.h"
#include "orvex/portable/file_descriptor.h"

extern char** environ;

namespace orvex {
namespace portable {
namespace {

using orvex::portable::CompactJsonText;
using orvex::portable::ParseCompactJson;

using Clock = std::chrono::steady_clock;

// The one-shot program prints one JSON object; anything much bigger than the
// parsers' text limit is not what it should print.
constexpr size_t kMaxProgramOutput = 32u << 20;
constexpr size_t kMaxProgramErrors = 4096;
// Beyond the deadline, what the daemon may spend queueing one request (as
// long again) and what the round trip costs.
constexpr int kDaemonSlackMs = 1000;

// For the failure record, which people read.
std::string IndentedJsonText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = " ";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

// An answer from the socket: its JSON text, and when that announces
// "text_bytes", the text behind its NUL put back into the data as the
// property it is. False when the message is not such an answer.
bool DecodeAnswer(const std::string& message, Json::Value& answer) {
  const char* begin = message.data();
  const char* end = begin + message.size();
  const char* header_end = static_cast<const char*>(std::memchr(begin, '\0', message.size()));
  if (header_end == nullptr) header_end = end;
  if (!ParseCompactJson(begin, header_end, answer) || !answer.isObject()) return false;
  if (!answer.isMember("text_bytes")) return header_end == end;
  const Json::Value& bytes = answer["text_bytes"];
  if (!bytes.isUInt64() || header_end == end ||
      static_cast<Json::UInt64>(end - header_end - 1) != bytes.asUInt64()) {
    return false;
  }
  Json::Value& data = answer["data"];
  if (!data.isObject()) data = Json::Value(Json::objectValue);
  data[kExtractTextMember] = Json::Value(header_end + 1, end);
  answer.removeMember("text_bytes");
  return true;
}

int MillisLeft(Clock::time_point end) {
  const auto left =
      std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now()).count();
  return static_cast<int>(std::max<long long>(0, std::min<long long>(left, INT_MAX)));
}

// A connection to the daemon that can wait for its answer with a time limit.
class DaemonConnection : public kalodaemon::DomainSockConnection {
 public:
  using DomainSockConnection::DomainSockConnection;

  // True once an answer starts to arrive within timeout_ms. The rest of it
  // follows at once, so the remaining reads are bounded by a short timeout.
  bool WaitForAnswer(int timeout_ms) {
    struct pollfd pfd = {fd_.get(), POLLIN, 0};
    const Clock::time_point end = Clock::now() + std::chrono::milliseconds(timeout_ms);
    for (;;) {
      const int ready = ::poll(&pfd, 1, MillisLeft(end));
      if (ready > 0) break;
      if (ready == 0) return false;
      if (errno != EINTR) return false;
    }
    const struct timeval guard = {2, 0};
    ::setsockopt(fd_.get(), SOL_SOCKET, SO_RCVTIMEO, &guard, sizeof(guard));
    return true;
  }
};

// The connection to the daemon kept by this thread between requests, so
// that each file costs one round trip and no connection set-up. A process
// forked since does not use its parent's: the two would read each other's
// answers.
// Its buffer for answers is kept too, up to kKeptBufferBytes: a long text
// then lands in memory already mapped rather than in fresh pages each time.
struct KeptConnection {
  pid_t pid = -1;
  std::unique_ptr<DaemonConnection> connection;
  std::string buffer;
};
constexpr size_t kKeptBufferBytes = 4u << 20;
thread_local KeptConnection t_kept;

// The kept connection to socket_path, taken from the keeping; null when
// there is none.
std::unique_ptr<DaemonConnection> TakeKeptConnection(const std::string& socket_path) {
  std::unique_ptr<DaemonConnection> connection = std::move(t_kept.connection);
  if (connection == nullptr || t_kept.pid != ::getpid() || connection->path() != socket_path) {
    return nullptr;  // closed: a forked child closes only its own copy
  }
  return connection;
}

void KeepConnection(std::unique_ptr<DaemonConnection> connection) {
  t_kept.pid = ::getpid();
  t_kept.connection = std::move(connection);
}

ExtractOutcome FromAnswer(Json::Value& answer) {
  ExtractOutcome outcome;
  if (answer["data"].isObject()) outcome.data.swap(answer["data"]);
  outcome.reason = answer["reason"].asString();
  if (answer["ok"].asBool()) {
    outcome.kind = ExtractOutcome::kOk;
  } else if (answer["fault"].isString()) {
    outcome.kind = ExtractOutcome::kFault;
  } else if (answer["busy"].asBool()) {
    outcome.kind = ExtractOutcome::kUnavailable;
  } else {
    outcome.kind = ExtractOutcome::kProblem;
  }
  return outcome;
}

// The child's output pipes, read until both close or the deadline passes.
struct ChildOutput {
  std::string out;
  std::string err;
  bool timed_out = false;
  bool overflowed = false;
};

void DrainPipes(int out_fd, int err_fd, Clock::time_point end, ChildOutput& result) {
  struct pollfd fds[2] = {{out_fd, POLLIN, 0}, {err_fd, POLLIN, 0}};
  char chunk[65536];
  while (fds[0].fd >= 0 || fds[1].fd >= 0) {
    const int ready = ::poll(fds, 2, MillisLeft(end));
    if (ready < 0 && errno == EINTR) continue;
    if (ready <= 0) {
      result.timed_out = true;
      return;
    }
    for (int i = 0; i < 2; ++i) {
      if (fds[i].fd < 0 || fds[i].revents == 0) continue;
      const ssize_t n = ::read(fds[i].fd, chunk, sizeof(chunk));
      if (n < 0 && errno == EINTR) continue;
      if (n <= 0) {
        fds[i].fd = -1;  // poll ignores negative descriptors
        continue;
      }
      std::string& text = i == 0 ? result.out : result.err;
      const size_t limit = i == 0 ? kMaxProgramOutput : kMaxProgramErrors;
      text.append(chunk, std::min(static_cast<size_t>(n), limit - std::min(limit, text.size())));
      if (i == 0 && text.size() >= kMaxProgramOutput) {
        result.overflowed = true;
        return;
      }
    }
  }
}

// True when the child pid ends before end (it is not reaped here).
bool ExitsBy(pid_t pid, Clock::time_point end) {
  const FileDescriptor pidfd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  if (!pidfd) return true;  // no pidfd (an old kernel): waitpid decides
  struct pollfd pfd = {pidfd.get(), POLLIN, 0};
  for (;;) {
    const int ready = ::poll(&pfd, 1, MillisLeft(end));
    if (ready < 0 && errno == EINTR) continue;
    return ready > 0;
  }
}

ExtractOutcome Unavailable(const std::string& reason) {
  ExtractOutcome outcome;
  outcome.kind = ExtractOutcome::kUnavailable;
  outcome.reason = reason;
  return outcome;
}

ExtractOutcome Fault(const std::string& reason) {
  ExtractOutcome outcome;
  outcome.kind = ExtractOutcome::kFault;
  outcome.reason = reason;
  return outcome;
}

ExtractOutcome OutcomeOfExit(int status, const ChildOutput& output, int memory_mb) {
  if (WIFSIGNALED(status)) {
    return Fault(std::string("the parser crashed (") + strsignal(WTERMSIG(status)) + ")");
  }
  const int code = WEXITSTATUS(status);
  if (code == kExtractExitMemoryCap) {
    return Fault("exceeded the memory cap of " + std::to_string(memory_mb) + " MiB");
  }
  ExtractOutcome outcome;
  if (code == kExtractExitOk || code == kExtractExitProblem) {
    if (!ParseCompactJson(output.out, outcome.data) || !outcome.data.isObject()) {
      return Fault("the extraction program printed no JSON object");
    }
    outcome.kind = code == kExtractExitOk ? ExtractOutcome::kOk : ExtractOutcome::kProblem;
    outcome.reason = output.err;
    return outcome;
  }
  if (code == kExtractExitNotRegular) {
    outcome.kind = ExtractOutcome::kProblem;
    outcome.reason = "not a regular file any more";
    return outcome;
  }
  if (code == kExtractExitUsage || code == 127) {
    return Unavailable("the extraction program failed to start: " + output.err);
  }
  return Fault("the parser ended with status " + std::to_string(code));
}

// The last version of a failure record read in this process, known by its
// file's identity, size and modification time.
struct RecordCache {
  std::string path;
  dev_t dev = 0;
  ino_t ino = 0;
  off_t size = -1;
  struct timespec mtime = {};
  Json::Value files;

  bool Matches(const std::string& record_path, const struct stat& st) const {
    return path == record_path && dev == st.st_dev && ino == st.st_ino && size == st.st_size &&
           mtime.tv_sec == st.st_mtim.tv_sec && mtime.tv_nsec == st.st_mtim.tv_nsec;
  }
};

std::mutex g_record_mutex;
RecordCache g_record_cache;  // under g_record_mutex

bool MakeDirs(const std::string& dir) {
  for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
    const std::string prefix = dir.substr(0, slash);
    if (!prefix.empty() && ::mkdir(prefix.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) return true;
  }
}

}  // namespace

bool AskExtractDaemon(const std::string& socket_path, const std::string& path, int deadline_ms,
                      ExtractOutcome& outcome) {
  Json::Value request(Json::objectValue);
  request["path"] = path;
  request["deadline_ms"] = deadline_ms;
  const std::string message = CompactJsonText(request);
  // A kept connection may have been closed by the daemon since (it drops
  // idle ones, or it restarted): that one is given up and the request sent
  // once more on a new connection.
  for (;;) {
    std::unique_ptr<DaemonConnection> connection = TakeKeptConnection(socket_path);
    const bool kept = connection != nullptr;
    if (!kept) {
      connection.reset(new DaemonConnection(socket_path));
      if (!connection->Connect()) return false;
    }
    if (!connection->Send(message)) {
      if (kept) continue;
      return false;
    }
    if (!connection->WaitForAnswer(2 * deadline_ms + kDaemonSlackMs)) {
      outcome = Unavailable("the extraction service did not answer in time");
      return true;  // the connection goes: its late answer must not be read as the next one's
    }
    std::string& text = t_kept.buffer;
    // A daemon that closes without answering (stopping, or full) is as good
    // as none: the one-shot mode takes over.
    if (!connection->Recv(text)) {
      if (kept) continue;
      return false;
    }
    Json::Value answer;
    const bool decoded = DecodeAnswer(text, answer);
    if (text.capacity() > kKeptBufferBytes) std::string().swap(text);
    if (!decoded) {
      outcome = Unavailable("the extraction service answered with no JSON object");
      return true;
    }
    outcome = FromAnswer(answer);
    KeepConnection(std::move(connection));
    return true;
  }
}

ExtractOutcome RunExtractProgram(const std::string& program, const std::string& path,
                                 int deadline_ms, int memory_mb) {
  int out_pipe[2];
  int err_pipe[2];
  if (::pipe2(out_pipe, O_CLOEXEC) != 0) return Unavailable(std::strerror(errno));
  FileDescriptor out_read(out_pipe[0]), out_write(out_pipe[1]);
  if (::pipe2(err_pipe, O_CLOEXEC) != 0) return Unavailable(std::strerror(errno));
  FileDescriptor err_read(err_pipe[0]), err_write(err_pipe[1]);

  const std::string deadline_text = std::to_string(deadline_ms);
  const std::string memory_text = std::to_string(memory_mb);
  std::vector<const char*> argv = {
      program.c_str(),       "--extract",   path.c_str(),        "--deadline-ms",
      deadline_text.c_str(), "--memory-mb", memory_text.c_str(), nullptr};
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_adddup2(&actions, out_write.get(), 1);
  posix_spawn_file_actions_adddup2(&actions, err_write.get(), 2);
  // The child starts with default signal handling and nothing blocked,
  // whatever the calling daemon set for itself.
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  sigset_t all, none;
  sigfillset(&all);
  sigemptyset(&none);
  posix_spawnattr_setsigdefault(&attributes, &all);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
  pid_t pid = -1;
  const int spawned = ::posix_spawn(&pid, program.c_str(), &actions, &attributes,
                                    const_cast<char* const*>(argv.data()), environ);
  posix_spawn_file_actions_destroy(&actions);
  posix_spawnattr_destroy(&attributes);
  out_write.reset();
  err_write.reset();
  if (spawned != 0) {
    return Unavailable("cannot run " + program + ": " + std::strerror(spawned));
  }
  ChildOutput output;
  const Clock::time_point end = Clock::now() + std::chrono::milliseconds(deadline_ms);
  DrainPipes(out_read.get(), err_read.get(), end, output);
  // A child that closed its output may still be running: the deadline holds
  // for its end too.
  if (!output.timed_out && !output.overflowed && !ExitsBy(pid, end)) output.timed_out = true;
  if (output.timed_out || output.overflowed) ::kill(pid, SIGKILL);
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  if (output.timed_out) {
    return Fault("took longer than the deadline of " + deadline_text + " ms");
  }
  if (output.overflowed) return Fault("the extraction program printed too much");
  return OutcomeOfExit(status, output, memory_mb);
}

ExtractFailureRecord::ExtractFailureRecord(std::string record_path)
    : path_(std::move(record_path)) {}

Json::Value ExtractFailureRecord::Load() const {
  std::string text;
  Json::Value record;
  // A missing or damaged record forgets old failures: those files are
  // simply tried once more.
  if (!ReadWholeFile(path_, text) || !ParseCompactJson(text, record) || !record.isObject() ||
      !record["files"].isObject()) {
    return Json::Value(Json::objectValue);
  }
  return record["files"];
}

ExtractFailureRecord::State ExtractFailureRecord::Lookup(const std::string& path,
                                                         const struct statx& st) const {
  // Asked once per extracted file: the record is read and parsed again only
  // when it has been replaced or changed since (writes replace it whole, so
  // a new version is a new inode).
  struct stat record_st;
  if (::stat(path_.c_str(), &record_st) != 0) return kAbsent;
  std::lock_guard<std::mutex> hold(g_record_mutex);
  RecordCache& cache = g_record_cache;
  if (!cache.Matches(path_, record_st)) {
    cache.path = path_;
    cache.dev = record_st.st_dev;
    cache.ino = record_st.st_ino;
    cache.size = record_st.st_size;
    cache.mtime = record_st.st_mtim;
    cache.files = Load();
  }
  const Json::Value& files = cache.files;
  if (!files.isMember(path)) return kAbsent;
  const Json::Value& entry = files[path];
  const bool same = entry["size"].asUInt64() == st.stx_size &&
                    entry["ctime_sec"].asInt64() == st.stx_ctime.tv_sec &&
                    entry["ctime_nsec"].asUInt() == st.stx_ctime.tv_nsec;
  return same ? kSameFile : kChangedFile;
}

bool ExtractFailureRecord::Add(const std::string& path, const struct statx& st,
                               const std::string& reason) {
  const size_t slash = path_.rfind('/');
  if (slash != std::string::npos && slash > 0 && !MakeDirs(path_.substr(0, slash))) return false;
  const FileDescriptor lock(::open((path_ + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
  if (!lock || ::flock(lock.get(), LOCK_EX) != 0) return false;
  Json::Value files = Load();
  Json::Value entry(Json::objectValue);
  entry["size"] = static_cast<Json::UInt64>(st.stx_size);
  entry["ctime_sec"] = static_cast<Json::Int64>(st.stx_ctime.tv_sec);
  entry["ctime_nsec"] = st.stx_ctime.tv_nsec;
  entry["reason"] = reason;
  entry["time"] = static_cast<Json::Int64>(std::time(nullptr));
  files[path] = entry;
  while (files.size() > kMaxEntries) {
    std::string oldest;
    Json::Int64 oldest_time = 0;
    for (const std::string& name : files.getMemberNames()) {
      const Json::Int64 when = files[name]["time"].asInt64();
      if (name == path) continue;  // the failure being recorded stays
      if (oldest.empty() || when < oldest_time) {
        oldest = name;
        oldest_time = when;
      }
    }
    files.removeMember(oldest);
  }
  return Save(files);
}

bool ExtractFailureRecord::Remove(const std::string& path) {
  const FileDescriptor lock(::open((path_ + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
  if (!lock || ::flock(lock.get(), LOCK_EX) != 0) return false;
  Json::Value files = Load();
  if (!files.isMember(path)) return true;
  files.removeMember(path);
  return Save(files);
}

bool ExtractFailureRecord::Save(const Json::Value& files) {
  Json::Value record(Json::objectValue);
  record["version"] = 1;
  record["files"] = files;
  const bool saved = WriteFileAtomic(path_, IndentedJsonText(record) + "\n", 0644);
  // A version written here is never taken for the one read before it,
  // however coarse the file system's clock.
  std::lock_guard<std::mutex> hold(g_record_mutex);
  g_record_cache.path.clear();
  return saved;
}

}  // namespace portable
}  // namespace orvex
