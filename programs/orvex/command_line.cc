#include "command_line.h"

#include <iostream>

#include "terminal_text.h"

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

ParsedArgs ParseArgs(const Args& args, const std::set<std::string>& allowed,
                     const std::vector<std::string>& positional, size_t required,
                     const std::string& usage) {
  ParsedArgs parsed;
  bool options_ended = false;
  for (const std::string& arg : args) {
    if (!options_ended && arg == "--") {
      options_ended = true;
    } else if (!options_ended && IsOption(arg)) {
      if (allowed.count(arg) == 0) throw UsageError("unknown option " + Quote(arg), usage);
      parsed.options.insert(arg);
    } else {
      parsed.positional.push_back(arg);
    }
  }
  if (parsed.positional.size() < required) {
    throw UsageError("missing " + positional[parsed.positional.size()], usage);
  }
  if (parsed.positional.size() > positional.size()) {
    throw UsageError("unexpected argument " + Quote(parsed.positional[positional.size()]), usage);
  }
  return parsed;
}

std::string WithNextStep(const std::string& reason, const std::string& next_step) {
  return next_step.empty() ? reason : reason + "; " + next_step;
}

int RunSubcommand(const Args& args, const std::string& group,
                  const std::vector<Subcommand>& subcommands, const std::string& usage) {
  std::string names;
  for (size_t i = 0; i < subcommands.size(); ++i) {
    names += i == 0 ? "" : i + 1 == subcommands.size() ? " or " : ", ";
    names += subcommands[i].name;
  }
  if (args.empty()) throw UsageError("missing " + group + " subcommand (" + names + ")", usage);
  if (args[0] == "--help") {
    std::cout << usage;
    return kExitOk;
  }
  for (const Subcommand& sub : subcommands) {
    if (args[0] == sub.name) return sub.run(Args(args.begin() + 1, args.end()));
  }
  throw UsageError("unknown " + group + " subcommand " + Quote(args[0]) + " (" + names + ")",
                   usage);
}

}  // namespace orvex_cli
