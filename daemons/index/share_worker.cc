#include "index/share_worker.h"

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <exception>
#include <utility>
#include <vector>

#include "elastic/channel.h"
#include "index/index_pages.h"
#include "index/ordered_tree_walk.h"
#include "orvex/elastic.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/foundation/util.h"
#include "orvex/queue/queue_mgr.h"
#include "orvex/status/status_mgr.h"

namespace orvex {
namespace indexd {

namespace el = fileindex::elastic;
using fileindex::OP;

namespace {

// The search daemon's answer to a change of a document it does not hold.
constexpr int kNoSuchDocument = 1107;

bool IsMetadataName(const std::string& name) {
  return name == "@eaDir" || name == "#recycle" || name == "#snapshot";
}

bool Exists(const std::string& path, bool& is_dir) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) return false;
  is_dir = S_ISDIR(st.st_mode);
  return true;
}

}  // namespace

struct ShareWorker::SubtreeWalk {
  OrderedTreeWalk disk;
  IndexPages index;
  bool refresh;
};

ShareWorker::ShareWorker(std::string share, std::string share_root, std::string queue_path,
                         WorkerOptions options)
    : share_(std::move(share)),
      share_root_(std::move(share_root)),
      queue_path_(std::move(queue_path)),
      options_(options),
      batch_(share_) {}

void ShareWorker::ScheduleFullWalk() {
  actions_.push_back({Kind::kReindex, share_root_, ""});
  full_walk_ = true;
  if (!in_batch_) {
    in_batch_ = true;
    from_snapshot_ = false;
    batch_start_ = Now();
    done_ = 0;
  }
}

bool ShareWorker::HasWork() const { return in_batch_ && retry_at_ <= Now(); }

size_t ShareWorker::Step() {
  const time_t now = Now();
  if (retry_at_ > now) return 0;
  size_t sent = 0;
  try {
    if (!in_batch_) {
      if (!SnapshotDue()) return 0;
      TakeSnapshot();
    }
    if (!folders_) folders_ = std::make_unique<fileindex::FolderMgr>();
    size_t work = 0;
    while (work < options_.step_budget && !actions_.empty()) {
      const Action action = actions_.front();
      actions_.pop_front();
      size_t n = 0;
      const size_t work_before = work;
      try {
        n = Perform(action, work);
      } catch (const Error& e) {
        if (e.code() != kErrorParseDocument) {
          actions_.push_front(action);
          throw;
        }
        // The file could not be read (it went, or it is not ours to read):
        // its own later event, or the next re-index, puts it right.
        LogPlain("fileindexd: share %s: skipped %s: %s", share_.c_str(), action.path.c_str(),
                 e.what());
      }
      if (work == work_before) work += std::max<size_t>(n, 1);
      sent += n;
      CountSent(n);
    }
    FlushBatch();
    if (actions_.empty()) FinishBatch();
    last_error_.clear();
  } catch (const std::exception& e) {
    // Sent since the last commit, then gathered but not sent: all again, in
    // that order, before the action that failed.
    actions_.insert(actions_.begin(), batched_.begin(), batched_.end());
    actions_.insert(actions_.begin(), uncommitted_.begin(), uncommitted_.end());
    uncommitted_.clear();
    batched_.clear();
    batched_paths_.clear();
    batch_.Clear();
    const auto* error = dynamic_cast<const Error*>(&e);
    if (error != nullptr && error->code() == kErrorNoSpace && !full_walk_) {
      // The share is flagged for a re-index: the batch that commits once
      // there is room again includes it, and clears the flag.
      ScheduleFullWalk();
    }
    last_error_ = e.what();
    retry_at_ = now + options_.retry_s;
    LogPlain("fileindexd: share %s: batch stopped, retry in %lds: %s", share_.c_str(),
             static_cast<long>(options_.retry_s), e.what());
  }
  return sent;
}

int64_t ShareWorker::NowMs() const {
  if (options_.clock_ms) return options_.clock_ms();
  return std::chrono::duration_cast<std::chrono::milliseconds>(
             std::chrono::steady_clock::now().time_since_epoch())
      .count();
}

