#include "index_mgr/folder_page.h"

#include "foundation/check.h"
#include "index_mgr/pending_scan.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/indexability.h"

namespace orvex {
namespace fileindex {
namespace {

// The checks below are the folder record's own, logged as it logs them.
constexpr char kLogSource[] = "folder";

constexpr char kAdditionalKey[] = "additional";
constexpr char kStatusWord[] = "status";

}  // namespace

FolderPage::FolderPage(const std::vector<FolderMgr::FolderPtr>& folders)
    : folders_(folders), indexable_(folders.size()) {}

FolderPage::~FolderPage() = default;

Json::Value FolderPage::GetDataWithAdditional(size_t i, const Json::Value& additional) {
  Json::Value data = folders_[i]->GetData();
  ORVEX_CHECK_AS(!additional.isArray(), "!addiitionals.isArray()", kErrorBadArgument,
                 toString(additional));
  for (const Json::Value& it : additional) {
    ORVEX_CHECK(!it.isString(), kErrorBadArgument, toString(it));
    const std::string word = it.asString();
    if (word != kStatusWord) throw Error(kErrorBadArgument, "Unknown additioal: " + word);
    GetStatus(i, data[kAdditionalKey][kStatusWord]);
  }
  return data;
}

// Folder::GetStatus, step for step.
void FolderPage::GetStatus(size_t i, Json::Value& out) {
  const StatusMgr& status = Status();
  if (!Indexable(i)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
    return;
  }
  if (status.GetShareStatus(folders_[i]->GetShare()) & NeedReindex) {
    out["text"] = "need_reindex";
    return;
  }
  if (!IsIndexing(i)) {
    out["text"] = "finished";
    return;
  }
  const int64_t resume_time = status.GetPauseInfo();
  const bool running = resume_time != kResumeTimeNoEnd && Now() >= resume_time;
  out["text"] = running ? "processing" : "paused";
}

// Loaded on the first status asked for, where each folder's status would
// load it: a malformed status file fails at the same folder.
const StatusMgr& FolderPage::Status() {
  if (!status_) status_ = std::make_unique<StatusMgr>();
  return *status_;
}

bool FolderPage::Indexable(size_t i) {
  if (!indexable_[i]) indexable_[i] = CanPathBeIndexed(folders_[i]->GetPath());
  return *indexable_[i];
}

bool FolderPage::IsIndexing(size_t i) {
  ShareScan& share_scan = ScanFor(folders_[i]->GetShare());
  return share_scan.scan->IsPending(share_scan.target_of.at(i));
}

// The targets are the page's folders of the share whose status reaches the
// queue: indexable ones (the share's need-reindex flag, which stops the
// others, is the same for all of them, and clear, or no folder of it would
// be asking).
FolderPage::ShareScan& FolderPage::ScanFor(const std::string& share) {
  auto found = scans_.find(share);
  if (found != scans_.end()) return found->second;
  const sdk::SDKShare share_info(share);
  const std::string queue_path = share_info.GetQueuePath();
  ShareScan share_scan;
  std::vector<std::string> targets;
  for (size_t j = 0; j < folders_.size(); ++j) {
    // Indexable first: a malformed path has no share to ask for.
    if (!Indexable(j) || folders_[j]->GetShare() != share) continue;
    share_scan.target_of[j] = targets.size();
    targets.push_back(folders_[j]->GetFullPath());
  }
  share_scan.scan = std::make_unique<PendingScan>(queue_path, std::move(targets));
  return scans_.emplace(share, std::move(share_scan)).first->second;
}

}  // namespace fileindex
}  // namespace orvex
