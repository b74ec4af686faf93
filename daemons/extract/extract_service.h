// The content-extraction service: parsers of untrusted files run only in
// worker processes that may crash, hang or exhaust memory without harming
// anyone else. Two ways in:
//   - the daemon (kalocontentextractd): ExtractService keeps a small pool of
//     workers forked from itself and answers requests on its socket;
//   - the one-shot mode (`kalocontentextractd --extract PATH`): the program
//     itself is the isolated worker for one file.
// Both take the parsers as an Extractor. This is the daemon's own library
// (orvex_extractd): libfileindex never links it, nor the parsers. doc/content_extraction.md
// describes the socket's messages and the failure record. ExtractService: one thread at a time. The
// free functions are thread-safe.
#ifndef ORVEX_DAEMONS_EXTRACT_EXTRACT_SERVICE_H_
#define ORVEX_DAEMONS_EXTRACT_EXTRACT_SERVICE_H_

#include <json/json.h>
#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "orvex/portable/extract_protocol.h"
#include "orvex/portable/file_descriptor.h"

namespace orvex {
namespace portable {

// The parsers: adds the metadata properties of the regular file at path to
// out; false with *problem set when the file is corrupt (out then holds what
// was read). Runs only in a worker process.
using Extractor =
    std::function<bool(const std::string& path, Json::Value& out, std::string* problem)>;

// ---- Worker side -------------------------------------------------------

// Caps the calling process's data memory (heap and private mappings) at
// memory_mb MiB beyond what it already uses, turns a failed allocation by
// operator new into an exit with kExtractExitMemoryCap, and turns off core
// dumps. False (errno set) when the limit cannot be set.
bool CapWorkerMemory(int memory_mb);

// Extracts one file in the calling process: the answer object of the
// socket's protocol ({"ok": true, "data": {...}} or {"ok": false,
// "reason": ..., "data": {...}}). A path that is not a regular file (checked
// with lstat: nothing is opened) gives {"ok": false, "not_regular": true}.
Json::Value ExtractInWorker(const std::string& path, const Extractor& extractor);

// The one-shot mode: caps memory, arms a backstop alarm a second after
// deadline_ms (so that a child whose caller died still ends), extracts path
// and writes the data object as JSON text to out and any reason to err.
// Returns the exit status (kExtractExit...).
int RunOneShot(const std::string& path, int deadline_ms, int memory_mb, const Extractor& extractor,
               std::string& out, std::string& err);

// ---- The daemon --------------------------------------------------------

struct ExtractServiceOptions {
  std::string socket_path;  // as given: callers resolve ORVEX_ROOT
  int workers = 2;
  int deadline_ms = kDefaultExtractDeadlineMs;  // per file; a request may ask for less
  int memory_mb = kDefaultExtractMemoryMb;      // per worker
  size_t max_connections = 64;                  // more are accepted and closed at once
  size_t max_queue = 128;                       // more requests are answered "busy"
  uint32_t max_request_bytes = 64 * 1024;       // a longer frame closes the connection
  int idle_ms = 30000;  // a client stalled mid-message (either way) this long is dropped
};

// The daemon's state and its step function. Start, then call RunOnce in a
// loop; every wait is bounded by the next deadline, so a request is answered
// within about twice its deadline (queueing, then extraction) whatever other
// clients do. Workers are forked from the calling process: call from a
// process with no other threads. Not copyable.
class ExtractService {
 public:
  ExtractService(ExtractServiceOptions options, Extractor extractor);
  ExtractService(const ExtractService&) = delete;
  ExtractService& operator=(const ExtractService&) = delete;
  ~ExtractService();  // Stop()

  // Creates the socket (mode 0660, its directory if missing) and listens.
  // A stale socket file is replaced; one that a live daemon answers on is
  // not (EADDRINUSE). False with errno set on failure.
  bool Start();

  // One round: starts missing workers, waits at most max_wait_ms (less when
  // a deadline falls sooner) for a client, a worker or wake_fd, and handles
  // what is ready. Returns true when wake_fd became readable.
  bool RunOnce(int max_wait_ms);

  // Kills the workers, closes every connection and removes the socket.
  // Harmless when not started.
  void Stop();

  // A descriptor RunOnce also waits on (a signalfd for SIGTERM); -1 for none.
  void set_wake_fd(int fd) { wake_fd_ = fd; }

  size_t connections() const { return clients_.size(); }
  size_t live_workers() const { return workers_.size(); }
  uint64_t workers_started() const { return workers_started_; }

 private:
  using Clock = std::chrono::steady_clock;
  struct Client {
    FileDescriptor fd;
    std::string in;
    std::string out;
    size_t out_done = 0;
    bool waiting = false;  // a request of its own is queued or being extracted
    bool close_after_write = false;
    Clock::time_point last_activity;
  };
  struct Worker {
    pid_t pid = -1;
    FileDescriptor channel;
    std::string in;
    bool ready = false;  // it has said so: only then is it given files
    bool busy = false;
    uint64_t client = 0;
    int deadline_ms = 0;
    Clock::time_point deadline;
  };
  struct Pending {
    uint64_t client = 0;
    std::string path;
    int deadline_ms = 0;
    Clock::time_point expires;
  };

  // Neither waiting for an answer nor writing one: it may send a request.
  static bool IsIdle(const Client& client) {
    return !client.waiting && client.out.empty() && !client.close_after_write;
  }
  bool SpawnWorker();
  void EnsureWorkers();
  int WaitBudget(int max_wait_ms) const;
  void AcceptClients();
  void ReadClient(uint64_t id);
  void TakeRequests(uint64_t id);
  void TakeAllRequests();
  void HandleRequest(uint64_t id, const std::string& body);
  void WriteClient(uint64_t id);
  void Answer(uint64_t id, const Json::Value& answer, bool close_after);
  void AnswerFrame(uint64_t id, std::string frame, bool close_after);
  void ReadWorker(size_t index);
  void EndWorker(size_t index, const Json::Value* fault_answer);
  void ExpireDeadlines();
  void Dispatch();
  void CloseClient(uint64_t id);

  ExtractServiceOptions options_;
  Extractor extractor_;
  FileDescriptor listener_;
  int wake_fd_ = -1;
  uint64_t next_client_ = 1;
  uint64_t workers_started_ = 0;
  Clock::time_point next_spawn_;  // no new worker before this
  std::map<uint64_t, Client> clients_;
  std::vector<Worker> workers_;
  std::deque<Pending> queue_;
};

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_DAEMONS_EXTRACT_EXTRACT_SERVICE_H_