bool ShareWorker::SnapshotDue() {
  if (IsFileExist(queue_path_ + ".tmp")) return true;  // left by a run that did not finish
  struct stat st;
  if (::stat(queue_path_.c_str(), &st) != 0 || st.st_size == 0) {
    seen_size_ = 0;
    first_seen_.reset();
    return false;
  }
  const int64_t now = NowMs();
  if (st.st_size != seen_size_) {
    seen_size_ = st.st_size;
    seen_change_ = now;
    if (!first_seen_) first_seen_ = now;
  }
  return now - seen_change_ >= options_.quiet_ms || now - *first_seen_ >= options_.max_wait_ms;
}

void ShareWorker::TakeSnapshot() {
  // The folder list of the moment governs the whole batch.
  folders_ = std::make_unique<fileindex::FolderMgr>();
  fileindex::QueueMgr queue(queue_path_);
  queue.ProcessOP([this](std::shared_ptr<OP> op) { AddOp(op); }, /*use_tmp=*/true);
  // Directories change with their entries, which report no event of their
  // own: refreshed last, once each, as they are when the batch ends.
  for (const std::string& path : refresh_) actions_.push_back({Kind::kRefresh, path, ""});
  refresh_.clear();
  in_batch_ = true;
  from_snapshot_ = true;
  batch_start_ = Now();
  done_ = 0;
  seen_size_ = 0;
  first_seen_.reset();
}

void ShareWorker::AddOp(const std::shared_ptr<OP>& op) {
  const std::string path = op->node->GetPath();
  switch (op->kind) {
    case fileindex::OP_DELETE:
      actions_.push_back({Kind::kDelete, path, ""});
      TouchParent(path);
      break;
    case fileindex::OP_UPSERT:
      actions_.push_back({Kind::kUpsert, path, ""});
      TouchParent(path);
      break;
    case fileindex::OP_ATTR:
      actions_.push_back({Kind::kAttr, path, ""});
      break;
    case fileindex::OP_RENAME:
      actions_.push_back({Kind::kRename, path, op->path});
      rename_targets_.insert(path);
      // A moved item's own change time moves with it.
      refresh_.insert(path);
      TouchParent(path);
      TouchParent(op->path);
      break;
    // A configuration change may switch metadata on or off for some file
    // types or remove the folder: the subtree is indexed again as it now
    // stands.
    case fileindex::OP_UPDATE_CFG:
      actions_.push_back({Kind::kReindex, path, "", /*refresh=*/true});
      break;
    case fileindex::OP_REINDEX:
      actions_.push_back({Kind::kReindex, path, "", false});
      TouchParent(path);
      break;
    case fileindex::OP_QUEUE_CRASHED:
      actions_.push_back({Kind::kReindex, share_root_, "", false});
      break;
    case fileindex::OP_NONE:
      break;
  }
}

size_t ShareWorker::Perform(const Action& action, size_t& work) {
  switch (action.kind) {
    case Kind::kDelete:
      return Remove(action.path, /*with_descendants=*/false);
    case Kind::kDeleteTree:
      return Remove(action.path, /*with_descendants=*/true);
    case Kind::kUpsert:
      return Upsert(action.path, /*attr_only=*/false);
    case Kind::kAttr:
      return Upsert(action.path, /*attr_only=*/true);
    case Kind::kRename:
      return Rename(action.from, action.path);
    case Kind::kReindex:
      return Reindex(action.path, action.refresh);
    case Kind::kWalk:
      return WalkSome(action, work);
    case Kind::kRefresh:
      return Refresh(action.path);
  }
  return 0;
}

void ShareWorker::TouchParent(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash != std::string::npos && slash > 0) refresh_.insert(path.substr(0, slash));
}

