// `orvex folder list|get`: the indexed folders as the web API lists them,
// read from the folder configuration through FolderMgr. Read-only: no lock
// is taken, as for the web API's list and get.
#include <algorithm>
#include <climits>
#include <functional>
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "command_line.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/share_registry.h"
#include "state_files.h"
#include "terminal_text.h"

namespace orvex_cli {
namespace {

using orvex::fileindex::Folder;
using orvex::fileindex::FolderMgr;

constexpr char kFolderUsage[] =
    "usage: orvex folder list [--offset N] [--limit N] [--sort-by KEY] [--desc] [--status]\n"
    "                         [--json]\n"
    "       orvex folder get PATH [--json]\n"
    "       orvex folder add PATH [NAME] [--no-TYPE...] [--updater]\n"
    "       orvex folder set PATH [NAME] [--no-TYPE...] [--updater]\n"
    "       orvex folder reindex PATH...\n"
    "       orvex folder delete PATH...\n"
    "Shows and changes the indexed folders. Run `orvex folder SUBCOMMAND --help` for details.\n";

constexpr char kListUsage[] =
    "usage: orvex folder list [--offset N] [--limit N] [--sort-by KEY] [--desc] [--status]\n"
    "                         [--json]\n"
    "Lists the indexed folders, one page of them, sorted.\n"
    "  --offset N    skip the first N folders of the sorted list (default 0)\n"
    "  --limit N     show at most N folders (default all; 0 shows none, only the total)\n"
    "  --sort-by KEY path (default), name, or document, audio, video, photo (folders\n"
    "                with the type off first); text sorts ignore letter case; any\n"
    "                other KEY is refused\n"
    "  --desc        reverse the order\n"
    "  --status      add each folder's indexing status (reads the share queues)\n"
    "  --json        print the reply {\"folder\": [...], \"total\": N, \"offset\": N}\n";

constexpr char kGetUsage[] =
    "usage: orvex folder get PATH [--json]\n"
    "Shows the indexed folder whose share-relative path is exactly PATH, such as\n"
    "/photo/2024. Fails with error 902 when there is none.\n"
    "  --json  print the folder's record as stored\n";

// The keys --sort-by accepts. The library sorts any other word by name; the
// tool refuses it instead, so that a misspelt key does not quietly sort by
// something else.
const std::vector<std::string> kSortKeys = {"path", "name", "document", "audio", "video", "photo"};

std::string SortKey(const std::optional<std::string>& given) {
  if (!given) return "path";
  if (std::find(kSortKeys.begin(), kSortKeys.end(), *given) != kSortKeys.end()) return *given;
  std::string keys;
  for (const std::string& key : kSortKeys) keys += (keys.empty() ? "" : ", ") + key;
  throw UsageError("unknown sort key " + Quote(*given) + "; use one of: " + keys, kListUsage);
}

// Removes "--name VALUE" or "--name=VALUE" from args (before any "--") and
// returns VALUE; the last one given wins.
std::optional<std::string> TakeValueOption(Args& args, const std::string& name,
                                           const std::string& usage) {
  std::optional<std::string> value;
  for (size_t i = 0; i < args.size() && args[i] != "--";) {
    if (args[i] == name) {
      if (i + 1 >= args.size()) throw UsageError("missing value after " + name, usage);
      value = args[i + 1];
      args.erase(args.begin() + i, args.begin() + i + 2);
    } else if (args[i].rfind(name + "=", 0) == 0) {
      value = args[i].substr(name.size() + 1);
      args.erase(args.begin() + i);
    } else {
      ++i;
    }
  }
  return value;
}

unsigned int ParseCount(const std::optional<std::string>& text, unsigned int fallback,
                        const std::string& name) {
  if (!text) return fallback;
  const bool digits =
      !text->empty() && text->size() <= 10 &&
      std::all_of(text->begin(), text->end(), [](char c) { return c >= '0' && c <= '9'; });
  if (!digits || std::stoull(*text) > UINT_MAX) {
    throw UsageError(name + " must be a whole number from 0 to " + std::to_string(UINT_MAX) +
                         ", not " + Quote(*text),
                     kListUsage);
  }
  return static_cast<unsigned int>(std::stoull(*text));
}

// Runs body, which reads the folder list and, for --status, the status
// file, the share registry and the share queues, explaining what fails.
void ReadingFolders(const std::function<void()>& body) {
  try {
    ExplainStateFileErrors({FoldersFile(), StatusFile()}, "", body);
  } catch (const orvex::Error& e) {
    // The registry's failures reach the library as one platform error among
    // others; whether the registry is at fault is seen by reading it.
    if (e.code() != orvex::kErrorSystem) throw;
    try {
      orvex::portable::LoadShares();
    } catch (const orvex::portable::ShareRegistryError& broken) {
      const std::string next_step =
          broken.error_number() == 0
              ? "correct the share registry by hand (its format is in doc/share_registry.md)"
              : NextStep(broken.error_number());
      throw orvex::Error(e.code(), WithNextStep(e.reason(), next_step));
    }
    throw;
  }
}

// The web API's folder list reply: one page with each folder's record and
// the sections named in additional.
Json::Value ListReply(unsigned int offset, unsigned int limit, const std::string& sort_by,
                      const std::string& direction, const Json::Value& additional) {
  const FolderMgr mgr;
  std::vector<std::shared_ptr<Folder>> folders;
  unsigned int total = 0;
  mgr.List(folders, total, offset, limit, sort_by, direction);
  Json::Value out(Json::objectValue);
  out["folder"] = Json::Value(Json::arrayValue);
  out["total"] = total;
  out["offset"] = offset;
  for (const auto& folder : folders)
    out["folder"].append(folder->GetDataWithAdditional(additional));
  return out;
}

std::string YesNo(const Json::Value& flag) { return flag.asBool() ? "yes" : "no"; }

std::string StatusText(const Json::Value& folder) {
  const Json::Value& status = folder["additional"]["status"];
  std::string text = status["text"].asString();
  if (status.isMember("desc")) text += " (" + status["desc"].asString() + ")";
  return text;
}

void PrintTable(const Json::Value& reply, bool with_status) {
  const Json::Value& folders = reply["folder"];
  const unsigned int total = reply["total"].asUInt();
  const unsigned int offset = reply["offset"].asUInt();
  if (folders.empty()) {
    if (total == 0) {
      std::cout << "no indexed folders\n";
    } else {
      std::cout << "no folders shown from offset " << offset << "; " << total << " in all\n";
    }
    return;
  }
  std::vector<std::vector<std::string>> rows{
      {"PATH", "NAME", "DOCUMENT", "AUDIO", "VIDEO", "PHOTO", "PAUSED"}};
  if (with_status) rows[0].push_back("STATUS");
  for (const Json::Value& folder : folders) {
    rows.push_back({folder["path"].asString(), folder["name"].asString(), YesNo(folder["document"]),
                    YesNo(folder["audio"]), YesNo(folder["video"]), YesNo(folder["photo"]),
                    YesNo(folder["paused"])});
    if (with_status) rows.back().push_back(StatusText(folder));
  }
  std::cout << FormatTable(rows);
  if (folders.size() != total) {
    std::cout << "showing " << folders.size() << " of " << total << " folders from offset "
              << offset << "\n";
  }
}

int List(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kListUsage;
    return kExitOk;
  }
  Args rest = args;
  const unsigned int offset =
      ParseCount(TakeValueOption(rest, "--offset", kListUsage), 0, "--offset");
  const unsigned int limit =
      ParseCount(TakeValueOption(rest, "--limit", kListUsage), UINT_MAX, "--limit");
  const std::string sort_by = SortKey(TakeValueOption(rest, "--sort-by", kListUsage));
  const ParsedArgs parsed = ParseArgs(rest, {"--desc", "--status", "--json"}, {}, 0, kListUsage);
  Json::Value additional(Json::arrayValue);
  if (parsed.Has("--status")) additional.append("status");
  Json::Value reply;
  ReadingFolders([&] {
    reply = ListReply(offset, limit, sort_by, parsed.Has("--desc") ? "desc" : "asc", additional);
  });
  if (parsed.Has("--json")) {
    std::cout << orvex::toString(reply) << "\n";
  } else {
    PrintTable(reply, parsed.Has("--status"));
  }
  return kExitOk;
}

int Get(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kGetUsage;
    return kExitOk;
  }
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, {"PATH"}, 1, kGetUsage);
  const std::string& path = parsed.positional[0];
  Json::Value data;
  ReadingFolders([&] {
    const FolderMgr mgr;
    std::shared_ptr<Folder> folder;
    try {
      mgr.Get(folder, path);
    } catch (const orvex::Error& e) {
      if (e.code() != orvex::kErrorNoFolder) throw;
      throw orvex::Error(e.code(), e.reason() +
                                       " is not an indexed folder (the path must match "
                                       "exactly, letter case and slashes included); "
                                       "see them all: orvex folder list");
    }
    data = folder->GetData();
  });
  if (parsed.Has("--json")) {
    std::cout << orvex::toString(data) << "\n";
    return kExitOk;
  }
  const std::string volume = data["volume_to_be_clean"].asString();
  std::cout << "path:      " << data["path"].asString() << "\n"
            << "name:      " << data["name"].asString() << "\n"
            << "document:  " << YesNo(data["document"]) << "\n"
            << "audio:     " << YesNo(data["audio"]) << "\n"
            << "video:     " << YesNo(data["video"]) << "\n"
            << "photo:     " << YesNo(data["photo"]) << "\n"
            << "paused:    " << YesNo(data["paused"]) << "\n";
  if (!volume.empty()) std::cout << "clean:     volume " << volume << "\n";
  return kExitOk;
}

}  // namespace

int RunFolderCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {
      {"list", List},
      {"get", Get},
      {"add", FolderAddCommand},
      {"set", FolderSetCommand},
      {"reindex", FolderReindexCommand},
      {"delete", FolderDeleteCommand},
  };
  return RunSubcommand(args, "folder", kSubcommands, kFolderUsage);
}

}  // namespace orvex_cli
