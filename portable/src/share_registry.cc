#include "orvex/portable/share_registry.h"

#include <fcntl.h>
#include <json/json.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <functional>
#include <memory>
#include <set>
#include <sstream>
#include <stdexcept>

#include "orvex/portable/atomic_file.h"
#include "orvex/portable/file_descriptor.h"
#include "orvex/portable/root.h"
#include "orvex/portable/utf8_text.h"

namespace orvex {
namespace portable {
namespace {

constexpr size_t kMaxNameBytes = 255;
constexpr size_t kMaxPathBytes = 4095;

bool* FlagOf(ShareRecord& share, const std::string& key) {
  if (key == "encryption") return &share.encryption;
  if (key == "encrypted") return &share.encrypted;
  if (key == "readonly") return &share.readonly;
  if (key == "recycle_bin") return &share.recycle_bin;
  if (key == "hide_unreadable") return &share.hide_unreadable;
  return nullptr;
}

using Kind = ShareRegistryError::Kind;

std::string Hex(unsigned value, int digits) {
  char text[16];
  std::snprintf(text, sizeof(text), "%0*X", digits, value);
  return text;
}

// The system's message for err, as it reads inside a sentence.
std::string Cause(int err) {
  std::string text = std::strerror(err);
  if (!text.empty()) text[0] = static_cast<char>(std::tolower(static_cast<unsigned char>(text[0])));
  return text;
}

// Throws for the system call that just failed; what names the file.
[[noreturn]] void Fail(Kind kind, const std::string& what) {
  const int err = errno;
  throw ShareRegistryError(kind, err, what + ": " + Cause(err));
}

// Checks a share name; returns what is wrong, or "" when it is fine.
std::string NameProblem(const std::string& name) {
  if (name.empty()) return "the name is empty";
  if (name.size() > kMaxNameBytes) return "the name is longer than 255 bytes";
  // Share-relative paths are "/<share>/...": a slash would split the name.
  if (name.find('/') != std::string::npos) return "the name contains \"/\"";
  if (name.find('\0') != std::string::npos) return "the name contains a NUL byte";
  return "";
}

// Names travel in JSON replies, log lines and terminal tables: bytes that
// are not UTF-8 break the first, control characters garble the others.
// Checked for new and changed shares only, so that a registry written by
// hand before stays readable.
std::string NameTextProblem(const std::string& name) {
  std::string problem;
  ForEachCodePoint(name, [&](UChar32 c, size_t begin, size_t) {
    if (!problem.empty()) return;
    if (c < 0) {
      problem = "the name is not valid UTF-8 (byte 0x" +
                Hex(static_cast<unsigned char>(name[begin]), 2) + " at offset " +
                std::to_string(begin) + ")";
    } else if (IsControlCodePoint(c)) {
      problem = "the name contains the control character U+" + Hex(static_cast<unsigned>(c), 4);
    }
  });
  return problem;
}

// Drops trailing slashes; returns what is wrong with the path, or "".
std::string NormalizePath(std::string& path) {
  if (path.empty()) return "the path is empty";
  if (path.front() != '/') return "the path " + QuoteForDisplay(path) + " is not absolute";
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  if (path == "/") return "the path is the root directory";
  if (path.size() > kMaxPathBytes) return "the path is longer than 4095 bytes";
  if (path.find('\0') != std::string::npos) return "the path contains a NUL byte";
  std::stringstream components(path.substr(1));
  std::string part;
  while (std::getline(components, part, '/')) {
    if (part.empty() || part == "." || part == "..") {
      return "the path " + QuoteForDisplay(path) + " has an empty, \".\" or \"..\" component";
    }
  }
  return "";
}

std::string PrivilegesProblem(const std::map<std::string, std::string>& privileges) {
  for (const auto& entry : privileges) {
    if (entry.first.empty() || entry.first.size() > kMaxNameBytes) {
      return "privilege user name " + QuoteForDisplay(entry.first) + " is empty or too long";
    }
    if (entry.second != kSharePrivReadWrite && entry.second != kSharePrivReadOnly &&
        entry.second != kSharePrivNone) {
      return "privilege of " + QuoteForDisplay(entry.first) + " is " +
             QuoteForDisplay(entry.second) + ", not \"rw\", \"ro\" or \"na\"";
    }
  }
  return "";
}

// Checks and normalises a record; returns what is wrong, or "".
std::string RecordProblem(ShareRecord& share) {
  std::string problem = NameProblem(share.name);
  if (problem.empty()) problem = NormalizePath(share.path);
  if (problem.empty()) problem = PrivilegesProblem(share.privileges);
  return problem;
}

// Reads one registry entry; throws std::runtime_error with what is wrong
// (without the file name, which the caller adds).
ShareRecord RecordFromJson(const Json::Value& entry) {
  if (!entry.isObject()) throw std::runtime_error("is not an object");
  ShareRecord share;
  for (const std::string& key : entry.getMemberNames()) {
    const Json::Value& value = entry[key];
    if (key == "name" || key == "path") {
      if (!value.isString())
        throw std::runtime_error("key " + QuoteForDisplay(key) + " is not a string");
      (key == "name" ? share.name : share.path) = value.asString();
    } else if (bool* flag = FlagOf(share, key)) {
      if (!value.isBool())
        throw std::runtime_error("key " + QuoteForDisplay(key) + " is not a boolean");
      *flag = value.asBool();
    } else if (key == "ftp_privilege") {
      if (!value.isInt()) throw std::runtime_error("key \"ftp_privilege\" is not an integer");
      share.ftp_privilege = value.asInt();
    } else if (key == "privileges") {
      if (!value.isObject()) throw std::runtime_error("key \"privileges\" is not an object");
      for (const std::string& user : value.getMemberNames()) {
        if (!value[user].isString()) {
          throw std::runtime_error("privilege of " + QuoteForDisplay(user) + " is not a string");
        }
        share.privileges[user] = value[user].asString();
      }
    } else {
      throw std::runtime_error("unknown key " + QuoteForDisplay(key));
    }
  }
  if (!entry.isMember("name")) throw std::runtime_error("key \"name\" is missing");
  if (!entry.isMember("path")) throw std::runtime_error("key \"path\" is missing");
  std::string problem = RecordProblem(share);
  if (!problem.empty()) throw std::runtime_error(problem);
  return share;
}

Json::Value RecordToJson(const ShareRecord& share) {
  Json::Value entry(Json::objectValue);
  entry["name"] = share.name;
  entry["path"] = share.path;
  entry["encryption"] = share.encryption;
  entry["encrypted"] = share.encrypted;
  entry["readonly"] = share.readonly;
  entry["recycle_bin"] = share.recycle_bin;
  entry["hide_unreadable"] = share.hide_unreadable;
  entry["ftp_privilege"] = share.ftp_privilege;
  Json::Value privileges(Json::objectValue);
  for (const auto& user : share.privileges) privileges[user.first] = user.second;
  entry["privileges"] = privileges;
  return entry;
}

void MakeParentDirs(const std::string& path, Kind kind) {
  for (size_t slash = path.find('/', 1); slash != std::string::npos;
       slash = path.find('/', slash + 1)) {
    std::string dir = path.substr(0, slash);
    if (::mkdir(dir.c_str(), 0755) != 0 && errno != EEXIST) {
      Fail(kind, "directory " + dir + " cannot be created");
    }
  }
}

// The registry must be the file itself. Returns false when it does not
// exist (no shares); throws for a link, a directory or a failed lstat.
bool RegistryFileExists(const std::string& path) {
  struct stat st;
  if (::lstat(path.c_str(), &st) != 0) {
    if (errno == ENOENT) return false;
    Fail(Kind::kLoad, path + " cannot be examined");
  }
  if (S_ISLNK(st.st_mode)) {
    throw ShareRegistryError(Kind::kLoad, ELOOP, path + " is a symbolic link");
  }
  if (S_ISDIR(st.st_mode)) {
    throw ShareRegistryError(Kind::kLoad, EISDIR, path + " is a directory");
  }
  return true;
}

// The writers' exclusive lock, held for its lifetime. flock locks belong to
// the open file description, so threads of one process exclude each other
// too.
class RegistryLock {
 public:
  RegistryLock() {
    const std::string path = RootPath(kShareRegistryLockPath);
    MakeParentDirs(path, Kind::kLock);
    fd_.reset(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
    if (!fd_) Fail(Kind::kLock, "lock file " + path + " cannot be opened");
    int rc;
    do {
      rc = ::flock(fd_.get(), LOCK_EX);
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) Fail(Kind::kLock, "lock file " + path + " cannot be locked");
  }

 private:
  FileDescriptor fd_;  // closing releases the lock
};

void Save(const std::vector<ShareRecord>& shares) {
  const std::string path = RootPath(kShareRegistryPath);
  MakeParentDirs(path, Kind::kSave);
  if (WriteFileAtomic(path, FormatShareRegistry(shares), 0644)) return;
  if (errno == ELOOP) throw ShareRegistryError(Kind::kSave, ELOOP, path + " is a symbolic link");
  if (errno == EISDIR) throw ShareRegistryError(Kind::kSave, EISDIR, path + " is a directory");
  Fail(Kind::kSave, path + " cannot be written");
}

// Loads, changes and saves the registry under the writers' lock. change
// returns false to leave the file as it is.
void Modify(const std::function<bool(std::vector<ShareRecord>&)>& change) {
  RegistryLock lock;
  std::vector<ShareRecord> shares = LoadShares();
  if (change(shares)) Save(shares);
}

std::vector<ShareRecord>::iterator FindIn(std::vector<ShareRecord>& shares,
                                          const std::string& name) {
  auto it = shares.begin();
  while (it != shares.end() && it->name != name) ++it;
  return it;
}

ShareRecord ValidCopy(const ShareRecord& share) {
  ShareRecord copy = share;
  std::string problem = RecordProblem(copy);
  if (problem.empty()) problem = NameTextProblem(copy.name);
  if (!problem.empty()) {
    throw std::invalid_argument("share " + QuoteForDisplay(share.name) + ": " + problem);
  }
  return copy;
}

}  // namespace

std::vector<ShareRecord> ParseShareRegistry(const std::string& text, const std::string& source) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value root;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &root, &errors)) {
    while (!errors.empty() && errors.back() == '\n') errors.pop_back();
    throw ShareRegistryError(Kind::kLoad, 0, source + ": not valid JSON: " + errors);
  }
  if (!root.isArray()) {
    throw ShareRegistryError(Kind::kLoad, 0, source + ": not a JSON array of shares");
  }
  std::vector<ShareRecord> shares;
  std::set<std::string> names;
  for (Json::ArrayIndex i = 0; i < root.size(); ++i) {
    const std::string where = source + ": share [" + std::to_string(i) + "]";
    try {
      shares.push_back(RecordFromJson(root[i]));
    } catch (const std::runtime_error& e) {
      throw ShareRegistryError(Kind::kLoad, 0, where + ": " + e.what());
    }
    if (!names.insert(shares.back().name).second) {
      throw ShareRegistryError(Kind::kLoad, 0,
                               where + ": duplicate name " + QuoteForDisplay(shares.back().name));
    }
  }
  return shares;
}

