#include "kalo/kalo_content_extract.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>

#include <atomic>
#include <cctype>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

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

// The attribute properties, each named once.
enum Field {
  kPath,
  kFSName,
  kParent,
  kExtension,
  kIsDir,
  kFSSize,
  kPhysicalSize,
  kContentChangeDate,
  kAttributeChangeDate,
  kCreationDate,
  kOwnerUserID,
  kOwnerGroupID,
  kPrivilege,
  kFieldCount,
};

constexpr const char* kFieldNames[kFieldCount] = {
    "KALOMDPath",
    "KALOMDFSName",
    "KALOMDParent",
    "KALOMDExtension",
    "KALOMDIsDir",
    "KALOMDFSSize",
    "KALOMDPhysicalSize",
    "KALOMDFSContentChangeDate",
    "KALOMDAttributeChangeDate",
    "KALOMDFSCreationDate",
    "KALOMDOwnerUserID",
    "KALOMDOwnerGroupID",
    "KALOMDPrivilege",
};

// A document that already holds every attribute property (null), and the
// property at each position of its members in their (sorted) order. Most
// of describing an item is building its object: copying this one copies a
// tree whose shape is known, where adding the members one by one would look
// each name up and compare it with its neighbours, and the names are never
// copied at all (Json::StaticString: they live as long as the program).
struct Skeleton {
  Json::Value doc{Json::objectValue};
  std::vector<Field> order;

  explicit Skeleton(bool with_creation_date) {
    for (int f = 0; f < kFieldCount; ++f) {
      if (f == kCreationDate && !with_creation_date) continue;
      doc[Json::StaticString(kFieldNames[f])] = Json::Value();
    }
    for (Json::ValueConstIterator it = doc.begin(); it != doc.end(); ++it) {
      const std::string name = it.name();
      for (int f = 0; f < kFieldCount; ++f) {
        if (name == kFieldNames[f]) order.push_back(static_cast<Field>(f));
      }
    }
  }
};

// Not every file system records a birth time; no date beats a made-up one.
// Never destroyed, so that an item can still be described while the
// program exits.
const Skeleton& SkeletonFor(const struct statx& st) {
  static const Skeleton* const with_creation_date = new Skeleton(true);
  static const Skeleton* const without_creation_date = new Skeleton(false);
  return (st.stx_mask & STATX_BTIME) ? *with_creation_date : *without_creation_date;
}

// A short text kept for the life of the process, the same pointer for the
// same text; null when the table has no room left for it. A share holds few
// kinds of file, so that a few hundred extensions cover nearly every item.
const char* Interned(const char* text, size_t length) {
  constexpr size_t kSlots = 512;  // at most 512 texts of up to 15 bytes
  constexpr size_t kProbes = 8;
  static std::atomic<const char*>* const slots = new std::atomic<const char*>[kSlots]();
  size_t hash = 14695981039346656037ull;  // FNV-1a
  for (size_t i = 0; i < length; ++i) {
    hash = (hash ^ static_cast<unsigned char>(text[i])) * 1099511628211ull;
  }
  for (size_t probe = 0; probe < kProbes; ++probe) {
    std::atomic<const char*>& slot = slots[(hash + probe) % kSlots];
    const char* kept = slot.load(std::memory_order_acquire);
    if (kept == nullptr) {
      char* copy = new char[length + 1];
      std::memcpy(copy, text, length);
      copy[length] = '\0';
      if (slot.compare_exchange_strong(kept, copy, std::memory_order_acq_rel)) return copy;
      delete[] copy;  // another thread filled the slot first: kept is its text
    }
    if (std::strncmp(kept, text, length) == 0 && kept[length] == '\0') return kept;
  }
  return nullptr;
}

// The same rule as the library's file-type classification, so that a
// renamed item and a re-extracted one carry the same extension. Short ones
// are interned: documents refer to them rather than each holding a copy.
Json::Value LowerExtension(const char* name, const char* end) {
  const char* dot = end;
  while (dot != name && dot[-1] != '.') --dot;
  if (dot == name) return Json::Value(Json::StaticString(""));
  char lower[16];
  const size_t length = static_cast<size_t>(end - dot);
  if (length >= sizeof(lower)) {
    std::string ext(dot, end);
    for (char& c : ext) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return Json::Value(ext);
  }
  for (size_t i = 0; i < length; ++i) {
    lower[i] = static_cast<char>(std::tolower(static_cast<unsigned char>(dot[i])));
  }
  // An extension holding a NUL would read as a shorter one.
  const char* kept =
      std::memchr(lower, '\0', length) == nullptr ? Interned(lower, length) : nullptr;
  if (kept == nullptr) return Json::Value(lower, lower + length);
  return Json::Value(Json::StaticString(kept));
}

Json::Value Decimal(uint32_t number) {
  char text[16];
  char* begin = text + sizeof(text);
  do {
    *--begin = static_cast<char>('0' + number % 10);
    number /= 10;
  } while (number != 0);
  return Json::Value(begin, text + sizeof(text));
}

