// `orvex folder list|get`: the indexed folders as the web API lists them,
// read from the folder configuration through FolderMgr. Read-only: no lock
// is taken, as for the web API's list and get.
#include <algorithm>
#include <climits>
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "command_line.h"
#include "orvex/config/folder_mgr.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"

namespace orvex_cli {
namespace {

using orvex::fileindex::Folder;
using orvex::fileindex::FolderMgr;

constexpr char kFolderUsage[] =
    "usage: orvex folder list [--offset N] [--limit N] [--sort-by KEY] [--desc] [--status]\n"
    "                         [--json]\n"
    "       orvex folder get PATH [--json]\n"
    "Shows the indexed folders. Run `orvex folder SUBCOMMAND --help` for details.\n";

constexpr char kListUsage[] =
    "usage: orvex folder list [--offset N] [--limit N] [--sort-by KEY] [--desc] [--status]\n"
    "                         [--json]\n"
    "Lists the indexed folders, one page of them, sorted.\n"
    "  --offset N    skip the first N folders of the sorted list (default 0)\n"
    "  --limit N     show at most N folders (default all; 0 shows none, only the total)\n"
    "  --sort-by KEY path (default), name, or document, audio, video, photo (folders\n"
    "                with the type off first); text sorts ignore letter case\n"
    "  --desc        reverse the order\n"
    "  --status      add each folder's indexing status (reads the share queues)\n"
    "  --json        print the reply {\"folder\": [...], \"total\": N, \"offset\": N}\n";

constexpr char kGetUsage[] =
    "usage: orvex folder get PATH [--json]\n"
    "Shows the indexed folder whose share-relative path is exactly PATH, such as\n"
    "/photo/2024. Fails with error 902 when there is none.\n"
    "  --json  print the folder's record as stored\n";

// Removes "--name VALUE" or "--name=VALUE" from args (before any "--") and
// returns VALUE; the last one given wins.
std::optional<std::string> TakeValueOption(Args& args, const std::string& name,
                                           const std::string& usage) {
  std::optional<std::string> value;
  for (size_t i = 0; i < args.size() && args[i] != "--";) {
    if (args[i] == name) {
      if (i + 1 >= args.size()) throw UsageError("missing value for " + name, usage);
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
    throw UsageError(
        name + " must be a whole number from 0 to " + std::to_string(UINT_MAX) + ": " + *text,
        kListUsage);
  }
  return static_cast<unsigned int>(std::stoull(*text));
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

// Terminal columns of UTF-8 text, counting each code point as one.
size_t Columns(const std::string& text) {
  return std::count_if(text.begin(), text.end(),
                       [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; });
}

std::string Pad(const std::string& text, size_t width) {
  const size_t columns = Columns(text);
  return columns >= width ? text : text + std::string(width - columns, ' ');
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
  std::vector<size_t> widths(rows[0].size(), 0);
  for (const auto& row : rows) {
    for (size_t i = 0; i < row.size(); ++i) widths[i] = std::max(widths[i], Columns(row[i]));
  }
  for (const auto& row : rows) {
    std::string line;
    for (size_t i = 0; i < row.size(); ++i) {
      line += i + 1 == row.size() ? row[i] : Pad(row[i], widths[i]) + "  ";
    }
    std::cout << line << "\n";
  }
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
  const std::string sort_by = TakeValueOption(rest, "--sort-by", kListUsage).value_or("path");
  const ParsedArgs parsed = ParseArgs(rest, {"--desc", "--status", "--json"}, 0, 0, kListUsage);
  Json::Value additional(Json::arrayValue);
  if (parsed.Has("--status")) additional.append("status");
  const Json::Value reply =
      ListReply(offset, limit, sort_by, parsed.Has("--desc") ? "desc" : "asc", additional);
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
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, 1, 1, kGetUsage);
  const FolderMgr mgr;
  std::shared_ptr<Folder> folder;
  mgr.Get(folder, parsed.positional[0]);
  const Json::Value data = folder->GetData();
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
  };
  return RunSubcommand(args, "folder", kSubcommands, kFolderUsage);
}

}  // namespace orvex_cli
