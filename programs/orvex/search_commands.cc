// `orvex search` and `orvex stats`: users' searches and the indexes' figures,
// asked of the search daemon kaloelasticd on its socket (under ORVEX_ROOT).
// The daemon trims a search to what the asking user may read.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <string>

#include "command_line.h"
#include "daemon_client.h"
#include "kalo/kalo_sock.h"
#include "orvex/foundation/error.h"
#include "orvex/foundation/json.h"
#include "orvex/portable/root.h"

namespace orvex_cli {
namespace {

constexpr char kSearchSocketPath[] = "/var/run/kaloelasticd.sock";

constexpr char kSearchUsage[] =
    "usage: orvex search [FRAGMENT] [--text WORDS] [--type TYPE] [--ext EXT]\n"
    "                    [--folder PATH] [--sort KEY] [--desc] [--limit N] [--offset N]\n"
    "                    [--share NAME] [--user NAME] [--json]\n"
    "Searches the indexed shares. FRAGMENT matches anywhere in file names, in any\n"
    "letter case. Prints one line per hit: type, size, path (and the matched text).\n"
    "  --text WORDS   words, \"phrases\" and prefix* in the files' text and metadata\n"
    "  --type TYPE    dir, document, audio, video, image or other\n"
    "  --ext EXT      only this extension\n"
    "  --folder PATH  only below this full path\n"
    "  --sort KEY     name (default), path, size, mtime or relevance; --desc reverses\n"
    "  --limit N      at most N hits (default 50, at most 1000); --offset N skips N\n"
    "  --share NAME   only this share's index\n"
    "  --user NAME    (root) search as this user would see\n"
    "  --json         print the daemon's answer as JSON\n";

constexpr char kStatsUsage[] =
    "usage: orvex stats [--json]\n"
    "Prints each search index: its id, documents, size on disk, whether it is paused\n"
    "and whether it holds uncommitted changes.\n";

Json::Value AskSearchDaemon(const Json::Value& request) {
  return AskDaemon(kSearchSocketPath, "the search daemon kaloelasticd", request);
}

int Number(const std::string& option, const std::string& text) {
  char* end = nullptr;
  const long value = std::strtol(text.c_str(), &end, 10);
  if (text.empty() || *end != '\0' || value < 0 || value > 1000000) {
    throw UsageError(option + " takes a number, not \"" + text + "\"", kSearchUsage);
  }
  return static_cast<int>(value);
}

Json::Value ParseSearch(const Args& args, bool& json) {
  Json::Value data(Json::objectValue);
  static const struct {
    const char* option;
    const char* member;
  } kText[] = {{"--text", "text"},     {"--type", "type"}, {"--ext", "extension"},
               {"--folder", "folder"}, {"--sort", "sort"}, {"--user", "user"}};
  for (size_t i = 0; i < args.size(); ++i) {
    const std::string& arg = args[i];
    auto value = [&]() -> std::string {
      if (i + 1 >= args.size()) throw UsageError(arg + " needs a value", kSearchUsage);
      return args[++i];
    };
    bool known = false;
    for (const auto& t : kText) {
      if (arg == t.option) {
        data[t.member] = value();
        known = true;
      }
    }
    if (known) continue;
    if (arg == "--json") {
      json = true;
    } else if (arg == "--desc") {
      data["order"] = "desc";
    } else if (arg == "--limit" || arg == "--offset") {
      data[arg.substr(2)] = Number(arg, value());
    } else if (arg == "--share") {
      data["id"] = "fileindex_" + value();
    } else if (arg.size() > 1 && arg[0] == '-') {
      throw UsageError("unknown option " + arg, kSearchUsage);
    } else if (data.isMember("name")) {
      throw UsageError("unexpected word " + arg + " (one FRAGMENT only)", kSearchUsage);
    } else {
      data["name"] = arg;
    }
  }
  return data;
}

std::string Field(const Json::Value& value) {
  return value.isNull() ? "-" : value.isString() ? value.asString() : orvex::toString(value);
}

}  // namespace

int RunSearchCommand(const Args& args) {
  if (WantsHelp(args)) {
    std::cout << kSearchUsage;
    return kExitOk;
  }
  bool json = false;
  Json::Value request;
  request["command"] = "search";
  request["data"] = ParseSearch(args, json);
  const Json::Value data = AskSearchDaemon(request);
  if (json) {
    std::cout << orvex::toString(data) << "\n";
    return kExitOk;
  }
  for (const Json::Value& hit : data["hits"]) {
    std::cout << Field(hit["type"]) << "\t" << Field(hit["size"]) << "\t" << Field(hit["path"]);
    if (hit.isMember("snippet")) std::cout << "\t" << hit["snippet"].asString();
    std::cout << "\n";
  }
  std::cout << data["hits"].size() << " of " << Field(data["total"]) << " hits\n";
  return kExitOk;
}

int RunStatsCommand(const Args& args) {
  const ParsedArgs parsed = ParseArgs(args, {"--json"}, {}, 0, kStatsUsage);
  if (WantsHelp(args)) {
    std::cout << kStatsUsage;
    return kExitOk;
  }
  Json::Value request;
  request["command"] = "stats";
  request["data"] = Json::Value(Json::objectValue);
  const Json::Value data = AskSearchDaemon(request);
  if (parsed.Has("--json")) {
    std::cout << orvex::toString(data) << "\n";
    return kExitOk;
  }
  for (const Json::Value& index : data["indexes"]) {
    std::cout << index["id"].asString() << "\t" << Field(index["documents"]) << " documents\t"
              << Field(index["bytes"]) << " bytes" << (index["paused"].asBool() ? "\tpaused" : "")
              << (index["uncommitted"].asBool() ? "\tuncommitted changes" : "") << "\n";
  }
  return kExitOk;
}

}  // namespace orvex_cli
