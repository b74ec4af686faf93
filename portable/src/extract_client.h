// The caller's side of content extraction (ParseFile's helpers): asking the
// daemon, running the one-shot program in a child of our own, and the record
// of files whose extraction crashed, hung or ran out of memory. Nothing here
// parses a file: the parsers only ever run in another process.
// Thread-safe: the only state in the process is the last failure record
// read, under a lock (the record file is shared between processes through a
// lock file).
#ifndef ORVEX_PORTABLE_SRC_EXTRACT_CLIENT_H_
#define ORVEX_PORTABLE_SRC_EXTRACT_CLIENT_H_

#include <json/json.h>
#include <sys/stat.h>

#include <string>

namespace orvex {
namespace portable {

struct ExtractOutcome {
  enum Kind {
    kOk,           // data holds the metadata
    kProblem,      // the parser found the file corrupt: data holds what it read
    kFault,        // the worker crashed, hung or ran out of memory: the file's fault
    kUnavailable,  // no answer for reasons that are not the file's
  };
  Kind kind = kUnavailable;
  Json::Value data{Json::objectValue};
  std::string reason;
};

// Asks the daemon listening on socket_path (resolved) to extract path,
// waiting at most about twice deadline_ms. The calling thread keeps its
// connection for the next request (a forked child makes its own). False
// when nothing answers the connection (no socket, or no daemon on it): run
// the one-shot mode then.
bool AskExtractDaemon(const std::string& socket_path, const std::string& path, int deadline_ms,
                      ExtractOutcome& outcome);

// Runs `program --extract path` in a child with the deadline (the child is
// killed when it passes) and the memory cap.
ExtractOutcome RunExtractProgram(const std::string& program, const std::string& path,
                                 int deadline_ms, int memory_mb);

// The failure record file: full path to the file's size and change time when
// its extraction failed, the reason and when. Bounded to kMaxEntries, the
// oldest dropped first. Written whole and atomically under a lock file, so
// concurrent writers in several processes lose nothing; read without a lock.
class ExtractFailureRecord {
 public:
  static constexpr size_t kMaxEntries = 1000;

  explicit ExtractFailureRecord(std::string record_path);

  enum State { kAbsent, kSameFile, kChangedFile };
  // What the record says of path, given its current attributes.
  State Lookup(const std::string& path, const struct statx& st) const;

  // Records (or replaces) path's failure; false with errno set when the
  // record cannot be written.
  bool Add(const std::string& path, const struct statx& st, const std::string& reason);

  // Drops path from the record; false with errno set when it cannot be
  // written.
  bool Remove(const std::string& path);

 private:
  Json::Value Load() const;
  bool Save(const Json::Value& files);

  std::string path_;
};

}  // namespace portable
}  // namespace orvex

#endif  // ORVEX_PORTABLE_SRC_EXTRACT_CLIENT_H_