// What is gone is removed and what remains is indexed again. Files whose
// size and change times match their document are not read again unless the
// folder's settings changed (refresh).
size_t ShareWorker::Reindex(const std::string& path, bool refresh) {
  bool is_dir = false;
  const bool exists = Exists(path, is_dir);
  if (IsDocument(path) && exists) {
    if (!is_dir) {
      const size_t sent = Upsert(path, /*attr_only=*/false);
      // Once a directory (now a file or a link in its place): what the index
      // still holds below it goes.
      FlushBatch();
      el::IndexDelDir(share_, path);
      Uncommitted(Kind::kReindex, path);
      return sent + 1;
    }
    auto walk = StartWalk(path, refresh);
    const size_t sent = Upsert(path, /*attr_only=*/false);
    actions_.push_front({Kind::kWalk, path, "", refresh, std::move(walk)});
    return sent;
  }
  // A path that is no document itself may still hold indexed folders (the
  // share root of a crashed queue, a renamed share): the walk goes down to
  // them, and what else the index holds below the path goes.
  if (!exists || !is_dir || InMetadataFolder(path) || FoldersBelow(path).empty()) {
    return Remove(path, /*with_descendants=*/true);
  }
  actions_.push_front({Kind::kWalk, path, "", refresh, StartWalk(path, refresh)});
  return 0;
}

std::shared_ptr<ShareWorker::SubtreeWalk> ShareWorker::StartWalk(const std::string& dir,
                                                                 bool refresh) {
  // Yields the documents below dir and goes down into the directories that
  // are documents or hold indexed folders. The targets of the batch's
  // pending renames are left to those renames, which move their documents
  // instead of reading the files again.
  auto visit = [this](const std::string& path, bool is_dir) -> OrderedTreeWalk::Visit {
    if (rename_targets_.count(path) != 0) return {};
    const bool document = IsDocument(path);
    return {document, is_dir && (document || !FoldersBelow(path).empty())};
  };
  auto walk = std::make_shared<SubtreeWalk>(SubtreeWalk{
      OrderedTreeWalk(dir, visit), IndexPages(share_, dir + "/", options_.page_size), refresh});
  // What the index holds is asked before anything below dir is sent, and
  // after what was gathered: the listing must see it. Later pages need no
  // flush: a walk's changes are to paths at or before the last one listed,
  // and the next page starts after it.
  FlushBatch();
  walk->index.Peek();
  return walk;
}

size_t ShareWorker::WalkSome(const Action& action, size_t& work) {
  SubtreeWalk& walk = *action.walk;
  size_t sent = 0;
  while (work < options_.step_budget) {
    const OrderedTreeWalk::Entry* found = walk.disk.Peek();
    const IndexPages::Doc* known = walk.index.Peek();
    if (found == nullptr && known == nullptr) return sent;
    ++work;
    if (found == nullptr || (known != nullptr && known->path < found->path)) {
      // Held by the index, not found by the walk.
      Batch(Kind::kDelete, known->path);
      ++sent;
      walk.index.Pop();
      continue;
    }
    const bool held = known != nullptr && known->path == found->path;
    const bool unchanged = held && known->size == found->size && known->ctime == found->ctime &&
                           known->mtime == found->mtime;
    if (walk.refresh || !unchanged) sent += UpsertFound(found->path);
    walk.disk.Pop();
    if (held) walk.index.Pop();
  }
  actions_.push_front(action);  // the rest at the next step
  return sent;
}

size_t ShareWorker::UpsertFound(const std::string& path) {
  try {
    return Upsert(path, /*attr_only=*/false);
  } catch (const Error& e) {
    if (e.code() != kErrorParseDocument) throw;
    LogPlain("fileindexd: share %s: skipped %s: %s", share_.c_str(), path.c_str(), e.what());
    return 0;
  }
}

