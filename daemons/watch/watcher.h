// Watcher: the heart of kalonotifyd. It follows the monitor registrations
// (one file per queue under the registry directory, doc/monitor_registry.md),
// watches every registered folder recursively with inotify, and appends one
// queue line per change (doc/queue_line.md) to each queue whose folders
// cover the change, in batches under the queue's lock. The loop is a step
// function, RunOnce(), so that tests drive it without threads.
// One thread at a time.
#ifndef ORVEX_DAEMONS_WATCH_WATCHER_H_
#define ORVEX_DAEMONS_WATCH_WATCHER_H_

#include <json/json.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "watch/inotify.h"
#include "watch/queue_writer.h"
#include "watch/registration.h"

namespace orvex {
namespace watch {

struct WatcherOptions {
  // The registry directory as it is opened (ORVEX_ROOT already applied);
  // created when missing.
  std::string registry_dir;
  // How often a registered folder that is missing is looked for again.
  std::chrono::milliseconds missing_retry{2000};
  // Lines that may wait for a queue that cannot be written before they are
  // replaced by a crash mark.
  size_t max_waiting_lines = 200000;
  // Events handled per step at most, so that queues are appended to and the
  // step returns regularly even under a storm.
  size_t max_events_per_step = 16384;
  // Tests only: when set and it returns an errno value for a directory, the
  // watch of that directory fails with it as if the kernel had refused
  // (ENOSPC: the watch limit), since the real limit is one for the whole
  // machine.
  std::function<int(const std::string& dir)> watch_fault;
};

class Watcher {
 public:
  explicit Watcher(WatcherOptions options);
  Watcher(const Watcher&) = delete;
  Watcher& operator=(const Watcher&) = delete;
  ~Watcher();

  // Opens the inotify instances, watches the registry and reads it, watching
  // every registered folder. Returns false with why when inotify cannot be
  // used at all or the registry directory cannot be made or watched.
  bool Start(std::string& why);

  // A descriptor whose readability ends a wait early (the program's stop
  // signals); not owned.
  void set_wake_fd(int fd) { wake_fd_ = fd; }

  // One step: waits up to timeout_ms for a change (or the wake descriptor),
  // follows the registry, handles every file event read, looks for missing
  // folders when due, and appends the lines to their queues before it
  // returns. Returns the number of kernel events handled. Every event read
  // is handled and written in the same step.
  size_t RunOnce(int timeout_ms);

  // True once the wake descriptor has been seen readable.
  bool woken() const { return woken_; }

  // What the status file shows: folders, watches, lines per queue.
  Json::Value Status() const;

  size_t watch_count() const { return dirs_.size(); }

 private:
  struct Root {
    std::string registration;  // file it came from
    std::string queue;
    WatchedFolder folder;
    bool present = false;
  };
  struct Dir {
    std::string path;
    std::set<int> roots;  // ids of the roots whose tree holds this directory
  };
  struct PendingMove {
    std::string path;
    bool is_dir = false;
    uint32_t cookie = 0;
    std::set<int> roots;
  };
  struct Queue {
    std::unique_ptr<QueueWriter> writer;
    int users = 0;  // roots writing to it
  };

  // Registry.
  void ResyncRegistry();
  void DrainRegistryEvents();
  void AddRegistration(const std::string& file, const Registration& reg);
  void RemoveRegistration(const std::string& file);
  int AddRoot(const std::string& file, const std::string& queue, const WatchedFolder& folder,
              const std::string& crash_path);
  void RemoveRoot(int id);

  // Watches.
  void WatchTree(const std::set<int>& roots, const std::string& top, bool emit_creates);
  int WatchOne(const std::set<int>& roots, const std::string& dir);
  void DropRootFromTree(int id, const std::string& top);
  // Watch descriptors of the directories at or below top, by path.
  std::vector<int> WatchesUnder(const std::string& top) const;
  void UnwatchTree(const std::string& top);
  void Retarget(const std::string& from, const std::string& to);
  void EraseDir(int wd);
  void RetryMissingRoots(bool force);
  void WatchLimitReached(const std::set<int>& roots, const std::string& dir);

  // Events.
  void HandleEvent(const InotifyEvent& ev);
  void HandleSelfEvent(const Dir& dir, const InotifyEvent& ev);
  void FlushPendingMove();
  void Rename(const PendingMove& from, const std::string& to, const std::set<int>& to_roots);
  void MovedIn(const std::string& path, bool is_dir, const std::set<int>& roots);
  void Overflow();
  void RootLost(int id, const char* why);

  // Lines.
  bool Covers(const Root& root, const std::string& path) const;
  std::set<std::string> AcceptingQueues(const std::set<int>& roots, const std::string& path,
                                        uint32_t kind) const;
  void Emit(uint32_t kind, bool is_dir, const std::string& path, const std::set<int>& roots);
  void FlushQueues();

  WatcherOptions options_;
  Inotify events_;
  Inotify registry_;
  int wake_fd_ = -1;
  bool woken_ = false;

  std::map<std::string, Registration> registrations_;  // by file
  std::map<std::string, std::vector<int>> roots_of_;   // file -> root ids
  std::map<int, Root> roots_;
  int next_root_id_ = 1;
  std::map<std::string, Queue> queues_;
  std::set<std::string> queue_files_;  // never reported: queues and snapshots

  std::unordered_map<int, Dir> dirs_;  // by watch descriptor
  std::map<std::string, int> dir_by_path_;
  std::map<int, std::string> registry_wds_;  // registry and application dirs

  std::optional<PendingMove> pending_move_;
  std::chrono::steady_clock::time_point next_retry_{};

  uint64_t overflows_ = 0;
  uint64_t watch_limit_hits_ = 0;
  bool told_overflow_ = false;
  bool told_watch_limit_ = false;
  std::set<std::string> told_bad_;  // registration files reported as bad
};

}  // namespace watch
}  // namespace orvex

#endif  // ORVEX_DAEMONS_WATCH_WATCHER_H_
