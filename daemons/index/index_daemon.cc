#include "index/index_daemon.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <exception>
#include <utility>

#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/log.h"
#include "orvex/foundation/system_hooks.h"
#include "orvex/platform/sdk_share.h"
#include "orvex/status/status_mgr.h"

namespace orvex {
namespace indexd {

namespace {

std::string ShareOf(const Json::Value& data) {
  if (!data.isObject() || !data["share_name"].isString() || data["share_name"].asString().empty()) {
    throw Error(kErrorBadArgument, "Missing share_name");
  }
  return data["share_name"].asString();
}

}  // namespace

IndexDaemon::IndexDaemon(IndexDaemonOptions options)
    : options_(std::move(options)), server_(options_.server) {}

bool IndexDaemon::Start(std::string& why) {
  fileindex::log_level = options_.log_level;
  if (!server_.Listen(why)) return false;
  try {
    resume_time_ = fileindex::StatusMgr().GetPauseInfo();
  } catch (const std::exception& e) {
    LogPlain("fileindexd: cannot read the pause state, indexing runs: %s", e.what());
  }
  try {
    fileindex::FolderMgr folders;
    std::map<std::string, bool> running;  // share -> has an unpaused folder
    for (const auto& folder : folders.GetFolders()) {
      running[folder->GetShare()] |= !folder->IsPaused();
    }
    for (const auto& [share, unpaused] : running) {
      if (!unpaused) continue;
      try {
        CreateWorker(share);
      } catch (const std::exception& e) {
        LogPlain("fileindexd: no worker for share %s: %s", share.c_str(), e.what());
      }
    }
  } catch (const std::exception& e) {
    LogPlain("fileindexd: cannot read the folder list: %s", e.what());
  }
  return true;
}

void IndexDaemon::CreateWorker(const std::string& share) {
  if (workers_.count(share)) return;  // a refresh: the folders are read per batch
  std::unique_ptr<sdk::SDKShare> record = sdk::SDKShare::Find(share);
  if (!record) throw Error(kErrorNoShare, share);
  auto worker = std::make_unique<ShareWorker>(share, record->GetPath(), record->GetQueuePath(),
                                              options_.worker);
  if (fileindex::StatusMgr().GetShareStatus(share) & fileindex::NeedReindex) {
    worker->ScheduleFullWalk();
  }
  workers_[share] = std::move(worker);
}

bool IndexDaemon::Paused() {
  if (resume_time_ == fileindex::kResumeTimeRunning) return false;
  if (resume_time_ != fileindex::kResumeTimeNoEnd && Now() >= resume_time_) {
    resume_time_ = fileindex::kResumeTimeRunning;
    LogPlain("fileindexd: the pause has ended, indexing resumes");
    return false;
  }
  return true;
}

void IndexDaemon::RunOnce(int timeout_ms) {
  bool work = false;
  if (!Paused()) {
    for (const auto& [share, worker] : workers_) work |= worker->HasWork();
  }
  const auto handler = [this](const Json::Value& request) { return HandleCommand(request); };
  serving_ = true;
  if (server_.Poll(work ? 0 : timeout_ms, wake_fd_, handler)) woken_ = true;
  serving_ = false;
  if (Paused()) return;
  for (const auto& [share, worker] : workers_) worker->Step();
}

void IndexDaemon::WaitServing(unsigned long micros) {
  if (serving_ || woken_) {
    if (woken_) throw StopRequested();
    ::usleep(static_cast<useconds_t>(std::min<unsigned long>(micros, 999999)));
    return;
  }
  const auto handler = [this](const Json::Value& request) {
    if (request["type"] == "status") return HandleCommand(request);
    return ErrorAnswer(kErrorSearchDaemon,
                       "the search daemon is busy and indexing waits for it; try again later");
  };
  const auto end = std::chrono::steady_clock::now() + std::chrono::microseconds(micros);
  serving_ = true;
  for (auto now = std::chrono::steady_clock::now(); now < end && !woken_;
       now = std::chrono::steady_clock::now()) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - now).count();
    if (server_.Poll(static_cast<int>(std::min<int64_t>(left + 1, 1000)), wake_fd_, handler)) {
      woken_ = true;
    }
  }
  serving_ = false;
  if (woken_) throw StopRequested();
}

Json::Value IndexDaemon::HandleCommand(const Json::Value& request) {
  if (!request["type"].isString()) return ErrorAnswer(kErrorBadArgument, "Missing type");
  try {
    return Dispatch(request["type"].asString(), request["data"]);
  } catch (const Error& e) {
    return ErrorAnswer(e.code(), e.what());
  } catch (const std::exception& e) {
    return ErrorAnswer(kErrorSystem, e.what());
  }
}

Json::Value IndexDaemon::Dispatch(const std::string& type, const Json::Value& data) {
  if (type == "pause") {
    if (!data.isObject() || !data["resume_time"].isIntegral()) {
      throw Error(kErrorBadArgument, "Missing resume_time");
    }
    resume_time_ = data["resume_time"].asInt64();
  } else if (type == "resume") {
    resume_time_ = fileindex::kResumeTimeRunning;
    // Told to go on: whatever stopped a batch (the search daemon away, a
    // full volume) may be over, so nobody waits out a retry.
    for (const auto& [share, worker] : workers_) worker->RetryNow();
  } else if (type == "worker_create") {
    CreateWorker(ShareOf(data));
  } else if (type == "worker_delete") {
    workers_.erase(ShareOf(data));
  } else if (type == "notify_setting_changed") {
    const std::string share = ShareOf(data);
    if (!data["is_upsert"].isBool()) throw Error(kErrorBadArgument, "Missing is_upsert");
    if (data["is_upsert"].asBool()) {
      CreateWorker(share);
    } else if (!fileindex::FolderMgr().IsShareIndexed(share)) {
      // Told after a folder went: a share that keeps other folders keeps its
      // worker, which carries the removal into the index.
      workers_.erase(share);
    }
  } else if (type == "status") {
    return SuccessAnswer(Status());
  } else {
    throw Error(kErrorBadArgument, "Unknown command: " + type);
  }
  return SuccessAnswer(Json::nullValue);
}

Json::Value IndexDaemon::Status() {
  Json::Value out(Json::objectValue);
  const bool paused = Paused();
  out["paused"] = paused;
  out["resume_time"] = static_cast<Json::Int64>(resume_time_);
  out["shares"] = Json::objectValue;
  for (const auto& [share, worker] : workers_) {
    Json::Value status = worker->Status();
    if (paused) status["state"] = "paused";
    out["shares"][share] = status;
  }
  return out;
}

}  // namespace indexd
}  // namespace orvex