size_t ShareWorker::Rename(const std::string& from, const std::string& to) {
  const auto pending = rename_targets_.find(to);
  if (pending != rename_targets_.end()) rename_targets_.erase(pending);
  FlushBatch();  // the move must find the documents as gathered so far
  const bool from_doc = IsDocument(from);
  const bool to_doc = IsDocument(to);
  if (from_doc && to_doc) {
    try {
      el::IndexRename(share_, from, to);
      Uncommitted(Kind::kRename, to, from);
    } catch (const Error& e) {
      if (e.code() != kNoSuchDocument) throw;
      // The source never reached the index (made and renamed within moments,
      // like a lock file): the target is indexed as it is, and anything still
      // recorded below the source goes.
      actions_.push_front({Kind::kReindex, to, ""});
      return Remove(from, /*with_descendants=*/true);
    }
    return 1;
  }
  if (from_doc) return Remove(from, /*with_descendants=*/true);  // moved out of the index
  if (to_doc) {
    actions_.push_front({Kind::kReindex, to, ""});  // moved in: nothing to move
    return 0;
  }
  // A renamed share root: the indexed folders below it move with it.
  if (!FoldersBelow(to).empty()) {
    el::IndexRename(share_, from, to);
    Uncommitted(Kind::kRename, to, from);
    return 1;
  }
  return 0;
}

size_t ShareWorker::Refresh(const std::string& path) {
  bool is_dir = false;
  if (!IsDocument(path) || !Exists(path, is_dir)) return 0;  // a delete of its own follows
  // A directory's document has no content to read.
  return Upsert(path, /*attr_only=*/!is_dir);
}

size_t ShareWorker::Upsert(const std::string& path, bool attr_only) {
  if (!IsDocument(path)) return 0;
  bool is_dir = false;
  if (!Exists(path, is_dir)) {
    Batch(Kind::kDelete, path);  // gone before its turn came
    return 1;
  }
  Batch(attr_only ? Kind::kAttr : Kind::kUpsert, path);
  if (!attr_only && !is_dir) ++total_read_;
  return 1;
}

void ShareWorker::Batch(Kind kind, const std::string& path) {
  if (batched_paths_.count(path) != 0 || batch_.size() >= options_.batch_docs ||
      batch_.bytes() >= options_.batch_bytes) {
    FlushBatch();
  }
  // Built first: an unreadable file (Error 914) leaves the batch as it was.
  if (kind == Kind::kUpsert) {
    batch_.Upsert(path, folders_->IsFullPathNeedMeta(path));
  } else if (kind == Kind::kAttr) {
    batch_.Attr(path);
  } else {
    batch_.Del(path);
  }
  batched_.push_back({kind, path, ""});
  batched_paths_.insert(path);
}

void ShareWorker::FlushBatch() {
  if (batched_.empty()) return;
  const std::vector<el::DocumentFailure> failures = batch_.Flush();
  std::vector<Action> refused;
  std::vector<int> codes;
  size_t next = 0;
  for (size_t i = 0; i < batched_.size(); ++i) {
    if (next < failures.size() && failures[next].index == i) {
      refused.push_back(batched_[i]);
      codes.push_back(failures[next].code);
      ++next;
    } else {
      uncommitted_.push_back(batched_[i]);
    }
  }
  // What was refused stays gathered until it is done, so that a batch that
  // stops on it sends it again.
  batched_ = std::move(refused);
  batched_paths_.clear();
  for (size_t i = 0; !batched_.empty(); ++i) {
    SendAlone(batched_.front(), codes[i]);
    batched_.erase(batched_.begin());
  }
}

void ShareWorker::SendAlone(const Action& action, int refused_code) {
  const std::string& path = action.path;
  try {
    if (action.kind == Kind::kDelete) {
      el::IndexDel(share_, path);
      Uncommitted(Kind::kDelete, path);
      return;
    }
    if (action.kind == Kind::kAttr) {
      // Never indexed (its upsert was skipped): the whole document it is.
      if (refused_code != kNoSuchDocument && AttrAlone(path)) return;
      bool is_dir = false;
      if (Exists(path, is_dir) && !is_dir) ++total_read_;
    }
    el::IndexUpsert(share_, path, folders_->IsFullPathNeedMeta(path));
    Uncommitted(Kind::kUpsert, path);
  } catch (const Error& e) {
    // Gone or unreadable since it was gathered: its own later event, or the
    // next re-index, puts it right.
    if (e.code() != kErrorParseDocument) throw;
    LogPlain("fileindexd: share %s: skipped %s: %s", share_.c_str(), path.c_str(), e.what());
  }
}

