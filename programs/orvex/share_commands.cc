// `orvex share add|list|remove`: the share registry through the portable
// platform's API, which validates, locks and writes the file atomically.
#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "command_line.h"
#include "orvex/foundation/error.h"
#include "orvex/portable/share_registry.h"

namespace orvex_cli {
namespace {

using orvex::portable::ShareRecord;

constexpr char kShareUsage[] =
    "usage: orvex share add NAME PATH [--readonly] [--encryption] [--recycle-bin]\n"
    "                       [--hide-unreadable]\n"
    "       orvex share list [--json]\n"
    "       orvex share remove NAME\n"
    "Manages the share registry, the list of shared folders that can be indexed.\n"
    "Run `orvex share SUBCOMMAND --help` for details.\n";

constexpr char kAddUsage[] =
    "usage: orvex share add NAME PATH [--readonly] [--encryption] [--recycle-bin]\n"
    "                       [--hide-unreadable]\n"
    "Registers the share NAME (exact case, no \"/\") whose root directory is PATH.\n"
    "A relative PATH is taken from the current directory and must exist.\n"
    "  --readonly         the share is read-only\n"
    "  --encryption       the share is of the encrypted kind\n"
    "  --recycle-bin      the share keeps a recycle bin at PATH/#recycle\n"
    "  --hide-unreadable  users do not see entries they cannot read\n"
    "Fails when a share of that name exists.\n";

constexpr char kListUsage[] =
    "usage: orvex share list [--json]\n"
    "Lists the registered shares: name, root directory and settings.\n"
    "  --json  print the registry's JSON array instead\n";

constexpr char kRemoveUsage[] =
    "usage: orvex share remove NAME\n"
    "Removes the share NAME from the registry (its files are not touched).\n"
    "Fails with error 800 when no share has that name.\n";

// A share's root is absolute in the registry; a relative one given here is
// resolved against the current directory.
std::string AbsoluteSharePath(const std::string& path) {
  if (!path.empty() && path[0] == '/') return path;
  std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr),
                                                       &std::free);
  if (!resolved) throw std::runtime_error("cannot resolve share path " + path);
  return resolved.get();
}

int Add(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kAddUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(
      args, {"--readonly", "--encryption", "--recycle-bin", "--hide-unreadable"}, 2, 2, kAddUsage);
  ShareRecord share;
  share.name = parsed.positional[0];
  share.path = AbsoluteSharePath(parsed.positional[1]);
  share.readonly = parsed.Has("--readonly");
  share.encryption = parsed.Has("--encryption");
  share.recycle_bin = parsed.Has("--recycle-bin");
  share.hide_unreadable = parsed.Has("--hide-unreadable");
  orvex::portable::AddShare(share);
  std::cout << "added share " << share.name << " at " << share.path << "\n";
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

std::string Pad(std::string text, size_t width) {
  if (text.size() < width) text.resize(width, ' ');
  return text;
}

void PrintTable(const std::vector<ShareRecord>& shares) {
  if (shares.empty()) {
    std::cout << "no shares registered\n";
    return;
  }
  size_t name_width = 4;
  size_t path_width = 4;
  for (const ShareRecord& share : shares) {
    name_width = std::max(name_width, share.name.size());
    path_width = std::max(path_width, share.path.size());
  }
  std::cout << Pad("NAME", name_width) << "  " << Pad("PATH", path_width) << "  SETTINGS\n";
  for (const ShareRecord& share : shares) {
    std::cout << Pad(share.name, name_width) << "  " << Pad(share.path, path_width) << "  "
              << Settings(share) << "\n";
  }
}

int List(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kListUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, 0, 0, kListUsage);
  const std::vector<ShareRecord> shares = orvex::portable::LoadShares();
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
  const ParsedArgs parsed = ParseArgs(args, {}, 1, 1, kRemoveUsage);
  const std::string& name = parsed.positional[0];
  if (!orvex::portable::RemoveShare(name)) throw orvex::Error(orvex::kErrorNoShare, name);
  std::cout << "removed share " << name << "\n";
  return kExitOk;
}

}  // namespace

int RunShareCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {
      {"add", Add},
      {"list", List},
      {"remove", Remove},
  };
  return RunSubcommand(args, "share", kSubcommands, kShareUsage);
}

}  // namespace orvex_cli
