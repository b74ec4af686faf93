// `orvex extract PATH... [--meta] [--json]`: what content extraction gives for
// each file, exactly as the indexing daemon gets it from ParseFile: the
// file-system attributes, and with --meta the metadata read by the
// extraction service (or its one-shot mode when no service runs).
#include <cerrno>
#include <cstring>
#include <iostream>
#include <string>
#include <vector>

#include "command_line.h"
#include "kalo/kalo_content_extract.h"
#include "orvex/foundation/json.h"

namespace orvex_cli {
namespace {

constexpr char kExtractUsage[] =
    "usage: orvex extract PATH... [--meta] [--json]\n"
    "Prints the document properties content extraction gives for each file (full\n"
    "paths), as the index would store them.\n"
    "  --meta  read metadata and text too, in the isolated extraction service (or\n"
    "          its one-shot program when the service is not running); a file whose\n"
    "          extraction crashed, hung or ran out of memory keeps its attributes\n"
    "          and is noted in /var/lib/orvex/extract_failures.json\n"
    "  --json  print one JSON array of {\"path\", \"properties\"} (or \"error\")\n"
    "Exit status 2 when any file cannot be examined (each is still reported).\n";

// The properties of one item as indented "KEY: value" lines.
void PrintText(const std::string& path, const Json::Value& doc) {
  std::cout << path << "\n";
  for (const std::string& name : doc.getMemberNames()) {
    const Json::Value& value = doc[name];
    std::cout << "  " << name << ": "
              << (value.isString() ? value.asString() : orvex::toString(value)) << "\n";
  }
}

}  // namespace

int RunExtractCommand(const Args& args) {
  bool meta = false;
  bool json = false;
  bool positional_only = false;
  std::vector<std::string> paths;
  for (const std::string& arg : args) {
    if (!positional_only && arg == "--help") {
      std::cout << kExtractUsage;
      return kExitOk;
    }
    if (!positional_only && arg.size() > 1 && arg[0] == '-') {
      if (arg == "--") {
        positional_only = true;
      } else if (arg == "--meta") {
        meta = true;
      } else if (arg == "--json") {
        json = true;
      } else {
        throw UsageError("unknown option " + arg, kExtractUsage);
      }
    } else {
      paths.push_back(arg);
    }
  }
  if (paths.empty()) throw UsageError("missing PATH", kExtractUsage);
  Json::Value cfg(Json::objectValue);
  cfg["need_meta"] = meta;
  Json::Value all(Json::arrayValue);
  int status = kExitOk;
  for (const std::string& path : paths) {
    Json::Value doc;
    Json::Value entry(Json::objectValue);
    entry["path"] = path;
    errno = 0;
    if (KALO::CONTENT_EXTRACT::ParseFile(path, cfg, doc)) {
      entry["properties"] = doc;
      if (!json) PrintText(path, doc);
    } else {
      const std::string why = "cannot examine " + path + ": " + std::strerror(errno);
      entry["error"] = why;
      std::cerr << "orvex: error 914: " << why << "\n";
      status = kExitFailure;
    }
    all.append(entry);
  }
  if (json) std::cout << orvex::toString(all) << "\n";
  return status;
}

}  // namespace orvex_cli