// A user or group id in decimal. The ids of a system's users and groups are
// few and small: each of those is written once, kept for the life of the
// process, and documents refer to it.
Json::Value OwnerID(uint32_t id) {
  // Ids below 65536, in pages of 256 made when first needed.
  using Page = std::atomic<const char*>[256];
  static std::atomic<Page*>* const pages = new std::atomic<Page*>[256]();
  if (id >= 65536) return Decimal(id);
  std::atomic<Page*>& page_slot = pages[id >> 8];
  Page* page = page_slot.load(std::memory_order_acquire);
  if (page == nullptr) {
    Page* made = new Page[1]();
    if (page_slot.compare_exchange_strong(page, made, std::memory_order_acq_rel)) {
      page = made;
    } else {
      delete[] made;  // another thread made it first: page is that one
    }
  }
  std::atomic<const char*>& slot = (*page)[id & 255];
  const char* text = slot.load(std::memory_order_acquire);
  if (text == nullptr) {
    const std::string written = Decimal(id).asString();
    char* copy = new char[written.size() + 1];
    std::memcpy(copy, written.c_str(), written.size() + 1);
    if (slot.compare_exchange_strong(text, copy, std::memory_order_acq_rel)) {
      text = copy;
    } else {
      delete[] copy;  // another thread wrote it first: text is that one
    }
  }
  return Json::Value(Json::StaticString(text));
}

// Permission bits as four octal digits ("0644"). There are only 4096 of
// them: each is written once, and documents refer to it, for as long as
// any document may live (the table is never destroyed).
Json::Value Octal(unsigned int mode) {
  struct Table {
    char text[07777 + 1][5];
    Table() {
      for (unsigned int m = 0; m <= 07777; ++m) {
        text[m][0] = static_cast<char>('0' + ((m >> 9) & 7));
        text[m][1] = static_cast<char>('0' + ((m >> 6) & 7));
        text[m][2] = static_cast<char>('0' + ((m >> 3) & 7));
        text[m][3] = static_cast<char>('0' + (m & 7));
        text[m][4] = '\0';
      }
    }
  };
  static const Table* const table = new Table;
  return Json::Value(Json::StaticString(table->text[mode & 07777]));
}

// Sets a member of a document being built: its payload only, as its
// comments and offsets are none.
void Set(Json::Value& member, Json::Value value) { member.swapPayload(value); }

// The names and attributes of the item at path.
Json::Value Describe(const std::string& path, const struct statx& st) {
  const size_t slash = path.rfind('/');
  const char* begin = path.data();
  const char* end = begin + path.size();
  const char* name = slash == std::string::npos ? begin : begin + slash + 1;
  const char* parent_end = slash == std::string::npos ? end : begin + slash;
  const Skeleton& skeleton = SkeletonFor(st);
  Json::Value doc(skeleton.doc);
  size_t position = 0;
  const Json::ValueIterator last = doc.end();
  for (Json::ValueIterator it = doc.begin(); it != last; ++it, ++position) {
    Json::Value& value = *it;
    switch (skeleton.order[position]) {
      case kPath:
        Set(value, Json::Value(begin, end));
        break;
      case kFSName:
        Set(value, Json::Value(name, end));
        break;
      case kParent:
        Set(value, Json::Value(begin, parent_end));
        break;
      case kExtension:
        Set(value, LowerExtension(name, end));
        break;
      case kIsDir:
        Set(value, S_ISDIR(st.stx_mode));
        break;
      case kFSSize:
        Set(value, static_cast<Json::Int64>(st.stx_size));
        break;
      case kPhysicalSize:
        Set(value, static_cast<Json::Int64>(st.stx_blocks * 512));
        break;
      case kContentChangeDate:
        Set(value, static_cast<Json::Int64>(st.stx_mtime.tv_sec));
        break;
      case kAttributeChangeDate:
        Set(value, static_cast<Json::Int64>(st.stx_ctime.tv_sec));
        break;
      case kCreationDate:
        Set(value, static_cast<Json::Int64>(st.stx_btime.tv_sec));
        break;
      case kOwnerUserID:
        Set(value, OwnerID(st.stx_uid));
        break;
      case kOwnerGroupID:
        Set(value, OwnerID(st.stx_gid));
        break;
      case kPrivilege:
        Set(value, Octal(st.stx_mode));
        break;
      case kFieldCount:
        break;
    }
  }
  return doc;
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
// The metadata is moved, not copied: it may carry a long text.
void MergeMetadata(Json::Value& meta, Json::Value& doc) {
  for (const std::string& name : meta.getMemberNames()) {
    if (!doc.isMember(name)) doc[name].swap(meta[name]);
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
  ExtractOutcome outcome = Extract(path, cfg);
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
  Json::Value doc = Describe(path, st);
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
