// The management commands: `orvex folder add|set|reindex|delete`, `orvex
// share pause|resume|forget|rename|migrate|check-recycle`, `orvex volume
// pause|resume|forget` and `orvex services prepare`. Each is one call of the
// library's management operation, exactly as the web API makes it, so the
// indexing daemon, the notification daemon's registrations and the search
// daemon are told as they would be.
#include <iostream>
#include <string>
#include <vector>

#include "command_line.h"
#include "orvex/foundation/util.h"
#include "orvex/index_mgr.h"

namespace orvex_cli {
namespace {

constexpr char kFolderAddUsage[] =
    "usage: orvex folder add PATH [NAME] [--no-document] [--no-audio] [--no-video]\n"
    "                        [--no-photo] [--updater]\n"
    "Indexes the folder whose share-relative path is PATH (such as /photo/2024),\n"
    "shown as NAME (default: the folder's own name). All four file types are\n"
    "indexed unless turned off. The folder must exist and may not be indexed yet.\n"
    "  --updater  accept a path the rules would refuse and queue no re-index\n";

constexpr char kFolderSetUsage[] =
    "usage: orvex folder set PATH [NAME] [--no-document] [--no-audio] [--no-video]\n"
    "                        [--no-photo] [--updater]\n"
    "Replaces the settings of the indexed folder PATH (adding it when it is not\n"
    "indexed); only the file types whose setting changes are re-indexed.\n";

constexpr char kFolderReindexUsage[] =
    "usage: orvex folder reindex PATH...\n"
    "Re-indexes everything below each share-relative PATH whose share has an\n"
    "indexed folder, and clears the share's need-reindex status.\n";

constexpr char kFolderDeleteUsage[] =
    "usage: orvex folder delete PATH...\n"
    "Stops indexing the folders PATH...; a share left without folders loses its\n"
    "index and queue.\n";

constexpr char kVolumeUsage[] =
    "usage: orvex volume pause MOUNT_POINT\n"
    "       orvex volume resume MOUNT_POINT\n"
    "       orvex volume forget MOUNT_POINT\n"
    "Pauses or resumes indexing of every share with folders whose path starts with\n"
    "MOUNT_POINT (a plain prefix: /volume1 also takes /volume10), or forgets the\n"
    "folders of a volume that has gone (their indexes are kept).\n";

constexpr char kServicesUsage[] =
    "usage: orvex services prepare\n"
    "Starts the services indexing needs (content extraction, the indexing daemon,\n"
    "the file server's Spotlight search) when some folder is indexed, and stops\n"
    "them when none is.\n";

Json::Value FolderRecord(const ParsedArgs& parsed) {
  const std::string& path = parsed.positional[0];
  Json::Value record(Json::objectValue);
  record["path"] = path;
  record["name"] = parsed.positional.size() > 1 ? parsed.positional[1] : orvex::Basename(path);
  for (const char* type : {"document", "audio", "video", "photo"}) {
    record[type] = !parsed.Has(std::string("--no-") + type);
  }
  return record;
}

int SaveFolder(const Args& args, const char* usage, void (*save)(const Json::Value&, bool)) {
  if (WantsHelp(args)) {
    std::cout << usage;
    return kExitOk;
  }
  const ParsedArgs parsed =
      ParseArgs(args, {"--no-document", "--no-audio", "--no-video", "--no-photo", "--updater"},
                {"PATH", "NAME"}, 1, usage);
  Json::Value request(Json::arrayValue);
  request.append(FolderRecord(parsed));
  save(request, parsed.Has("--updater"));
  return kExitOk;
}

// One or more paths, as the library's array.
Json::Value PathList(const Args& args, const char* usage) {
  const ParsedArgs parsed =
      ParseArgs(args, {}, std::vector<std::string>(args.size() + 1, "PATH"), 1, usage);
  Json::Value list(Json::arrayValue);
  for (const std::string& path : parsed.positional) list.append(path);
  return list;
}

int PathsCommand(const Args& args, const char* usage, void (*run)(const Json::Value&)) {
  if (WantsHelp(args)) {
    std::cout << usage;
    return kExitOk;
  }
  run(PathList(args, usage));
  return kExitOk;
}

// A command whose words are all required positional arguments.
std::vector<std::string> Words(const Args& args, const std::vector<std::string>& names,
                               const std::string& usage) {
  return ParseArgs(args, {}, names, names.size(), usage).positional;
}

template <typename Run>
int WordsCommand(const Args& args, const std::vector<std::string>& names, const std::string& usage,
                 Run run) {
  if (WantsHelp(args)) {
    std::cout << usage;
    return kExitOk;
  }
  run(Words(args, names, usage));
  return kExitOk;
}

int VolumePause(const Args& args) {
  return WordsCommand(args, {"MOUNT_POINT"}, kVolumeUsage,
                      [](const auto& w) { orvex::fileindex::VolumePause(w[0]); });
}
int VolumeResume(const Args& args) {
  return WordsCommand(args, {"MOUNT_POINT"}, kVolumeUsage,
                      [](const auto& w) { orvex::fileindex::VolumeResume(w[0]); });
}
int VolumeForget(const Args& args) {
  return WordsCommand(args, {"MOUNT_POINT"}, kVolumeUsage,
                      [](const auto& w) { orvex::fileindex::VolumeClearPaused(w[0]); });
}

int ServicesPrepare(const Args& args) {
  return WordsCommand(args, {}, kServicesUsage,
                      [](const auto&) { orvex::fileindex::PrepareServices(); });
}

constexpr char kShareManageUsage[] =
    "usage: orvex share pause|resume|check-recycle NAME\n"
    "       orvex share forget NAME PATH\n"
    "       orvex share rename FROM TO\n"
    "       orvex share migrate NAME FROM_PATH TO_PATH\n"
    "pause and resume stop and restart indexing of the share NAME; forget drops\n"
    "the index, queue and folders of a share that has gone (PATH was its root);\n"
    "rename and migrate carry a share renamed or moved to another volume (FROM_PATH\n"
    "and TO_PATH are its old and new roots) into the index; check-recycle\n"
    "re-indexes the share's recycle bin.\n";

}  // namespace

int FolderAddCommand(const Args& args) {
  return SaveFolder(args, kFolderAddUsage, orvex::fileindex::FolderAdd);
}
int FolderSetCommand(const Args& args) {
  return SaveFolder(args, kFolderSetUsage, orvex::fileindex::FolderSet);
}
int FolderReindexCommand(const Args& args) {
  return PathsCommand(args, kFolderReindexUsage, orvex::fileindex::FolderReindex);
}
int FolderDeleteCommand(const Args& args) {
  return PathsCommand(args, kFolderDeleteUsage, orvex::fileindex::FolderDelete);
}

int SharePauseCommand(const Args& args) {
  return WordsCommand(args, {"NAME"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::SharePause(w[0]); });
}
int ShareResumeCommand(const Args& args) {
  return WordsCommand(args, {"NAME"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::ShareResume(w[0]); });
}
int ShareForgetCommand(const Args& args) {
  return WordsCommand(args, {"NAME", "PATH"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::ShareClearPaused(w[0], w[1]); });
}
int ShareRenameCommand(const Args& args) {
  return WordsCommand(args, {"FROM", "TO"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::ShareRename(w[0], w[1]); });
}
int ShareMigrateCommand(const Args& args) {
  return WordsCommand(args, {"NAME", "FROM_PATH", "TO_PATH"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::ShareMigrate(w[0], w[1], w[2]); });
}
int ShareCheckRecycleCommand(const Args& args) {
  return WordsCommand(args, {"NAME"}, kShareManageUsage,
                      [](const auto& w) { orvex::fileindex::ShareCheckRecycle(w[0]); });
}

int RunVolumeCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {
      {"pause", VolumePause},
      {"resume", VolumeResume},
      {"forget", VolumeForget},
  };
  return RunSubcommand(args, "volume", kSubcommands, kVolumeUsage);
}

int RunServicesCommand(const Args& args) {
  static const std::vector<Subcommand> kSubcommands = {{"prepare", ServicesPrepare}};
  return RunSubcommand(args, "services", kSubcommands, kServicesUsage);
}

}  // namespace orvex_cli
