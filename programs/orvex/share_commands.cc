// `orvex share add|list|remove`: the share registry through the portable
// platform's API, which validates, locks and writes the file atomically.
// The tool adds its own rules for new shares: the root directory must exist
// and no two shares may overlap, since every file must belong to exactly
// one share's index.
#include <sys/stat.h>

#include <cerrno>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "command_line.h"
#include "foundation/path_prefix.h"
#include "orvex/foundation/error.h"
#include "orvex/portable/root.h"
#include "orvex/portable/share_registry.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

using orvex::portable::ShareRecord;
using orvex::portable::ShareRegistryError;

constexpr char kShareUsage[] =
    "usage: orvex share add NAME PATH [--readonly] [--encryption] [--recycle-bin]\n"
    "                       [--hide-unreadable]\n"
    "       orvex share list [--json]\n"
    "       orvex share remove NAME\n"
    "       orvex share pause|resume|check-recycle NAME\n"
    "       orvex share forget NAME PATH\n"
    "       orvex share rename FROM TO\n"
    "       orvex share migrate NAME FROM_PATH TO_PATH\n"
    "Manages the share registry, the list of shared folders that can be indexed,\n"
    "and the indexing of each share.\n"
    "Run `orvex share SUBCOMMAND --help` for details.\n";

constexpr char kAddUsage[] =
    "usage: orvex share add NAME PATH [--readonly] [--encryption] [--recycle-bin]\n"
    "                       [--hide-unreadable]\n"
    "Registers the share NAME (exact case; UTF-8 without \"/\" or control characters)\n"
    "whose root directory is PATH. PATH must be an existing directory; a relative\n"
    "PATH is taken from the current directory. PATH may not be the path of another\n"
    "share, lie inside one, or contain one.\n"
    "  --readonly         the share is read-only (read-only shares are never indexed)\n"
    "  --encryption       the share is of the encrypted kind\n"
    "  --recycle-bin      the share keeps a recycle bin at PATH/#recycle\n"
    "  --hide-unreadable  users do not see entries they cannot read\n"
    "Fails (error 120) when a share of that name exists.\n";

constexpr char kListUsage[] =
    "usage: orvex share list [--json]\n"
    "Lists the registered shares: name, root directory and settings.\n"
    "  --json  print the registry's JSON array instead\n";

constexpr char kRemoveUsage[] =
    "usage: orvex share remove NAME\n"
    "Removes the share NAME from the registry (its files are not touched).\n"
    "Fails with error 800 when no share has that name.\n";

std::string RegistryPath() {
  return orvex::portable::RootPath(orvex::portable::kShareRegistryPath);
}

// The registry's failures as the tool's errors: the code says which step
// failed, the reason what is wrong and what to do.
[[noreturn]] void ThrowRegistryError(const ShareRegistryError& e) {
  using Kind = ShareRegistryError::Kind;
  const orvex::ErrorCode code = e.kind() == Kind::kLoad   ? orvex::kErrorLoadJson
                                : e.kind() == Kind::kLock ? orvex::kErrorLockFile
                                                          : orvex::kErrorSaveJson;
  std::string next_step = NextStep(e.error_number());
  if (e.error_number() == 0) {
    next_step = "correct the file by hand (its format is described in doc/share_registry.md)";
  }
  throw orvex::Error(code, WithNextStep(std::string("share registry: ") + e.what(), next_step));
}

// Runs a registry call, turning its exceptions into the tool's errors.
template <typename Call>
auto WithRegistry(Call call) -> decltype(call()) {
  try {
    return call();
  } catch (const ShareRegistryError& e) {
    ThrowRegistryError(e);
  } catch (const std::invalid_argument& e) {
    throw orvex::Error(orvex::kErrorBadArgument, e.what());
  }
}

// A share's root is absolute in the registry; a relative one given here is
// resolved against the current directory.
std::string AbsoluteSharePath(const std::string& path) {
  if (!path.empty() && path[0] == '/') return path;
  std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr),
                                                       &std::free);
  if (!resolved) {
    const int err = errno;
    throw orvex::Error(
        orvex::kErrorBadArgument,
        WithNextStep("share path " + Quote(path) + " cannot be resolved: " + Cause(err),
                     err == ENOENT ? "create the directory first" : NextStep(err)));
  }
  return resolved.get();
}

// The root must be there now: a share whose directory is missing could
// never be indexed and would only fail later, far from this command.
void CheckRootDirectory(const std::string& path) {
  struct stat st;
  if (::stat(path.c_str(), &st) != 0) {
    const int err = errno;
    if (err == ENOENT || err == ENOTDIR) {
      throw orvex::Error(orvex::kErrorBadArgument,
                         "share path " + path + " does not exist" +
                             (err == ENOTDIR ? " (a component of it is not a directory)" : "") +
                             "; create the directory first, or give the share's existing root");
    }
    throw orvex::Error(
        orvex::kErrorBadArgument,
        WithNextStep("share path " + path + " cannot be examined: " + Cause(err), NextStep(err)));
  }
  if (!S_ISDIR(st.st_mode)) {
    throw orvex::Error(orvex::kErrorBadArgument,
                       "share path " + path + " is not a directory; a share's root is a directory");
  }
}

