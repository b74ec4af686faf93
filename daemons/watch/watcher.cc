#include "watch/watcher.h"

#include <dirent.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "orvex/foundation/log.h"
#include "orvex/queue/event.h"

namespace orvex {
namespace watch {
namespace {

using fileindex::EVENT_ATTR;
using fileindex::EVENT_CREATE;
using fileindex::EVENT_DELETE;
using fileindex::EVENT_MODIFY;
using fileindex::EVENT_RENAME;

// IN_CLOSE_WRITE rather than IN_MODIFY: one line when a writer is done, not
// one per write() call. IN_EXCL_UNLINK keeps files unlinked while still open
// from reporting into a directory they have left.
constexpr uint32_t kDirMask = IN_CREATE | IN_DELETE | IN_CLOSE_WRITE | IN_ATTRIB | IN_MOVED_FROM |
                              IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR |
                              IN_EXCL_UNLINK;
constexpr uint32_t kRegistryMask = IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM |
                                   IN_DELETE | IN_DELETE_SELF | IN_ONLYDIR;
// The two halves of a rename are queued one after the other by the same
// system call, but a reader on another CPU can see the first before the
// second is in. This is how long a lone first half at the end of a read
// waits for its pair before it counts as moved out.
constexpr int kMovePairWaitMs = 10;
// The platform's per-directory metadata folders: never watched, never told.
constexpr char kMetadataDir[] = "@eaDir";

#define WATCH_LOG(format, ...)                                                                   \
  ::orvex::LogPlain("%s:%d (%d, %u) " format, "watcher", __LINE__, static_cast<int>(::getpid()), \
                    static_cast<unsigned>(::geteuid()), __VA_ARGS__)

bool IsUnder(const std::string& path, const std::string& top) {
  return path == top || (path.size() > top.size() && path.compare(0, top.size(), top) == 0 &&
                         path[top.size()] == '/');
}

bool IsDirectory(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

std::string Parent(const std::string& path) {
  const size_t slash = path.rfind('/');
  return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

bool MakeDirs(const std::string& dir) {
  for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
    const std::string part = dir.substr(0, slash);
    if (::mkdir(part.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) break;
  }
  errno = 0;
  return true;
}

}  // namespace

Watcher::Watcher(WatcherOptions options) : options_(std::move(options)) {}

Watcher::~Watcher() = default;

bool Watcher::Start(std::string& why) {
  if (!events_.valid() || !registry_.valid()) {
    why = std::string("inotify_init1 failed: ") + std::strerror(errno) +
          " (raise fs.inotify.max_user_instances if the limit is reached)";
    return false;
  }
  if (!MakeDirs(options_.registry_dir)) {
    why = "cannot make " + options_.registry_dir + ": " + std::strerror(errno);
    return false;
  }
  const int wd = registry_.AddWatch(options_.registry_dir, kRegistryMask);
  if (wd < 0) {
    why = "cannot watch " + options_.registry_dir + ": " + std::strerror(errno);
    return false;
  }
  registry_wds_[wd] = options_.registry_dir;
  ResyncRegistry();
  FlushQueues();
  return true;
}

// ---------------------------------------------------------------- registry

void Watcher::ResyncRegistry() {
  // Made again if it was removed: a registry directory that came back is
  // watched again at the next resync.
  const bool watched = std::any_of(registry_wds_.begin(), registry_wds_.end(), [&](const auto& wd) {
    return wd.second == options_.registry_dir;
  });
  if (!watched && MakeDirs(options_.registry_dir)) {
    const int wd = registry_.AddWatch(options_.registry_dir, kRegistryMask);
    if (wd >= 0) registry_wds_[wd] = options_.registry_dir;
  }
  // Application directories are watched before their files are read, so a
  // registration written meanwhile is either read now or reported later.
  std::unique_ptr<DIR, int (*)(DIR*)> d(::opendir(options_.registry_dir.c_str()), ::closedir);
  while (d && (errno = 0, true)) {
    const struct dirent* e = ::readdir(d.get());
    if (e == nullptr) break;
    const std::string name = e->d_name;
    if (name == "." || name == "..") continue;
    const std::string app_dir = options_.registry_dir + "/" + name;
    const int wd = registry_.AddWatch(app_dir, kRegistryMask);
    if (wd >= 0) registry_wds_[wd] = app_dir;
  }
  errno = 0;
  std::map<std::string, std::string> bad;
  const std::map<std::string, Registration> now = ReadRegistry(options_.registry_dir, bad);
  for (const auto& [file, why] : bad) {
    if (told_bad_.insert(file).second) {
      WATCH_LOG("Registration %s is not usable (%s); it is left as it was", file.c_str(),
                why.c_str());
    }
  }
  std::vector<std::string> gone;
  for (const auto& [file, reg] : registrations_) {
    if (now.count(file) == 0 && bad.count(file) == 0) gone.push_back(file);
  }
  for (const std::string& file : gone) RemoveRegistration(file);
  for (const auto& [file, reg] : now) {
    told_bad_.erase(file);
    const auto old = registrations_.find(file);
    if (old == registrations_.end() || old->second.queue != reg.queue ||
        !(old->second.folders == reg.folders)) {
      AddRegistration(file, reg);
    }
  }
}

void Watcher::DrainRegistryEvents() {
  std::vector<InotifyEvent> events;
  registry_.ReadAvailable(events, SIZE_MAX);
  if (events.empty()) return;
  for (const InotifyEvent& ev : events) {
    if (ev.mask & IN_IGNORED) registry_wds_.erase(ev.wd);
  }
  // Registrations are few: reading them all again is simpler and safer than
  // following each file, and also covers an overflow of this instance.
  ResyncRegistry();
}

void Watcher::AddRegistration(const std::string& file, const Registration& reg) {
  const std::string fallback = reg.folders.empty() ? Parent(reg.queue) : reg.folders.front().path;
  const std::string crash_path = CrashMarkPath(reg.queue, fallback);
  std::vector<int> old = roots_of_[file];
  std::vector<int> kept;
  // Folders that stay as they were keep their watches untouched; new ones
  // are watched before the old ones go, so a directory both cover never
  // loses its watch in between.
  for (const WatchedFolder& folder : reg.folders) {
    auto same = std::find_if(old.begin(), old.end(), [&](int id) {
      return roots_[id].queue == reg.queue && roots_[id].folder == folder;
    });
    if (same != old.end()) {
      kept.push_back(*same);
      old.erase(same);
    } else {
      kept.push_back(AddRoot(file, reg.queue, folder, crash_path));
    }
  }
  for (int id : old) RemoveRoot(id);
  roots_of_[file] = kept;
  registrations_[file] = reg;
}

void Watcher::RemoveRegistration(const std::string& file) {
  for (int id : roots_of_[file]) RemoveRoot(id);
  roots_of_.erase(file);
  registrations_.erase(file);
}

int Watcher::AddRoot(const std::string& file, const std::string& queue, const WatchedFolder& folder,
                     const std::string& crash_path) {
  const int id = next_root_id_++;
  Root& root = roots_[id];
  root.registration = file;
  root.queue = queue;
  root.folder = folder;
  Queue& q = queues_[queue];
  if (!q.writer) q.writer = std::make_unique<QueueWriter>(queue, crash_path);
  ++q.users;
  queue_files_.insert(queue);
  queue_files_.insert(queue + ".tmp");
  root.present = IsDirectory(folder.path);
  if (root.present) {
    WatchTree({id}, folder.path, /*emit_creates=*/false);
  } else {
    WATCH_LOG("Folder %s of queue %s is missing; it is watched as soon as it exists",
              folder.path.c_str(), queue.c_str());
  }
  return id;
}

void Watcher::RemoveRoot(int id) {
  const Root root = roots_[id];
  DropRootFromTree(id, "");
  roots_.erase(id);
  Queue& q = queues_[root.queue];
  if (--q.users > 0) return;
  // What was seen before the registration went is still owed to the queue.
  q.writer->Flush(options_.max_waiting_lines);
  queues_.erase(root.queue);
  queue_files_.erase(root.queue);
  queue_files_.erase(root.queue + ".tmp");
}

// ---------------------------------------------------------------- watches

void Watcher::WatchTree(const std::set<int>& roots, const std::string& top, bool emit_creates) {
  std::vector<std::string> todo{top};
  while (!todo.empty()) {
    const std::string dir = std::move(todo.back());
    todo.pop_back();
    std::set<int> cover;
    for (int id : roots) {
      if (roots_.count(id) && Covers(roots_[id], dir)) cover.insert(id);
    }
    if (cover.empty() || WatchOne(cover, dir) < 0) continue;
    // Listed after the watch is in place: whatever appears from now on is
    // either in this listing or reported by the watch (or both; a create
    // told twice is harmless).
    std::unique_ptr<DIR, int (*)(DIR*)> d(::opendir(dir.c_str()), ::closedir);
    while (d) {
      const struct dirent* e = ::readdir(d.get());
      if (e == nullptr) break;
      const std::string name = e->d_name;
      if (name == "." || name == "..") continue;
      const std::string child = dir + "/" + name;
      bool is_dir = e->d_type == DT_DIR;
      if (e->d_type == DT_UNKNOWN) {
        struct stat st;
        is_dir = ::lstat(child.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
      }
      if (emit_creates) Emit(EVENT_CREATE, is_dir, child, cover);
      if (is_dir) todo.push_back(child);
    }
  }
  errno = 0;
}

int Watcher::WatchOne(const std::set<int>& roots, const std::string& dir) {
  const int fault = options_.watch_fault ? options_.watch_fault(dir) : 0;
  if (fault != 0) errno = fault;
  const int wd = fault != 0 ? -1 : events_.AddWatch(dir, kDirMask);
  if (wd < 0) {
    if (errno == ENOSPC) {
      WatchLimitReached(roots, dir);
    } else if (errno != ENOENT && errno != ENOTDIR) {
      WATCH_LOG("Cannot watch %s: %s; changes below it are not seen", dir.c_str(),
                std::strerror(errno));
    }
    errno = 0;
    return -1;
  }
  Dir& entry = dirs_[wd];
  if (entry.path != dir) {
    // The kernel knew this directory under another name we missed.
    const auto old = dir_by_path_.find(entry.path);
    if (old != dir_by_path_.end() && old->second == wd) dir_by_path_.erase(old);
    entry.path = dir;
  }
  dir_by_path_[dir] = wd;
  entry.roots.insert(roots.begin(), roots.end());
  return wd;
}

void Watcher::DropRootFromTree(int id, const std::string& top) {
  std::vector<int> empty;
  for (auto& [wd, dir] : dirs_) {
    if (!top.empty() && !IsUnder(dir.path, top)) continue;
    if (dir.roots.erase(id) && dir.roots.empty()) empty.push_back(wd);
  }
  for (int wd : empty) {
    events_.RemoveWatch(wd);
    EraseDir(wd);
  }
}

std::vector<int> Watcher::WatchesUnder(const std::string& top) const {
  std::vector<int> wds;
  for (auto it = dir_by_path_.lower_bound(top); it != dir_by_path_.end(); ++it) {
    if (it->first.compare(0, top.size(), top) != 0) break;  // past every "top..." name
    if (IsUnder(it->first, top)) wds.push_back(it->second);
  }
  return wds;
}

void Watcher::UnwatchTree(const std::string& top) {
  for (int wd : WatchesUnder(top)) {
    events_.RemoveWatch(wd);
    EraseDir(wd);
  }
}

void Watcher::Retarget(const std::string& from, const std::string& to) {
  std::vector<std::pair<std::string, int>> moved;
  for (auto it = dir_by_path_.lower_bound(from); it != dir_by_path_.end(); ++it) {
    if (it->first.compare(0, from.size(), from) != 0) break;
    if (IsUnder(it->first, from)) moved.emplace_back(it->first, it->second);
  }
  for (const auto& [path, wd] : moved) {
    dir_by_path_.erase(path);
    const std::string renamed = to + path.substr(from.size());
    dirs_[wd].path = renamed;
    dir_by_path_[renamed] = wd;
  }
}

void Watcher::EraseDir(int wd) {
  const auto it = dirs_.find(wd);
  if (it == dirs_.end()) return;
  const auto by_path = dir_by_path_.find(it->second.path);
  if (by_path != dir_by_path_.end() && by_path->second == wd) dir_by_path_.erase(by_path);
  dirs_.erase(it);
}

void Watcher::RetryMissingRoots(bool force) {
  const auto now = std::chrono::steady_clock::now();
  if (!force && now < next_retry_) return;
  next_retry_ = now + options_.missing_retry;
  for (auto& [id, root] : roots_) {
    if (root.present || !IsDirectory(root.folder.path)) continue;
    root.present = true;
    WATCH_LOG("Folder %s of queue %s is back; watching it again", root.folder.path.c_str(),
              root.queue.c_str());
    WatchTree({id}, root.folder.path, /*emit_creates=*/false);
    // What it holds now is unknown to the queue: a created directory is
    // indexed afresh as a whole.
    Emit(EVENT_CREATE, /*is_dir=*/true, root.folder.path, {id});
  }
}

void Watcher::WatchLimitReached(const std::set<int>& roots, const std::string& dir) {
  ++watch_limit_hits_;
  if (!told_watch_limit_) {
    told_watch_limit_ = true;
    WATCH_LOG(
        "Cannot watch %s: the inotify watch limit is reached, so changes below it are lost and "
        "its queue is marked crashed; raise the sysctl fs.inotify.max_user_watches",
        dir.c_str());
  }
  for (int id : roots) {
    const auto root = roots_.find(id);
    if (root != roots_.end()) queues_[root->second.queue].writer->AddCrashMark();
  }
}

// ---------------------------------------------------------------- events

size_t Watcher::RunOnce(int timeout_ms) {
  bool missing = false;
  for (const auto& [id, root] : roots_) missing = missing || !root.present;
  if (missing) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        next_retry_ - std::chrono::steady_clock::now());
    timeout_ms = std::max<int>(0, std::min<long long>(timeout_ms, left.count()));
  }
  struct pollfd fds[3] = {
      {events_.fd(), POLLIN, 0}, {registry_.fd(), POLLIN, 0}, {wake_fd_, POLLIN, 0}};
  const int nfds = wake_fd_ >= 0 ? 3 : 2;
  if (::poll(fds, nfds, timeout_ms) > 0 && nfds == 3 && (fds[2].revents & POLLIN)) woken_ = true;
  errno = 0;

  DrainRegistryEvents();
  size_t handled = 0;
  std::vector<InotifyEvent> batch;
  bool waited = false;
  while (handled < options_.max_events_per_step) {
    batch.clear();
    if (!events_.ReadAvailable(batch, options_.max_events_per_step - handled)) {
      WATCH_LOG("Cannot read file events: %s", std::strerror(errno));
      break;
    }
    for (const InotifyEvent& ev : batch) HandleEvent(ev);
    handled += batch.size();
    if (!batch.empty()) {
      waited = false;
      continue;
    }
    // Nothing more queued: a first half of a rename still alone gets one
    // short chance to meet its second half.
    if (!pending_move_ || waited) break;
    waited = true;
    struct pollfd more = {events_.fd(), POLLIN, 0};
    if (::poll(&more, 1, kMovePairWaitMs) <= 0) break;
  }
  FlushPendingMove();
  RetryMissingRoots(/*force=*/false);
  FlushQueues();
  errno = 0;
  return handled;
}

void Watcher::HandleEvent(const InotifyEvent& ev) {
  if (pending_move_ && !((ev.mask & IN_MOVED_TO) && ev.cookie == pending_move_->cookie)) {
    FlushPendingMove();
  }
  if (ev.mask & IN_Q_OVERFLOW) {
    Overflow();
    return;
  }
  const auto it = dirs_.find(ev.wd);
  if (it == dirs_.end()) return;  // a watch given up; its last events are moot
  if (ev.mask & IN_IGNORED) {
    EraseDir(ev.wd);
    return;
  }
  const Dir dir = it->second;  // handlers below change the maps
  if (ev.name.empty()) {
    HandleSelfEvent(dir, ev);
    return;
  }
  const std::string path = dir.path + "/" + ev.name;
  const bool is_dir = (ev.mask & IN_ISDIR) != 0;
  if (ev.mask & IN_CREATE) {
    Emit(EVENT_CREATE, is_dir, path, dir.roots);
    if (is_dir) WatchTree(dir.roots, path, /*emit_creates=*/true);
  } else if (ev.mask & IN_DELETE) {
    Emit(EVENT_DELETE, is_dir, path, dir.roots);
  } else if (ev.mask & IN_CLOSE_WRITE) {
    Emit(EVENT_MODIFY, /*is_dir=*/false, path, dir.roots);
  } else if (ev.mask & IN_ATTRIB) {
    Emit(EVENT_ATTR, is_dir, path, dir.roots);
  } else if (ev.mask & IN_MOVED_FROM) {
    pending_move_ = PendingMove{path, is_dir, ev.cookie, dir.roots};
  } else if (ev.mask & IN_MOVED_TO) {
    if (pending_move_) {
      const PendingMove from = std::move(*pending_move_);
      pending_move_.reset();
      Rename(from, path, dir.roots);
    } else {
      MovedIn(path, is_dir, dir.roots);
    }
  }
}

void Watcher::HandleSelfEvent(const Dir& dir, const InotifyEvent& ev) {
  // Changes of a directory inside a tree are told by its parent's watch,
  // with its name; only a registered folder itself has no parent watched.
  std::set<int> own;
  for (int id : dir.roots) {
    if (roots_[id].folder.path == dir.path && roots_[id].present) own.insert(id);
  }
  if (own.empty()) return;
  if (ev.mask & IN_ATTRIB) {
    Emit(EVENT_ATTR, /*is_dir=*/true, dir.path, own);
  } else if (ev.mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT)) {
    for (int id : own) {
      RootLost(id, ev.mask & IN_DELETE_SELF ? "was deleted" : "was moved or unmounted");
    }
  }
}

void Watcher::FlushPendingMove() {
  if (!pending_move_) return;
  const PendingMove from = std::move(*pending_move_);
  pending_move_.reset();
  // Moved out of every watched tree: gone, as far as the queues can tell.
  Emit(EVENT_DELETE, from.is_dir, from.path, from.roots);
  if (!from.is_dir) return;
  for (auto& [id, root] : roots_) {
    if (root.present && IsUnder(root.folder.path, from.path)) RootLost(id, "was moved away");
  }
  UnwatchTree(from.path);
}

void Watcher::Rename(const PendingMove& from, const std::string& to,
                     const std::set<int>& to_roots) {
  std::set<int> all = from.roots;
  all.insert(to_roots.begin(), to_roots.end());
  // Per queue: a rename inside what it watches, or else the half it sees.
  std::map<std::string, std::pair<const Root*, const Root*>> sides;
  for (int id : all) {
    const auto found = roots_.find(id);
    if (found == roots_.end()) continue;
    const Root& root = found->second;
    auto& side = sides[root.queue];
    if (Covers(root, from.path) && !side.first) side.first = &root;
    if (Covers(root, to) && !side.second) side.second = &root;
  }
  for (const auto& [queue, side] : sides) {
    QueueWriter& writer = *queues_[queue].writer;
    const Root* src = side.first;
    const Root* dst = side.second;
    if (src && dst && (dst->folder.mask & EVENT_RENAME)) {
      writer.Add(EventLine(EVENT_RENAME, from.is_dir, to, from.path));
      continue;
    }
    if (src && (src->folder.mask & EVENT_DELETE)) {
      writer.Add(EventLine(EVENT_DELETE, from.is_dir, from.path, ""));
    }
    if (dst && (dst->folder.mask & EVENT_CREATE)) {
      writer.Add(EventLine(EVENT_CREATE, from.is_dir, to, ""));
    }
  }
  if (!from.is_dir) return;
  // Registered folders inside the moved directory are no longer where they
  // were registered.
  for (auto& [id, root] : roots_) {
    if (root.present && IsUnder(root.folder.path, from.path) && root.folder.path != to) {
      RootLost(id, "was moved away with a directory above it");
    }
  }
  Retarget(from.path, to);
  // The watches follow the directories; which trees hold them may change
  // (moved out of an ignored name, into another folder, ...).
  std::vector<int> empty;
  bool newly_covered = dir_by_path_.count(to) == 0;
  for (int wd : WatchesUnder(to)) {
    Dir& dir = dirs_[wd];
    std::set<int> cover;
    std::set<int> candidates = all;
    candidates.insert(dir.roots.begin(), dir.roots.end());
    for (int id : candidates) {
      const auto found = roots_.find(id);
      if (found != roots_.end() && Covers(found->second, dir.path)) cover.insert(id);
    }
    if (dir.path == to) {
      for (int id : cover) newly_covered = newly_covered || dir.roots.count(id) == 0;
    }
    dir.roots = cover;
    if (cover.empty()) empty.push_back(wd);
  }
  for (int wd : empty) {
    events_.RemoveWatch(wd);
    EraseDir(wd);
  }
  if (newly_covered) WatchTree(to_roots, to, /*emit_creates=*/false);
}

void Watcher::MovedIn(const std::string& path, bool is_dir, const std::set<int>& roots) {
  // A directory moved in is created as a whole: the queue's consumer indexes
  // everything below it, so its content needs no line of its own.
  Emit(EVENT_CREATE, is_dir, path, roots);
  if (is_dir) WatchTree(roots, path, /*emit_creates=*/false);
}

void Watcher::Overflow() {
  ++overflows_;
  if (!told_overflow_) {
    told_overflow_ = true;
    WATCH_LOG("%s",
              "The kernel's event queue overflowed: changes were lost and every queue is marked "
              "crashed; raise the sysctl fs.inotify.max_queued_events if this repeats");
  }
  for (auto& [queue, q] : queues_) q.writer->AddCrashMark();
  // Directories made while events were being dropped have no watch yet.
  for (const auto& [id, root] : roots_) {
    if (root.present) WatchTree({id}, root.folder.path, /*emit_creates=*/false);
  }
}

void Watcher::RootLost(int id, const char* why) {
  Root& root = roots_[id];
  if (!root.present) return;
  Emit(EVENT_DELETE, /*is_dir=*/true, root.folder.path, {id});
  root.present = false;
  WATCH_LOG("Folder %s of queue %s %s; it is watched again when it returns",
            root.folder.path.c_str(), root.queue.c_str(), why);
  DropRootFromTree(id, "");
  next_retry_ = std::chrono::steady_clock::now() + options_.missing_retry;
}

// ---------------------------------------------------------------- lines

bool Watcher::Covers(const Root& root, const std::string& path) const {
  const std::string& top = root.folder.path;
  if (!root.present || !IsUnder(path, top) || queue_files_.count(path)) return false;
  // Only the components below the folder count: the folder was chosen as it
  // is, wherever it lives.
  for (size_t begin = top.size() + 1; begin < path.size();) {
    size_t end = path.find('/', begin);
    if (end == std::string::npos) end = path.size();
    const std::string name = path.substr(begin, end - begin);
    if (name == kMetadataDir || root.folder.ignore.count(name)) return false;
    begin = end + 1;
  }
  return true;
}

std::set<std::string> Watcher::AcceptingQueues(const std::set<int>& roots, const std::string& path,
                                               uint32_t kind) const {
  std::set<std::string> queues;
  for (int id : roots) {
    const auto it = roots_.find(id);
    if (it != roots_.end() && (it->second.folder.mask & kind) && Covers(it->second, path)) {
      queues.insert(it->second.queue);
    }
  }
  return queues;
}

void Watcher::Emit(uint32_t kind, bool is_dir, const std::string& path,
                   const std::set<int>& roots) {
  const std::set<std::string> queues = AcceptingQueues(roots, path, kind);
  if (queues.empty()) return;
  const std::string line = EventLine(kind, is_dir, path, "");
  for (const std::string& queue : queues) queues_[queue].writer->Add(line);
}

void Watcher::FlushQueues() {
  for (auto& [queue, q] : queues_) q.writer->Flush(options_.max_waiting_lines);
}

Json::Value Watcher::Status() const {
  Json::Value status(Json::objectValue);
  status["watches"] = static_cast<Json::UInt64>(dirs_.size());
  status["registrations"] = static_cast<Json::UInt64>(registrations_.size());
  status["overflows"] = static_cast<Json::UInt64>(overflows_);
  status["watch_limit_hits"] = static_cast<Json::UInt64>(watch_limit_hits_);
  Json::Value folders(Json::arrayValue);
  for (const auto& [id, root] : roots_) {
    Json::Value folder(Json::objectValue);
    folder["path"] = root.folder.path;
    folder["queue"] = root.queue;
    folder["mask"] = root.folder.mask;
    folder["watched"] = root.present;
    folders.append(folder);
  }
  status["folders"] = folders;
  Json::Value queues(Json::arrayValue);
  for (const auto& [path, q] : queues_) {
    Json::Value queue(Json::objectValue);
    queue["queue"] = path;
    queue["lines_written"] = static_cast<Json::UInt64>(q.writer->written_lines());
    queue["lines_waiting"] = static_cast<Json::UInt64>(q.writer->waiting_lines());
    queue["crash_marks"] = static_cast<Json::UInt64>(q.writer->crash_marks());
    queue["failed_appends"] = static_cast<Json::UInt64>(q.writer->failed_flushes());
    queues.append(queue);
  }
  status["queues"] = queues;
  return status;
}

}  // namespace watch
}  // namespace orvex