bool ShareWorker::AttrAlone(const std::string& path) {
  try {
    el::IndexAttr(share_, path);
  } catch (const Error& e) {
    if (e.code() != kNoSuchDocument) throw;
    return false;
  }
  Uncommitted(Kind::kAttr, path);
  return true;
}

size_t ShareWorker::Remove(const std::string& path, bool with_descendants) {
  if (InMetadataFolder(path)) return 0;  // never a document
  if (!with_descendants) {
    Batch(Kind::kDelete, path);
    return 1;
  }
  FlushBatch();  // what was gathered below path goes too
  el::IndexDel(share_, path);
  el::IndexDelDir(share_, path);
  Uncommitted(Kind::kDeleteTree, path);
  return 2;
}

void ShareWorker::Uncommitted(Kind kind, const std::string& path, const std::string& from) {
  uncommitted_.push_back({kind, path, from});
}

void ShareWorker::CountSent(size_t sent) {
  since_commit_ += sent;
  done_ += sent;
  total_done_ += sent;
  if (since_commit_ >= options_.commit_every) Commit();
}

void ShareWorker::Commit() {
  FlushBatch();
  el::IndexCommit(share_);
  since_commit_ = 0;
  uncommitted_.clear();
}

void ShareWorker::FinishBatch() {
  if (since_commit_ > 0) Commit();
  uncommitted_.clear();
  // Only now, with everything committed, may the snapshot go: a run killed
  // before this point finds it again and starts the batch over.
  if (from_snapshot_) fileindex::QueueMgr(queue_path_).DeleteTmp();
  if (full_walk_) {
    fileindex::StatusMgr().UnsetShareStatus(share_, fileindex::NeedReindex);
    full_walk_ = false;
  }
  in_batch_ = false;
  from_snapshot_ = false;
  rename_targets_.clear();
  folders_.reset();
}

bool ShareWorker::IsDocument(const std::string& path) const {
  if (InMetadataFolder(path) || !folders_) return false;
  try {
    return folders_->GetMostSuitableCfg(path) != nullptr;
  } catch (const Error&) {
    return false;  // a folder of a share that is gone governs nothing
  }
}

bool ShareWorker::InMetadataFolder(const std::string& path) {
  size_t start = 0;
  while (start <= path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string::npos) end = path.size();
    if (IsMetadataName(path.substr(start, end - start))) return true;
    start = end + 1;
  }
  return false;
}

std::vector<std::string> ShareWorker::FoldersBelow(const std::string& path) const {
  std::vector<std::string> below;
  if (!folders_) return below;
  for (const auto& folder : folders_->GetFolders()) {
    try {
      if (folder->GetShare() != share_) continue;
      const std::string full = folder->GetFullPath();
      if (full == path || StringStartWith(full, path + "/")) below.push_back(full);
    } catch (const Error&) {
    }
  }
  return below;
}

Json::Value ShareWorker::Status() const {
  const time_t now = Now();
  Json::Value out(Json::objectValue);
  if (retry_at_ > now) {
    out["state"] = "retrying";
  } else if (in_batch_) {
    out["state"] = "indexing";
  } else if (seen_size_ > 0) {
    out["state"] = "waiting";
  } else {
    out["state"] = "idle";
  }
  const double elapsed = static_cast<double>(std::max<time_t>(1, now - batch_start_));
  const double rate = in_batch_ ? static_cast<double>(done_) / elapsed : 0.0;
  out["done"] = static_cast<Json::Int64>(done_);
  out["todo"] = static_cast<Json::Int64>(actions_.size());
  out["rate"] = rate;
  out["eta"] = rate > 0 ? static_cast<Json::Int64>(static_cast<double>(actions_.size()) / rate)
                        : static_cast<Json::Int64>(-1);
  out["total_done"] = static_cast<Json::Int64>(total_done_);
  out["total_read"] = static_cast<Json::Int64>(total_read_);
  out["last_error"] = last_error_;
  return out;
}

}  // namespace indexd
}  // namespace orvex