// path with symbolic links followed, or path itself when it cannot be.
std::string Canonical(const std::string& path) {
  std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr),
                                                       &std::free);
  return resolved ? resolved.get() : path;
}

// How path relates to other (a registered share's path): "" when they do
// not overlap.
std::string Overlap(const std::string& path, const std::string& other) {
  if (path == other) return "is already the path of";
  if (orvex::IsSameOrBelow(path, other)) return "lies inside";
  if (orvex::IsSameOrBelow(other, path)) return "contains";
  return "";
}

// Runs under the registry's lock (AddShare), after the registry has checked
// the name and the path's form, so that two adds at once cannot both pass:
// each file must belong to exactly one share, and a name must not be taken
// twice.
void CheckNewShare(const std::vector<ShareRecord>& shares, const ShareRecord& share) {
  CheckRootDirectory(share.path);
  const std::string canonical = Canonical(share.path);
  for (const ShareRecord& other : shares) {
    if (other.name == share.name) {
      throw orvex::Error(orvex::kErrorBadArgument,
                         "share " + Quote(share.name) + " exists already, at " + other.path +
                             "; pick another name, or remove it first: orvex share remove " +
                             other.name);
    }
    std::string how = Overlap(share.path, other.path);
    std::string through_links;
    if (how.empty()) {
      how = Overlap(canonical, Canonical(other.path));
      if (!how.empty()) through_links = " once symbolic links are followed";
    }
    if (how.empty()) continue;
    throw orvex::Error(orvex::kErrorBadArgument,
                       "share path " + share.path + " " + how + " share " + Quote(other.name) +
                           " (" + other.path + ")" + through_links +
                           "; shares may not overlap: pick a directory outside every other share");
  }
}

int Add(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kAddUsage;
    return kExitOk;
  }
  const ParsedArgs parsed =
      ParseArgs(args, {"--readonly", "--encryption", "--recycle-bin", "--hide-unreadable"},
                {"NAME", "PATH"}, 2, kAddUsage);
  ShareRecord share;
  share.name = parsed.positional[0];
  share.path = AbsoluteSharePath(parsed.positional[1]);
  share.readonly = parsed.Has("--readonly");
  share.encryption = parsed.Has("--encryption");
  share.recycle_bin = parsed.Has("--recycle-bin");
  share.hide_unreadable = parsed.Has("--hide-unreadable");
  WithRegistry([&share] { orvex::portable::AddShare(share, CheckNewShare); });
  while (share.path.size() > 1 && share.path.back() == '/') share.path.pop_back();  // as stored
  std::cout << "added share " << share.name << " at " << share.path << "\n";
  if (share.readonly) {
    std::cout << "note: " << share.name
              << " is read-only, and read-only shares are never indexed\n";
  }
  return kExitOk;
}

std::string Settings(const ShareRecord& share) {
  std::string text;
  auto add = [&text](bool on, const char* name) {
    if (!on) return;
    if (!text.empty()) text += ",";
    text += name;
  };
  add(share.readonly, "readonly");
  add(share.encryption, "encryption");
  add(share.encrypted, "locked");
  add(share.recycle_bin, "recycle-bin");
  add(share.hide_unreadable, "hide-unreadable");
  return text.empty() ? "-" : text;
}

void PrintTable(const std::vector<ShareRecord>& shares) {
  if (shares.empty()) {
    std::cout << "no shares registered\n";
    return;
  }
  std::vector<std::vector<std::string>> rows{{"NAME", "PATH", "SETTINGS"}};
  for (const ShareRecord& share : shares) rows.push_back({share.name, share.path, Settings(share)});
  std::cout << FormatTable(rows);
}

int List(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kListUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, {}, 0, kListUsage);
  const std::vector<ShareRecord> shares = WithRegistry(orvex::portable::LoadShares);
  if (parsed.Has("--json")) {
    std::cout << orvex::portable::FormatShareRegistry(shares);
  } else {
    PrintTable(shares);
  }
  return kExitOk;
}

int Remove(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kRemoveUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {}, {"NAME"}, 1, kRemoveUsage);
  const std::string& name = parsed.positional[0];
  if (!WithRegistry([&name] { return orvex::portable::RemoveShare(name); })) {
    throw orvex::Error(orvex::kErrorNoShare, "no share is called " + Quote(name) + " in " +
                                                 RegistryPath() +
                                                 "; see the registered shares: orvex share list");
  }
  std::cout << "removed share " << name << "\n";
  return kExitOk;
}

}  // namespace

int RunShareCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {
      {"add", Add},
      {"list", List},
      {"remove", Remove},
      {"pause", SharePauseCommand},
      {"resume", ShareResumeCommand},
      {"forget", ShareForgetCommand},
      {"rename", ShareRenameCommand},
      {"migrate", ShareMigrateCommand},
      {"check-recycle", ShareCheckRecycleCommand},
  };
  return RunSubcommand(args, "share", kSubcommands, kShareUsage);
}

}  // namespace orvex_cli
