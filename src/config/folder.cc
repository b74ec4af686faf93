#include "orvex/config/folder.h"

#include "foundation/check.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/policy/indexability.h"
#include "orvex/policy/share_path.h"
#include "orvex/queue/queue_mgr.h"
#include "orvex/status/status_mgr.h"

namespace orvex {
namespace fileindex {
namespace {

constexpr char kLogSource[] = "folder";

constexpr char kPathKey[] = "path";
constexpr char kNameKey[] = "name";
constexpr char kDocumentKey[] = "document";
constexpr char kAudioKey[] = "audio";
constexpr char kVideoKey[] = "video";
constexpr char kPhotoKey[] = "photo";
constexpr char kPausedKey[] = "paused";
constexpr char kVolumeToBeCleanKey[] = "volume_to_be_clean";

constexpr char kAdditionalKey[] = "additional";
constexpr char kStatusWord[] = "status";

}  // namespace

Folder::Folder(const std::string& path, const std::string& name, bool document, bool audio,
               bool video, bool photo, bool paused)
    : path_(path),
      name_(name),
      document_(document),
      audio_(audio),
      video_(video),
      photo_(photo),
      paused_(paused) {}

Folder::Folder(const Json::Value& data) {
  GetJsonValue(path_, data, kPathKey, /*required=*/true);
  GetJsonValue(name_, data, kNameKey, /*required=*/true);
  GetJsonValue(document_, data, kDocumentKey, /*required=*/true);
  GetJsonValue(audio_, data, kAudioKey, /*required=*/true);
  GetJsonValue(video_, data, kVideoKey, /*required=*/true);
  GetJsonValue(photo_, data, kPhotoKey, /*required=*/true);
  GetJsonValue(paused_, data, kPausedKey, /*required=*/false);
  GetJsonValue(volume_to_be_clean_, data, kVolumeToBeCleanKey, /*required=*/false);
}

Folder::~Folder() = default;

std::string Folder::GetShare() const {
  if (share_.empty()) share_ = GetShareNameByPath(path_);
  return share_;
}

void Folder::SetShare(const std::string& share) {
  const std::string old_share = GetShare();
  path_ = ReplacePathShare(path_, share, old_share);
  share_ = share;
}

std::string Folder::GetFullPath() const { return CachedFullPath(); }

const std::string& Folder::CachedFullPath() const {
  // The free function of the share path helpers, not this method.
  if (full_path_.empty()) full_path_ = fileindex::GetFullPath(path_);
  return full_path_;
}

Json::Value Folder::GetData() const {
  Json::Value data = GetIndexCfg();
  data[kPathKey] = path_;
  data[kNameKey] = name_;
  data[kPausedKey] = paused_;
  data[kVolumeToBeCleanKey] = volume_to_be_clean_;
  return data;
}

Json::Value Folder::GetIndexCfg() const {
  Json::Value cfg(Json::objectValue);
  cfg[kDocumentKey] = document_;
  cfg[kAudioKey] = audio_;
  cfg[kVideoKey] = video_;
  cfg[kPhotoKey] = photo_;
  return cfg;
}

bool Folder::IsIndexing() const {
  // Whether a folder is being indexed has always been asked with the folder
  // configuration loaded: a malformed folders file fails the question
  // (504) rather than answering it from the queue alone.
  const FolderMgr folders;
  (void)folders;
  const sdk::SDKShare share(GetShare());
  QueueMgr queue(share.GetQueuePath());
  return queue.IsFullPathProcessing(CachedFullPath());
}

void Folder::GetStatus(Json::Value& out) const {
  const StatusMgr status;
  // An invalid path outranks everything: such a folder cannot be indexed
  // whatever its share or queue say.
  if (!CanPathBeIndexed(path_)) {
    out["text"] = "error";
    out["desc"] = "invalid_path";
    return;
  }
  if (status.GetShareStatus(GetShare()) & NeedReindex) {
    out["text"] = "need_reindex";
    return;
  }
  if (!IsIndexing()) {
    out["text"] = "finished";
    return;
  }
  // Pending events under a pause: 0 pauses without end, a future time still
  // pauses, and -1 (running) or a time already past means work goes on. An
  // expired pause has no state of its own.
  const int64_t resume_time = status.GetPauseInfo();
  const bool running = resume_time != kResumeTimeNoEnd && Now() >= resume_time;
  out["text"] = running ? "processing" : "paused";
}

Json::Value Folder::GetDataWithAdditional(const Json::Value& additional) const {
  Json::Value data = GetData();
  // The condition text keeps the spelling the system has always logged.
  ORVEX_CHECK_AS(!additional.isArray(), "!addiitionals.isArray()", kErrorBadArgument,
                 toString(additional));
  for (const Json::Value& it : additional) {
    ORVEX_CHECK(!it.isString(), kErrorBadArgument, toString(it));
    const std::string word = it.asString();
    if (word != kStatusWord) throw Error(kErrorBadArgument, "Unknown additioal: " + word);
    GetStatus(data[kAdditionalKey][kStatusWord]);
  }
  return data;
}

}  // namespace fileindex
}  // namespace orvex
