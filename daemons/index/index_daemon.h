// IndexDaemon: the heart of fileindexd. It serves the daemon command socket
// and keeps one ShareWorker per indexed share that is not paused, each of
// which drains its share's queue into the search daemon's index. The global
// pause (with its resume time) holds every worker. The loop is a step
// function, RunOnce(), so that tests drive it without threads.
// One thread at a time.
#ifndef ORVEX_DAEMONS_INDEX_INDEX_DAEMON_H_
#define ORVEX_DAEMONS_INDEX_INDEX_DAEMON_H_

#include <json/json.h>
#include <syslog.h>

#include <cstdint>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>

#include "index/command_server.h"
#include "index/share_worker.h"

namespace orvex {
namespace indexd {

struct IndexDaemonOptions {
  CommandServerOptions server;
  WorkerOptions worker;
  // The library's trace level while the daemon runs (a syslog priority).
  // At LOG_DEBUG every queue line is written to the log, which costs more
  // than indexing it under a storm; below it only failures are.
  int log_level = LOG_INFO;
};

// Thrown out of a wait when the daemon is asked to stop.
class StopRequested : public std::runtime_error {
 public:
  StopRequested() : std::runtime_error("the indexing daemon is stopping") {}
};

class IndexDaemon {
 public:
  explicit IndexDaemon(IndexDaemonOptions options);
  IndexDaemon(const IndexDaemon&) = delete;
  IndexDaemon& operator=(const IndexDaemon&) = delete;

  // Sets the library's trace level, opens the command socket, reads the
  // pause state and starts a worker for every indexed share with a folder
  // that is not paused. Returns false with
  // why when the socket cannot be made; unreadable state files are logged
  // and read as "running, no shares".
  bool Start(std::string& why);

  // A descriptor whose readability ends a wait early (the stop signals);
  // not owned.
  void set_wake_fd(int fd) { wake_fd_ = fd; }

  // One step: waits up to timeout_ms for a command (not at all while a
  // worker has work), answers every complete command, then lets each worker
  // take one step unless indexing is paused.
  void RunOnce(int timeout_ms);

  bool woken() const { return woken_; }

  // A wait of micros inside the library, such as the quarter of an hour it
  // waits after each busy answer of the search daemon: meanwhile the command
  // socket still answers "status" (other commands, which could change the
  // worker that is waiting, are answered "try again"), and a stop signal
  // ends the wait by throwing StopRequested through the library to the
  // worker, whose batch is then found again from its snapshot at the next
  // start. A wait that begins while a command is being answered is a plain
  // sleep. Install it as the process's sleep hook.
  void WaitServing(unsigned long micros);

  // Answers one command: "pause", "resume", "worker_create",
  // "worker_delete", "notify_setting_changed" and "status".
  Json::Value HandleCommand(const Json::Value& request);

  // {"paused", "resume_time", "shares": {share: worker status}}.
  Json::Value Status();

  bool HasWorker(const std::string& share) const { return workers_.count(share) > 0; }

 private:
  // True while indexing is paused; a pause whose end has come is lifted.
  bool Paused();
  void CreateWorker(const std::string& share);
  Json::Value Dispatch(const std::string& type, const Json::Value& data);

  IndexDaemonOptions options_;
  CommandServer server_;
  bool serving_ = false;  // inside server_.Poll: a wait must not poll again
  int wake_fd_ = -1;
  bool woken_ = false;
  int64_t resume_time_ = -1;
  std::map<std::string, std::unique_ptr<ShareWorker>> workers_;
};

}  // namespace indexd
}  // namespace orvex

#endif  // ORVEX_DAEMONS_INDEX_INDEX_DAEMON_H_
