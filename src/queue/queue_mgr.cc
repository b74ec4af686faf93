#include "orvex/queue/queue_mgr.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "foundation/check.h"
#include "orvex/foundation/lock.h"
#include "orvex/queue/event.h"
#include "queue/queue_scan.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "queue_mgr";
constexpr char kTmpSuffix[] = ".tmp";

// Anything at the path, a directory included: a queue path that names a
// directory must fail loudly when opened, not read as "no queue".
bool PathExists(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0;
}

}  // namespace

QueueMgr::QueueMgr(const std::string& queue_path)
    : queue_path_(queue_path), queue_path_tmp_(queue_path + kTmpSuffix) {}

QueueMgr::~QueueMgr() = default;

bool QueueMgr::PrepareTmpQueue() {
  if (!PathExists(queue_path_)) return false;
  // The producers append under this same lock, so the file is never moved
  // in the middle of a line.
  LockFile lock(queue_path_, /*exclusive=*/true);
  // An existing snapshot is an earlier run's work not yet done: it keeps its
  // place, and the live queue waits for the next rotation.
  if (PathExists(queue_path_tmp_)) return true;
  ORVEX_CHECK(0 > rename(queue_path_.c_str(), queue_path_tmp_.c_str()), kErrorSystem,
              "rename failed, reason=" + std::string(std::strerror(errno)));
  return true;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTree() const {
  if (!tree_) tree_ = std::make_shared<OPTree>(queue_path_);
  return tree_;
}

std::shared_ptr<OPTree> QueueMgr::GetOPTreeTmp() const {
  if (!tree_tmp_) tree_tmp_ = std::make_shared<OPTree>(queue_path_tmp_);
  return tree_tmp_;
}

int QueueMgr::ProcessOP(const std::function<void(std::shared_ptr<OP>)>& f, bool use_tmp) {
  if (use_tmp) {
    PrepareTmpQueue();
    if (!PathExists(queue_path_tmp_)) return 0;
    return GetOPTreeTmp()->ProcessOP(f);
  }
  if (!PathExists(queue_path_)) return 0;
  return GetOPTree()->ProcessOP(f);
}

void QueueMgr::DeleteTmp() { ::unlink(queue_path_tmp_.c_str()); }

bool QueueMgr::IsFullPathProcessing(const std::string& full_path) {
  auto touches = [&full_path](const Event& event) {
    return IsSameOrBelow(event.path, full_path) || IsSameOrBelow(event.path_old, full_path);
  };
  return ScanQueue(queue_path_, touches) || ScanQueue(queue_path_tmp_, touches);
}

bool QueueMgr::IsFullPathHasReindex(const std::string& full_path) {
  auto covers = [&full_path](const Event& event) {
    return event.event == EVENT_REINDEX && IsSameOrBelow(full_path, event.path);
  };
  return ScanQueue(queue_path_, covers) || ScanQueue(queue_path_tmp_, covers);
}

}  // namespace fileindex
}  // namespace orvex