std::string FormatShareRegistry(const std::vector<ShareRecord>& shares) {
  Json::Value root(Json::arrayValue);
  for (const ShareRecord& share : shares) root.append(RecordToJson(share));
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "  ";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, root) + "\n";
}

std::vector<ShareRecord> LoadShares() {
  const std::string path = RootPath(kShareRegistryPath);
  if (!RegistryFileExists(path)) return {};
  std::string text;
  if (!ReadWholeFile(path, text)) {
    if (errno == ENOENT) return {};  // removed since the lstat
    Fail(Kind::kLoad, path + " cannot be read");
  }
  return ParseShareRegistry(text, path);
}

bool FindShare(const std::string& name, ShareRecord& out) {
  std::vector<ShareRecord> shares = LoadShares();
  auto it = FindIn(shares, name);
  if (it == shares.end()) return false;
  out = *it;
  return true;
}

void AddShare(const ShareRecord& share, const ShareAddCheck& check) {
  ShareRecord valid = ValidCopy(share);
  Modify([&valid, &check](std::vector<ShareRecord>& shares) {
    if (check) check(shares, valid);
    if (FindIn(shares, valid.name) != shares.end()) {
      throw std::invalid_argument("share " + QuoteForDisplay(valid.name) + " exists already");
    }
    shares.push_back(valid);
    return true;
  });
}

void UpdateShare(const ShareRecord& share) {
  ShareRecord valid = ValidCopy(share);
  Modify([&valid](std::vector<ShareRecord>& shares) {
    auto it = FindIn(shares, valid.name);
    if (it == shares.end()) {
      throw std::invalid_argument("no share called " + QuoteForDisplay(valid.name));
    }
    *it = valid;
    return true;
  });
}

bool RemoveShare(const std::string& name) {
  bool removed = false;
  Modify([&](std::vector<ShareRecord>& shares) {
    auto it = FindIn(shares, name);
    if (it == shares.end()) return false;
    shares.erase(it);
    removed = true;
    return true;
  });
  return removed;
}

}  // namespace portable
}  // namespace orvex
