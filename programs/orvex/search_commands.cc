// `orvex search` and `orvex stats`: users' searches and the indexes' figures,
// asked of the search daemon kaloelasticd on its socket (under ORVEX_ROOT).
// The daemon trims a search to what the asking user may read.
#include <unistd.h>

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
#include "terminal_text.h"

namespace orvex_cli {
namespace {

constexpr char kSearchSocketPath[] = "/var/run/kaloelasticd.sock";

constexpr char kSearchUsage[] =
    "usage: orvex search [QUERY] [--name FRAGMENT] [--type TYPE] [--ext EXT]\n"
    "                    [--in FOLDER] [--owner USER] [--share NAME] [--sort KEY]\n"
    "                    [--desc] [--limit N] [--offset N] [--user NAME] [--json]\n"
    "Searches the indexed shares. QUERY is words, \"phrases\", prefix*, OR and\n"
    "-excluded words in the files' text and metadata; each hit shows its matched\n"
    "words. Prints one line per hit: type, size, path (and the matched text).\n"
    "  --name FRAGMENT  a piece of the file name, anywhere in it, in any letter case\n"
    "  --type TYPE      dir, document, audio, video, image or other\n"
    "  --ext EXT        only this extension\n"
    "  --in FOLDER      only below this full path\n"
    "  --owner USER     only files this user (a name or a user id) owns\n"
    "  --share NAME     only this share's index\n"
    "  --sort KEY       name (default; relevance with QUERY), path, size or mtime;\n"
    "                   --desc reverses\n"
    "  --limit N        at most N hits (default 50, at most 1000); --offset N skips N\n"
    "  --user NAME      (root) search as this user would see\n"
    "  --json           print the daemon's answer as JSON\n";

constexpr char kStatsUsage[] =
    "usage: orvex stats [--json]\n"
    "Prints each search index: its id, documents, size on disk, whether it is paused,\n"
    "whether it holds uncommitted changes, and when it was last committed.\n";

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
  } kText[] = {{"--name", "name"},   {"--type", "type"}, {"--ext", "extension"}, {"--in", "folder"},
               {"--owner", "owner"}, {"--sort", "sort"}, {"--user", "user"}};
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
    } else if (data.isMember("text")) {
      throw UsageError("unexpected word " + arg + " (quote a QUERY of several words)",
                       kSearchUsage);
    } else {
      data["text"] = arg;
    }
  }
  // Words are looked for to find the files most about them first.
  if (data.isMember("text") && !data.isMember("sort")) data["sort"] = "relevance";
  return data;
}

// A snippet on one line: the file's own control characters (line breaks,
// and escape sequences that could drive the terminal) become spaces. On a
// terminal the matched words, which the daemon puts in brackets, are shown
// in bold instead; a bracket inside a match, or a closing one outside, is
// the file's own.
std::string ShownSnippet(const std::string& snippet, bool terminal) {
  std::string out;
  out.reserve(snippet.size() + 32);
  bool bold = false;
  for (const char c : snippet) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte < 0x20 || byte == 0x7F) {
      out += ' ';
    } else if (terminal && c == (bold ? ']' : '[')) {
      out += bold ? "\x1b[0m" : "\x1b[1m";
      bold = !bold;
    } else {
      out += c;
    }
  }
  if (bold) out += "\x1b[0m";
  return out;
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
  const bool terminal = ::isatty(STDOUT_FILENO) != 0;
  for (const Json::Value& hit : data["hits"]) {
    std::cout << Field(hit["type"]) << "\t" << Field(hit["size"]) << "\t" << Field(hit["path"]);
    if (hit.isMember("snippet")) {
      std::cout << "\t" << ShownSnippet(hit["snippet"].asString(), terminal);
    }
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
              << (index["uncommitted"].asBool() ? "\tuncommitted changes" : "") << "\t"
              << (index["last_commit"].isInt64()
                      ? "last commit " + LocalTime(index["last_commit"].asInt64())
                      : std::string("never committed"))
              << "\n";
  }
  return kExitOk;
}

}  // namespace orvex_cli
