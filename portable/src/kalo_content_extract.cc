#include "kalo/kalo_content_extract.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <utility>

#include "extract_client.h"
#include "kalo/kalo_error.h"
#include "kalo_log.h"
#include "orvex/portable/extract_protocol.h"
#include "orvex/portable/root.h"

namespace KALO {
namespace CONTENT_EXTRACT {
namespace {

using orvex::portable::ExtractFailureRecord;
using orvex::portable::ExtractOutcome;

// The same rule as the library's file-type classification, so that a
// renamed item and a re-extracted one carry the same extension.
std::string LowerExtension(const std::string& name) {
  const size_t dot = name.rfind('.');
  if (dot == std::string::npos) return "";
  std::string ext = name.substr(dot + 1);
  for (char& c : ext) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return ext;
}

std::string Octal(unsigned int mode) {
  char text[16];
  std::snprintf(text, sizeof(text), "%04o", mode & 07777);
  return text;
}

void AddNames(const std::string& path, Json::Value& doc) {
  const size_t slash = path.rfind('/');
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  doc["KALOMDPath"] = path;
  doc["KALOMDFSName"] = name;
  doc["KALOMDParent"] = slash == std::string::npos ? path : path.substr(0, slash);
  doc["KALOMDExtension"] = LowerExtension(name);
}

void AddAttributes(const struct statx& st, Json::Value& doc) {
  doc["KALOMDIsDir"] = S_ISDIR(st.stx_mode);
  doc["KALOMDFSSize"] = static_cast<Json::Int64>(st.stx_size);
  doc["KALOMDPhysicalSize"] = static_cast<Json::Int64>(st.stx_blocks * 512);
  doc["KALOMDFSContentChangeDate"] = static_cast<Json::Int64>(st.stx_mtime.tv_sec);
  doc["KALOMDAttributeChangeDate"] = static_cast<Json::Int64>(st.stx_ctime.tv_sec);
  // Not every file system records a birth time; no date beats a made-up one.
  if (st.stx_mask & STATX_BTIME) {
    doc["KALOMDFSCreationDate"] = static_cast<Json::Int64>(st.stx_btime.tv_sec);
  }
  doc["KALOMDOwnerUserID"] = std::to_string(st.stx_uid);
  doc["KALOMDOwnerGroupID"] = std::to_string(st.stx_gid);
  doc["KALOMDPrivilege"] = Octal(st.stx_mode);
}

// A positive integer member of cfg, or fallback.
int Setting(const Json::Value& cfg, const char* name, int fallback) {
  if (!cfg.isObject()) return fallback;
  const Json::Value& value = cfg[name];
  if (!value.isIntegral() || value.asInt64() <= 0 || value.asInt64() > 24 * 3600 * 1000) {
    return fallback;
  }
  return value.asInt();
}

bool NeedMeta(const Json::Value& cfg) {
  return cfg.isObject() && cfg["need_meta"].isBool() && cfg["need_meta"].asBool();
}

// The attributes win: they were read just now from the file system, the
// metadata by another process from a file that may have changed since.
void MergeMetadata(const Json::Value& meta, Json::Value& doc) {
  for (const std::string& name : meta.getMemberNames()) {
    if (!doc.isMember(name)) doc[name] = meta[name];
  }
}

ExtractOutcome Extract(const std::string& path, const Json::Value& cfg) {
  using orvex::portable::RootPath;
  const int deadline_ms = Setting(cfg, "deadline_ms", orvex::portable::kDefaultExtractDeadlineMs);
  const int memory_mb = Setting(cfg, "memory_mb", orvex::portable::kDefaultExtractMemoryMb);
  ExtractOutcome outcome;
  if (orvex::portable::AskExtractDaemon(RootPath(orvex::portable::kExtractSocketPath), path,
                                        deadline_ms, outcome)) {
    return outcome;
  }
  return orvex::portable::RunExtractProgram(RootPath(orvex::portable::kExtractProgramPath), path,
                                            deadline_ms, memory_mb);
}

// Metadata of a regular file, isolated from this process. A file whose
// extraction crashed, hung or ran out of memory is recorded and not tried
// again until its size or change time differs; it keeps its attributes.
void AddMetadata(const std::string& path, const Json::Value& cfg, const struct statx& st,
                 Json::Value& doc) {
  ExtractFailureRecord record(orvex::portable::RootPath(orvex::portable::kExtractFailuresPath));
  const ExtractFailureRecord::State recorded = record.Lookup(path, st);
  if (recorded == ExtractFailureRecord::kSameFile) return;
  const ExtractOutcome outcome = Extract(path, cfg);
  switch (outcome.kind) {
    case ExtractOutcome::kOk:
      MergeMetadata(outcome.data, doc);
      if (recorded == ExtractFailureRecord::kChangedFile) record.Remove(path);
      break;
    case ExtractOutcome::kProblem:
      MergeMetadata(outcome.data, doc);
      KALO_LOG(LOG_NOTICE, "Extraction incomplete [%s], reason: %s", path.c_str(),
               outcome.reason.c_str());
      break;
    case ExtractOutcome::kFault:
      KALO_LOG(LOG_WARNING, "Extraction failed [%s], reason: %s; not tried again until it changes",
               path.c_str(), outcome.reason.c_str());
      if (!record.Add(path, st, outcome.reason)) {
        KALO_LOG(LOG_ERR, "Cannot record the extraction failure of [%s]: %s", path.c_str(),
                 std::strerror(errno));
      }
      break;
    case ExtractOutcome::kUnavailable:
      KALO_LOG(LOG_WARNING, "No metadata for [%s], reason: %s", path.c_str(),
               outcome.reason.c_str());
      break;
  }
}

}  // namespace

bool ParseFile(const std::string& path, const Json::Value& cfg, Json::Value& out) {
  if (path.empty()) {
    errno = EINVAL;
    KLIBC_ERR_SET(KLIB_ERR_BAD_PARAMETER);
    return false;
  }
  struct statx st;
  if (::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_STATX_SYNC_AS_STAT,
              STATX_BASIC_STATS | STATX_BTIME, &st) != 0) {
    KLIBC_ERR_SET(KLIB_ERR_IO);
    return false;
  }
  Json::Value doc(Json::objectValue);
  AddNames(path, doc);
  AddAttributes(st, doc);
  // Only regular files are read: a FIFO would block the reader, a device
  // (or a link to one, such as /dev/zero) never ends or acts when opened.
  if (NeedMeta(cfg) && S_ISREG(st.stx_mode)) {
    const int saved_errno = errno;
    AddMetadata(path, cfg, st, doc);
    errno = saved_errno;
  }
  out = std::move(doc);
  return true;
}

}  // namespace CONTENT_EXTRACT
}  // namespace KALO
