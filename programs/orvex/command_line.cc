#include "command_line.h"

#include <iostream>

namespace orvex_cli {
namespace {

bool IsOption(const std::string& arg) {
  if (arg.size() < 2 || arg[0] != '-') return false;
  return !(arg[1] >= '0' && arg[1] <= '9');
}

}  // namespace

bool WantsHelp(const Args& args) {
  for (const std::string& arg : args) {
    if (arg == "--") return false;
    if (arg == "--help") return true;
  }
  return false;
}

ParsedArgs ParseArgs(const Args& args, const std::set<std::string>& allowed, size_t min_positional,
                     size_t max_positional, const std::string& usage) {
  ParsedArgs parsed;
  bool options_ended = false;
  for (const std::string& arg : args) {
    if (!options_ended && arg == "--") {
      options_ended = true;
    } else if (!options_ended && IsOption(arg)) {
      if (allowed.count(arg) == 0) throw UsageError("unknown option " + arg, usage);
      parsed.options.insert(arg);
    } else {
      parsed.positional.push_back(arg);
    }
  }
  if (parsed.positional.size() < min_positional) throw UsageError("missing argument", usage);
  if (parsed.positional.size() > max_positional) {
    throw UsageError("unexpected argument " + parsed.positional[max_positional], usage);
  }
  return parsed;
}

int RunSubcommand(const Args& args, const std::string& group,
                  const std::vector<Subcommand>& subcommands, const std::string& usage) {
  if (args.empty()) throw UsageError("missing " + group + " subcommand", usage);
  if (args[0] == "--help") {
    std::cout << usage;
    return kExitOk;
  }
  for (const Subcommand& sub : subcommands) {
    if (args[0] == sub.name) return sub.run(Args(args.begin() + 1, args.end()));
  }
  throw UsageError("unknown " + group + " subcommand " + args[0], usage);
}

}  // namespace orvex_cli
